#include "vellum/VLDaemonConnection.h"

namespace skein {
namespace {

NSErrorPtr notOffered(const std::string& what) {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFeatureUnsupportedError,
      {{NSLocalizedDescriptionKey, "This vald offers no " + what + "."}});
}

}  // namespace

void VLDaemon::getContainerURLForID(
    const std::string& containerID, bool /*recreateDocumentsIfNeeded*/,
    Reply<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr> reply) {
  reply(nullptr, std::nullopt, false,
        notOffered("lookup of a container's folder (" + containerID + ")"));
}

void VLDaemon::checkIfItemIsShareableWithInode(std::uint64_t /*inode*/,
                                               Reply<bool, NSErrorPtr> reply) {
  reply(false, notOffered("sharing"));
}

void VLDaemon::refreshSharingStateForItemIdentifier(
    const NSFileProviderItemIdentifier& /*identifier*/, Reply<NSErrorPtr> reply) {
  reply(notOffered("sharing"));
}

void VLDaemon::getShareOptionsOfItemIdentifier(
    const NSFileProviderItemIdentifier& /*identifier*/,
    Reply<std::int64_t, std::int64_t, std::int64_t, std::optional<std::string>, NSErrorPtr> reply) {
  reply(0, 0, 0, std::nullopt, notOffered("sharing"));
}

void VLDaemon::resolveFileObjectIDsToContentRecordIDs(
    const std::vector<VLFileObjectID>& /*fileObjectIDs*/,
    Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) {
  reply(std::nullopt, notOffered("lookup of the cloud's records"));
}

}  // namespace skein
