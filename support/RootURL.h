#pragma once

#include <cstdint>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "platform/foundation/NSURL.h"
#include "vellum/VLContainer.h"

namespace skein {

// The documents URL of the default container, found once per process on first need and
// kept, also when the container has none.
class RootURL {
 public:
  // Null when the default container has no documents folder, or is not in the table: then the
  // daemon could not be asked, nothing is kept, and the next call asks again. Any thread; the
  // first call asks the daemon, and those that come meanwhile wait for its answer, which they
  // declare to `executor`.
  NSURLPtr get(VLContainers& containers, Executor& executor) SKEIN_EXCLUDES(_mutex);

 private:
  NSURLPtr _waitForAnswer(Executor& executor) SKEIN_EXCLUDES(_mutex);

  Mutex _mutex;
  CondVar _answered;
  bool _isKnown SKEIN_GUARDED_BY(_mutex) = false;
  bool _isAsking SKEIN_GUARDED_BY(_mutex) = false;
  std::uint64_t _answers SKEIN_GUARDED_BY(_mutex) = 0;
  NSURLPtr _url SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
