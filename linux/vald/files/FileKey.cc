#include "linux/vald/files/FileKey.h"

#include <fcntl.h>

#include <cerrno>
#include <cstring>
#include <limits>

namespace skein::vald {

int readFileKey(int folder, const std::string& name, FileKey& key) {
  const int flags = name.empty() ? AT_EMPTY_PATH : 0;
  struct statx status {};
  if (statx(folder, name.c_str(), flags | AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT,
            STATX_INO | STATX_BTIME, &status) != 0) {
    return errno;
  }
  key.inode = status.stx_ino;
  key.born = fileBirth(status);
  key.generation = fileGeneration(folder, name.c_str(), flags, key.inode);
  return 0;
}

std::int64_t nanosecondsOf(const statx_timestamp& time) {
  std::int64_t result = 0;
  if (__builtin_mul_overflow(time.tv_sec, std::int64_t{1'000'000'000}, &result) ||
      __builtin_add_overflow(result, std::int64_t{time.tv_nsec}, &result)) {
    return time.tv_sec < 0 ? std::numeric_limits<std::int64_t>::min() + 1
                           : std::numeric_limits<std::int64_t>::max();
  }
  return result;
}

// As the file's handle tells it.
std::uint32_t fileGeneration(int folder, const char* name, int flags, std::uint64_t inode) {
  alignas(file_handle) char storage[sizeof(file_handle) + MAX_HANDLE_SZ];
  auto* handle = reinterpret_cast<file_handle*>(storage);
  handle->handle_bytes = MAX_HANDLE_SZ;
  int mount = 0;
  if (name_to_handle_at(folder, name, handle, &mount, flags) != 0) return 0;
  constexpr int kInode32AndGeneration = 1;
  std::uint32_t words[2] = {};
  if (handle->handle_type == kInode32AndGeneration && handle->handle_bytes == sizeof words) {
    std::memcpy(words, storage + sizeof(file_handle), sizeof words);
    if (words[0] == inode && words[1] != 0) return words[1];
  }
  // Any other layout: the whole handle names the file, so a digest of it tells it from the
  // next owner of the inode.
  std::uint32_t digest = 2166136261U;
  const char* bytes = storage + sizeof(file_handle);
  for (unsigned i = 0; i < handle->handle_bytes; ++i) {
    digest = (digest ^ static_cast<unsigned char>(bytes[i])) * 16777619U;
  }
  return digest != 0 ? digest : 1;
}

std::int64_t fileBirth(const struct statx& status) {
  return (status.stx_mask & STATX_BTIME) != 0 ? nanosecondsOf(status.stx_btime) : 0;
}

}  // namespace skein::vald
