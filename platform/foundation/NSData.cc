#include "platform/foundation/NSData.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace skein {
namespace {

// All there is from the file's start on, `expected` bytes as a first guess.
std::optional<std::vector<std::uint8_t>> readToEnd(int file, std::size_t expected) {
  // One more, so that a file that is as long as it said ends in one read.
  std::vector<std::uint8_t> bytes(expected + 1);
  std::size_t length = 0;
  for (;;) {
    if (length == bytes.size()) bytes.resize(bytes.size() * 2);
    const ssize_t got = read(file, bytes.data() + length, bytes.size() - length);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return std::nullopt;
    if (got == 0) break;
    length += static_cast<std::size_t>(got);
  }
  bytes.resize(length);
  return bytes;
}

}  // namespace

std::optional<NSData> NSData::dataWithContentsOfURL(const NSURLPtr& url) {
  if (!url) return std::nullopt;
  const int file = open(url->path().c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) return std::nullopt;
  struct stat status {};
  const bool isFile = fstat(file, &status) == 0 && S_ISREG(status.st_mode);
  auto bytes = isFile ? readToEnd(file, static_cast<std::size_t>(status.st_size)) : std::nullopt;
  close(file);
  if (!bytes) return std::nullopt;
  NSData data;
  data._bytes = std::move(*bytes);
  return data;
}

}  // namespace skein
