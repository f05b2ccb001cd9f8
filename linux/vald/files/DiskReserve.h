#pragma once

#include <sys/types.h>

#include <string>

#include "linux/protocol/FileDescriptor.h"

namespace skein::vald {

// Room on a disk that is kept by a file, so that little can still be written when the disk is
// full: a database's next entries, and what else is written because of them. It is given up in
// parts, and taken again when there is room. One thread at a time.
class DiskReserve {
 public:
  // `size` bytes, given up `part` bytes at a time. The file at `path` is made when it is missing;
  // where that fails nothing is kept.
  DiskReserve(const std::string& path, off_t size, off_t part);

  // Takes all that is missing, when there is room for all of it.
  void take();
  bool isOn(dev_t disk) const;
  // Gives a part back to the disk; false when nothing is left.
  bool giveUp();

 private:
  FileDescriptor _file;
  const off_t _size;
  const off_t _part;
  off_t _kept = 0;  // bytes that the file has
};

}  // namespace skein::vald
