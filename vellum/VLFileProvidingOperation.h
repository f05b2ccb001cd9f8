#pragma once

#include "base/Completion.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSOperation.h"

namespace skein {

// Makes one document's contents present on disk. Any thread.
class VLFileProvidingOperation : public NSOperation {
 public:
  // Whether contents that are present but not current are fetched again.
  virtual void setWantsCurrentVersion(bool wantsCurrentVersion) = 0;

  // Set before the operation is queued. Called once, on the operation's thread, also when
  // it was cancelled before it started; null when the contents are there.
  virtual void setFileProvidingCompletion(Completion<NSErrorPtr> completion) = 0;
};

}  // namespace skein
