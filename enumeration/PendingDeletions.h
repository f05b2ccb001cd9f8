#pragma once

#include <list>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "vellum/VLFileObjectID.h"

namespace skein {

// The deletions that wait for the next batch, in the order they came. An item deleted
// twice stands in it twice, and counts twice; taking an item out takes out all its
// entries, at a cost that does not depend on how many other entries there are.
class PendingDeletions {
 public:
  void append(const VLFileObjectID& id) { _places.emplace(id, _order.insert(_order.end(), id)); }

  void removeEvery(const VLFileObjectID& id) {
    const auto [first, last] = _places.equal_range(id);
    for (auto place = first; place != last; ++place) _order.erase(place->second);
    _places.erase(first, last);
  }

  bool empty() const { return _order.empty(); }
  std::size_t count() const { return _order.size(); }
  void clear() {
    _places.clear();
    _order.clear();
  }

  // The identifiers' strings, in order.
  std::vector<std::string> strings() const {
    std::vector<std::string> strings;
    strings.reserve(_order.size());
    for (const VLFileObjectID& id : _order) strings.push_back(id.asString());
    return strings;
  }

 private:
  std::list<VLFileObjectID> _order;
  std::unordered_multimap<VLFileObjectID, std::list<VLFileObjectID>::iterator> _places;
};

}  // namespace skein
