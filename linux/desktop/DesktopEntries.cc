#include "linux/desktop/DesktopEntries.h"

#include <glib.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <set>
#include <system_error>
#include <utility>

#include "vellum/VLContainer.h"
#include "vellum/VLEntitlements.h"

namespace skein {
namespace {

namespace fs = std::filesystem;

constexpr char kGroup[] = G_KEY_FILE_DESKTOP_GROUP;
constexpr char kSuffix[] = ".desktop";
constexpr char kUndecoratedKey[] = "X-Skein-Undecorated";
// The entry's keys, and the entitlements that they stand for.
constexpr std::array<std::pair<const char*, const char*>, 4> kEntitlementKeys = {{
    {"X-Skein-Application-Identifier", VLApplicationIdentifierEntitlement},
    {"X-Skein-Services", VLSkeinServicesEntitlement},
    {"X-Skein-Containers", VLSkeinContainerIdentifiersEntitlement},
    {"X-Skein-Ubiquity-Containers", VLUbiquityContainerIdentifiersEntitlement},
}};
constexpr std::size_t kLongestID = 128;
// So that a name that is told apart by the container's identifier is one still.
constexpr std::size_t kLongestName = 255 - kLongestID - 3;
constexpr std::size_t kMostContainers = 1000;
constexpr std::uintmax_t kLargestEntry = 1 << 20;
constexpr int kDeepestFolder = 8;

using KeyFile = std::unique_ptr<GKeyFile, decltype(&g_key_file_unref)>;
using Text = std::unique_ptr<char, decltype(&g_free)>;
using Texts = std::unique_ptr<char*, decltype(&g_strfreev)>;

std::optional<std::string> localText(GKeyFile* file, const char* key) {
  const Text text(g_key_file_get_locale_string(file, kGroup, key, nullptr, nullptr), g_free);
  if (!text || *text == '\0') return std::nullopt;
  return std::string(text.get());
}

// The app of one entry; nil for one that is hidden or unreadable.
std::optional<InstalledApp> readEntry(const std::string& identifier, const fs::path& path) {
  std::error_code failure;
  if (!fs::is_regular_file(path, failure) || fs::file_size(path, failure) > kLargestEntry) {
    return std::nullopt;
  }
  const KeyFile file(g_key_file_new(), g_key_file_unref);
  if (!g_key_file_load_from_file(file.get(), path.c_str(), G_KEY_FILE_NONE, nullptr) ||
      g_key_file_get_boolean(file.get(), kGroup, G_KEY_FILE_DESKTOP_KEY_HIDDEN, nullptr)) {
    return std::nullopt;
  }
  InstalledApp app;
  app.identifier = identifier;
  app.name = localText(file.get(), G_KEY_FILE_DESKTOP_KEY_NAME).value_or("");
  app.icon = localText(file.get(), G_KEY_FILE_DESKTOP_KEY_ICON);
  app.isIconUndecorated =
      g_key_file_get_boolean(file.get(), kGroup, kUndecoratedKey, nullptr) != FALSE;
  app.entitlements[VLApplicationIdentifierEntitlement] = {identifier};
  for (const auto& [key, entitlement] : kEntitlementKeys) {
    const Texts values(g_key_file_get_string_list(file.get(), kGroup, key, nullptr, nullptr),
                       g_strfreev);
    if (!values) continue;
    std::vector<std::string>& claimed = app.entitlements[entitlement];
    claimed.clear();
    for (char** value = values.get(); *value != nullptr; ++value) claimed.emplace_back(*value);
  }
  return app;
}

// The entries below `folder`: the identifier of each and where it is.
std::map<std::string, fs::path> entriesInFolder(const std::string& folder) {
  std::map<std::string, fs::path> entries;
  std::error_code failure;
  fs::recursive_directory_iterator entry(folder, fs::directory_options::skip_permission_denied,
                                         failure);
  for (; !failure && entry != fs::recursive_directory_iterator(); entry.increment(failure)) {
    if (entry.depth() >= kDeepestFolder) entry.disable_recursion_pending();
    if (entry->path().extension() != kSuffix) continue;
    std::string name = entry->path().lexically_relative(folder).replace_extension().native();
    std::replace(name.begin(), name.end(), '/', '-');
    entries.emplace(std::move(name), entry->path());
  }
  return entries;
}

// A display name is a name in the drive's root: the identifier where the app's cannot be one.
std::string asFileName(std::string name, const std::string& containerID) {
  std::replace(name.begin(), name.end(), '/', '-');
  const bool isName = !name.empty() && name.front() != '.' && name.size() <= kLongestName;
  return isName ? name : containerID;
}

}  // namespace

bool isAppContainerID(const std::string& id) {
  const bool plain = std::all_of(id.begin(), id.end(), [](char c) {
    const auto byte = static_cast<unsigned char>(c);
    return byte > 0x20 && byte != 0x7F && byte != '/';
  });
  return plain && !id.empty() && id.size() <= kLongestID && id.front() != '.' &&
         id != VLUbiquitousDefaultContainerID && id != VLUbiquitousDocumentsContainerID &&
         id != VLUbiquitousDesktopContainerID;
}

std::vector<std::string> applicationFolders() {
  std::vector<std::string> folders{std::string(g_get_user_data_dir()) + "/applications"};
  for (const char* const* folder = g_get_system_data_dirs(); *folder != nullptr; ++folder) {
    folders.push_back(std::string(*folder) + "/applications");
  }
  return folders;
}

std::optional<InstalledApp> appInFolders(const std::vector<std::string>& folders,
                                         const std::string& identifier) {
  for (const std::string& folder : folders) {
    const auto entries = entriesInFolder(folder);
    const auto found = entries.find(identifier);
    if (found != entries.end()) return readEntry(identifier, found->second);
  }
  return std::nullopt;
}

std::vector<AppContainer> appContainersInFolders(const std::vector<std::string>& folders) {
  std::set<std::string> seenEntries;
  std::map<std::string, AppContainer> byID;
  for (const std::string& folder : folders) {
    for (const auto& [identifier, path] : entriesInFolder(folder)) {
      if (!seenEntries.insert(identifier).second) continue;
      const std::optional<InstalledApp> app = readEntry(identifier, path);
      if (!app) continue;
      for (const std::string& id : VLEntitledContainerIdentifiers(app->entitlements)) {
        if (isAppContainerID(id) && byID.size() < kMostContainers) {
          byID.try_emplace(
              id, AppContainer{id, asFileName(app->name, id), app->icon, app->isIconUndecorated});
        }
      }
    }
  }

  std::vector<AppContainer> containers;
  std::set<std::string> seenNames;
  for (auto& [id, container] : byID) {
    // Two apps of one name, or one app with two containers, are told apart, also where
    // another app has the very name that this makes.
    while (!seenNames.insert(container.displayName).second) {
      container.displayName += " (" + id + ")";
    }
    containers.push_back(std::move(container));
  }
  return containers;
}

}  // namespace skein
