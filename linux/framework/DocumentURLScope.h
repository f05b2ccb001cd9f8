#pragma once

#include <functional>
#include <memory>
#include <unordered_map>
#include <vector>

#include "base/Executor.h"
#include "linux/protocol/LocalDaemon.h"

namespace skein {

// Finds out where many documents are before the extension asks one after the other: on this
// thread, until the scope ends, vl_documentURLFromFileObjectID answers from what vald said at
// the scope's beginning. A batch then waits for vald once, and not once for each item.
//
// One scope per thread at a time; it must be short, since what it knows gets old.
class DocumentURLScope {
 public:
  using Proxies =
      std::function<std::shared_ptr<LocalDaemon>(std::function<void(NSErrorPtr)> errorHandler)>;

  // Asks for all of them in one message and waits for the answer; `executor` learns of the wait.
  // What vald cannot tell is asked for again when the extension asks.
  DocumentURLScope(const Proxies& daemon, Executor& executor,
                   const std::vector<VLFileObjectID>& documents);
  ~DocumentURLScope();
  DocumentURLScope(const DocumentURLScope&) = delete;
  DocumentURLScope& operator=(const DocumentURLScope&) = delete;

  // The calling thread's answer; null without one.
  static NSURLPtr find(const VLFileObjectID& document);

 private:
  std::unordered_map<VLFileObjectID, NSURLPtr> _urls;
};

}  // namespace skein
