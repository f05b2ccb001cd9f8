#pragma once

#include <cstddef>
#include <memory>
#include <unordered_set>
#include <utility>

namespace skein {

// A set of objects, told apart by identity and held strongly. Not synchronised.
template <class Object>
class NSHashTable {
 public:
  // hashTableWithOptions: of options 0, the only ones there are here.
  NSHashTable() = default;

  // Adding what is in it, and removing what is not, does nothing.
  void addObject(std::shared_ptr<Object> object) { _objects.insert(std::move(object)); }
  void removeObject(const std::shared_ptr<Object>& object) { _objects.erase(object); }

 private:
  std::unordered_set<std::shared_ptr<Object>> _objects;
};

}  // namespace skein
