#include "linux/vald/RandomToken.h"

#include <cstdint>
#include <string_view>

#include "platform/foundation/uuid.h"

namespace skein::vald {

std::string randomToken() {
  uuid_t uuid{};
  uuid_generate(uuid);
  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text;
  for (const std::uint8_t byte : uuid) {
    text += kDigits[byte >> 4];
    text += kDigits[byte & 15];
  }
  return text;
}

}  // namespace skein::vald
