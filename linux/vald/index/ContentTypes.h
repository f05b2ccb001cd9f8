#pragma once

#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/index/FileState.h"

namespace skein::vald {

// MIME types from names, as the desktop's type database gives them; contents are never
// looked at. Any thread. One for the process: content types are a machine's.
class ContentTypes {
 public:
  static ContentTypes& shared();

  std::string typeForName(const std::string& name, ItemKind kind) SKEIN_EXCLUDES(_mutex);

 private:
  ContentTypes();

  // Whether the database has a rule for this very name, not just for its extension.
  bool hasRuleOfItsOwn(std::string_view lowerName) const;

  std::unordered_set<std::string> _literals;
  std::vector<std::string> _patterns;
  Mutex _mutex;
  std::unordered_map<std::string, std::string> _typeByExtension SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
