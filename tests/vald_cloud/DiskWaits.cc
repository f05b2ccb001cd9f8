#include "tests/vald_cloud/DiskWaits.h"

#include <unistd.h>

#include <atomic>

namespace skein::vald {
namespace {

std::atomic<std::uint64_t> waits{0};

int count() {
  ++waits;
  return 0;
}

}  // namespace

std::uint64_t diskWaits() { return waits; }

}  // namespace skein::vald

// In place of the system's.
extern "C" {
int fsync(int) { return skein::vald::count(); }
int fdatasync(int) { return skein::vald::count(); }
int syncfs(int) noexcept { return skein::vald::count(); }
}
