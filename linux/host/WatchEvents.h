#pragma once

#include <cstddef>
#include <cstdint>
#include <list>
#include <string>
#include <unordered_map>
#include <vector>

#include "linux/protocol/HostService.h"
#include "platform/fileprovider/NSFileProviderItem.h"

namespace skein {

// What a watch remembers of an item, to tell what changed when it has to list afresh: its
// name, and a digest of everything else that a consumer is shown.
struct KnownItem {
  std::string filename;
  std::uint64_t digest = 0;

  static KnownItem of(const NSFileProviderItem& item);
  friend bool operator==(const KnownItem&, const KnownItem&) = default;
};
using KnownItems = std::unordered_map<NSFileProviderItemIdentifier, KnownItem>;

// The changes that one consumer has yet to take, at most one per item: what happened since
// the consumer last heard of it. So a slow consumer costs no more than the container's own
// size: an item that came and went unseen leaves nothing behind. Not synchronised.
class WatchEvents {
 public:
  void add(HostChange change);
  // The oldest changes, `limit` of them or as many as one answer holds.
  std::vector<HostChange> take(std::size_t limit);
  bool empty() const { return _changes.empty(); }

 private:
  std::list<HostChange> _changes;  // the oldest first
  std::unordered_map<NSFileProviderItemIdentifier, std::list<HostChange>::iterator> _places;
};

}  // namespace skein
