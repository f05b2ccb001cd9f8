#include "linux/vald/files/LockHolder.h"

#include <sys/sysmacros.h>

#include <cstdio>
#include <fstream>
#include <string>

namespace skein::vald {

pid_t lockHolderOf(const struct stat& file) {
  char wanted[64];
  std::snprintf(wanted, sizeof(wanted), "%02x:%02x:%llu ", major(file.st_dev), minor(file.st_dev),
                static_cast<unsigned long long>(file.st_ino));
  std::ifstream locks("/proc/locks");
  for (std::string line; std::getline(locks, line);) {
    // "12: FLOCK  ADVISORY  WRITE 4711 fe:00:1234 0 EOF"; waiters have "->" in between.
    if (line.find("->") != std::string::npos || line.find(wanted) == std::string::npos) continue;
    long holder = 0;
    if (std::sscanf(line.c_str(), "%*s %*s %*s %*s %ld", &holder) == 1 && holder > 0) {
      return static_cast<pid_t>(holder);
    }
  }
  return 0;
}

}  // namespace skein::vald
