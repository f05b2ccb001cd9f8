// The one seam through which every call that changes a file system goes, so that tests
// can fail it or end the process at it.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <ctime>
#include <string>
#include <string_view>

#include "linux/protocol/FileDescriptor.h"

namespace skein::vald {

// The changing calls, by name.
enum class FileStep : std::uint8_t {
  MakeFolder,
  CreateFile,
  Write,
  Clone,  // copying within the kernel, by reference where the file system can
  SetAttribute,
  RemoveAttribute,
  SetMode,
  SetGroup,
  SetTimes,
  MakeLink,
  Link,  // a second name
  Rename,
  Unlink,
  RemoveFolder,
  Sync,
  JournalBegin,
  JournalMark,
  JournalEnd,
};
std::string_view fileStepName(FileStep step);

// Each function is the system call of its name, with EINTR repeated: 0, or the errno.
// Names are single components below the folder `at`; symbolic links are never followed.
// Any thread. A subclass decides before each step whether it happens at all.
class FileLayer {
 public:
  FileLayer() = default;
  FileLayer(const FileLayer&) = delete;
  FileLayer& operator=(const FileLayer&) = delete;
  virtual ~FileLayer() = default;

  int makeFolder(int at, const std::string& name, mode_t mode);
  // A new file, open for writing: O_EXCL.
  int createFile(int at, const std::string& name, mode_t mode, FileDescriptor& file);
  // All of `bytes`, from the file's position on.
  int write(int file, std::string_view bytes);
  // Shares all of `from`'s contents with `to`. EOPNOTSUPP, EXDEV, EINVAL or ENOTTY where
  // that is impossible.
  int cloneContents(int from, int to);
  // At most `length` bytes from `offset` to the same place; `copied` is 0 at the end.
  int copyRange(int from, int to, std::int64_t offset, std::size_t length, std::size_t& copied);
  int setLength(int file, std::int64_t length);
  // `path` is followed: made by descriptorPath() for a file that is open already.
  int setAttribute(const std::string& path, const std::string& name, std::string_view value);
  int removeAttribute(const std::string& path, const std::string& name);
  int setMode(int file, mode_t mode);
  int setGroup(int file, gid_t group);
  // By name, not followed; times are (access, modification). An empty name is `at` itself.
  int setTimes(int at, const std::string& name, const timespec times[2]);
  int makeLink(const std::string& target, int at, const std::string& name);
  // Another name of an open file.
  int link(int file, int at, const std::string& name);
  // Without replacing: EEXIST when `newName` is there. Where the file system cannot
  // promise that (EINVAL, ENOSYS), a file gets its new name as a second one before it loses
  // the old; a crash between leaves both. For a folder it looks first and then renames.
  int renameWithoutReplacing(int at, const std::string& name, int newAt,
                             const std::string& newName);
  // For a change of case alone, where both names are the same entry.
  int renameOver(int at, const std::string& name, int newAt, const std::string& newName);
  int unlink(int at, const std::string& name);
  int removeFolder(int at, const std::string& name);
  // While a large file is written: has the disk begin with the bytes `from` to `to`, and waits
  // for those before. Nothing piles up then that a sync, or whoever needs the file's lock, has
  // to wait for. An error of the disk that is told here is not told again by the sync.
  int writeBehind(int file, std::uint64_t from, std::uint64_t to);
  // A file or folder. A file system that has nothing to say about folders is no failure.
  int sync(int file);
  // Everything that is pending on the file system of `file`.
  int syncAll(int file);

  // The journal's writes are SQLite's own; they ask here.
  int step(FileStep step, std::string_view name) { return beforeStep(step, name); }

 protected:
  // 0 to go on, or the errno that the step fails with. The name is what the call names; for a
  // sync it is the descriptorPath() of what waits for the disk.
  virtual int beforeStep(FileStep, std::string_view) { return 0; }
  // The system call that promises it.
  virtual int renameKeeping(int at, const std::string& name, int newAt, const std::string& newName);

 private:
  int linkBeside(int at, const std::string& name, int newAt, const std::string& newName);
};

// "/proc/self/fd/N": names an open file for calls that take only paths.
std::string descriptorPath(int file);

}  // namespace skein::vald
