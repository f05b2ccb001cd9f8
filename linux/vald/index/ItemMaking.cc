#include "linux/vald/index/ItemMaking.h"

#include "linux/vald/index/ContentTypes.h"

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

}  // namespace

VLQueryItemPtr makeItem(const ItemRow& row, const ItemHolder& holder,
                        std::optional<std::uint64_t> children) {
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
