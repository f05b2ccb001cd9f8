#pragma once

#include <set>
#include <string>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "platform/quicklook/QLThumbnailStoreRetrievalOperation.h"

namespace skein {

// What this desktop can draw thumbnails of: the content types of the .thumbnailer entries
// whose program is there, and their subtypes. An entry that comes or goes is noticed. Any
// thread; reads folders.
class InstalledThumbnailers final : public QLThumbnailStoreRetrievalOperation {
 public:
  // Entries of an earlier folder hide those of the same name in later ones.
  explicit InstalledThumbnailers(std::vector<std::string> folders) : _folders(std::move(folders)) {}
  // $XDG_DATA_HOME/thumbnailers and $XDG_DATA_DIRS/thumbnailers.
  static std::vector<std::string> installedFolders();

  bool canMostRecentClientsGenerateThumbnailsForUTI(
      const std::optional<std::string>& typeIdentifier) override SKEIN_EXCLUDES(_mutex);

 private:
  // When each folder's list of entries last changed.
  using State = std::vector<std::int64_t>;

  State state() const;
  std::set<std::string> readTypes() const;

  const std::vector<std::string> _folders;
  Mutex _mutex;
  State _state SKEIN_GUARDED_BY(_mutex);
  std::set<std::string> _types SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
