#include "linux/protocol/DriveIdentity.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <optional>
#include <thread>
#include <tuple>
#include <utility>

#include "linux/protocol/DrivePaths.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/protocol/UploadConsent.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr char kAttribute[] = "user.skein.drive";
constexpr std::size_t kDigits = 32;
constexpr char kRecordName[] = "/folder";
// Who holds the list of drives only reads and writes a few small files.
constexpr std::chrono::milliseconds kPatience{3000};
constexpr std::chrono::milliseconds kBetweenListTries{5};

bool isThere(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0;
}

// A folder, however it is called. The birth tells one from a later one that got its inode;
// it is zero where the file system does not keep it. A device's number may differ after the
// machine was started again, so two folders are told apart by it only at the same moment.
struct FolderKey {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::uint64_t born = 0;

  bool isSameNow(const FolderKey& other) const {
    return device == other.device && inode == other.inode && born == other.born;
  }
  bool isSame(const FolderKey& other) const { return inode == other.inode && born == other.born; }
};

std::optional<FolderKey> keyOf(const std::string& path) {
  struct statx status {};
  if (statx(AT_FDCWD, path.c_str(), AT_NO_AUTOMOUNT, STATX_INO | STATX_BTIME, &status) != 0) {
    return std::nullopt;
  }
  FolderKey key{makedev(status.stx_dev_major, status.stx_dev_minor), status.stx_ino, 0};
  if ((status.stx_mask & STATX_BTIME) != 0) {
    key.born = static_cast<std::uint64_t>(status.stx_btime.tv_sec) * 1'000'000'000U +
               status.stx_btime.tv_nsec;
  }
  return key;
}

// ---- what the folder says

// Empty when the folder has no identity, or none that makes sense. `code`: why the folder
// could not be asked; zero when it was.
std::string attributeOf(const std::string& path, int& code) {
  std::array<char, kDigits + 1> text{};
  const ssize_t size = getxattr(path.c_str(), kAttribute, text.data(), text.size());
  code = size < 0 && errno != ENODATA && errno != ERANGE && errno != ENOTSUP ? errno : 0;
  if (size != static_cast<ssize_t>(kDigits)) return {};
  std::string name(text.data(), kDigits);
  // It becomes the name of folders.
  return name.find_first_not_of("0123456789abcdef") == std::string::npos ? name : std::string();
}

// The new identity; empty when the folder does not take one.
std::string giveIdentity(const std::string& path) {
  std::array<unsigned char, kDigits / 2> bits{};
  if (getrandom(bits.data(), bits.size(), 0) != static_cast<ssize_t>(bits.size())) return {};
  std::string name;
  for (const unsigned char byte : bits) {
    constexpr char kHexadecimal[] = "0123456789abcdef";
    name += kHexadecimal[byte >> 4];
    name += kHexadecimal[byte & 15];
  }
  return setxattr(path.c_str(), kAttribute, name.data(), name.size(), 0) == 0 ? name
                                                                              : std::string();
}

// FNV-1a: the same on every run, not hard to guess.
std::string nameFromPath(const std::string& path) {
  std::uint64_t hash = 0xcbf29ce484222325U;
  for (const char c : path) {
    hash ^= static_cast<unsigned char>(c);
    hash *= 0x100000001b3U;
  }
  std::array<char, 17> text{};
  std::snprintf(text.data(), text.size(), "%016llx", static_cast<unsigned long long>(hash));
  return text.data();
}

// ---- what the state says

struct Record {
  FolderKey key;
  std::string path;
};

