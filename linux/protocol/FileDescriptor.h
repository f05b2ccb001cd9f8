#pragma once

#include <unistd.h>

#include <utility>

namespace skein {

// An open file descriptor, or none (-1). Closes it when it goes.
class FileDescriptor {
 public:
  FileDescriptor() = default;
  explicit FileDescriptor(int descriptor) : _descriptor(descriptor) {}
  FileDescriptor(FileDescriptor&& other) noexcept
      : _descriptor(std::exchange(other._descriptor, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    if (this != &other) {
      reset();
      _descriptor = std::exchange(other._descriptor, -1);
    }
    return *this;
  }
  ~FileDescriptor() { reset(); }

  int get() const { return _descriptor; }
  explicit operator bool() const { return _descriptor >= 0; }
  // Gives the descriptor up to the caller.
  int release() { return std::exchange(_descriptor, -1); }
  void reset() {
    if (_descriptor >= 0) ::close(std::exchange(_descriptor, -1));
  }

 private:
  int _descriptor = -1;
};

}  // namespace skein
