#include "linux/vald/index/ListingPlaces.h"

namespace skein::vald {
namespace {

// Some thousand pages of listings at once; a place costs about 300 bytes.
constexpr std::size_t kMostPlaces = 8192;

}  // namespace

std::uint64_t ListingPlaces::remember(FolderKey folder, SortOrder order, std::uint64_t from,
                                      std::uint64_t items, ListingPlace place) {
  MutexLock lock(_mutex);
  Key key{folder, order, from + items};
  auto found = _entries.find(key);
  if (found != _entries.end() && found->second.place != place) {
    std::get<2>(key) = (std::uint64_t{++_apart} << 32) + index(from) + items;
    found = _entries.find(key);
  }
  if (found == _entries.end()) {
    if (_entries.size() >= kMostPlaces) {
      std::list<Key>& oldest = _used.empty() ? _waiting : _used;
      _entries.erase(oldest.front());
      oldest.pop_front();
    }
    found = _entries.emplace(key, Entry{{}, false, _waiting.insert(_waiting.end(), key)}).first;
  }
  found->second.place = std::move(place);
  queue(found->second, false);
  return std::get<2>(key);
}

std::optional<ListingPlace> ListingPlaces::find(FolderKey folder, SortOrder order,
                                                std::uint64_t offset) {
  MutexLock lock(_mutex);
  const auto found = _entries.find({folder, order, offset});
  if (found == _entries.end()) return std::nullopt;
  queue(found->second, true);
  return found->second.place;
}

void ListingPlaces::queue(Entry& entry, bool isUsed) {
  std::list<Key>& to = isUsed ? _used : _waiting;
  to.splice(to.end(), entry.isUsed ? _used : _waiting, entry.turn);
  entry.isUsed = isUsed;
}

}  // namespace skein::vald
