#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

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

// Where listings that are under way go on, by folder, order and offset, so that a page
// costs the same at any offset. A listing goes on at its place even when the folder
// changed since: an item that only shifted is thereby never skipped. Where several
// listings reached one offset, the earliest place is used: rather twice than never. Any
// thread.
class ListingPlaces {
 public:
  // `changes`: the folder's count of changes.
  void remember(FolderKey folder, SortOrder order, std::uint64_t offset, std::uint64_t changes,
                ListingPlace place) SKEIN_EXCLUDES(_mutex);
  std::optional<ListingPlace> find(FolderKey folder, SortOrder order, std::uint64_t offset,
                                   std::uint64_t changes) SKEIN_EXCLUDES(_mutex);

 private:
  using Instant = std::chrono::steady_clock::time_point;
  struct Entry {
    std::uint64_t changes;
    ListingPlace place;
    Instant when;
  };
  static std::string key(FolderKey folder, SortOrder order, std::uint64_t offset);

  Mutex _mutex;
  std::unordered_map<std::string, std::vector<Entry>> _entries SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
