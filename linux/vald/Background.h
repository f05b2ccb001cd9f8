#pragma once

#include <string>

#include "linux/protocol/FileDescriptor.h"

namespace skein::vald {

// Goes on in a process of its own, away from the terminal, while the first one waits to
// hear how the start went. Before any thread is started.
class Background {
 public:
  // Returns in the new process alone. The first one ends: with 0 after isReady(), with the
  // message and 1 after failed(), and with 1 and `log`'s name when neither came.
  static Background enter(const std::string& log);

  // Without a background (--foreground): failures go to standard error.
  Background() = default;

  void isReady();
  void failed(const std::string& message);

 private:
  explicit Background(FileDescriptor report) : _report(std::move(report)), _entered(true) {}

  FileDescriptor _report;
  bool _entered = false;
};

}  // namespace skein::vald
