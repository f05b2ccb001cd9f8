#include "linux/protocol/DocumentURL.h"

#include <utility>

namespace skein {
namespace {

// Carries the identifier, since a URL itself knows nothing of the daemon's identifiers.
struct Deleter {
  VLFileObjectID fileObjectID;
  void operator()(NSURL* url) const { delete url; }
};

}  // namespace

NSURLPtr documentURL(std::string path, VLFileObjectID fileObjectID) {
  return {new NSURL(std::move(path)), Deleter{fileObjectID}};
}

std::optional<VLFileObjectID> fileObjectIDOfDocumentURL(const NSURLPtr& url) {
  const auto* deleter = std::get_deleter<Deleter>(url);
  return deleter != nullptr ? std::optional(deleter->fileObjectID) : std::nullopt;
}

}  // namespace skein
