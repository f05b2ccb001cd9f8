#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>

#include "base/Mutex.h"
#include "platform/fileprovider/NSFileProviderExtension.h"
#include "platform/foundation/NSOperation.h"
#include "support/Environment.h"

namespace skein {

// The principal class's contents providing: makes a file's contents present, and lets them
// go. It downloads nothing itself: it starts the framework's operation and remembers it
// while it runs, so that a stop can cancel it.
//
// Called on the host's threads, several at once; operations report on theirs. Handlers are
// called, operations queued and cancelled without the lock.
class Contents {
 public:
  using ErrorCompletion = NSFileProviderExtension::ErrorCompletion;

  explicit Contents(Environment& environment) : _environment(environment) {}

  // providePlaceholderAtURL:completionHandler: succeeds at once: the store shows every file
  // by itself.
  static void providePlaceholder(ErrorCompletion completionHandler);

  // startProvidingItemAtURL:readingOptions:completionHandler:
  // Answers at once, before it returns, for a URL outside the synced location and for a
  // file that is present; else when the operation, which `queue` runs, has reported. `self`
  // keeps the extension alive until then.
  static void startProvidingItemAtURL(std::shared_ptr<Contents> self, const NSURLPtr& url,
                                      std::uint64_t readingOptions, NSOperationQueue& queue,
                                      ErrorCompletion completionHandler);

  // stopProvidingItemAtURL: cancels the file's download, or evicts the file when there is
  // none.
  void stopProvidingItemAtURL(const NSURLPtr& url) SKEIN_EXCLUDES(_lock);

  // itemChangedAtURL: the daemon watches the store and needs no telling.
  void itemChangedAtURL(const NSURLPtr& url);

 private:
  using Operation = std::shared_ptr<VLFileProvidingOperation>;

  void _store(const std::string& path, Operation operation) SKEIN_EXCLUDES(_lock);
  void _remove(const std::string& path) SKEIN_EXCLUDES(_lock);
  Operation _operationForPath(const std::string& path) SKEIN_EXCLUDES(_lock);
  void _operationDidComplete(const std::string& path, std::uint64_t section,
                             const NSErrorPtr& error, ErrorCompletion& completionHandler)
      SKEIN_EXCLUDES(_lock);

  Environment& _environment;
  Monitor _lock;
  // The download under way for a file's path, at most one, from its start to its report.
  std::map<std::string, Operation> _downloadOperationByPath SKEIN_GUARDED_BY(_lock);
};

}  // namespace skein
