#include "platform/foundation/uuid.h"

#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>

namespace skein {

void uuid_generate(uuid_t& out) {
  if (getentropy(out.data(), out.size()) != 0) {
    // A kernel without random numbers: no two of this process are equal all the same.
    static std::atomic<std::uint64_t> count{0};
    const std::uint64_t words[] = {
        static_cast<std::uint64_t>(std::chrono::system_clock::now().time_since_epoch().count()),
        ++count};
    std::memcpy(out.data(), words, out.size());
  }
  out[6] = static_cast<std::uint8_t>((out[6] & 0x0F) | 0x40);
  out[8] = static_cast<std::uint8_t>((out[8] & 0x3F) | 0x80);
}

int uuid_compare(const uuid_t& a, const uuid_t& b) {
  return std::memcmp(a.data(), b.data(), a.size());
}

}  // namespace skein
