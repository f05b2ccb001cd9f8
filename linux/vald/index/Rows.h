#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "linux/vald/index/FileState.h"
#include "linux/vald/index/Sqlite.h"
#include "vellum/VLFileObjectID.h"

namespace skein::vald {

// The index's own short number of a folder: what rows name their parent by. It is never
// used again while the index lives.
using FolderKey = std::int64_t;
inline constexpr FolderKey kNoFolder = 0;
inline constexpr FolderKey kDriveFolder = 1;

// One item as the index keeps it. Its rank is also the row's key.
struct ItemRow {
  std::uint64_t rank = 0;
  FolderKey parent = kNoFolder;
  std::string name;
  VLFileObjectID id = VLFileObjectID::documentWithRawID(0);
  FileState state;
  std::int64_t seen = 0;         // milliseconds since 1970 when it came; 0: it was always there
  FolderKey folder = kNoFolder;  // its own key, for a folder
  std::optional<std::string> containerID;
  // The cloud has the contents; and had them when the file last looked as it does now. An
  // evicted document is both.
  bool isUploaded = false;
  bool isSettled = false;
  bool hasDetails = false;  // there is an ItemDetails of it
};

// What few items have, kept by identifier: so it stays with the item wherever the item
// goes, and is there again when the item comes back.
struct ItemDetails {
  std::string tags;                      // as "user.xdg.tags" has them: commas between
  bool tagsAreOnFile = false;            // else the index alone has them
  std::optional<std::int64_t> created;   // nanoseconds since 1970, before it was ever evicted
  std::optional<std::int64_t> used;      // nanoseconds since 1970
  std::optional<std::int64_t> favorite;  // rank

  bool isEmpty() const { return *this == ItemDetails(); }
  friend bool operator==(const ItemDetails&, const ItemDetails&) = default;
};

// What is left of an item that is gone.
struct Tombstone {
  std::uint64_t rank = 0;
  VLFileObjectID id = VLFileObjectID::documentWithRawID(0);
  VLFileObjectID folder = VLFileObjectID::folderOrAliasWithRawID(0);  // that held it
  FolderKey parent = kNoFolder;
  std::string name;
  ItemKind kind = ItemKind::Document;
  FileKey key;
  std::int64_t died = 0;  // milliseconds since 1970
};

inline VLFileObjectID idOfKind(ItemKind kind, std::uint64_t rawID) {
  return kind == ItemKind::Document ? VLFileObjectID::documentWithRawID(rawID)
                                    : VLFileObjectID::folderOrAliasWithRawID(rawID);
}

// The columns that itemFromRow reads, in its order.
#define SKEIN_ITEM_COLUMNS                                                                 \
  "item.rank, item.parent, item.name, item.id, item.kind, item.inode, item.generation, "   \
  "item.size, item.age, item.changed, item.born, item.seen, item.folder, item.container, " \
  "item.flags"
inline constexpr int kItemColumns = 15;

// The bits of `flags`.
inline constexpr std::int64_t kIsEvicted = 1;
inline constexpr std::int64_t kIsUploaded = 2;
inline constexpr std::int64_t kIsSettled = 4;
inline constexpr std::int64_t kHasDetails = 8;
std::int64_t flagsOf(const ItemRow& row);

// The columns that detailsFromRow reads, from `column` on.
#define SKEIN_DETAIL_COLUMNS \
  "detail.tags, detail.on_file, detail.created, detail.used, detail.favorite"
ItemDetails detailsFromRow(SqliteStatement& statement, int column);

ItemRow itemFromRow(SqliteStatement& statement);

// The setting that names the trash folder of a root.
inline std::string trashSetting(FolderKey root) { return "trash " + std::to_string(root); }

// Times are kept by their distance from the modification date, and that date negated, so
// that rising order is newest first. Wraps around rather than overflow.
inline std::int64_t difference(std::int64_t a, std::int64_t b) {
  return static_cast<std::int64_t>(static_cast<std::uint64_t>(a) - static_cast<std::uint64_t>(b));
}

}  // namespace skein::vald
