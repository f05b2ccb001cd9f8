#pragma once

#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "linux/protocol/FileDescriptor.h"
#include "platform/log/Log.h"

namespace skein::vald {

// Tells when desktop entries may have changed: watches folders of them, subfolders too,
// and where a folder is missing, the nearest one above it that exists.
class ApplicationsWatcher {
 public:
  // `onChange` runs on the watcher's thread, once after the watch stands and then after
  // each run of changes that `quiet` has followed, without a change. It returns soon.
  // Installing an app is many changes in a row; a run that never ends is told all the
  // same. Where nothing can be watched, the log says so and what it costs.
  ApplicationsWatcher(std::vector<std::string> folders, std::chrono::milliseconds quiet,
                      std::function<void()> onChange, Log& log);
  // Ends the thread; `onChange` does not run any more afterwards.
  ~ApplicationsWatcher();
  ApplicationsWatcher(const ApplicationsWatcher&) = delete;
  ApplicationsWatcher& operator=(const ApplicationsWatcher&) = delete;

 private:
  void run();
  FileDescriptor watchAll();
  // Waits for a change; false when the watcher is to end.
  bool waitForChange(int watches) const;
  // Waits until it has been quiet.
  bool waitForQuiet(int watches) const;

  const std::vector<std::string> _folders;
  const std::chrono::milliseconds _quiet;
  const std::function<void()> _onChange;
  Log& _log;
  const FileDescriptor _stop;
  std::thread _thread;
};

}  // namespace skein::vald
