#include "linux/vald/cloud/CloudContents.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <optional>
#include <utility>
#include <vector>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

std::string shardOf(const std::string& object) { return object.substr(0, 2); }
std::string pathOf(const std::string& object) { return shardOf(object) + "/" + object; }

FileDescriptor openFolder(int folder, const char* name) {
  return FileDescriptor(openat(folder, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

// The names in a folder, but "." and "..". 0 or the errno.
int entries(int folder, std::vector<std::string>& names) {
  const int copy = openat(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  DIR* directory = copy >= 0 ? fdopendir(copy) : nullptr;
  if (directory == nullptr) {
    const int code = errno;
    if (copy >= 0) close(copy);
    return code;
  }
  errno = 0;
  while (const dirent* entry = readdir(directory)) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..") names.push_back(name);
    errno = 0;
  }
  const int code = errno;
  closedir(directory);
  return code;
}

constexpr std::size_t kKeySize = 32;
constexpr char kKeyName[] = "key";
constexpr char kOtherKeysName[] = "keys";
constexpr std::size_t kMostOtherKeys = 1000;

// At most `most` keys of a file of this user's own; none when there is no such file. 0 or an errno.
int readKeys(int top, const char* name, std::size_t most, std::string& keys) {
  keys.clear();
  const FileDescriptor file(openat(top, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  if (!file) return errno == ENOENT ? 0 : errno;
  struct stat status {};
  if (fstat(file.get(), &status) != 0) return errno;
  if (!S_ISREG(status.st_mode) || status.st_uid != geteuid()) return EACCES;
  keys.resize(most * kKeySize);
  const ssize_t got = pread(file.get(), keys.data(), keys.size(), 0);
  if (got < 0) return errno;
  keys.resize(static_cast<std::size_t>(got) / kKeySize * kKeySize);
  return 0;
}

// 0 or an errno.
int writeKeys(FileLayer& files, int top, int incoming, const char* name, const std::string& keys) {
  FileDescriptor fresh;
  int code = files.createFile(incoming, name, 0600, fresh);
  if (code == 0) code = files.write(fresh.get(), keys);
  if (code == 0) code = files.sync(fresh.get());
  if (code == 0) code = files.renameOver(incoming, name, top, name);
  return code;
}

// The key that markers are sealed with; made when there is none, or only a part of one.
Outcome<std::string> openKey(FileLayer& files, int top, int incoming, const std::string& folder) {
  const std::string path = joinPath(folder, kKeyName);
  std::string key;
  if (const int code = readKeys(top, kKeyName, 1, key)) {
    return fileError(code, "can't read the cloud's key, a file of this user's own,", path);
  }
  if (key.size() == kKeySize) return key;
  key.resize(kKeySize);
  if (getrandom(key.data(), key.size(), 0) != static_cast<ssize_t>(key.size())) {
    return fileError(errno, "can't make the cloud's key", path);
  }
  if (const int code = writeKeys(files, top, incoming, kKeyName, key)) {
    return fileError(code, "can't make the cloud's key", path);
  }
  return key;
}

}  // namespace

CloudContents::Hold::Hold(Hold&& other) noexcept
    : _owner(std::exchange(other._owner, nullptr)), _hash(other._hash) {}

CloudContents::Hold& CloudContents::Hold::operator=(Hold&& other) noexcept {
  std::swap(_owner, other._owner);
  std::swap(_hash, other._hash);
  return *this;
}

CloudContents::Hold::~Hold() {
  if (_owner != nullptr) _owner->releaseHold(_hash);
}

Outcome<std::unique_ptr<CloudContents>> CloudContents::open(const std::string& folder,
                                                            FileLayer& files,
                                                            const std::string& drives) {
  std::error_code failure;
  std::filesystem::create_directories(folder, failure);
  if (failure) return fileError(failure.value(), "can't make the cloud's folder", folder);
  const FileDescriptor top(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!top) return fileError(errno, "can't open the cloud's folder", folder);
  if (fchmod(top.get(), 0700) != 0) {
    return fileError(errno, "can't close to other users the cloud's folder", folder);
  }
  for (const char* name : {"objects", "incoming"}) {
    const int code = files.makeFolder(top.get(), name, 0700);
    if (code != 0 && code != EEXIST) {
      return fileError(code, "can't make the cloud's folder", folder + "/" + name);
    }
  }
  FileDescriptor objects = openFolder(top.get(), "objects");
  FileDescriptor incoming = openFolder(top.get(), "incoming");
  if (!objects || !incoming) return fileError(errno, "can't open the cloud's folder", folder);
  std::vector<std::string> left;
  if (const int code = entries(incoming.get(), left)) {
    return fileError(code, "can't read the cloud's folder", folder + "/incoming");
  }
  for (const std::string& name : left) {
    if (const int code = files.unlink(incoming.get(), name)) {
      return fileError(code, "can't remove", joinPath(folder + "/incoming", name));
    }
  }
  auto key = openKey(files, top.get(), incoming.get(), folder);
  if (!key) return key.error();
  if (const int code = files.sync(top.get())) return fileError(code, "can't make durable", folder);
  std::string others;
  if (const int code = readKeys(top.get(), kOtherKeysName, kMostOtherKeys, others)) {
    return fileError(code, "can't read", joinPath(folder, kOtherKeysName));
  }
  std::unique_ptr<CloudContents> cloud(new CloudContents(folder, drives, files, std::move(objects),
                                                         std::move(incoming), std::move(*key)));
  MutexLock lock(cloud->_mutex);
  for (std::size_t at = 0; at < others.size(); at += kKeySize) {
    cloud->_otherKeys.push_back(others.substr(at, kKeySize));
  }
  lock.unlock();
  return cloud;
}

void CloudContents::eachOther(const std::function<bool(const FileDescriptor&)>& each) const {
  const FileDescriptor drives(
      ::open(_drives.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  std::vector<std::string> names;
  struct stat own {};
  if (!drives || entries(drives.get(), names) != 0 || fstat(_objects.get(), &own) != 0) return;
  for (const std::string& name : names) {
    const FileDescriptor drive = openFolder(drives.get(), name.c_str());
    const FileDescriptor cloud = drive ? openFolder(drive.get(), "cloud") : FileDescriptor();
    struct stat status {};
    if (!cloud || fstat(cloud.get(), &status) != 0 || status.st_uid != geteuid()) continue;
    struct stat objects {};
    const bool isOwn = fstatat(cloud.get(), "objects", &objects, AT_SYMLINK_NOFOLLOW) == 0 &&
                       objects.st_dev == own.st_dev && objects.st_ino == own.st_ino;
    if (!isOwn && each(cloud)) return;
  }
}

bool CloudContents::isSeal(const ContentHash& seal, std::string_view text) {
  if (keyedHash(_key, text) == seal) return true;
  MutexLock lock(_mutex);
  for (const std::string& key : _otherKeys) {
    if (keyedHash(key, text) == seal) return true;
  }
  bool isOthers = false;
  std::string key;
  eachOther([&](const FileDescriptor& cloud) {
    isOthers = readKeys(cloud.get(), kKeyName, 1, key) == 0 && key.size() == kKeySize &&
               keyedHash(key, text) == seal;
    return isOthers;
  });
  // With the other drive its key may go. One that cannot be kept is looked for again.
  if (isOthers && keep(key) == nullptr) _otherKeys.push_back(key);
  return isOthers;
}

NSErrorPtr CloudContents::keep(const std::string& key) {
  if (_otherKeys.size() >= kMostOtherKeys) return fileError(ENOSPC, "can't keep", kOtherKeysName);
  std::string keys;
  for (const std::string& known : _otherKeys) keys += known;
  const FileDescriptor top(::open(_folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  int code =
      top ? writeKeys(_files, top.get(), _incoming.get(), kOtherKeysName, keys + key) : errno;
  if (code == 0) code = _files.sync(top.get());
  return code == 0 ? nullptr : fileError(code, "can't keep", joinPath(_folder, kOtherKeysName));
}

void CloudContents::takeOver(const HashedContents& contents) {
  const std::string object = contents.hash.asString();
  eachOther([&](const FileDescriptor& cloud) {
    const FileDescriptor file(openat(cloud.get(), ("objects/" + pathOf(object)).c_str(),
                                     O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    struct stat status {};
    if (!file || fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode) ||
        status.st_uid != geteuid() || static_cast<std::uint64_t>(status.st_size) != contents.size) {
      return false;
    }
    std::string incoming;
    {
      MutexLock lock(_mutex);
      incoming = std::to_string(_nextIncoming++);
    }
    if (_files.link(file.get(), _incoming.get(), incoming) == 0) {
      if (settle(incoming, file.get(), contents) == nullptr) return true;
      _files.unlink(_incoming.get(), incoming);
      return false;
    }
    LocalRead read;
    const auto added = add(file.get(), objectPath(object), read);
    return added && added->contents.hash == contents.hash;
  });
}

Outcome<CloudContents::Added> CloudContents::add(int file, const std::string& name,
                                                 StreamObserver& observer) {
  std::string incoming;
  {
    MutexLock lock(_mutex);
    incoming = std::to_string(_nextIncoming++);
  }
  FileDescriptor copy;
  if (const int code = _files.createFile(_incoming.get(), incoming, 0600, copy)) {
    return fileError(code, "can't upload", name);
  }
  // A clone stands still while its original may change: it is what is hashed.
  const bool cloned = _files.cloneContents(file, copy.get()) == 0;
  auto contents = cloned ? hashContents(copy.get(), name, observer)
                         : copyContents(_files, file, copy.get(), name, observer);
  NSErrorPtr error = contents.error();
  Hold hold;
  if (error == nullptr) {
    hold = takeHold(contents->hash);
    LocalRead read;
    if (!contains(*contents) || verify(contents->hash, read) != nullptr) {
      error = settle(incoming, copy.get(), *contents);
      if (error == nullptr) return Added{*contents, std::move(hold)};
    }
  }
  // Not needed, or not complete. A failure to remove it is mended at the next opening.
  _files.unlink(_incoming.get(), incoming);
  if (error != nullptr) return error;
  return Added{*contents, std::move(hold)};
}

NSErrorPtr CloudContents::settle(const std::string& incoming, int file,
                                 const HashedContents& contents) {
  const std::string object = contents.hash.asString();
  if (const int code = _files.setMode(file, 0400)) {
    return fileError(code, "can't write to the cloud", objectPath(object));
  }
  if (const int code = _files.sync(file)) {
    return fileError(code, "can't write to the cloud", objectPath(object));
  }
  FileDescriptor shard = openFolder(_objects.get(), shardOf(object).c_str());
  if (!shard) {
    int code = _files.makeFolder(_objects.get(), shardOf(object), 0700);
    if (code == 0 || code == EEXIST) code = _files.sync(_objects.get());
    if (code != 0) return fileError(code, "can't make a folder for", objectPath(object));
    shard = openFolder(_objects.get(), shardOf(object).c_str());
    if (!shard) return fileError(errno, "can't open the folder of", objectPath(object));
  }
  int code = _files.renameOver(_incoming.get(), incoming, shard.get(), object);
  if (code == 0) code = _files.sync(shard.get());
  return code == 0 ? nullptr : fileError(code, "can't write to the cloud", objectPath(object));
}

std::string CloudContents::objectPath(const std::string& object) const {
  return _folder + "/objects/" + pathOf(object);
}

bool CloudContents::contains(const HashedContents& contents) const {
  struct stat status {};
  return fstatat(_objects.get(), pathOf(contents.hash.asString()).c_str(), &status,
                 AT_SYMLINK_NOFOLLOW) == 0 &&
         S_ISREG(status.st_mode) && static_cast<std::uint64_t>(status.st_size) == contents.size;
}

std::optional<CloudContents::Hold> CloudContents::hold(const HashedContents& contents) {
  Hold hold = takeHold(contents.hash);
  if (!contains(contents) && !_drives.empty()) takeOver(contents);
  if (!contains(contents)) return std::nullopt;
  return hold;
}

Outcome<FileDescriptor> CloudContents::read(const ContentHash& hash) const {
  const std::string object = hash.asString();
  FileDescriptor file(
      openat(_objects.get(), pathOf(object).c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
  if (!file) return fileError(errno, "can't read from the cloud", objectPath(object));
  return file;
}

NSErrorPtr CloudContents::verify(const ContentHash& hash, StreamObserver& observer) const {
  auto file = read(hash);
  if (!file) return file.error();
  const auto found = hashContents(file->get(), hash.asString(), observer);
  if (!found) return found.error();
  return found->hash == hash ? nullptr : corruptError(hash.asString());
}

NSErrorPtr CloudContents::list(const std::function<NSErrorPtr(const HashedContents&)>& each) {
  std::vector<std::string> shards;
  if (const int code = entries(_objects.get(), shards)) {
    return fileError(code, "can't read the cloud's folder", _folder + "/objects");
  }
  for (const std::string& shard : shards) {
    const FileDescriptor folder = openFolder(_objects.get(), shard.c_str());
    std::vector<std::string> names;
    if (const int code = folder ? entries(folder.get(), names) : errno) {
      return fileError(code, "can't read the cloud's folder", _folder + "/objects/" + shard);
    }
    for (const std::string& name : names) {
      const auto hash = ContentHash::parse(name);
      struct stat status {};
      if (!hash || fstatat(folder.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 ||
          isHeld(*hash)) {
        continue;
      }
      NSErrorPtr error = each({*hash, static_cast<std::uint64_t>(status.st_size)});
      if (error != nullptr) return error;
    }
  }
  return nullptr;
}

Outcome<CloudContents::Garbage> CloudContents::remove(const std::vector<ContentHash>& contents,
                                                      const Release& release) {
  std::vector<ContentHash> unheld;
  for (const ContentHash& hash : contents) {
    if (beginCollecting(hash)) unheld.push_back(hash);
  }
  const auto released = release(unheld);
  const auto freed = released ? unlinkAll(*released) : Outcome<Garbage>(released.error());
  endCollecting(unheld);
  return freed;
}

Outcome<CloudContents::Garbage> CloudContents::unlinkAll(const std::vector<ContentHash>& contents) {
  Garbage garbage;
  for (const ContentHash& hash : contents) {
    const std::string object = hash.asString();
    struct stat status {};
    const FileDescriptor shard = openFolder(_objects.get(), shardOf(object).c_str());
    int code = shard && fstatat(shard.get(), object.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0
                   ? 0
                   : errno;
    if (code == 0) code = _files.unlink(shard.get(), object);
    if (code == ENOENT) continue;
    if (code != 0) return fileError(code, "can't remove from the cloud", objectPath(object));
    garbage += {1, static_cast<std::uint64_t>(status.st_size)};
  }
  return garbage;
}

CloudContents::Hold CloudContents::takeHold(const ContentHash& hash) {
  MutexLock lock(_mutex);
  while (_collecting.contains(hash)) _collected.wait(_mutex);
  ++_holds[hash];
  return {this, hash};
}

void CloudContents::releaseHold(const ContentHash& hash) {
  MutexLock lock(_mutex);
  if (const auto held = _holds.find(hash); --held->second == 0) _holds.erase(held);
}

bool CloudContents::beginCollecting(const ContentHash& hash) {
  MutexLock lock(_mutex);
  return !_holds.contains(hash) && _collecting.insert(hash).second;
}

void CloudContents::endCollecting(const std::vector<ContentHash>& contents) {
  MutexLock lock(_mutex);
  for (const ContentHash& hash : contents) _collecting.erase(hash);
  _collected.notifyAll();
}

bool CloudContents::isHeld(const ContentHash& hash) {
  MutexLock lock(_mutex);
  return _holds.contains(hash);
}

}  // namespace skein::vald
