#pragma once

#include <cstddef>
#include <unordered_map>
#include <vector>

#include "vellum/VLQueryItem.h"

namespace skein::vald {

// What one watch has yet to push: the latest state of each item, in the order in which
// the items first changed. Not synchronised.
class PendingItems {
 public:
  // A later state of an item replaces the earlier one in its place.
  void add(VLQueryItemPtr item);

  // Takes the oldest items out, `limit` of them or as many as one message holds.
  VLQueryItems take(std::size_t limit);

  // How many items wait.
  std::size_t size() const { return _placeByID.size(); }
  bool empty() const { return _placeByID.empty(); }
  void clear();

 private:
  VLQueryItems _items;  // those before _taken are gone
  std::size_t _taken = 0;
  std::unordered_map<VLFileObjectID, std::size_t> _placeByID;
};

}  // namespace skein::vald
