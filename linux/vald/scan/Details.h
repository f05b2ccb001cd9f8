#pragma once

#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "linux/vald/index/IndexWriter.h"
#include "linux/vald/scan/Disk.h"

namespace skein::vald {

// What items have beside what a folder tells of them: keeps the index's part equal to the
// attributes of the files. On the writer thread, inside a transaction.
//
// Attributes are read when a file was seen to have changed (that changes its time of
// change), and once for every file in the background after a first scan, which would take
// half as long again if it asked for them.
class Details {
 public:
  Details(IndexWriter& index, Disk& disk) : _index(index), _disk(disk) {}

  // Before the row, which stands at its place, is written. `isSameFile`: as which the index
  // knew the item. Tags that the file has are the item's; tags that it lost are gone, but
  // those of a file that was replaced stay, since programs that save often forget them. True
  // when something is different now.
  bool refresh(ItemRow& row, bool isSameFile);
  // Whether the file has attributes of its own at all: cheaper than asking for each.
  bool mayHaveAttributes(const ItemRow& row);
  // An item that takes up an identifier again.
  void recall(ItemRow& row) { row.hasDetails = !_index.details(row.id).isEmpty(); }
  // Writes details and the row's mark of them.
  void put(ItemRow& row, const ItemDetails& details);

  // The document that a new file says it is, by being its marker or by its hint (see
  // DocumentHint.h), unless that document lives as another file: then this one is a copy. The
  // hint of another file, as copies and restored files have it, counts too, but not while the
  // document's own file may yet be found: then `waits`, and the row's number is to be told to
  // wait() once it has one.
  std::optional<VLFileObjectID> hinted(const ItemRow& row, bool& waits);
  void wait(VLFileObjectID id) { _waiting.push_back(id); }
  // From now on hints of other files wait; and the end of it: what waited.
  void expectMore() { _expectsMore = true; }
  std::vector<VLFileObjectID> endExpecting() {
    _expectsMore = false;
    return std::exchange(_waiting, {});
  }

 private:
  enum class Read { Value, Absent, Unknown };
  // Empty when the folder cannot be reached.
  std::string pathOf(const ItemRow& row);
  Read read(const ItemRow& row, const char* attribute, std::string& value);

  IndexWriter& _index;
  Disk& _disk;
  bool _expectsMore = false;
  std::vector<VLFileObjectID> _waiting;
};

}  // namespace skein::vald
