#include "linux/vald/files/DiskReserve.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

namespace skein::vald {

DiskReserve::DiskReserve(const std::string& path, off_t size, off_t part)
    : _file(::open(path.c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0600)),
      _size(size),
      _part(part) {
  struct stat status {};
  if (!_file || ::fstat(_file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
    _file.reset();
    return;
  }
  _kept = status.st_size;
}

void DiskReserve::take() {
  if (!_file || _kept == _size) return;
  if (::posix_fallocate(_file.get(), 0, _size) == 0) {
    _kept = _size;
  } else {
    // What was allocated of the rest is for others.
    [[maybe_unused]] const int failure = ::ftruncate(_file.get(), _kept);
  }
}

bool DiskReserve::isOn(dev_t disk) const {
  struct stat status {};
  return _file && ::fstat(_file.get(), &status) == 0 && status.st_dev == disk;
}

bool DiskReserve::giveUp() {
  if (_kept == 0) return false;
  _kept = std::max<off_t>(_kept - _part, 0);
  return ::ftruncate(_file.get(), _kept) == 0;
}

}  // namespace skein::vald
