#pragma once

#include <optional>

#include "linux/vald/index/Rows.h"
#include "vellum/VLQueryItem.h"

namespace skein::vald {

// Where an item is: what the framework calls the folder that holds it. The drive's folder
// goes by the host's reserved name, for itself and for its children.
struct ItemHolder {
  VLFileObjectID id;
  bool isDrive = false;
  bool isTrashed = false;  // it is the trash, or lies in it
};

// The framework's item made of a row. `children`: of a folder that has been read.
VLQueryItemPtr makeItem(const ItemRow& row, const ItemHolder& holder,
                        std::optional<std::uint64_t> children, const ItemDetails& details);
// A root's trash, as what lies in it names its parent.
VLQueryItemPtr makeTrashItem(VLFileObjectID id, const ItemHolder& holder,
                             std::optional<std::uint64_t> children);
// The drive's own folder.
VLQueryItemPtr makeDriveItem(VLFileObjectID id, const std::string& name, const FileState& state,
                             std::optional<std::uint64_t> children);
// An item that is gone: its identifiers alone.
VLQueryItemPtr makeDeadItem(VLFileObjectID id, ItemKind kind, const ItemHolder& holder);

}  // namespace skein::vald