std::optional<Record> readRecord(const std::string& state) {
  const FileDescriptor file(
      open((state + kRecordName).c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  if (!file) return std::nullopt;
  std::string text(PATH_MAX + 128, '\0');
  const ssize_t size = pread(file.get(), text.data(), text.size(), 0);
  if (size <= 0) return std::nullopt;
  text.resize(static_cast<std::size_t>(size));
  Record record;
  unsigned long long device = 0;
  unsigned long long inode = 0;
  unsigned long long born = 0;
  int length = 0;
  if (std::sscanf(text.c_str(), "%llu %llu %llu%n", &device, &inode, &born, &length) != 3 ||
      text.compare(static_cast<std::size_t>(length), 2, "\n/") != 0) {
    return std::nullopt;
  }
  record.key = {device, inode, born};
  record.path = text.substr(static_cast<std::size_t>(length) + 1);
  return record;
}

// The path comes last and to the end: it may hold any byte.
NSErrorPtr writeRecord(const std::string& state, const Record& record) {
  const std::string path = state + kRecordName;
  const std::string partial = path + ".new";
  const auto failed = [&] { return pathFailure(errno, "The note " + path + " cannot be written"); };
  FileDescriptor file(
      open(partial.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!file) return failed();
  const std::string text = std::to_string(record.key.device) + ' ' +
                           std::to_string(record.key.inode) + ' ' +
                           std::to_string(record.key.born) + '\n' + record.path;
  errno = EIO;
  if (write(file.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size()) ||
      fsync(file.get()) != 0 || rename(partial.c_str(), path.c_str()) != 0) {
    return failed();
  }
  return nullptr;
}

// ---- processes

// The number of the process that holds the lock, as it wrote it there; empty: nobody does.
std::string holderOf(const std::string& lock) {
  const FileDescriptor file(open(lock.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  if (!file || flock(file.get(), LOCK_SH | LOCK_NB) == 0 || errno != EWOULDBLOCK) return {};
  std::array<char, 16> text{};
  const ssize_t size = pread(file.get(), text.data(), text.size() - 1, 0);
  std::string number(text.data(), size > 0 ? static_cast<std::size_t>(size) : 0);
  number.erase(
      std::find_if_not(number.begin(), number.end(), [](char c) { return c >= '0' && c <= '9'; }),
      number.end());
  return number.empty() ? "unknown" : number;
}

bool isServed(const std::string& state) {
  return !holderOf(state + kDaemonLockName).empty() || !holderOf(state + kHostLockName).empty();
}

// Processes of versions that kept locks and sockets in the session's runtime folder do not
// see ours, and ours not theirs: two would write the same state.
NSErrorPtr olderVersionRuns(const std::string& path, const std::string& name) {
  const char* session = std::getenv("XDG_RUNTIME_DIR");
  for (const std::string& base :
       {std::string(session != nullptr ? session : ""), "/run/user/" + std::to_string(geteuid()),
        "/tmp/skein-runtime-" + std::to_string(geteuid())}) {
    for (const char* lock : {kHostLockName, kDaemonLockName}) {
      const std::string holder = holderOf(base + "/skein/" + name + lock);
      if (holder.empty()) continue;
      return vl_errorWithPOSIXCode(EBUSY, "An older version still serves the drive " + path +
                                              " (process " + holder +
                                              "): end it first, with kill " + holder + ".");
    }
  }
  return nullptr;
}

// Held while identities are given and notes written.
NSErrorPtr lockDrives(const std::string& stateTop, FileDescriptor& file) {
  const std::string path = stateTop + "/drives.lock";
  file = FileDescriptor(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!file) return pathFailure(errno, "The lock file " + path + " cannot be used");
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno != EWOULDBLOCK && errno != EINTR) {
      return pathFailure(errno, "The lock file " + path + " cannot be used");
    }
    if (std::chrono::steady_clock::now() >= deadline) {
      return vl_errorWithPOSIXCode(
          EBUSY, "Another process holds " + path + "; find it with \"fuser\" and let it end.");
    }
    std::this_thread::sleep_for(kBetweenListTries);
  }
  return nullptr;
}

// ---- the decision

class Finder {
 public:
  Finder(const std::string& path, FolderKey key, const std::string& stateTop,
         const std::string& dataTop)
      : _path(path), _key(key), _stateTop(stateTop), _dataTop(dataTop) {}

  // Whether there is nothing to decide or to write.
  bool isSettled(DriveIdentity& identity) const {
    int code = 0;
    identity = {attributeOf(_path, code), _path};
    if (identity.name.empty()) return false;
    const auto record = readRecord(stateOf(identity.name));
    return record && record->path == _path && record->key.isSame(_key);
  }

  bool isKnown() const {
    int code = 0;
    DriveIdentity identity{attributeOf(_path, code), _path};
    if (!identity.name.empty() && isThere(stateOf(identity.name)) &&
        compareWithRecord(identity, false) == nullptr && !identity.name.empty()) {
      return true;
    }
    return isThere(stateOf(nameFromPath(_path)));
  }

  // The lock is held.
  NSErrorPtr decide(DriveIdentity& identity) {
    int code = 0;
    identity = {attributeOf(_path, code), _path};
    if (!identity.name.empty()) {
      if (NSErrorPtr error = compareWithRecord(identity, true)) return error;
      if (identity.path != _path) return nullptr;
    }
    if (NSErrorPtr error = takeOverByPath(identity.name)) return error;
    const std::string state = stateOf(identity.name);
    identity.isNew = !isThere(state + kRecordName) && !isThere(state + "/index.sqlite");
    if (mkdir(state.c_str(), 0700) != 0 && errno != EEXIST) {
      return pathFailure(errno, "The folder " + state + " cannot be made");
    }
    if (identity.isNew) {
      if (NSErrorPtr error = setUploadConsent(state, UploadConsent::Unasked)) return error;
    }
    return writeRecord(state, {_key, _path});
  }

 private:
  std::string stateOf(const std::string& name) const { return _stateTop + '/' + name; }

  // Empties the name where the folder is a copy, and answers the path of its other mount.
  NSErrorPtr compareWithRecord(DriveIdentity& identity, bool endsFormer) const {
    const std::string state = stateOf(identity.name);
    const auto record = readRecord(state);
    if (!record || record->path == _path) return nullptr;
    int code = 0;
    const std::string other = attributeOf(record->path, code);
    if (code != 0 && code != ENOENT && code != ENOTDIR) {
      return pathFailure(code, "The folder " + _path + " has the identity of the drive " +
                                   record->path + ", which cannot be looked at");
    }
    if (other == identity.name) {
      const auto otherKey = keyOf(record->path);
      if (otherKey && otherKey->isSameNow(_key)) {
        identity.path = record->path;
      } else {
        identity.name.clear();
      }
      return nullptr;
    }
    // It was moved. Whoever serves its old path ends, as its socket is gone.
    if (!endsFormer) return nullptr;
    unlink((state + kHostSocketName).c_str());
    unlink((state + kDaemonSocketName).c_str());
    return nullptr;
  }

  // Names the drive when it has no name, and gives it what is kept under its path. The
  // attribute comes before the folders: when this is cut off, the next one goes on.
  NSErrorPtr takeOverByPath(std::string& name) const {
    const std::string byPath = nameFromPath(_path);
    const std::string state = stateOf(byPath);
    const bool isKnown = isThere(state);
    if (isKnown && !isThere(state + kRecordName)) {
      if (NSErrorPtr error = olderVersionRuns(_path, byPath)) return error;
    }
    const bool mayMove = isKnown && !isServed(state);
    if (name.empty() && (!isKnown || mayMove)) name = giveIdentity(_path);
    if (name.empty()) name = byPath;
    if (!mayMove || name == byPath || isThere(stateOf(name))) return nullptr;
    for (const std::string& top : {_dataTop, _stateTop}) {
      const std::string from = top + '/' + byPath;
      if (rename(from.c_str(), (top + '/' + name).c_str()) != 0 && errno != ENOENT) {
        return pathFailure(errno, "The drive's folder " + from + " cannot be renamed to " + name);
      }
    }
    return nullptr;
  }

  const std::string _path;
  const FolderKey _key;
  const std::string _stateTop;
  const std::string _dataTop;
};

}  // namespace

NSErrorPtr pathFailure(int code, const std::string& what) {
  return vl_errorWithPOSIXCode(code, what + ": " + std::strerror(code) + ".");
}

DriveIdentity identityOfDrive(const std::string& path, const std::string& stateTop,
                              const std::string& dataTop, NSErrorOut error) {
  DriveIdentity identity;
  const auto failed = [&](NSErrorPtr problem) {
    error.store(std::move(problem));
    return DriveIdentity{};
  };
  const auto key = keyOf(path);
  if (!key)
    return failed(pathFailure(errno, "The drive's folder " + path + " cannot be looked at"));
  Finder finder(path, *key, stateTop, dataTop);
  if (finder.isSettled(identity)) return identity;
  FileDescriptor lock;
  if (NSErrorPtr problem = lockDrives(stateTop, lock)) return failed(std::move(problem));
  if (NSErrorPtr problem = finder.decide(identity)) return failed(std::move(problem));
  return identity;
}

bool isKnownDrive(const std::string& path, const std::string& stateTop) {
  const auto key = keyOf(path);
  return key && Finder(path, *key, stateTop, {}).isKnown();
}

std::vector<NotedDrive> notedDrives(const std::string& stateTop) {
  std::vector<NotedDrive> drives;
  std::error_code none;
  for (const auto& folder : std::filesystem::directory_iterator(stateTop, none)) {
    std::error_code ignored;
    if (!folder.is_directory(ignored) || folder.is_symlink(ignored)) continue;
    NotedDrive drive{folder.path().filename(), {}};
    if (const auto record = readRecord(folder.path())) {
      drive.path = record->path;
      int code = 0;
      const auto key = keyOf(record->path);
      drive.isThere =
          attributeOf(record->path, code) == drive.name || (key && key->isSame(record->key));
    }
    drives.push_back(std::move(drive));
  }
  std::sort(drives.begin(), drives.end(), [](const NotedDrive& a, const NotedDrive& b) {
    return std::tie(a.path, a.name) < std::tie(b.path, b.name);
  });
  return drives;
}

void removeIdentity(const std::string& path, const std::string& name) {
  int code = 0;
  if (attributeOf(path, code) == name) removexattr(path.c_str(), kAttribute);
}

}  // namespace skein
