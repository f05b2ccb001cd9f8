#pragma once

#include <atomic>
#include <cstdint>

#include "linux/vald/files/FileLayer.h"

namespace skein::vald {

// Counts the changing calls and, at the chosen one, fails it or ends the process as a
// crash would: for tests, and for a vald that was started with fault injection allowed.
class FaultyFileLayer : public FileLayer {
 public:
  // The n-th call from now on (1 is the next) answers `error` and changes nothing;
  // `andAllAfter`: so does every later one, as on a disk that stays full. 0 disarms.
  void failAt(std::uint64_t n, int error, bool andAllAfter = false);
  // The process ends at the n-th call, before the call is made, without any cleaning up.
  void crashAt(std::uint64_t n);

  // From now on this is a file system that has no rename without replacing.
  void renameReplaces() { _renameReplaces = true; }

  // Calls since the last arming.
  std::uint64_t steps() const { return _steps; }
  // Whether the armed fault was met.
  bool met() const { return _steps >= _at && _at != 0; }

  static constexpr int kCrashStatus = 86;  // of a process that crashAt() ended

 protected:
  int beforeStep(FileStep step, std::string_view name) override;
  int renameKeeping(int at, const std::string& name, int newAt,
                    const std::string& newName) override;

 private:
  void arm(std::uint64_t n, int error, bool crash, bool andAllAfter);

  std::atomic<std::uint64_t> _steps{0};
  std::atomic<std::uint64_t> _at{0};
  std::atomic<int> _error{0};
  std::atomic<bool> _crash{false};
  std::atomic<bool> _andAllAfter{false};
  std::atomic<bool> _renameReplaces{false};
};

}  // namespace skein::vald
