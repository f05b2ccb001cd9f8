#include "linux/desktop/InstalledThumbnailers.h"

#include <gio/gio.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <memory>

namespace skein {
namespace {

namespace fs = std::filesystem;

constexpr char kThumbnailerGroup[] = "Thumbnailer Entry";

using KeyFile = std::unique_ptr<GKeyFile, decltype(&g_key_file_unref)>;
using Text = std::unique_ptr<char, decltype(&g_free)>;
using Texts = std::unique_ptr<char*, decltype(&g_strfreev)>;

bool isThere(const char* program) {
  return Text(g_find_program_in_path(program), g_free) != nullptr;
}

// The types that one entry draws; none when its program is not installed.
std::vector<std::string> typesOf(const fs::path& entry) {
  std::vector<std::string> types;
  const KeyFile file(g_key_file_new(), g_key_file_unref);
  if (!g_key_file_load_from_file(file.get(), entry.c_str(), G_KEY_FILE_NONE, nullptr)) return types;
  const Text program(g_key_file_get_string(file.get(), kThumbnailerGroup, "TryExec", nullptr),
                     g_free);
  if (program && !isThere(program.get())) return types;
  const Texts names(
      g_key_file_get_string_list(file.get(), kThumbnailerGroup, "MimeType", nullptr, nullptr),
      g_strfreev);
  if (!names) return types;
  for (char** name = names.get(); *name != nullptr; ++name) types.emplace_back(*name);
  return types;
}

bool isA(const std::string& type, const std::string& drawn) {
  const Text content(g_content_type_from_mime_type(drawn.c_str()), g_free);
  return content && g_content_type_is_a(type.c_str(), content.get());
}

}  // namespace

std::vector<std::string> InstalledThumbnailers::installedFolders() {
  std::vector<std::string> folders{std::string(g_get_user_data_dir()) + "/thumbnailers"};
  for (const char* const* folder = g_get_system_data_dirs(); *folder != nullptr; ++folder) {
    folders.push_back(std::string(*folder) + "/thumbnailers");
  }
  return folders;
}

InstalledThumbnailers::State InstalledThumbnailers::state() const {
  State state;
  for (const std::string& folder : _folders) {
    struct stat status {};
    const bool stands = stat(folder.c_str(), &status) == 0;
    state.push_back(stands ? status.st_mtim.tv_sec * 1'000'000'000 + status.st_mtim.tv_nsec : -1);
  }
  return state;
}

std::set<std::string> InstalledThumbnailers::readTypes() const {
  std::set<std::string> types;
  std::set<std::string> seen;
  for (const std::string& folder : _folders) {
    std::error_code failure;
    for (fs::directory_iterator entry(folder, failure);
         !failure && entry != fs::directory_iterator(); entry.increment(failure)) {
      if (entry->path().extension() != ".thumbnailer") continue;
      if (!seen.insert(entry->path().filename().native()).second) continue;
      for (std::string& type : typesOf(entry->path())) types.insert(std::move(type));
    }
  }
  return types;
}

bool InstalledThumbnailers::canMostRecentClientsGenerateThumbnailsForUTI(
    const std::optional<std::string>& typeIdentifier) {
  if (!typeIdentifier) return false;
  State now = state();
  std::set<std::string> types;
  {
    MutexLock lock(_mutex);
    if (_state == now) types = _types;
  }
  if (types.empty()) {
    types = readTypes();
    MutexLock lock(_mutex);
    _types = types;
    _state = std::move(now);
  }
  if (types.contains(*typeIdentifier)) return true;
  return std::any_of(types.begin(), types.end(),
                     [&](const std::string& drawn) { return isA(*typeIdentifier, drawn); });
}

}  // namespace skein
