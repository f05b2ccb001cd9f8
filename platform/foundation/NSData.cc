#include "platform/foundation/NSData.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace skein {

// All there is from the file's start on, `expected` bytes as a first guess.
std::optional<NSData> NSData::dataWithRestOfFile(int file, std::size_t expected) {
  // One more, so that a file that is as long as it said ends in one read.
  std::size_t room = expected + 1;
  auto bytes = std::make_shared_for_overwrite<std::uint8_t[]>(room);
  NSData data;
  for (;;) {
    if (data._length == room) {
      auto larger = std::make_shared_for_overwrite<std::uint8_t[]>(room * 2);
      std::memcpy(larger.get(), bytes.get(), room);
      bytes = std::move(larger);
      room *= 2;
    }
    const ssize_t got = read(file, bytes.get() + data._length, room - data._length);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return std::nullopt;
    if (got == 0) break;
    data._length += static_cast<std::size_t>(got);
  }
  if (data._length > 0) data._bytes = std::move(bytes);
  return data;
}

std::optional<NSData> NSData::dataWithContentsOfURL(const NSURLPtr& url) {
  if (!url) return std::nullopt;
  const int file = open(url->path().c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) return std::nullopt;
  struct stat status {};
  const bool isFile = fstat(file, &status) == 0 && S_ISREG(status.st_mode);
  auto data =
      isFile ? dataWithRestOfFile(file, static_cast<std::size_t>(status.st_size)) : std::nullopt;
  close(file);
  return data;
}

}  // namespace skein
