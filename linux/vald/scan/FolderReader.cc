#include "linux/vald/scan/FolderReader.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/files/OwnFolders.h"
#include "linux/vald/scan/StoreNames.h"

namespace skein::vald {
namespace {

constexpr unsigned kMask = STATX_BASIC_STATS | STATX_BTIME;
constexpr int kFolderFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;

enum class Kept : std::uint8_t { Yes, No };

Kept fill(const struct statx& status, FileState& state) {
  if (S_ISDIR(status.stx_mode) &&
      isOwnFolder(makedev(status.stx_dev_major, status.stx_dev_minor), status.stx_ino)) {
    return Kept::No;
  }
  if (S_ISREG(status.stx_mode)) {
    state.kind = ItemKind::Document;
  } else if (S_ISDIR(status.stx_mode)) {
    state.kind = ItemKind::Folder;
  } else if (S_ISLNK(status.stx_mode)) {
    state.kind = ItemKind::Alias;
  } else {
    return Kept::No;
  }
  state.key.inode = status.stx_ino;
  state.key.born = fileBirth(status);
  state.size = state.kind == ItemKind::Folder ? 0 : status.stx_size;
  state.modified = nanosecondsOf(status.stx_mtime);
  state.changed = nanosecondsOf(status.stx_ctime);
  return Kept::Yes;
}

// openat2 with component-wise walking where the kernel, or the path's length, forbids it.
int openBelow(int root, const std::string& relativePath) {
  open_how how{};
  how.flags = static_cast<std::uint64_t>(kFolderFlags);
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS | RESOLVE_NO_XDEV;
  int folder = static_cast<int>(syscall(SYS_openat2, root, relativePath.c_str(), &how, sizeof how));
  if (folder >= 0 || (errno != ENOSYS && errno != ENAMETOOLONG && errno != EPERM)) return folder;

  struct stat rootStatus {};
  if (fstat(root, &rootStatus) != 0) return -1;
  FileDescriptor current;
  for (std::size_t start = 0; start <= relativePath.size();) {
    const std::size_t end = std::min(relativePath.find('/', start), relativePath.size());
    FileDescriptor next(::openat(current ? current.get() : root,
                                 relativePath.substr(start, end - start).c_str(), kFolderFlags));
    struct stat status {};
    if (!next || fstat(next.get(), &status) != 0) return -1;
    if (status.st_dev != rootStatus.st_dev) {
      errno = EXDEV;
      return -1;
    }
    current = std::move(next);
    start = end + 1;
  }
  return current.release();
}

// Where a name is among a snapshot's.
struct Place {
  std::size_t offset;
  std::size_t length;
};

// Sorts the entries; a marker whose document is present is none.
void fillEntries(FolderSnapshot& snapshot, const std::vector<std::pair<Place, FileState>>& found,
                 const std::vector<std::pair<std::string, FileState>>& markers) {
  std::vector<Place> names;
  for (const auto& [document, state] : markers) {
    names.push_back({snapshot.names.size(), document.size()});
    snapshot.names.insert(snapshot.names.end(), document.begin(), document.end());
  }
  const auto nameAt = [&](const Place& place) {
    return std::string_view(snapshot.names.data() + place.offset, place.length);
  };
  const auto before = [](const DiskEntry& a, const DiskEntry& b) { return a.name < b.name; };
  snapshot.entries.reserve(found.size() + markers.size());
  for (const auto& [place, state] : found) snapshot.entries.push_back({nameAt(place), state});
  std::sort(snapshot.entries.begin(), snapshot.entries.end(), before);
  if (markers.empty()) return;
  std::vector<DiskEntry> evicted;
  for (std::size_t i = 0; i < markers.size(); ++i) {
    const DiskEntry entry{nameAt(names[i]), markers[i].second};
    if (!std::binary_search(snapshot.entries.begin(), snapshot.entries.end(), entry, before)) {
      evicted.push_back(entry);
    }
  }
  snapshot.entries.insert(snapshot.entries.end(), evicted.begin(), evicted.end());
  std::sort(snapshot.entries.begin(), snapshot.entries.end(), before);
}

Look lookOfError(int error) {
  // A name that became a symbolic link, or something else, is no folder any more.
  return error == ENOENT || error == ENOTDIR || error == ELOOP ? Look::Gone : Look::Unreadable;
}

}  // namespace

bool readSelf(int folder, FileState& state) {
  struct statx status {};
  if (statx(folder, "", AT_EMPTY_PATH, kMask, &status) != 0) return false;
  if (fill(status, state) == Kept::No) return false;
  state.key.generation = fileGeneration(folder, "", AT_EMPTY_PATH, state.key.inode);
  return true;
}

std::optional<RootFolder> findRoot(const std::string& path, int& error) {
  FileDescriptor folder(::open(path.c_str(), kFolderFlags));
  struct stat status {};
  RootFolder root{path, 0, {}};
  FileState state;
  if (!folder || fstat(folder.get(), &status) != 0 || !readSelf(folder.get(), state)) {
    error = errno;
    return std::nullopt;
  }
  root.device = status.st_dev;
  root.key = state.key;
  return root;
}

Look openFolder(const RootFolder& root, const std::string& relativePath, const FileKey& key,
                FileDescriptor& folder, int& error) {
  FileDescriptor top(::open(root.path.c_str(), kFolderFlags));
  struct statx status {};
  if (!top || statx(top.get(), "", AT_EMPTY_PATH, kMask, &status) != 0) {
    error = errno;
    return Look::RootLost;
  }
  // An unlinked folder may be open still; it is empty, and that means nothing.
  if (status.stx_ino != root.key.inode || status.stx_nlink == 0 ||
      makedev(status.stx_dev_major, status.stx_dev_minor) != root.device) {
    error = ENOENT;
    return Look::RootLost;
  }
  if (relativePath.empty()) {
    folder = std::move(top);
    return Look::Seen;
  }
  FileDescriptor found(openBelow(top.get(), relativePath));
  if (!found) {
    error = errno;
    return lookOfError(error);
  }
  FileState state;
  if (!readSelf(found.get(), state)) {
    error = errno;
    return Look::Unreadable;
  }
  if (!state.key.names(key)) {
    error = ENOENT;
    return Look::Gone;
  }
  folder = std::move(found);
  return Look::Seen;
}

Look readEntry(int folder, const std::string& name, FileState& state, int& error) {
  if (isHiddenFromStore(name)) return Look::Gone;
  std::string found = name;
  struct statx status {};
  const auto look = [&] {
    return statx(folder, found.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, kMask, &status);
  };
  if (look() != 0) {
    error = errno;
    if (error == ENAMETOOLONG) return Look::Gone;
    if (error != ENOENT) return Look::Unreadable;
    found = MarkerNames(name).marker;
    if (look() != 0) return Look::Gone;
  }
  FileState seen;
  if (fill(status, seen) == Kept::No) return Look::Gone;
  const std::string document = readMarker(folder, found, seen);
  if (found == name ? !document.empty() : document != name) return Look::Gone;
  seen.key.generation = fileGeneration(folder, found.c_str(), 0, seen.key.inode);
  state = seen;
  return Look::Seen;
}

FolderSnapshot readFolder(int folder, Detail detail) {
  FolderSnapshot snapshot;
  const auto fail = [&](int error) {
    snapshot.look = Look::Unreadable;
    snapshot.error = error;
    snapshot.entries.clear();
    return std::move(snapshot);
  };
  // Its own state first: what changes while it is read shows next time.
  if (!readSelf(folder, snapshot.self)) return fail(errno);

  alignas(dirent64) char buffer[32 * 1024];
  std::vector<Place> places;
  for (;;) {
    const ssize_t count = getdents64(folder, buffer, sizeof buffer);
    if (count < 0) return fail(errno);
    if (count == 0) break;
    for (ssize_t at = 0; at < count;) {
      const auto* entry = reinterpret_cast<const dirent64*>(buffer + at);
      at += entry->d_reclen;
      const std::string_view name(entry->d_name);
      if (isHiddenFromStore(name)) continue;
      if (entry->d_type == DT_SOCK || entry->d_type == DT_FIFO || entry->d_type == DT_CHR ||
          entry->d_type == DT_BLK) {
        continue;
      }
      places.push_back({snapshot.names.size(), name.size()});
      snapshot.names.insert(snapshot.names.end(), name.begin(), name.end());
      snapshot.names.push_back('\0');
    }
  }

  std::vector<std::pair<Place, FileState>> found;
  std::vector<std::pair<std::string, FileState>> markers;
  found.reserve(places.size());
  for (const Place& place : places) {
    const char* name = snapshot.names.data() + place.offset;
    struct statx status {};
    if (statx(folder, name, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, kMask, &status) != 0) {
      if (errno == ENOENT) continue;  // gone since; its deletion is told by itself
      return fail(errno);
    }
    FileState state;
    if (fill(status, state) == Kept::No) continue;
    if (detail == Detail::Full || state.kind != ItemKind::Document || state.key.born == 0) {
      state.key.generation = fileGeneration(folder, name, 0, state.key.inode);
    }
    std::string document;
    if (name[0] == '.') document = readMarker(folder, name, state);
    if (document.empty()) {
      found.emplace_back(place, state);
    } else {
      markers.emplace_back(std::move(document), state);
    }
  }
  fillEntries(snapshot, found, markers);
  snapshot.look = Look::Seen;
  return snapshot;
}

}  // namespace skein::vald
