#include "linux/vald/index/ContentTypes.h"

#include <fnmatch.h>
#include <gio/gio.h>

#include <algorithm>
#include <fstream>

namespace skein::vald {
namespace {

constexpr std::size_t kMostExtensions = 4096;

std::string guess(const std::string& name) {
  char* type = g_content_type_guess(name.c_str(), nullptr, 0, nullptr);
  char* mime = type != nullptr ? g_content_type_get_mime_type(type) : nullptr;
  std::string result = mime != nullptr ? mime : "application/octet-stream";
  g_free(mime);
  g_free(type);
  return result;
}

std::string lowerCase(std::string_view text) {
  std::string result(text);
  std::transform(result.begin(), result.end(), result.begin(),
                 [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; });
  return result;
}

}  // namespace

ContentTypes& ContentTypes::shared() {
  static ContentTypes types;
  return types;
}

// The rules that go by more than an extension are few; names that they may concern are
// not answered from the cache. A line of the file: "weight:type:pattern[:flags]".
ContentTypes::ContentTypes() {
  std::vector<std::string> folders{g_get_user_data_dir()};
  for (const char* const* folder = g_get_system_data_dirs(); *folder != nullptr; ++folder) {
    folders.emplace_back(*folder);
  }
  for (const std::string& folder : folders) {
    std::ifstream file(folder + "/mime/globs2");
    for (std::string line; std::getline(file, line);) {
      const std::size_t type = line.find(':');
      const std::size_t start = type == std::string::npos ? type : line.find(':', type + 1);
      if (line.starts_with('#') || start == std::string::npos) continue;
      std::string glob = line.substr(start + 1, line.find(':', start + 1) - start - 1);
      glob = lowerCase(glob);
      if (glob.find_first_of("*?[") == std::string::npos) {
        _literals.insert(std::move(glob));
      } else if (!glob.starts_with("*.") || glob.find_first_of("*?[", 1) != std::string::npos) {
        _patterns.push_back(std::move(glob));
      }
    }
  }
}

bool ContentTypes::hasRuleOfItsOwn(std::string_view lowerName) const {
  const std::string name(lowerName);
  if (_literals.contains(name)) return true;
  return std::any_of(_patterns.begin(), _patterns.end(), [&](const std::string& pattern) {
    // Most patterns begin with a letter: comparing that first is cheaper than matching.
    const char first = pattern[0];
    if (first != '*' && first != '[' && first != '?' && !name.starts_with(first)) return false;
    return fnmatch(pattern.c_str(), name.c_str(), 0) == 0;
  });
}

std::string ContentTypes::typeForName(const std::string& name, ItemKind kind) {
  if (kind == ItemKind::Folder) return "inode/directory";
  if (kind == ItemKind::Alias) return "inode/symlink";
  // The case counts: "*.C" is not "*.c".
  const std::size_t dot = name.find('.', 1);
  const std::string extension = dot == std::string::npos ? std::string() : name.substr(dot);
  if (extension.size() > 32 || hasRuleOfItsOwn(lowerCase(name))) return guess(name);
  {
    MutexLock lock(_mutex);
    const auto known = _typeByExtension.find(extension);
    if (known != _typeByExtension.end()) return known->second;
  }
  std::string type = guess("x" + extension);
  MutexLock lock(_mutex);
  if (_typeByExtension.size() >= kMostExtensions) _typeByExtension.clear();
  _typeByExtension.emplace(extension, type);
  return type;
}

}  // namespace skein::vald
