#pragma once

#include <cstdint>
#include <list>
#include <map>
#include <optional>
#include <string>
#include <tuple>

#include "base/Mutex.h"
#include "linux/vald/Store.h"
#include "linux/vald/index/Rows.h"

namespace skein::vald {

// The last item of a page: the next one starts after it.
struct ListingPlace {
  std::int64_t age = 0;  // for listings by date
  std::string name;
  // Of several items with one name. Not the rank: that changes with the item, which would
  // then come once more.
  std::uint64_t rawID = 0;

  friend auto operator<=>(const ListingPlace&, const ListingPlace&) = default;
};

// Where listings that are under way go on, by folder, order and offset. Whatever comes and
// goes in the folder meanwhile, a listing goes on after the item that it ended with, so that
// no other is lost or doubled; and a page costs the same at any offset.
//
// An offset is the index of its page's first item. Two listings that read the folder before
// and after a change reach the same index after different items: then the later one is told
// apart by a number in the offset's upper half, which it keeps. Any thread.
class ListingPlaces {
 public:
  // The index in an offset.
  static std::uint64_t index(std::uint64_t offset) { return offset & 0xffffffffU; }

  // The offset at which the listing goes on that read `items` from offset `from` on, up to
  // and with `place`.
  std::uint64_t remember(FolderKey folder, SortOrder order, std::uint64_t from, std::uint64_t items,
                         ListingPlace place) SKEIN_EXCLUDES(_mutex);
  // Nil for an offset that no listing led to, or that was forgotten.
  std::optional<ListingPlace> find(FolderKey folder, SortOrder order, std::uint64_t offset)
      SKEIN_EXCLUDES(_mutex);

 private:
  using Key = std::tuple<FolderKey, SortOrder, std::uint64_t>;
  struct Entry {
    ListingPlace place;
    bool isUsed = false;
    std::list<Key>::iterator turn;
  };
  // Puts an entry's turn last among those of its kind.
  void queue(Entry& entry, bool isUsed) SKEIN_REQUIRES(_mutex);

  Mutex _mutex;
  std::map<Key, Entry> _entries SKEIN_GUARDED_BY(_mutex);
  // In the order in which they are forgotten: those from which a listing went on, which may
  // be asked for again, before those at which one still waits.
  std::list<Key> _used SKEIN_GUARDED_BY(_mutex);
  std::list<Key> _waiting SKEIN_GUARDED_BY(_mutex);
  std::uint32_t _apart SKEIN_GUARDED_BY(_mutex) = 0;  // listings that were told apart
};

}  // namespace skein::vald
