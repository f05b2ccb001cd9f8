#pragma once

#include <optional>
#include <string>
#include <vector>

namespace skein::vald {

// A container that an installed app's desktop entry claims.
struct AppContainer {
  std::string containerID;
  std::string displayName;
  std::optional<std::string> icon;  // a name in the icon theme, or an absolute path

  friend bool operator==(const AppContainer&, const AppContainer&) = default;
};

// Whether `id` may name a container, and thereby a folder: 1 to 128 printable bytes, no
// separator, no leading dot, and none of the drive's own containers.
bool isAppContainerID(const std::string& id);

// $XDG_DATA_HOME/applications and $XDG_DATA_DIRS/applications, in order of precedence.
std::vector<std::string> applicationFolders();

// The containers that the entries in `folders` claim with X-Skein-Containers=ID;ID;... An
// entry hides those of the same name in later folders; the first entry that claims a
// container names it. Sorted by identifier. No two have the same display name. Entries
// that cannot be read are passed over, as the desktop does.
std::vector<AppContainer> appContainersInFolders(const std::vector<std::string>& folders);

}  // namespace skein::vald
