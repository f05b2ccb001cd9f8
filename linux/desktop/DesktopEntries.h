// The installed apps, as their desktop entries tell of them.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/launchservices/LSBundleProxy.h"

namespace skein {

// An installed app. Its identifier is what the desktop knows it by: its entry's path below
// the folder of entries, with a dash for each separator, without ".desktop".
struct InstalledApp {
  std::string identifier;
  std::string name;                 // in the user's language
  std::optional<std::string> icon;  // a name in the icon theme, or an absolute path
  bool isIconUndecorated = false;   // X-Skein-Undecorated=: shown without a folder around it
  // What the entry claims of the drive, by the entitlement's key:
  //   X-Skein-Application-Identifier=ID   or else the app's identifier
  //   X-Skein-Services=SkeinDocuments;...
  //   X-Skein-Containers=ID;...           by the app's own preference
  //   X-Skein-Ubiquity-Containers=ID;...
  LSBundleProxy::EntitlementValues entitlements;
};

// A container that an installed app's desktop entry claims.
struct AppContainer {
  std::string containerID;
  std::string displayName;
  std::optional<std::string> icon;  // both as an app's
  bool isIconUndecorated = false;

  friend bool operator==(const AppContainer&, const AppContainer&) = default;
};

// Whether `id` may name a container, and thereby a folder: 1 to 128 printable bytes, no
// separator, no leading dot, and none of the drive's own containers.
bool isAppContainerID(const std::string& id);

// $XDG_DATA_HOME/applications and $XDG_DATA_DIRS/applications, in order of precedence.
std::vector<std::string> applicationFolders();

// The app of that identifier; an entry hides those of the same name in later folders. Nil
// when there is none, or its entry is hidden or cannot be read.
std::optional<InstalledApp> appInFolders(const std::vector<std::string>& folders,
                                         const std::string& identifier);

// The containers that the entries in `folders` are entitled to. The first entry that claims
// a container names it. Sorted by identifier. No two have the same display name. Entries
// that cannot be read are passed over, as the desktop does.
std::vector<AppContainer> appContainersInFolders(const std::vector<std::string>& folders);

}  // namespace skein
