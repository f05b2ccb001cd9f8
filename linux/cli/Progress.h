#pragma once

#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <string>
#include <utility>

#include "linux/cli/Session.h"

namespace skein::cli {

// How far a long command is, for a person who waits: on a terminal, after a second.
class Progress {
 public:
  ~Progress() { clear(); }

  void show(const std::string& text);
  void clear();

 private:
  const bool _terminal = isatty(STDERR_FILENO) == 1;
  const std::chrono::steady_clock::time_point _begin = std::chrono::steady_clock::now();
  bool _shown = false;
};

// "1.5 GB"; bytes below a thousand as they are.
std::string sizeText(std::uint64_t bytes);

// Follows a transfer to its end, showing how far it is; its last step, or why it failed. A
// signal that is noted cancels it, and the answer is what became of it.
std::pair<HostTransferStep, NSErrorPtr> followTransfer(
    const std::shared_ptr<HostTransfer>& transfer, const std::string& name);

}  // namespace skein::cli
