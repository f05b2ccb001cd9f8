#include "linux/protocol/HostThumbnailsObject.h"

#include "linux/protocol/HostCodec.h"

namespace skein {
namespace {

void encode(wire::Thumbnail::Builder builder, const HostThumbnail& thumbnail) {
  builder.setIndex(thumbnail.index);
  builder.setKind(static_cast<std::uint8_t>(thumbnail.kind));
  if (thumbnail.data) builder.setData(codec::bytes(*thumbnail.data));
  if (thumbnail.type) builder.setType(codec::bytes(*thumbnail.type));
  codec::setError(builder, thumbnail.error);
}

class BatchObject final : public wire::ThumbnailBatch::Server {
 public:
  BatchObject(HostPeerPtr peer, std::shared_ptr<HostThumbnailBatch> stream)
      : _stream(std::move(peer), std::move(stream)) {}

  kj::Promise<void> next(NextContext context) override {
    return _stream.next(
        context, [](auto results, const HostThumbnailStep& step, const NSErrorPtr& error) {
          auto list = results.initThumbnails(static_cast<unsigned>(step.thumbnails.size()));
          unsigned at = 0;
          for (const HostThumbnail& thumbnail : step.thumbnails) encode(list[at++], thumbnail);
          results.setDone(step.done);
          results.setTotal(step.total);
          results.setFinished(step.finished);
          codec::setError(results, error);
        });
  }

 private:
  StreamOwner<HostThumbnailBatch> _stream;
};

}  // namespace

kj::Promise<void> HostThumbnailsObject::fetchThumbnails(FetchThumbnailsContext context) {
  const auto params = context.getParams();
  std::vector<HostTarget> targets;
  for (const auto target : params.getTargets()) targets.push_back(codec::decode(target));
  return answerOnExecutor(
      _peer, context,
      [service = _peer->service, targets = std::move(targets),
       size = NSSize{params.getWidth(), params.getHeight()}](auto reply) mutable {
        service->thumbnails().fetchThumbnails(std::move(targets), size, std::move(reply));
      },
      [peer = _peer](auto results, std::shared_ptr<HostThumbnailBatch>& batch,
                     const NSErrorPtr& error) {
        if (batch) results.setBatch(kj::heap<BatchObject>(peer, std::move(batch)));
        codec::setError(results, error);
      });
}

}  // namespace skein
