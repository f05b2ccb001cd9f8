#include "linux/vald/files/FaultyFileLayer.h"

#include <unistd.h>

#include <cerrno>

namespace skein::vald {

void FaultyFileLayer::failAt(std::uint64_t n, int error, bool andAllAfter) {
  arm(n, error, false, andAllAfter);
}

void FaultyFileLayer::crashAt(std::uint64_t n) { arm(n, 0, true, false); }

void FaultyFileLayer::arm(std::uint64_t n, int error, bool crash, bool andAllAfter) {
  _error = error;
  _crash = crash;
  _andAllAfter = andAllAfter;
  _steps = 0;
  _at = n;
}

int FaultyFileLayer::beforeStep(FileStep, std::string_view) {
  const std::uint64_t step = ++_steps;
  const std::uint64_t at = _at;
  if (at == 0 || step < at || (step > at && !_andAllAfter)) return 0;
  if (_crash) ::_exit(kCrashStatus);
  return _error;
}

int FaultyFileLayer::renameKeeping(int at, const std::string& name, int newAt,
                                   const std::string& newName) {
  return _renameReplaces ? EINVAL : FileLayer::renameKeeping(at, name, newAt, newName);
}

}  // namespace skein::vald
