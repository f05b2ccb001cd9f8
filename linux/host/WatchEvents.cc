#include "linux/host/WatchEvents.h"

#include <functional>
#include <string_view>
#include <utility>

#include "linux/protocol/AnswerRoom.h"

namespace skein {
namespace {

void mix(std::uint64_t& digest, std::uint64_t value) {
  digest ^= value + 0x9e3779b97f4a7c15ULL + (digest << 6) + (digest >> 2);
  digest *= 0xff51afd7ed558ccdULL;
  digest ^= digest >> 33;
}

void mix(std::uint64_t& digest, std::string_view text) {
  mix(digest, std::hash<std::string_view>()(text));
}

std::size_t bytesOf(const HostChange& change) {
  return change.filename.size() + change.previousFilename.value_or("").size() +
         skein::bytesOf(change.item);
}

template <class T>
void mixOptional(std::uint64_t& digest, const std::optional<T>& value) {
  mix(digest, value ? 1U : 0U);
  if (!value) return;
  if constexpr (std::is_same_v<T, NSDate>) {
    mix(digest, static_cast<std::uint64_t>(value->time_since_epoch().count()));
  } else if constexpr (std::is_same_v<T, NSData>) {
    mix(digest, value->view());
  } else if constexpr (std::is_same_v<T, std::string>) {
    mix(digest, std::string_view(*value));
  } else {
    mix(digest, static_cast<std::uint64_t>(*value));
  }
}

}  // namespace

KnownItem KnownItem::of(const NSFileProviderItem& item) {
  std::uint64_t digest = 0;
  mix(digest, std::string_view(item.parentItemIdentifier()));
  mixOptional(digest, item.typeIdentifier());
  mix(digest, item.capabilities());
  mixOptional(digest, item.documentSize());
  mixOptional(digest, item.creationDate());
  mixOptional(digest, item.contentModificationDate());
  mixOptional(digest, item.lastUsedDate());
  mixOptional(digest, item.tagData());
  mixOptional(digest, item.favoriteRank());
  // The child count is left out: it is counted late, and a folder's date moves with it.
  mix(digest, (item.isFolder() ? 1U : 0U) | (item.isTrashed() ? 2U : 0U) |
                  (item.isUploaded() ? 4U : 0U) | (item.isDownloaded() ? 8U : 0U) |
                  (item.isShared() ? 16U : 0U));
  return {item.filename(), digest};
}

void WatchEvents::add(HostChange change) {
  const auto [place, isNew] = _places.try_emplace(change.identifier, _changes.end());
  if (isNew) {
    place->second = _changes.insert(_changes.end(), std::move(change));
    return;
  }
  HostChange& earlier = *place->second;
  using Kind = HostChange::Kind;
  if (change.kind == Kind::Deleted) {
    if (earlier.kind == Kind::Created) {
      _changes.erase(place->second);
      _places.erase(place);
      return;
    }
    // The name that the consumer knows.
    if (earlier.previousFilename) change.filename = *earlier.previousFilename;
    earlier = std::move(change);
    return;
  }
  // Deleted and then back is a change to who never heard of the deletion.
  if (earlier.kind == Kind::Deleted) {
    change.kind = Kind::Changed;
    if (earlier.filename != change.filename) change.previousFilename = earlier.filename;
  } else {
    change.kind = earlier.kind;
    change.previousFilename = earlier.previousFilename;
    if (earlier.kind == Kind::Changed && !earlier.previousFilename &&
        earlier.filename != change.filename) {
      change.previousFilename = earlier.filename;
    }
    if (change.previousFilename == change.filename) change.previousFilename.reset();
  }
  earlier = std::move(change);
}

std::vector<HostChange> WatchEvents::take(std::size_t limit) {
  std::vector<HostChange> taken;
  AnswerRoom room;
  while (!_changes.empty() && taken.size() < limit && room.take(bytesOf(_changes.front()))) {
    _places.erase(_changes.front().identifier);
    taken.push_back(std::move(_changes.front()));
    _changes.pop_front();
  }
  return taken;
}

}  // namespace skein
