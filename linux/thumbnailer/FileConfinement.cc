#include "linux/thumbnailer/FileConfinement.h"

#include <fcntl.h>
#include <linux/landlock.h>
#include <sys/syscall.h>
#include <unistd.h>

#include "linux/protocol/FileDescriptor.h"

namespace skein::thumbnailer {
namespace {

constexpr __u64 kReading = LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_READ_DIR;
// What the first kernels with Landlock know to forbid, in one run of bits.
constexpr __u64 kEverything = (LANDLOCK_ACCESS_FS_MAKE_SYM << 1) - 1;

}  // namespace

bool confineFilesTo(const std::vector<std::string>& folders) {
  landlock_ruleset_attr attributes{};
  attributes.handled_access_fs = kEverything;
  const FileDescriptor rules(static_cast<int>(
      syscall(SYS_landlock_create_ruleset, &attributes, sizeof attributes.handled_access_fs, 0)));
  if (!rules) return false;
  for (const std::string& folder : folders) {
    const FileDescriptor place(open(folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!place) continue;
    landlock_path_beneath_attr below{};
    below.allowed_access = kReading;
    below.parent_fd = place.get();
    if (syscall(SYS_landlock_add_rule, rules.get(), LANDLOCK_RULE_PATH_BENEATH, &below, 0) != 0) {
      return false;
    }
  }
  return syscall(SYS_landlock_restrict_self, rules.get(), 0) == 0;
}

}  // namespace skein::thumbnailer
