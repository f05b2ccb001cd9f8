// Faults of the system calls that look at a disk, which the file layer does not see: in a program
// that links ReadingFaults.cc they are taken in place of the calls.
#pragma once

#include <cstddef>
#include <string>

namespace skein::vald {

enum class ReadingCall {
  Open,
  Statx,
  Fstatat,
  Getdents,
  Readdir,
  Pread,
  CopyFileRange,
  Write,  // does not fail: takes `error` bytes at most
};

// From its construction to its end, calls about a path that holds `part`, for a file that is open
// the path that it has, answer `error`; the first `spared` of them do not. One at a time per call.
class ReadingFault {
 public:
  ReadingFault(ReadingCall call, std::string part, int error, int spared = 0);
  ~ReadingFault();
  ReadingFault(const ReadingFault&) = delete;
  ReadingFault& operator=(const ReadingFault&) = delete;

  // How many calls it was met by.
  int met() const;

 private:
  const ReadingCall _call;
};

}  // namespace skein::vald
