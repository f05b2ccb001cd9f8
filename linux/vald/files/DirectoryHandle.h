#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <functional>
#include <string>

#include "linux/protocol/FileDescriptor.h"

namespace skein::vald {

// An open folder. What lies below it is reached through it, by names that never leave it:
// no symbolic link is followed and ".." is refused. Reading only; changes go through
// FileLayer with get(). Functions answer 0 or an errno. A value that moves; any thread.
class DirectoryHandle {
 public:
  DirectoryHandle() = default;

  // `path` is absolute and is followed, links included: it is the user's own choice.
  static int openRoot(const std::string& path, DirectoryHandle& folder);

  // `relative`: components without "." and ".."; empty is this folder again. ELOOP where
  // a symbolic link is in the way, ENOTDIR where a component is no folder.
  int openFolder(const std::string& relative, DirectoryHandle& folder) const;

  // The folder that holds this one at the moment: whoever goes up knows which it expects.
  int openParent(DirectoryHandle& folder) const;

  // An entry of this folder, for reading; never waits for a pipe's other end.
  int openFile(const std::string& name, FileDescriptor& file) const;
  // The entry itself, whatever it is: names it for descriptorPath().
  int openEntry(const std::string& name, FileDescriptor& entry) const;

  // The entry itself, not what it links to.
  int status(const std::string& name, struct stat& status) const;
  int status(struct stat& status) const;
  bool exists(const std::string& name) const;
  // Whether it has an entry of exactly this name, by its own list: a file system that folds case
  // answers exists() for others too. True when it cannot be read.
  bool lists(const std::string& name) const;
  // What a symbolic link says.
  int readLink(const std::string& name, std::string& target) const;

  // Calls `each` with every name but "." and "..", in the folder's own order, until it
  // answers false. Entries that come or go meanwhile may or may not be seen.
  int list(const std::function<bool(const std::string& name)>& each) const;

  // Which mount the entry (empty: this folder) is on: files cannot be renamed from one
  // mount to another. 0 when the system does not tell.
  std::uint64_t mountOf(const std::string& name = {}) const;

  int get() const { return _folder.get(); }
  explicit operator bool() const { return static_cast<bool>(_folder); }

 private:
  explicit DirectoryHandle(FileDescriptor folder) : _folder(std::move(folder)) {}

  FileDescriptor _folder;
};

}  // namespace skein::vald
