#include "linux/protocol/HostThumbnailsProxy.h"

#include <utility>

#include "linux/protocol/HostCalls.h"
#include "linux/protocol/HostCodec.h"
#include "linux/protocol/hostthumbnails.capnp.h"

namespace skein {
namespace {

HostThumbnail decode(wire::Thumbnail::Reader reader) {
  HostThumbnail thumbnail;
  thumbnail.index = reader.getIndex();
  thumbnail.kind = codec::enumerator(reader.getKind(), HostThumbnail::Kind::Error);
  if (reader.hasData()) {
    const auto data = reader.getData();
    thumbnail.data = NSData(std::span(data.begin(), data.size()));
  }
  if (reader.hasType()) thumbnail.type = codec::text(reader.getType());
  thumbnail.error = codec::errorOf(reader);
  return thumbnail;
}

Task decodeStep(const auto& results, const SharedReply<HostThumbnailStep>& reply) {
  HostThumbnailStep step;
  step.thumbnails.reserve(results.getThumbnails().size());
  for (const auto thumbnail : results.getThumbnails()) step.thumbnails.push_back(decode(thumbnail));
  step.done = results.getDone();
  step.total = results.getTotal();
  step.finished = results.getFinished();
  return [reply, step = std::move(step), error = codec::errorOf(results)]() mutable {
    (*reply)(std::move(step), std::move(error));
  };
}

class HostThumbnailsProxy final : public HostThumbnails, private HostCalls<wire::HostThumbnails> {
 public:
  using HostCalls::HostCalls;

  void fetchThumbnails(std::vector<HostTarget> targets, NSSize size,
                       Reply<std::shared_ptr<HostThumbnailBatch>, NSErrorPtr> reply) override {
    call<std::shared_ptr<HostThumbnailBatch>>(
        [targets = std::move(targets), size](wire::HostThumbnails::Client& host) {
          auto request = host.fetchThumbnailsRequest();
          auto list = request.initTargets(static_cast<unsigned>(targets.size()));
          unsigned at = 0;
          for (const HostTarget& target : targets) codec::encode(list[at++], target);
          request.setWidth(size.width);
          request.setHeight(size.height);
          return request.send();
        },
        [socket = _socket](auto& results) -> std::shared_ptr<HostThumbnailBatch> {
          if (!results.hasBatch()) return nullptr;
          return makeStream<HostThumbnailStep>(
              socket, results.getBatch(),
              [](const auto& step, const auto& next) { return decodeStep(step, next); });
        },
        reply);
  }
};

}  // namespace

std::unique_ptr<HostThumbnails> makeHostThumbnailsProxy(std::shared_ptr<SocketClient> socket) {
  return std::make_unique<HostThumbnailsProxy>(std::move(socket));
}

}  // namespace skein
