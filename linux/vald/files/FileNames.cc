#include "linux/vald/files/FileNames.h"

#include <algorithm>
#include <cerrno>

#include "linux/vald/files/FileErrors.h"

namespace skein::vald {
namespace {

// Where the extension begins, its dot included; the length when there is none.
std::size_t extensionOf(const std::string& name) {
  const std::size_t dot = name.rfind('.');
  if (dot == std::string::npos || dot == 0 || dot + 1 == name.size()) return name.size();
  constexpr const char* kOuter[] = {".gz", ".bz2", ".xz", ".zst", ".lz", ".Z"};
  const bool compressed = std::any_of(std::begin(kOuter), std::end(kOuter),
                                      [&](const char* end) { return name.substr(dot) == end; });
  if (compressed && dot > 4 && name.compare(dot - 4, 4, ".tar") == 0) return dot - 4;
  // A long tail after a dot is a sentence, not an extension.
  return name.size() - dot > 16 ? name.size() : dot;
}

}  // namespace

std::string trashFolderName(uid_t user) { return ".Trash-" + std::to_string(user); }

NSErrorPtr refusalOfName(const std::string& name, bool atStoreRoot) {
  std::string why;
  if (name.empty()) {
    why = "a name must not be empty";
  } else if (name == "." || name == "..") {
    why = "\"" + name + "\" means a folder and is no name";
  } else if (name.find('/') != std::string::npos) {
    why = "a name must not contain \"/\"";
  } else if (name.find('\0') != std::string::npos) {
    why = "a name must not contain a NUL byte";
  } else if (name.size() > kLongestName) {
    why = "a name has at most 255 bytes; this one has " + std::to_string(name.size());
  } else if (const char* use = useOfReservedName(name)) {
    why = std::string("it ") + use;
  } else if (atStoreRoot && isTrashName(name)) {
    why = "it belongs to the trash";
  } else {
    return nullptr;
  }
  return fileErrorWithWords(NSFileWriteInvalidFileNameError, EINVAL,
                            "can't use the name \"" + printable(name) + "\": " + why, {});
}

std::string numberedName(const std::string& name, unsigned number, char separator,
                         std::size_t room) {
  const std::size_t dot = extensionOf(name);
  const std::string tail =
      (number > 1 ? separator + std::to_string(number) : std::string()) + name.substr(dot);
  std::string stem = name.substr(0, dot);
  const std::size_t most = kLongestName - room - tail.size();
  if (stem.size() > most) {
    std::size_t end = most;
    while (end > 1 && (static_cast<unsigned char>(stem[end]) >> 6) == 2) --end;
    stem.resize(end);
  }
  return stem + tail;
}

std::vector<std::string> pathComponents(const std::string& path) {
  std::vector<std::string> components;
  for (std::size_t at = 0; at < path.size();) {
    const std::size_t end = std::min(path.find('/', at), path.size());
    if (end > at) components.push_back(path.substr(at, end - at));
    at = end + 1;
  }
  return components;
}

std::string parentOfPath(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? std::string() : path.substr(0, slash);
}

std::string nameOfPath(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? path : path.substr(slash + 1);
}

std::string joinPath(const std::string& folder, const std::string& name) {
  if (folder.empty()) return name;
  return folder.back() == '/' ? folder + name : folder + '/' + name;
}

bool isAtOrBelow(const std::string& path, const std::string& folder) {
  if (!path.starts_with(folder)) return false;
  return path.size() == folder.size() || folder.empty() || folder.back() == '/' ||
         path[folder.size()] == '/';
}

}  // namespace skein::vald
