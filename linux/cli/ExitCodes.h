#pragma once

#include <string>

#include "platform/foundation/NSError.h"

namespace skein::cli {

// What skein's exit codes mean; `skein --help` lists them.
enum ExitCode : int {
  kSuccess = 0,
  kFailure = 1,
  kUsage = 2,
  kNoSuchItem = 3,
  kNotAuthenticated = 4,
  kUnreachable = 5,
  kCollision = 6,
  kQuota = 7,
  kRefused = 8,
  kInterrupted = 130,
};

// The one table from errors to exit codes; the first underlying error that has a code of
// its own counts when the error itself has none.
ExitCode exitCodeFor(const NSErrorPtr& error);

// "CAUSE; NEXT STEP" for people, without a line end.
std::string textFor(const NSErrorPtr& error);

}  // namespace skein::cli
