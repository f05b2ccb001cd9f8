#include "tests/support/TestEnvironment.h"

#include <gtest/gtest.h>

#include "vellum/VLErrors.h"

namespace skein {

TestEnvironment::TestEnvironment(std::shared_ptr<Executor> other,
                                 NSFileProviderManager* otherManager,
                                 NSXPCListeners* otherListeners)
    : logSections(other ? other : executor),
      environment{log,
                  other ? std::move(other) : executor,
                  notificationCenter,
                  otherManager != nullptr ? *otherManager : framework.manager,
                  framework.accounts,
                  framework.containers,
                  framework.daemon,
                  framework.documents,
                  framework.queryItems,
                  logSections,
                  rootURL,
                  framework.fileOperations,
                  framework.fileManager,
                  framework.operations,
                  framework.cloud,
                  framework.transfer,
                  framework.transfer,
                  framework.transfer,
                  framework.bundles,
                  framework.sharing,
                  framework.resourceValues,
                  otherListeners != nullptr ? *otherListeners : framework.xpcListeners,
                  fileProviderLog} {
  framework.containers.add(VLUbiquitousDefaultContainerID, storeURL());
  _previousFaultHandler =
      setFaultHandler([](std::string_view text) { ADD_FAILURE() << "a fault: " << text; });
}

TestEnvironment::~TestEnvironment() {
  do {
    framework.dropConnection(vl_errorDaemonUnreachable("the test has ended"));
  } while (executor->runAll() > 0);
  setFaultHandler(std::move(_previousFaultHandler));
}

}  // namespace skein
