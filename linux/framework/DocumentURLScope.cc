#include "linux/framework/DocumentURLScope.h"

#include <cstddef>
#include <utility>

#include "base/Mutex.h"

namespace skein {
namespace {

// What vald answers, until the last answer or failure has come.
struct Answers {
  explicit Answers(std::size_t questions) : missing(questions) {}

  void add(const VLFileObjectID& document, NSURLPtr url) SKEIN_EXCLUDES(mutex) {
    MutexLock lock(mutex);
    if (url) urls.emplace(document, std::move(url));
    if (--missing == 0) came.notifyAll();
  }

  Mutex mutex;
  CondVar came;
  std::size_t missing SKEIN_GUARDED_BY(mutex);
  std::unordered_map<VLFileObjectID, NSURLPtr> urls SKEIN_GUARDED_BY(mutex);
};

const DocumentURLScope*& scopeOfThread() {
  thread_local const DocumentURLScope* scope = nullptr;
  return scope;
}

}  // namespace

DocumentURLScope::DocumentURLScope(const Proxies& daemon, Executor& executor,
                                   const std::vector<VLFileObjectID>& documents) {
  const auto answers = std::make_shared<Answers>(documents.size());
  for (const VLFileObjectID& document : documents) {
    daemon([answers, document](const NSErrorPtr&) {
      answers->add(document, nullptr);
    })->URLForFileObjectID(document, [answers, document](NSURLPtr url, const NSErrorPtr&) {
      answers->add(document, std::move(url));
    });
  }
  {
    ScopedWait wait(executor);
    MutexLock lock(answers->mutex);
    while (answers->missing > 0) answers->came.wait(answers->mutex);
    _urls = std::move(answers->urls);
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
