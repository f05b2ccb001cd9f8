#pragma once

#include <cstdint>

namespace skein::thumbnailer {

// Decodes and writes a tiny picture of each kind, so that all code and data that this takes
// is loaded: afterwards nothing is opened any more but fonts. Answers the kinds for which that
// worked, as the greeting has them. Once, before the process is locked down.
std::uint32_t warmUp();

}  // namespace skein::thumbnailer
