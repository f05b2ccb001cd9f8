#include "linux/vald/files/FileLease.h"

#include <fcntl.h>

#include <cerrno>
#include <csignal>

namespace skein::vald {

int FileLease::take(int file) {
  giveUp();
  // Who waits is asked for with isUndisturbed(). The signal that would tell is one that is
  // ignored unless somebody handles it; the one sent otherwise would end the process.
  if (fcntl(file, F_SETSIG, SIGURG) != 0) return errno;
  if (fcntl(file, F_SETLEASE, F_RDLCK) != 0) return errno;
  _file = file;
  return 0;
}

// A lease that somebody waits for shows as what it is to become.
bool FileLease::isUndisturbed() const { return _file >= 0 && fcntl(_file, F_GETLEASE) == F_RDLCK; }

void FileLease::giveUp() {
  if (_file >= 0) fcntl(std::exchange(_file, -1), F_SETLEASE, F_UNLCK);
}

}  // namespace skein::vald
