#include "linux/vald/index/Rows.h"

namespace skein::vald {

ItemRow itemFromRow(SqliteStatement& statement) {
  ItemRow row;
  row.rank = statement.number(0);
  row.parent = statement.integer(1);
  row.name = statement.bytes(2);
  row.state.kind = static_cast<ItemKind>(statement.integer(4));
  row.id = idOfKind(row.state.kind, statement.number(3));
  row.state.key.inode = statement.number(5);
  row.state.key.generation = static_cast<std::uint32_t>(statement.integer(6));
  row.state.size = statement.number(7);
  row.state.modified = difference(0, statement.integer(8));
  row.state.changed = difference(row.state.modified, statement.integer(9));
  row.state.key.born = difference(row.state.modified, statement.integer(10));
  row.seen = statement.integer(11);
  row.folder = statement.integer(12);
  if (!statement.isNull(13)) row.containerID = statement.bytes(13);
  const std::int64_t flags = statement.integer(14);
  row.state.isEvicted = (flags & kIsEvicted) != 0;
  row.isUploaded = (flags & kIsUploaded) != 0;
  row.isSettled = (flags & kIsSettled) != 0;
  row.hasDetails = (flags & kHasDetails) != 0;
  return row;
}

std::int64_t flagsOf(const ItemRow& row) {
  return (row.state.isEvicted ? kIsEvicted : 0) | (row.isUploaded ? kIsUploaded : 0) |
         (row.isSettled ? kIsSettled : 0) | (row.hasDetails ? kHasDetails : 0);
}

ItemDetails detailsFromRow(SqliteStatement& statement, int column) {
  const auto optional = [&](int at) {
    return statement.isNull(at) ? std::nullopt : std::optional(statement.integer(at));
  };
  ItemDetails details;
  details.tags = statement.bytes(column);
  details.tagsAreOnFile = statement.integer(column + 1) != 0;
  details.created = optional(column + 2);
  details.used = optional(column + 3);
  details.favorite = optional(column + 4);
  return details;
}

}  // namespace skein::vald
