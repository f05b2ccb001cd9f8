#include "linux/vald/TrashListings.h"

#include <utility>

namespace skein::vald {
namespace {

constexpr std::size_t kMostListings = 16;

}  // namespace

TrashListings::Items TrashListings::find(const Place& place) {
  MutexLock lock(_mutex);
  const auto found = _listings.find(place.listing);
  return found == _listings.end() ? nullptr : found->second;
}

void TrashListings::begin(Items items, Place& place) {
  MutexLock lock(_mutex);
  place.listing = ++_last;
  _listings[place.listing] = std::move(items);
  if (_listings.size() > kMostListings) _listings.erase(_listings.begin());
}

void TrashListings::end(const Place& place) {
  MutexLock lock(_mutex);
  _listings.erase(place.listing);
}

}  // namespace skein::vald
