#include "linux/protocol/StandardDescriptors.h"

#include <fcntl.h>
#include <unistd.h>

#include "linux/protocol/FileDescriptor.h"

namespace skein {

void openStandardDescriptors() {
  for (const int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    // The lowest free number is the one that is closed: those below it are open by now. What it
    // is for goes on to fail.
    const int refused = standard == STDIN_FILENO ? O_WRONLY : O_RDONLY;
    if (fcntl(standard, F_GETFD) < 0) [[maybe_unused]]
      const int opened = open("/dev/null", refused);
  }
}

void releaseStandardDescriptors() {
  const FileDescriptor nothing(open("/dev/null", O_RDWR | O_CLOEXEC));
  if (!nothing) return;
  for (const int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    dup2(nothing.get(), standard);
  }
}

}  // namespace skein
