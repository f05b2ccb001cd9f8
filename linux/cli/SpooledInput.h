#pragma once

#include <memory>
#include <string>

#include "platform/foundation/NSError.h"

namespace skein::cli {

// Standard input as a private file with a name of choice, on the disk and never in memory;
// gone with this object, and when a signal ends the command.
class SpooledInput {
 public:
  // Reads standard input to its end into a folder below $TMPDIR, or /var/tmp. Null with an
  // error when that cannot be done.
  static std::unique_ptr<SpooledInput> read(const std::string& name, NSErrorOut error);
  ~SpooledInput();
  SpooledInput(const SpooledInput&) = delete;
  SpooledInput& operator=(const SpooledInput&) = delete;

  const std::string& path() const { return _path; }

 private:
  SpooledInput(std::string folder, std::string path);

  const std::string _folder;
  const std::string _path;
};

}  // namespace skein::cli
