#include "support/VLLogSection.h"

namespace skein {

std::uint64_t VLLogSections::create(VLLogSectionLevel level) {
  return _queue.sync([&] {
    std::uint64_t candidate = _last + 1;
    const bool isDebug = candidate % 2 == 1;
    if (isDebug != (level == VLLogSectionLevel::Debug)) ++candidate;
    _last = candidate;
    return candidate;
  });
}

void vlc_closeLogSection(Log& log, std::uint64_t section) {
  if (section == 0) return;
  // Both texts end in one space, on purpose.
  if (section % 2 == 1) {
    VL_DEBUG(log, "[DEBUG] ┗%llx ", section);
  } else {
    VL_INFO(log, "[INFO] ┗%llx ", section);
  }
}

}  // namespace skein
