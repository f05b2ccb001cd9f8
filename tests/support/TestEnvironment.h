#pragma once

#include <memory>

#include "base/Fault.h"
#include "support/Environment.h"
#include "tests/support/ManualExecutor.h"
#include "tests/support/ScriptedFramework.h"
#include "tests/support/Transcript.h"

namespace skein {

// A whole environment of scripted roles: the store at /store, somebody logged in, every
// log level on. A fault (a completion called twice or never, a queue that waits for
// itself) fails the test. At its end the connection drops, so that what a test left
// unanswered ends as in a dying process.
class TestEnvironment {
 public:
  // With the manual executor, `executor`, unless another one is given, and with the
  // framework's own manager and listeners unless others are.
  explicit TestEnvironment(std::shared_ptr<Executor> other = nullptr,
                           NSFileProviderManager* otherManager = nullptr,
                           NSXPCListeners* otherListeners = nullptr);
  ~TestEnvironment();

  // Runs what is posted, and answers what was recorded since the last time.
  Lines run() {
    executor->runAll();
    return transcript.take();
  }
  // The same without the log's lines.
  Lines runCalls() {
    executor->runAll();
    return transcript.takeCalls();
  }

  Transcript transcript;
  LogCapture log{transcript};
  // Its lines are told apart by "fp: " before them.
  LogCapture fileProviderLog{transcript, "fp: "};
  const std::shared_ptr<ManualExecutor> executor = std::make_shared<ManualExecutor>();
  NSNotificationCenter notificationCenter;
  ScriptedFramework framework{transcript};
  VLLogSections logSections;
  RootURL rootURL;
  Environment environment;

 private:
  FaultHandler _previousFaultHandler;
};

inline NSURLPtr storeURL(const std::string& below = "") {
  return NSURL::fileURLWithPath("/store" + below);
}

}  // namespace skein
