#include "linux/vald/files/DatabaseFile.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <filesystem>
#include <string_view>
#include <utility>

#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

constexpr const char* kParts[] = {"", "-wal", "-shm"};
constexpr char kDamaged[] = ".damaged-";
constexpr std::size_t kKept = 3;

bool isDamaged(const std::string& path) {
  sqlite3* database = nullptr;
  int code = sqlite3_open_v2(path.c_str(), &database, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOFOLLOW,
                             nullptr);
  bool isSound = false;
  if (code == SQLITE_OK) {
    sqlite3_busy_timeout(database, 1000);
    const auto hear = [](void* sound, int, char** values, char**) {
      *static_cast<bool*>(sound) = values[0] != nullptr && std::string_view(values[0]) == "ok";
      return 0;
    };
    code = sqlite3_exec(database, "PRAGMA quick_check(1)", hear, &isSound, nullptr);
  }
  sqlite3_close(database);
  return code == SQLITE_OK ? !isSound : code == SQLITE_CORRUPT || code == SQLITE_NOTADB;
}

// The files of these names, the newest last.
std::vector<std::string> setAside(const std::string& folder, const std::string& infix) {
  std::vector<std::string> files;
  std::error_code none;
  for (const auto& entry : std::filesystem::directory_iterator(folder, none)) {
    const std::string path = entry.path();
    const std::size_t at = nameOfPath(path).find(infix);
    const bool isPart = path.ends_with("-wal") || path.ends_with("-shm");
    if (at != std::string::npos && !isPart) files.push_back(path);
  }
  const auto age = [](const std::string& path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 ? status.st_ctim.tv_sec : 0;
  };
  std::sort(files.begin(), files.end(), [&](const std::string& a, const std::string& b) {
    return std::pair(age(a), a) < std::pair(age(b), b);
  });
  return files;
}

}  // namespace

void makeDatabasePrivate(const std::string& path) {
  // A file that is there is not opened: closing it would end the locks that SQLite has on it.
  const FileDescriptor fresh(
      open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, 0600));
  struct stat status {};
  if (fresh || lstat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) return;
  if ((status.st_mode & 077) != 0) [[maybe_unused]]
    const int closed = chmod(path.c_str(), 0600);
}

bool setAsideWhenDamaged(const std::string& path, Log& log) {
  if (!isDamaged(path)) return false;
  const std::string aside = path + kDamaged + std::to_string(std::time(nullptr));
  if (std::rename(path.c_str(), aside.c_str()) != 0) return false;
  // The log belongs to it: SQLite would write a stale one into the new file.
  for (const char* part : {"-wal", "-shm"}) {
    const std::string from = path + part;
    if (std::rename(from.c_str(), (aside + part).c_str()) != 0) unlink(from.c_str());
  }
  VL_ERROR(log, "[ERROR] the database %@ is damaged; it is kept as %@ and a new one is made", path,
           aside);
  pruneSetAside(path, kDamaged, kKept);
  return true;
}

std::vector<std::string> notesOfDatabasesSetAside(const std::string& folder) {
  std::vector<std::string> notes;
  for (const std::string& path : setAside(folder, kDamaged)) {
    notes.push_back(path.substr(0, path.rfind(kDamaged)) +
                    " was damaged, and what it said is lost; it is kept as " + path +
                    ", remove that when you no longer need it");
  }
  return notes;
}

void pruneSetAside(const std::string& path, const std::string& infix, std::size_t kept) {
  std::vector<std::string> files = setAside(parentOfPath(path), nameOfPath(path) + infix);
  for (std::size_t i = 0; i + kept < files.size(); ++i) {
    for (const char* part : kParts) unlink((files[i] + part).c_str());
  }
}

}  // namespace skein::vald
