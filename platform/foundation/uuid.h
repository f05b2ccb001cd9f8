#pragma once

#include <array>
#include <cstdint>

namespace skein {

using uuid_t = std::array<std::uint8_t, 16>;

// Fills `out` with a fresh random (version 4) uuid.
void uuid_generate(uuid_t& out);

// Negative, zero or positive, byte by byte from the first.
int uuid_compare(const uuid_t& a, const uuid_t& b);

}  // namespace skein
