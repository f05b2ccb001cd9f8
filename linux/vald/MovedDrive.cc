#include "linux/vald/MovedDrive.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <memory>

#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/index/Sqlite.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

// Each statement takes the new path, how long the old one is, and the old one.
constexpr const char* kJournal[] = {
    "UPDATE operation SET path = CAST(?1 || substr(path, ?2 + 1) AS BLOB) "
    "WHERE substr(path, 1, ?2 + 1) = ?3",
    "UPDATE operation SET destination = CAST(?1 || substr(destination, ?2 + 1) AS BLOB) "
    "WHERE substr(destination, 1, ?2 + 1) = ?3",
    "UPDATE operation SET aside = CAST(?1 || substr(aside, ?2 + 1) AS BLOB) "
    "WHERE substr(aside, 1, ?2 + 1) = ?3"};
constexpr const char* kCloud[] = {
    "UPDATE work SET path = CAST(?1 || substr(path, ?2 + 1) AS BLOB) "
    "WHERE substr(path, 1, ?2 + 1) = ?3"};

template <class Statements>
NSErrorPtr move(const std::string& file, const Statements& statements, const std::string& from,
                const std::string& to) {
  struct stat status {};
  if (lstat(file.c_str(), &status) != 0 && errno == ENOENT) return nullptr;
  int code = 0;
  std::string message;
  const auto database = SqliteDatabase::open(file, true, code, message);
  if (database) {
    const std::string below = from + '/';
    database->begin();
    for (const char* sql : statements) {
      SqliteStatement(*database, sql).start(std::string_view(to), from.size(), below).run();
    }
    if (database->commit()) return nullptr;
    message = database->message();
  }
  return vl_errorWithPOSIXCode(EIO,
                               "The paths in " + file + " can't be moved along: " + message + ".");
}

// A small file's text; empty when there is none. 0 or an errno. Whatever has the name, a pipe's
// other end is not waited for.
int readNote(const std::string& path, std::string& text) {
  const FileDescriptor file(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  if (!file) return errno == ENOENT ? 0 : errno;
  struct stat status {};
  if (fstat(file.get(), &status) != 0) return errno;
  if (!S_ISREG(status.st_mode)) return EINVAL;
  text.resize(PATH_MAX);
  const ssize_t length = read(file.get(), text.data(), text.size());
  if (length < 0) return errno;
  text.resize(static_cast<std::size_t>(length));
  return 0;
}

}  // namespace

NSErrorPtr followMovedDrive(const std::string& stateDirectory, const std::string& cloudDirectory,
                            const std::string& store) {
  const std::string note = joinPath(stateDirectory, "served");
  std::string from;
  if (const int failure = readNote(note, from)) return fileError(failure, "can't read", note);
  if (from == store) return nullptr;
  if (!from.empty()) {
    NSErrorPtr error = move(joinPath(stateDirectory, "operations.db"), kJournal, from, store);
    if (!error) error = move(joinPath(cloudDirectory, "records.db"), kCloud, from, store);
    if (error) return error;
  }
  const std::string partial = note + ".new";
  FileDescriptor file(
      open(partial.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC, 0600));
  errno = file ? ENOSPC : errno;
  const bool isWritten =
      file && write(file.get(), store.data(), store.size()) == static_cast<ssize_t>(store.size()) &&
      fchmod(file.get(), 0600) == 0 && rename(partial.c_str(), note.c_str()) == 0;
  return isWritten ? nullptr : fileError(errno, "can't write", note);
}

}  // namespace skein::vald
