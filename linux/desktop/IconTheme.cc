#include "linux/desktop/IconTheme.h"

#include <glib.h>

#include <algorithm>
#include <climits>
#include <filesystem>
#include <utility>

namespace skein {
namespace {

namespace fs = std::filesystem;

constexpr char kLastTheme[] = "hicolor";
constexpr std::size_t kMostThemes = 32;
constexpr const char* kSuffixes[] = {".png", ".svg"};

using KeyFile = std::unique_ptr<GKeyFile, decltype(&g_key_file_unref)>;
using Texts = std::unique_ptr<char*, decltype(&g_strfreev)>;

std::vector<std::string> list(GKeyFile* file, const char* group, const char* key) {
  std::vector<std::string> values;
  const Texts texts(g_key_file_get_string_list(file, group, key, nullptr, nullptr), g_strfreev);
  if (!texts) return values;
  for (char** text = texts.get(); *text != nullptr; ++text) values.emplace_back(*text);
  return values;
}

int number(GKeyFile* file, const std::string& group, const char* key, int otherwise) {
  GError* error = nullptr;
  const int value = g_key_file_get_integer(file, group.c_str(), key, &error);
  if (error == nullptr) return value;
  g_error_free(error);
  return otherwise;
}

// What an index says of one folder.
struct Sizes {
  int least = 0;
  int most = 0;
  int scale = 1;
};

Sizes sizesOf(GKeyFile* index, const std::string& folder) {
  const int size = number(index, folder, "Size", 0);
  const std::unique_ptr<char, decltype(&g_free)> type(
      g_key_file_get_string(index, folder.c_str(), "Type", nullptr), g_free);
  const std::string kind = type ? type.get() : "Threshold";
  const int scale = number(index, folder, "Scale", 1);
  if (kind == "Fixed") return {size, size, scale};
  if (kind == "Scalable") {
    return {number(index, folder, "MinSize", size), number(index, folder, "MaxSize", size), scale};
  }
  const int threshold = number(index, folder, "Threshold", 2);
  return {size - threshold, size + threshold, scale};
}

// The folders that apps' icons are usually in, where nobody says so.
std::vector<std::pair<std::string, Sizes>> usualFolders() {
  std::vector<std::pair<std::string, Sizes>> folders;
  for (const int size : {16, 22, 24, 32, 36, 48, 64, 72, 96, 128, 192, 256, 512}) {
    std::string folder = std::to_string(size);
    folder += "x" + folder + "/apps";
    folders.emplace_back(std::move(folder), Sizes{size - 2, size + 2, 1});
  }
  folders.push_back({"scalable/apps", {1, 512, 1}});
  return folders;
}

std::optional<std::string> iconIn(const std::string& folder, const std::string& name) {
  std::error_code ignored;
  for (const char* suffix : kSuffixes) {
    std::string path = folder;
    path.append("/").append(name).append(suffix);
    if (fs::is_regular_file(path, ignored)) return path;
  }
  return std::nullopt;
}

// The theme that the user's toolkit settings name; else the usual one. The desktop's own
// settings service is not asked: it would bring its modules and a connection to the session
// bus into this process.
std::string chosenTheme() {
  for (const char* toolkit : {"gtk-4.0", "gtk-3.0"}) {
    const std::string path = std::string(g_get_user_config_dir()) + '/' + toolkit + "/settings.ini";
    const KeyFile file(g_key_file_new(), g_key_file_unref);
    if (!g_key_file_load_from_file(file.get(), path.c_str(), G_KEY_FILE_NONE, nullptr)) continue;
    const std::unique_ptr<char, decltype(&g_free)> name(
        g_key_file_get_string(file.get(), "Settings", "gtk-icon-theme-name", nullptr), g_free);
    if (name) return name.get();
  }
  return "Adwaita";
}

}  // namespace

std::shared_ptr<const IconTheme> IconTheme::load(const std::string& name,
                                                 std::vector<std::string> baseFolders) {
  const std::shared_ptr<IconTheme> theme(new IconTheme());
  theme->_baseFolders = std::move(baseFolders);
  std::vector<std::string> seen;
  theme->add(name, seen);
  theme->add(kLastTheme, seen);
  return theme;
}

std::shared_ptr<const IconTheme> IconTheme::installed() {
  std::vector<std::string> folders{std::string(g_get_home_dir()) + "/.icons",
                                   std::string(g_get_user_data_dir()) + "/icons"};
  for (const char* const* folder = g_get_system_data_dirs(); *folder != nullptr; ++folder) {
    folders.push_back(std::string(*folder) + "/icons");
  }
  folders.emplace_back("/usr/share/pixmaps");
  return load(chosenTheme(), std::move(folders));
}

void IconTheme::add(const std::string& name, std::vector<std::string>& seen) {
  const bool isPlain = !name.empty() && name.find('/') == std::string::npos && name.front() != '.';
  if (!isPlain || seen.size() >= kMostThemes ||
      std::find(seen.begin(), seen.end(), name) != seen.end()) {
    return;
  }
  seen.push_back(name);

  // The first index that there is speaks for the theme's folders under every base.
  const KeyFile index(g_key_file_new(), g_key_file_unref);
  g_key_file_set_list_separator(index.get(), ',');
  const bool hasIndex =
      std::any_of(_baseFolders.begin(), _baseFolders.end(), [&](const std::string& base) {
        const std::string path = base + "/" + name + "/index.theme";
        return g_key_file_load_from_file(index.get(), path.c_str(), G_KEY_FILE_NONE, nullptr);
      });
  std::vector<std::pair<std::string, Sizes>> folders;
  if (hasIndex) {
    for (const char* key : {"Directories", "ScaledDirectories"}) {
      for (const std::string& folder : list(index.get(), "Icon Theme", key)) {
        folders.emplace_back(folder, sizesOf(index.get(), folder));
      }
    }
  } else if (name == kLastTheme) {
    folders = usualFolders();
  }

  Theme theme;
  for (const auto& [folder, sizes] : folders) {
    // Icons drawn for a screen of another density are not what is asked for.
    if (sizes.scale != 1) continue;
    for (const std::string& base : _baseFolders) {
      std::error_code ignored;
      Folder there{fs::path(base) / name / folder, sizes.least, sizes.most};
      if (fs::is_directory(there.path, ignored)) theme.push_back(std::move(there));
    }
  }
  if (!theme.empty()) _themes.push_back(std::move(theme));
  for (const std::string& parent : list(index.get(), "Icon Theme", "Inherits")) {
    if (parent != kLastTheme) add(parent, seen);
  }
}

std::optional<std::string> IconTheme::pathOfIcon(const std::string& icon, int side) const {
  if (icon.empty()) return std::nullopt;
  if (icon.front() == '/') {
    std::error_code ignored;
    const bool isKnown = std::any_of(std::begin(kSuffixes), std::end(kSuffixes),
                                     [&](const char* suffix) { return icon.ends_with(suffix); });
    return isKnown && fs::is_regular_file(icon, ignored) ? std::optional(icon) : std::nullopt;
  }
  if (icon.find('/') != std::string::npos) return std::nullopt;

  for (const Theme& theme : _themes) {
    std::optional<std::string> best;
    int bestDistance = INT_MAX;
    for (const Folder& folder : theme) {
      const int distance = folder.distanceTo(side);
      if (distance >= bestDistance) continue;
      if (auto path = iconIn(folder.path, icon)) {
        best = std::move(path);
        bestDistance = distance;
        if (distance == 0) break;
      }
    }
    if (best) return best;
  }
  // Outside every theme.
  for (const std::string& base : _baseFolders) {
    if (auto path = iconIn(base, icon)) return path;
  }
  return std::nullopt;
}

}  // namespace skein
