#pragma once

#include <utility>

namespace skein::vald {

// A read lease on an open file: while it is held nobody has the file open for writing, and
// who opens it so waits until the lease is given up. Moves; one thread at a time.
class FileLease {
 public:
  FileLease() = default;
  FileLease(FileLease&& other) noexcept : _file(std::exchange(other._file, -1)) {}
  FileLease& operator=(FileLease&& other) noexcept {
    std::swap(_file, other._file);
    return *this;
  }
  ~FileLease() { giveUp(); }

  // `file` is open for reading alone and outlives the lease. 0; EAGAIN when somebody has
  // it open for writing; EACCES when it is not the caller's own; EINVAL and others where
  // the file system has no leases.
  int take(int file);
  // Whether nobody waits for the file to write to it.
  bool isUndisturbed() const;
  void giveUp();

 private:
  int _file = -1;
};

}  // namespace skein::vald
