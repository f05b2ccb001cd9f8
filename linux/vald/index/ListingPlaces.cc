#include "linux/vald/index/ListingPlaces.h"

#include <algorithm>

namespace skein::vald {
namespace {

// Some thousand pages of listings at once; a place costs about 200 bytes.
constexpr std::size_t kMostOffsets = 8192;
constexpr std::size_t kMostPlaces = 4;
constexpr auto kLifetime = std::chrono::seconds(60);

}  // namespace

std::string ListingPlaces::key(FolderKey folder, SortOrder order, std::uint64_t offset) {
  return std::to_string(folder) + (order == SortOrder::Name ? 'n' : 'd') + std::to_string(offset);
}

void ListingPlaces::remember(FolderKey folder, SortOrder order, std::uint64_t offset,
                             std::uint64_t changes, ListingPlace place) {
  const Instant now = std::chrono::steady_clock::now();
  MutexLock lock(_mutex);
  if (_entries.size() >= kMostOffsets) {
    std::erase_if(_entries,
                  [&](const auto& entry) { return now - entry.second.back().when > kLifetime; });
    if (_entries.size() >= kMostOffsets) _entries.clear();
  }
  auto& places = _entries[key(folder, order, offset)];
  std::erase_if(places, [&](const Entry& entry) {
    return entry.changes == changes || now - entry.when > kLifetime;
  });
  if (places.size() >= kMostPlaces) places.erase(places.begin());
  places.push_back({changes, std::move(place), now});
}

std::optional<ListingPlace> ListingPlaces::find(FolderKey folder, SortOrder order,
                                                std::uint64_t offset, std::uint64_t changes) {
  const Instant now = std::chrono::steady_clock::now();
  MutexLock lock(_mutex);
  const auto found = _entries.find(key(folder, order, offset));
  if (found == _entries.end()) return std::nullopt;
  const Entry* earliest = nullptr;
  for (const Entry& entry : found->second) {
    if (entry.changes != changes && now - entry.when > kLifetime) continue;
    if (earliest == nullptr || entry.place < earliest->place) earliest = &entry;
  }
  if (earliest == nullptr) return std::nullopt;
  return earliest->place;
}

}  // namespace skein::vald
