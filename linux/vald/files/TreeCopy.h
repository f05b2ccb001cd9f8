#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "linux/vald/files/DirectoryHandle.h"
#include "linux/vald/files/FileLayer.h"
#include "linux/vald/files/FileLease.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// How far an import has come.
struct FileProgress {
  std::uint64_t totalItems = 0;
  std::uint64_t doneItems = 0;
  std::uint64_t totalBytes = 0;
  std::uint64_t doneBytes = 0;
};
// False cancels. On the copying thread, every few files or megabytes.
using FileProgressHandler = std::function<bool(const FileProgress&)>;

// Copies a file or a whole tree into a folder: contents by reference where the file
// system can, else within the kernel; modification times, permissions (never set-user-id,
// and always enough for the owner to use the copy), the group and access lists, user attributes
// but this system's own, links as links, holes as holes. Where a group or a list cannot be kept,
// nobody may do more with the copy than with the source.
//
// A file that another program has open for writing is refused with ETXTBSY (files of this
// user's own, on file systems with leases), and so is one that changed while it was read.
//
// A copy that takes its source's place (Purpose::Move) has the attributes of this system too, and
// gives the owner no more than the source did; see TreeComparison for what must be the same.
//
// Memory does not grow with the tree. One use; one thread.
class TreeCopy {
 public:
  enum class Purpose : std::uint8_t { Import, Move };

  TreeCopy(FileLayer& files, FileProgressHandler progress, Purpose purpose = Purpose::Import)
      : _files(files),
        _progress(std::move(progress)),
        _isMove(purpose == Purpose::Move),
        _doing(_isMove ? "can't move" : "can't bring in") {}

  // Counts what is there, before anything is made. An error for what cannot be copied
  // (devices, pipes, sockets, what may not be read, reserved names, what is more than
  // kDeepestTree folders deep), naming it.
  NSErrorPtr measure(const DirectoryHandle& folder, const std::string& name,
                     const std::string& path);
  // After measure(). On an error a part may have been made; the caller removes it.
  NSErrorPtr copy(const DirectoryHandle& from, const std::string& name, const std::string& path,
                  const DirectoryHandle& to, const std::string& newName);
  // Puts the copy on the disk: a few files each by itself, many all at once. The last that can be
  // cancelled.
  NSErrorPtr sync(const DirectoryHandle& to, const std::string& newName, const std::string& path);

 private:
  class Measure;
  class Copy;
  class Sync;

  // These answer 0 or an errno.
  int copyFile(const DirectoryHandle& from, const std::string& name, const DirectoryHandle& to,
               const std::string& newName);
  int copyContents(int from, int to, const struct stat& status);
  int copyRange(int from, int to, std::int64_t offset, std::int64_t end, bool untilEnd);
  int copyByReading(int from, int to, std::int64_t offset, std::int64_t end, bool untilEnd);
  int copyAttributes(int from, int to);
  // The copy of a file that says which document it is says so, too.
  int copyHint(int from, int to);
  // Group, access lists and mode of the source, whose status is `status`, `least` at least.
  int copyAccess(int from, int to, const struct stat& status, mode_t least);
  int copyList(int to, const char* name, const std::string& list);
  // Whether another program waits to write to the file that is read.
  bool isDisturbed() const { return _lease != nullptr && !_lease->isUndisturbed(); }
  // ECANCELED when the handler wants no more.
  int advance(std::uint64_t items, std::uint64_t bytes);

  FileLayer& _files;
  const FileProgressHandler _progress;
  const bool _isMove;
  const char* const _doing;
  FileProgress _state;
  std::uint64_t _toldItems = 0;
  std::uint64_t _toldBytes = 0;
  // Until the file systems say that they cannot.
  bool _clones = true;
  bool _copiesRanges = true;
  std::string _buffer;
  const FileLease* _lease = nullptr;  // of the file that is read
};

}  // namespace skein::vald
