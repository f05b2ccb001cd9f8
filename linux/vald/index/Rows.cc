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
  return row;
}

}  // namespace skein::vald
