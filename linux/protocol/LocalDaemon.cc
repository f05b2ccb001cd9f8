#include "linux/protocol/LocalDaemon.h"

#include <utility>

namespace skein {

void LocalDaemon::checkIfItemIsShareableWithInode(std::uint64_t inode,
                                                  Reply<bool, NSErrorPtr> reply) {
  shares().isShareable(VLFileObjectID::folderOrAliasWithRawID(inode), std::move(reply));
}

void LocalDaemon::refreshSharingStateForItemIdentifier(
    const NSFileProviderItemIdentifier& identifier, Reply<NSErrorPtr> reply) {
  shares().refreshSharingState(identifier, std::move(reply));
}

void LocalDaemon::getShareOptionsOfItemIdentifier(
    const NSFileProviderItemIdentifier& identifier,
    Reply<std::int64_t, std::int64_t, std::int64_t, std::optional<std::string>, NSErrorPtr> reply) {
  shares().shareOptions(identifier,
                        [reply = std::move(reply)](ShareOptions options, NSErrorPtr error) mutable {
                          reply(options.flags, options.publicPermission, options.ownFlags,
                                std::move(options.sharedFolder), std::move(error));
                        });
}

void LocalDaemon::resolveFileObjectIDsToContentRecordIDs(
    const std::vector<VLFileObjectID>& fileObjectIDs,
    Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) {
  records().resolveFileObjectIDsToContentRecordIDs(fileObjectIDs, std::move(reply));
}

}  // namespace skein
