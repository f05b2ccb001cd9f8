#include "linux/host/ThumbnailRequests.h"

#include <utility>

#include "linux/framework/DocumentURLScope.h"
#include "linux/host/ThumbnailStream.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

class BatchStream final : public HostThumbnailBatch {
 public:
  explicit BatchStream(std::shared_ptr<ThumbnailStream> stream) : _stream(std::move(stream)) {}
  ~BatchStream() override { _stream->letGo(); }
  void next(Reply<HostThumbnailStep, NSErrorPtr> reply) override {
    _stream->next(std::move(reply));
  }

 private:
  const std::shared_ptr<ThumbnailStream> _stream;
};

// Asks the extension for all of them at once; blocks while vald finds out what they are.
void begin(const DriveRequests& drive, const std::vector<HostTarget>& targets, NSSize size,
           const std::shared_ptr<ThumbnailStream>& stream) {
  std::vector<NSFileProviderItemIdentifier> identifiers;
  std::vector<VLFileObjectID> documents;
  ThumbnailStream::Targets expected;
  for (std::uint32_t index = 0; index < targets.size(); ++index) {
    NSErrorPtr error;
    if (auto identifier = drive.resolve(targets[index], &error)) {
      expected.emplace(*identifier, index);
      if (const auto id = VLFileObjectID::fileObjectIDWithString(*identifier)) {
        documents.push_back(*id);
      }
      identifiers.push_back(std::move(*identifier));
    } else {
      stream->fail(index, error);
    }
  }
  stream->expect(std::move(expected));
  // A folder without a picture like any other. The extension takes it for an unknown item, as
  // its name is no identifier of the daemon's.
  const std::string root = NSFileProviderRootContainerItemIdentifier;
  if (std::erase(identifiers, root) > 0) {
    stream->thumbnailDidCome(root, std::nullopt, std::nullopt, nullptr);
  }
  const DocumentURLScope urls(drive.daemon(), *drive.tools().executor, documents);
  stream->setProgress(drive.extension().fetchThumbnailsForItemIdentifiersWithType(
      identifiers, size,
      [stream](const NSFileProviderItemIdentifier& identifier, std::optional<NSData> data,
               std::optional<std::string> type, NSErrorPtr error) {
        stream->thumbnailDidCome(identifier, std::move(data), std::move(type), std::move(error));
      },
      [stream](NSErrorPtr error) { stream->batchDidEnd(std::move(error)); }));
}

}  // namespace

void ThumbnailRequests::fetchThumbnails(
    std::vector<HostTarget> targets, NSSize size,
    Reply<std::shared_ptr<HostThumbnailBatch>, NSErrorPtr> reply) {
  _drive->withDrive<std::shared_ptr<HostThumbnailBatch>>(
      std::move(reply), [drive = _drive, targets = std::move(targets),
                         size](DriveRequests::Timed<std::shared_ptr<HostThumbnailBatch>> timed) {
        if (targets.size() > kMostTargets) {
          (*timed)(nullptr,
                   vlc_errorInvalidParameter("number of items", std::to_string(targets.size())));
          return;
        }
        auto stream = std::make_shared<ThumbnailStream>(drive->tools(), targets.size());
        (*timed)(std::make_shared<BatchStream>(stream), nullptr);
        begin(*drive, targets, size, stream);
      });
}

}  // namespace skein
