#include "linux/vald/index/ItemMaking.h"

#include "linux/vald/files/TagAttributes.h"
#include "linux/vald/index/ContentTypes.h"
#include "platform/fileprovider/FPTags.h"

namespace skein::vald {
namespace {

constexpr std::uint64_t kRootCapabilities =
    NSFileProviderItemCapabilitiesAllowsReading | NSFileProviderItemCapabilitiesAllowsWriting;
constexpr std::uint64_t kItemCapabilities =
    kRootCapabilities | NSFileProviderItemCapabilitiesAllowsReparenting |
    NSFileProviderItemCapabilitiesAllowsRenaming | NSFileProviderItemCapabilitiesAllowsTrashing |
    NSFileProviderItemCapabilitiesAllowsDeleting;

NSDate date(std::int64_t nanoseconds) { return NSDate(std::chrono::nanoseconds(nanoseconds)); }

std::string identifierOf(const ItemHolder& holder) {
  return holder.isDrive ? NSFileProviderRootContainerItemIdentifier : holder.id.asString();
}

void setState(VLQueryItem::Properties& properties, const FileState& state) {
  properties.kind = state.kind;
  properties.size = state.kind == ItemKind::Folder ? 0 : state.size;
  properties.contentModificationDate = date(state.modified);
  if (state.key.born != 0) properties.creationDate = date(state.key.born);
}

void setDetails(VLQueryItem::Properties& properties, const ItemDetails& details) {
  if (details.created) properties.creationDate = date(*details.created);
  if (details.used) properties.lastUsedDate = date(*details.used);
  properties.favoriteRank = details.favorite;
  if (details.tags.empty()) return;
  std::vector<FPTag> tags;
  for (std::string& name : splitTags(details.tags)) tags.push_back({std::move(name)});
  properties.tagData = FPGetTagsDataFromTags(tags);
}

}  // namespace

VLQueryItemPtr makeItem(const ItemRow& row, const ItemHolder& holder,
                        std::optional<std::uint64_t> children, const ItemDetails& details) {
  VLQueryItem::Properties properties;
  properties.fileObjectID = row.id;
  properties.itemIdentifier = row.id.asString();
  properties.parentItemIdentifier = identifierOf(holder);
  properties.filename = row.name;
  properties.typeIdentifier = ContentTypes::shared().typeForName(row.name, row.state.kind);
  properties.capabilities = row.containerID ? kRootCapabilities : kItemCapabilities;
  properties.containerID = row.containerID;
  properties.childItemCount = children;
  setState(properties, row.state);
  properties.isTrashed = holder.isTrashed;
  properties.isUploaded = row.isUploaded || row.state.isEvicted;
  properties.isDownloaded = !row.state.isEvicted;
  setDetails(properties, details);
  return std::make_shared<const VLQueryItem>(std::move(properties));
}

VLQueryItemPtr makeTrashItem(VLFileObjectID id, const ItemHolder& holder,
                             std::optional<std::uint64_t> children) {
  VLQueryItem::Properties properties;
  properties.fileObjectID = id;
  properties.itemIdentifier = id.asString();
  properties.parentItemIdentifier = identifierOf(holder);
  properties.filename = "Trash";
  properties.typeIdentifier = ContentTypes::shared().typeForName("Trash", ItemKind::Folder);
  properties.kind = ItemKind::Folder;
  properties.capabilities = NSFileProviderItemCapabilitiesAllowsReading;
  properties.childItemCount = children;
  properties.isTrashed = true;
  return std::make_shared<const VLQueryItem>(std::move(properties));
}

VLQueryItemPtr makeDriveItem(VLFileObjectID id, const std::string& name, const FileState& state,
                             std::optional<std::uint64_t> children) {
  VLQueryItem::Properties properties;
  properties.fileObjectID = id;
  properties.itemIdentifier = NSFileProviderRootContainerItemIdentifier;
  properties.parentItemIdentifier = NSFileProviderRootContainerItemIdentifier;
  properties.filename = name;
  properties.typeIdentifier = ContentTypes::shared().typeForName(name, ItemKind::Folder);
  properties.capabilities = kRootCapabilities;
  properties.childItemCount = children;
  setState(properties, state);
  return std::make_shared<const VLQueryItem>(std::move(properties));
}

VLQueryItemPtr makeDeadItem(VLFileObjectID id, ItemKind kind, const ItemHolder& holder) {
  VLQueryItem::Properties properties;
  properties.fileObjectID = id;
  properties.itemIdentifier = id.asString();
  properties.parentItemIdentifier = identifierOf(holder);
  properties.kind = kind;
  properties.isDead = true;
  return std::make_shared<const VLQueryItem>(std::move(properties));
}

}  // namespace skein::vald
