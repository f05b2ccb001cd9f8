#pragma once

#include <memory>
#include <utility>

#include "linux/framework/SyncCall.h"
#include "vellum/VLFileOperations.h"

namespace skein {

// Operations that ask vald. They report on the executor, or on the thread that starts a
// cancelled one: once, however they end. Cancelling one that runs reaches vald, whose answer
// is the operation's: NSUserCancelledError, or success where the file has just appeared.
//
// An operation reports to the RequestProgress of the thread that made it.
class LocalOperations final : public VLOperations {
 public:
  explicit LocalOperations(DaemonAccess access) : _access(std::move(access)) {}

  std::shared_ptr<VLFileProvidingOperation> fileProvidingOperation(
      const NSURLPtr& url, std::uint64_t readingOptions) override;

 private:
  const DaemonAccess _access;
};

}  // namespace skein
