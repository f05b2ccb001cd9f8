#include "platform/foundation/uuid.h"

#include <cstring>
#include <random>

namespace skein {

void uuid_generate(uuid_t& out) {
  std::random_device device;
  for (std::size_t i = 0; i < out.size(); i += sizeof(std::uint32_t)) {
    const std::uint32_t word = device();
    std::memcpy(&out[i], &word, sizeof word);
  }
  out[6] = static_cast<std::uint8_t>((out[6] & 0x0F) | 0x40);
  out[8] = static_cast<std::uint8_t>((out[8] & 0x3F) | 0x80);
}

int uuid_compare(const uuid_t& a, const uuid_t& b) {
  return std::memcmp(a.data(), b.data(), a.size());
}

}  // namespace skein
