#include "linux/vald/scan/DocumentNumbers.h"

#include <sys/random.h>

#include <array>
#include <cstdlib>

namespace skein::vald {
namespace {

std::uint64_t mix(std::uint64_t value) {
  value += 0x9e3779b97f4a7c15ULL;
  value = (value ^ (value >> 30)) * 0xbf58476d1ce4e5b9ULL;
  value = (value ^ (value >> 27)) * 0x94d049bb133111ebULL;
  return value ^ (value >> 31);
}

}  // namespace

std::uint64_t drawDocumentNumber() {
  thread_local std::array<std::uint64_t, 32> pool{};
  thread_local std::size_t left = 0;
  if (left == 0) {
    // Up to 256 bytes come whole, or not at all when interrupted.
    while (getrandom(pool.data(), sizeof pool, 0) != static_cast<ssize_t>(sizeof pool)) {
    }
    left = pool.size();
  }
  return pool[--left];
}

std::uint64_t inodeNumber(const FileKey& key, std::uint32_t attempt) {
  const std::uint64_t plain = std::uint64_t{key.generation} << 32 | key.inode;
  if (attempt == 0 && key.inode <= 0xffffffffU) return plain;
  return mix(mix(key.inode + attempt) ^ key.generation);
}

}  // namespace skein::vald
