#include "linux/vald/files/TreeComparison.h"

#include <fcntl.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <functional>
#include <map>
#include <string_view>
#include <utility>

#include "linux/vald/files/DocumentHint.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileLease.h"
#include "linux/vald/files/TreeWalk.h"

namespace skein::vald {
namespace {

constexpr std::size_t kPiece = std::size_t{1} << 20;
constexpr std::size_t kMostAttributeBytes = 65536;  // the system's limit, of the list as well
// Some file systems keep dates in steps of two seconds.
constexpr std::int64_t kDateStep = 2;

constexpr std::string_view kTop = "it";  // what the source is called where no error tells

using Attributes = std::map<std::string, std::string>;

// What a copy keeps of them. 0 or an errno.
int readAttributes(int file, Attributes& attributes) {
  std::string names(kMostAttributeBytes, '\0');
  const ssize_t length = ::flistxattr(file, names.data(), names.size());
  if (length < 0) return errno == ENOTSUP || errno == ENOSYS ? 0 : errno;
  names.resize(static_cast<std::size_t>(length));
  for (std::size_t at = 0; at < names.size();) {
    const std::string name(names.c_str() + at);
    at += name.size() + 1;
    const bool isKept = name.starts_with("user.") || name.starts_with("system.posix_acl_");
    if (!isKept || name == kHintAttribute) continue;
    std::string value(kMostAttributeBytes, '\0');
    const ssize_t size = ::fgetxattr(file, name.c_str(), value.data(), value.size());
    if (size < 0) return errno;
    value.resize(static_cast<std::size_t>(size));
    attributes.emplace(name, std::move(value));
  }
  return 0;
}

std::uint64_t mixed(std::uint64_t seed, std::uint64_t value) {
  seed ^= value + 0x9e3779b97f4a7c15ULL + (seed << 6) + (seed >> 2);
  return seed * 0xbf58476d1ce4e5b9ULL;
}

// One entry, so that a sum over all does not depend on their order. The first one's own date of
// change is left out: a rename changes it.
std::uint64_t printOf(std::string_view below, const struct stat& status) {
  std::uint64_t print = std::hash<std::string_view>()(below);
  const auto add = [&](auto value) { print = mixed(print, static_cast<std::uint64_t>(value)); };
  add(status.st_ino);
  add(status.st_mode);
  add(status.st_size);
  add(status.st_mtim.tv_sec);
  add(status.st_mtim.tv_nsec);
  if (!below.empty()) {
    add(status.st_ctim.tv_sec);
    add(status.st_ctim.tv_nsec);
  }
  return print;
}

// As much as there is, up to `piece`. Negative: errno tells.
ssize_t readPiece(int file, std::string& piece, off_t offset) {
  std::size_t got = 0;
  while (got < piece.size()) {
    const ssize_t count =
        ::pread(file, piece.data() + got, piece.size() - got, offset + static_cast<off_t>(got));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return -1;
    if (count == 0) break;
    got += static_cast<std::size_t>(count);
  }
  return static_cast<ssize_t>(got);
}

}  // namespace

class TreeComparison::Pairs final : public TreeWalk {
 public:
  Pairs(TreeComparison& comparison, const std::string& path, const DirectoryHandle& to,
        const std::string& newName)
      : _comparison(comparison), _length(path.size()), _to(to), _newName(newName) {}

  // What differs; empty while nothing does.
  const std::string& difference() const { return _difference; }

 private:
  const DirectoryHandle& copyFolder() const { return depth() == 0 ? _to : _copy; }
  const std::string& copyName(const std::string& name) const {
    return depth() == 0 ? _newName : name;
  }
  int differ(std::string what) {
    _difference = std::move(what);
    return EIO;
  }

  int visit(const DirectoryHandle& from, const std::string& name,
            const struct stat& status) override {
    if (!_comparison._goesOn()) return ECANCELED;
    _comparison._print += printOf(std::string_view(path()).substr(_length), status);
    struct stat copy {};
    const std::string& other = copyName(name);
    if (const int failure = copyFolder().status(other, copy)) return failure;
    if ((status.st_mode & S_IFMT) != (copy.st_mode & S_IFMT)) return differ("the copy is not it");
    if (status.st_uid != copy.st_uid) return differ("its owner can't be kept there");
    const std::int64_t apart = status.st_mtim.tv_sec - copy.st_mtim.tv_sec;
    if (apart > kDateStep || apart < -kDateStep) return differ("its dates can't be kept there");
    if (S_ISLNK(status.st_mode)) {
      std::string targets[2];
      int failure = from.readLink(name, targets[0]);
      if (failure == 0) failure = copyFolder().readLink(other, targets[1]);
      if (failure != 0) return failure;
      return targets[0] == targets[1] ? 0 : differ("the copy leads elsewhere");
    }
    if (status.st_gid != copy.st_gid) return differ("its group can't be kept there");
    if (status.st_mode != copy.st_mode) return differ("its permissions can't be kept there");
    return S_ISREG(status.st_mode) ? compareFiles(from, name, other) : 0;
  }

