// The waits for the disk of this program, SQLite's too. They are counted and do not happen: a
// crash of the process leaves what the kernel has, synced or not.
#pragma once

#include <cstdint>

namespace skein::vald {

std::uint64_t diskWaits();

}  // namespace skein::vald
