#include "linux/vald/files/TagAttributes.h"

#include <sys/xattr.h>

#include <algorithm>
#include <cerrno>
#include <string_view>
#include <unordered_set>

#include "linux/vald/files/FileErrors.h"

namespace skein::vald {
namespace {

// EPERM is how links, devices and the like say that they have none.
bool saysUnsupported(int number) { return number == ENOTSUP || number == EPERM; }

TagResult failed(int number, const char* doing, const std::string& path) {
  if (saysUnsupported(number)) return {TagStorage::Unsupported, {}, nullptr};
  if (number == E2BIG || number == ERANGE || number == ENOSPC) {
    // A full disk says the same; both are cured by fewer or shorter tags.
    return {TagStorage::Failed,
            {},
            fileErrorWithWords(NSFileWriteOutOfSpaceError, number,
                               std::string(doing) + " \"" + printable(path) +
                                   "\": there is no room for them; use fewer or shorter "
                                   "tags, or free some space",
                               path)};
  }
  return {TagStorage::Failed, {}, fileError(number, doing, path)};
}

// Whether the file has exactly these, and nothing is to be written.
bool hasTags(const std::string& file, const std::string& value) {
  std::string known(value.size() + 1, '\0');
  const ssize_t size = ::getxattr(file.c_str(), kTagsAttribute, known.data(), known.size());
  if (size < 0) return errno == ENODATA && value.empty();
  return !value.empty() && value == std::string_view(known.data(), static_cast<std::size_t>(size));
}

}  // namespace

NSErrorPtr refusalOfTags(const std::vector<std::string>& names) {
  for (const std::string& name : names) {
    std::string why;
    if (name.empty()) {
      why = "a tag must not be empty";
    } else if (name.find(',') != std::string::npos) {
      why = "a tag must not contain a comma, which separates tags";
    } else if (std::any_of(name.begin(), name.end(), [](char c) {
                 return static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
               })) {
      why = "a tag must not contain control characters";
    } else if (printable(name) != name) {
      why = "a tag must be UTF-8 text";
    }
    if (!why.empty()) {
      return fileErrorWithWords(NSFileWriteInvalidFileNameError, EINVAL,
                                "can't use the tag \"" + printable(name) + "\": " + why, {});
    }
  }
  return nullptr;
}

std::string joinTags(const std::vector<std::string>& names) {
  std::string value;
  std::unordered_set<std::string_view> seen;
  for (const std::string& name : names) {
    if (name.empty() || !seen.insert(name).second) continue;
    if (!value.empty()) value += ',';
    value += name;
  }
  return value;
}

std::vector<std::string> splitTags(const std::string& value) {
  std::vector<std::string> names;
  std::unordered_set<std::string_view> seen;
  for (std::size_t at = 0; at <= value.size();) {
    const std::size_t end = std::min(value.find(',', at), value.size());
    const std::string_view name = std::string_view(value).substr(at, end - at);
    if (!name.empty() && seen.insert(name).second) names.emplace_back(name);
    at = end + 1;
  }
  return names;
}

TagResult readTags(const DirectoryHandle& folder, const std::string& name,
                   const std::string& path) {
  FileDescriptor entry;
  if (const int failure = folder.openEntry(name, entry)) {
    return {TagStorage::Failed, {}, fileError(failure, "can't read the tags of", path)};
  }
  const std::string own = descriptorPath(entry.get());
  std::string value;
  while (true) {
    const ssize_t size = ::getxattr(own.c_str(), kTagsAttribute, nullptr, 0);
    if (size > 0) value.resize(static_cast<std::size_t>(size));
    const ssize_t got =
        size > 0 ? ::getxattr(own.c_str(), kTagsAttribute, value.data(), value.size()) : size;
    if (got >= 0) {
      value.resize(static_cast<std::size_t>(got));
      return {TagStorage::Kept, splitTags(value), nullptr};
    }
    if (errno == ENODATA) return {};
    if (size > 0 && errno == ERANGE) continue;  // it grew in between
    return failed(errno, "can't read the tags of", path);
  }
}

TagResult writeTags(FileLayer& files, const DirectoryHandle& folder, const std::string& name,
                    const std::string& path, const std::vector<std::string>& names,
                    const std::function<void()>& written, const std::optional<FileKey>& asked) {
  if (NSErrorPtr refusal = refusalOfTags(names)) return {TagStorage::Failed, {}, refusal};
  const char* const doing = "can't set the tags of";
  FileDescriptor entry;
  if (const int failure = folder.openEntry(name, entry)) {
    return {TagStorage::Failed, {}, fileError(failure, doing, path)};
  }
  FileKey key;
  if (asked && (readFileKey(entry.get(), {}, key) != 0 || !asked->names(key))) {
    return {TagStorage::Failed, {}, fileError(ESTALE, doing, path)};
  }
  const std::string own = descriptorPath(entry.get());
  const std::string value = joinTags(names);
  if (hasTags(own, value)) return {TagStorage::Kept, splitTags(value), nullptr};
  int failure = value.empty() ? files.removeAttribute(own, kTagsAttribute)
                              : files.setAttribute(own, kTagsAttribute, value);
  if (failure == ENODATA) failure = 0;
  if (failure != 0) return failed(failure, doing, path);
  if (written) written();
  // What may be written but not read cannot be opened to be synced; the system writes
  // it out in its own time.
  FileDescriptor file;
  if (folder.openFile(name, file) == 0) failure = files.sync(file.get());
  if (failure != 0) return {TagStorage::Failed, {}, fileError(failure, doing, path)};
  return {TagStorage::Kept, splitTags(value), nullptr};
}

}  // namespace skein::vald
