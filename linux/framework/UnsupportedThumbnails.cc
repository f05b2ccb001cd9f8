#include "linux/framework/UnsupportedThumbnails.h"

#include <utility>

namespace skein {
namespace {

NSErrorPtr notSupported(const std::string& what) {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFeatureUnsupportedError,
      {{NSLocalizedDescriptionKey, "This host does not offer " + what + "."}});
}

class Fetch final : public CKFetchRecordsOperation {
 public:
  void cancel() override {}
};

struct Container final : CKContainer, CKDatabase {
  CKDatabase& privateCloudDatabase() override { return *this; }
  CKDatabase& sharedCloudDatabase() override { return *this; }
  std::shared_ptr<CKFetchRecordsOperation> fetchRecordsOperation() override {
    return std::make_shared<Fetch>();
  }
  void addOperation(std::shared_ptr<CKFetchRecordsOperation> operation) override {
    operation->perRecordCompletionBlock = nullptr;
    std::exchange(operation->fetchRecordsCompletionBlock, nullptr)(notSupported("cloud records"));
  }
};

}  // namespace

std::shared_ptr<CKContainer> UnsupportedCloud::containerWithIdentifier(const std::string&) {
  return std::make_shared<Container>();
}

bool UnsupportedThumbnailTransfer::canMostRecentClientsGenerateThumbnailsForUTI(
    const std::optional<std::string>&) {
  return false;
}
std::int64_t UnsupportedThumbnailTransfer::minFileSizeForThumbnailTransfer() { return -1; }
void UnsupportedThumbnailTransfer::VLStartDownloadForItemsWithOptions(
    const std::vector<NSURLPtr>&, std::uint64_t, UniqueFunction<void(NSErrorPtr)> completion) {
  completion(notSupported("downloads"));
}

}  // namespace skein
