#pragma once

#include <mutex>

#include "platform/foundation/NSURL.h"
#include "vellum/VLContainer.h"

namespace skein {

// The documents URL of the default container, found once per process on first need and
// kept, also when there was none.
class RootURL {
 public:
  // Null when the default container had no documents folder at the first call. Any
  // thread; the first call may ask the daemon, others wait for it.
  NSURLPtr get(VLContainers& containers);

 private:
  std::once_flag _once;
  NSURLPtr _url;
};

}  // namespace skein
