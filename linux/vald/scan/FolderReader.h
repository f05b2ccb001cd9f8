#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/index/FileState.h"

namespace skein::vald {

// One of the store's roots as it was found at the start: the folder at `path` is the root
// only while it is this very folder.
struct RootFolder {
  std::string path;
  dev_t device = 0;
  FileKey key;
};

// What came of looking at a folder.
enum class Look : std::uint8_t {
  Seen,
  Gone,        // no such folder there any more
  Unreadable,  // it is there (or may be), but cannot be read: never a reason to delete
  RootLost,    // the root itself is missing, or another folder has its place
};

struct DiskEntry {
  std::string_view name;  // into the snapshot's names
  FileState state;
};

// One folder as it was read: its own state, and its entries sorted by the bytes of their
// names. A marker is an entry of its document's name, unless a file has that name: then the
// file is the document. Sockets, pipes, devices, hidden names and this system's own folders
// (OwnFolders.h) are left out.
struct FolderSnapshot {
  Look look = Look::Unreadable;
  int error = 0;  // why it is unreadable
  FileState self;
  std::vector<char> names;
  std::vector<DiskEntry> entries;
};

// How much to ask about a document.
enum class Detail : std::uint8_t {
  Quick,  // leaves the generation out where the birth time is known
  Full,
};

// Reads folders by handles. Below the root no symbolic link is followed and no mount point
// is crossed: a file system that is mounted inside the store is listed as a folder that
// cannot be read. Nothing is written, and no file is opened but markers. Stateless; any
// thread.

// Opens the root anew, so that vald never keeps a volume from being unmounted.
std::optional<RootFolder> findRoot(const std::string& path, int& error);

// The folder at `relativePath` ("" is the root itself), which must be `key`.
Look openFolder(const RootFolder& root, const std::string& relativePath, const FileKey& key,
                FileDescriptor& folder, int& error);

// Reads an open folder.
FolderSnapshot readFolder(int folder, Detail detail);

// The document of one name in an open folder, present or not: Seen, Gone (also for what is never
// listed), or Unreadable.
Look readEntry(int folder, const std::string& name, FileState& state, int& error);

// The folder itself.
bool readSelf(int folder, FileState& state);

}  // namespace skein::vald
