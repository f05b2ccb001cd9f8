#pragma once

#include <memory>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/Store.h"
#include "vellum/VLQueryItem.h"

namespace skein::vald {

// Which items have a share of their own, at a moment.
struct SharedIDs {
  std::unordered_set<VLFileObjectID> items;
  std::vector<VLFileObjectID> folders;  // those of the items that are folders
};

// The items that have a share of their own, as they are shown at the moment. Any thread.
class SharedItems {
 public:
  std::shared_ptr<const SharedIDs> now() const SKEIN_EXCLUDES(_mutex);
  void add(VLFileObjectID item) SKEIN_EXCLUDES(_mutex);
  void remove(VLFileObjectID item) SKEIN_EXCLUDES(_mutex);

 private:
  mutable Mutex _mutex;
  std::shared_ptr<const SharedIDs> _now SKEIN_GUARDED_BY(_mutex) = std::make_shared<SharedIDs>();
};

// Marks items as shared: those with a share, and what is below a folder with one. Looks up
// each folder once, so it is made for one answer and used by one thread.
class SharedMarks {
 public:
  SharedMarks(Store& store, std::shared_ptr<const SharedIDs> shared)
      : _store(store), _shared(std::move(shared)) {}

  // The item itself, unless it is shared.
  VLQueryItemPtr marked(const VLQueryItemPtr& item);
  void mark(std::vector<VLQueryItemPtr>& items);
  // Whether what is in this folder is covered by a share of the folder or of one above it.
  bool coversChildrenOf(const VLFileObjectID& folder);

 private:
  Store& _store;
  const std::shared_ptr<const SharedIDs> _shared;
  bool _hasPaths = false;
  std::vector<std::string> _paths;  // of the shared folders
  std::unordered_map<VLFileObjectID, bool> _known;
};

}  // namespace skein::vald
