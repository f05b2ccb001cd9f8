#pragma once

#include <optional>
#include <string>
#include <vector>

#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/files/StoreRoots.h"

namespace skein::vald {

// A document, or a folder or alias, by the path that people know, and by the file that stands
// for it.
struct DocumentPlace {
  std::string path;                      // as if it were present
  std::string physical;                  // its marker's while it is not
  std::optional<EvictionMarker> marker;  // nil: the file itself, or nothing, is there
  bool namedByMarker = false;            // what was asked for was the marker

  bool isEvicted() const { return marker.has_value(); }
};

// Finds the place of an absolute path, which may be the marker's. A path outside the roots,
// or of nothing, is its own place: whoever uses it meets the error. Looks at the disk.
DocumentPlace findDocument(const StoreRoots& roots, const std::string& path);

// The path that people know of one that an operation answered or noted. `roots` null: by the
// name alone, for what may be gone.
std::string documentPath(const StoreRoots* roots, const std::string& physical);

// Under which names beside an item called `name` the same item may stand: a document's
// marker, and a marker's document.
std::vector<std::string> otherNamesOfItem(const std::string& name);

}  // namespace skein::vald