  int enter(const DirectoryHandle& from, const std::string& name) override {
    const bool isFirst = depth() == 1;
    DirectoryHandle below;
    int failure = (isFirst ? _to : _copy).openFolder(isFirst ? _newName : name, below);
    if (failure == 0) failure = compareAttributes(from.get(), below.get());
    _copy = std::move(below);
    return failure;
  }
  int leave(const DirectoryHandle&, bool) override {
    DirectoryHandle above;
    const int failure = _copy.openParent(above);
    _copy = std::move(above);
    return failure;
  }

  int compareFiles(const DirectoryHandle& from, const std::string& name, const std::string& other) {
    FileDescriptor source;
    FileDescriptor copy;
    int failure = from.openFile(name, source);
    if (failure == 0) failure = copyFolder().openFile(other, copy);
    if (failure == 0) failure = compareAttributes(source.get(), copy.get());
    if (failure != 0) return failure;
    // What is compared is what the disk has, not what memory still holds of the writing.
    ::posix_fadvise(copy.get(), 0, 0, POSIX_FADV_DONTNEED);
    std::string pieces[2];
    for (off_t at = 0;;) {
      if (!_comparison._goesOn()) return ECANCELED;
      for (std::string& piece : pieces) piece.resize(kPiece);
      const ssize_t counts[2] = {readPiece(source.get(), pieces[0], at),
                                 readPiece(copy.get(), pieces[1], at)};
      if (counts[0] < 0 || counts[1] < 0) return errno;
      for (int one = 0; one < 2; ++one) pieces[one].resize(static_cast<std::size_t>(counts[one]));
      if (pieces[0] != pieces[1]) return differ("the copy is not the same; it may have been saved");
      if (pieces[0].size() < kPiece) return 0;
      at += static_cast<off_t>(kPiece);
    }
  }

  int compareAttributes(int source, int copy) {
    Attributes attributes[2];
    int failure = readAttributes(source, attributes[0]);
    if (failure == 0) failure = readAttributes(copy, attributes[1]);
    if (failure != 0 || attributes[0] == attributes[1]) return failure;
    for (const auto& [name, value] : attributes[0]) {
      const auto kept = attributes[1].find(name);
      if (kept == attributes[1].end() || kept->second != value) {
        return differ("its attribute " + printable(name) + " can't be kept there");
      }
    }
    return differ("the copy has other attributes");
  }

  TreeComparison& _comparison;
  const std::size_t _length;  // of what the first one's path is called
  const DirectoryHandle& _to;
  const std::string& _newName;
  DirectoryHandle _copy;  // of the folder that is being read
  std::string _difference;
};

NSErrorPtr TreeComparison::compare(const DirectoryHandle& from, const std::string& name,
                                   const std::string& path, const DirectoryHandle& to,
                                   const std::string& newName) {
  Pairs pairs(*this, path, to, newName);
  const int failure = pairs.walk(from, name, path);
  if (failure == 0) return nullptr;
  if (pairs.difference().empty()) return fileError(failure, "can't move", pairs.path());
  return fileErrorWithWords(NSFileWriteUnknownError, failure,
                            "can't move \"" + printable(pairs.path()) + "\" to another volume: " +
                                pairs.difference() + "; bring in a copy and remove this one",
                            pairs.path());
}

class TreeComparison::Source final : public TreeWalk {
 public:
  std::uint64_t print() const { return _print; }

 private:
  int visit(const DirectoryHandle& folder, const std::string& name,
            const struct stat& status) override {
    _print += printOf(std::string_view(path()).substr(kTop.size()), status);
    if (!S_ISREG(status.st_mode)) return 0;
    FileDescriptor file;
    FileLease lease;
    if (const int failure = folder.openFile(name, file)) return failure;
    return lease.take(file.get()) == EAGAIN ? ETXTBSY : 0;
  }

  std::uint64_t _print = 0;
};

int TreeComparison::refusalOfSource(const DirectoryHandle& folder, const std::string& name) const {
  Source source;
  const int failure = source.walk(folder, name, std::string(kTop));
  if (failure != 0) return failure;
  return source.print() == _print ? 0 : ETXTBSY;
}

}  // namespace skein::vald
