#include "linux/framework/DocumentURLScope.h"

#include <algorithm>
#include <cstddef>
#include <utility>

#include "base/Mutex.h"

namespace skein {
namespace {

// vald's answer, or that there is none.
struct Answer {
  void set(std::vector<NSURLPtr> found) SKEIN_EXCLUDES(mutex) {
    MutexLock lock(mutex);
    urls = std::move(found);
    isThere = true;
    came.notifyAll();
  }

  Mutex mutex;
  CondVar came;
  bool isThere SKEIN_GUARDED_BY(mutex) = false;
  std::vector<NSURLPtr> urls SKEIN_GUARDED_BY(mutex);
};

const DocumentURLScope*& scopeOfThread() {
  thread_local const DocumentURLScope* scope = nullptr;
  return scope;
}

}  // namespace

DocumentURLScope::DocumentURLScope(const Proxies& daemon, Executor& executor,
                                   const std::vector<VLFileObjectID>& documents) {
  const auto answer = std::make_shared<Answer>();
  daemon([answer](const NSErrorPtr&) {
    answer->set({});
  })->URLsForFileObjectIDs(documents, [answer](std::vector<NSURLPtr> urls, const NSErrorPtr&) {
    answer->set(std::move(urls));
  });
  {
    ScopedWait wait(executor);
    MutexLock lock(answer->mutex);
    while (!answer->isThere) answer->came.wait(answer->mutex);
    const std::size_t known = std::min(documents.size(), answer->urls.size());
    _urls.reserve(known);
    for (std::size_t at = 0; at < known; ++at) {
      if (answer->urls[at]) _urls.emplace(documents[at], std::move(answer->urls[at]));
    }
  }
  scopeOfThread() = this;
}

DocumentURLScope::~DocumentURLScope() { scopeOfThread() = nullptr; }

NSURLPtr DocumentURLScope::find(const VLFileObjectID& document) {
  const DocumentURLScope* scope = scopeOfThread();
  if (scope == nullptr) return nullptr;
  const auto found = scope->_urls.find(document);
  // A copy: the extension may attach the physical property to what it is given.
  return found != scope->_urls.end() ? found->second->copy() : nullptr;
}

}  // namespace skein
