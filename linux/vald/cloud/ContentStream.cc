#include "linux/vald/cloud/ContentStream.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>
#include <vector>

#include "linux/vald/files/FileErrors.h"

namespace skein::vald {
namespace {

constexpr std::uint64_t kWriteBehind = std::uint64_t{8} << 20;

// A piece of nothing but zeroes needs no block.
bool isHole(const char* data, std::size_t size) {
  constexpr std::size_t kBlock = 4096;
  return size >= kBlock && data[0] == 0 && std::memcmp(data, data + 1, size - 1) == 0;
}

// `write` answers an errno.
template <class Write>
Outcome<HashedContents> stream(int file, const std::string& name, StreamObserver& observer,
                               Write write) {
  if (NSErrorPtr stopped = observer.didPass(0)) return stopped;
  posix_fadvise(file, 0, 0, POSIX_FADV_SEQUENTIAL);
  std::vector<char> buffer(StreamObserver::kLargestPiece);
  ContentHasher hasher;
  std::uint64_t passed = 0;
  for (;;) {
    const std::size_t wanted =
        std::clamp<std::size_t>(observer.pieceSize(), 1, StreamObserver::kLargestPiece);
    const ssize_t got = pread(file, buffer.data(), wanted, static_cast<off_t>(passed));
    if (got < 0) {
      if (errno == EINTR) continue;
      return fileError(errno, "can't read", name);
    }
    if (got == 0) return HashedContents{hasher.finish(), passed};
    const auto size = static_cast<std::size_t>(got);
    observer.willPass(buffer.data(), size);
    hasher.update(buffer.data(), size);
    if (const int code = write(buffer.data(), size)) return fileError(code, "can't write", name);
    passed += size;
    if (NSErrorPtr stopped = observer.didPass(passed)) return stopped;
  }
}

}  // namespace

Outcome<HashedContents> hashContents(int file, const std::string& name, StreamObserver& observer) {
  return stream(file, name, observer, [](const char*, std::size_t) { return 0; });
}

Outcome<HashedContents> copyContents(FileLayer& files, int file, int target,
                                     const std::string& name, StreamObserver& observer) {
  std::uint64_t written = 0;
  std::uint64_t begun = 0;  // so far the disk was asked to write
  bool endsInHole = false;
  auto copied = stream(file, name, observer, [&](const char* data, std::size_t size) {
    endsInHole = isHole(data, size);
    if (endsInHole) {
      if (lseek(target, static_cast<off_t>(size), SEEK_CUR) < 0) return errno;
    } else if (const int failure = files.write(target, {data, size})) {
      return failure;
    }
    written += size;
    if (written - begun < kWriteBehind) return 0;
    return files.writeBehind(target, std::exchange(begun, written), written);
  });
  if (copied && endsInHole) {
    const int failure = files.setLength(target, static_cast<std::int64_t>(written));
    if (failure != 0) return fileError(failure, "can't write", name);
  }
  return copied;
}

int reserveSpace(FileLayer& files, int file, std::uint64_t size) {
  if (size == 0) return 0;
  if (const int refused = files.step(FileStep::Write, "reserve")) return refused;
  if (fallocate(file, FALLOC_FL_KEEP_SIZE, 0, static_cast<off_t>(size)) == 0) return 0;
  return errno == EOPNOTSUPP || errno == ENOSYS ? 0 : errno;
}

}  // namespace skein::vald
