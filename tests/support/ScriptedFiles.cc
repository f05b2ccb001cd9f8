#include "tests/support/ScriptedFiles.h"

#include <stdexcept>

#include "platform/log/Description.h"

namespace skein {
namespace {

template <class T>
T valueAt(const std::map<std::string, T>& map, const NSURLPtr& url) {
  const auto found = url ? map.find(url->path()) : map.end();
  return found != map.end() ? found->second : T();
}

std::string inQuotes(const std::optional<std::string>& text) {
  return text ? "\"" + *text + "\"" : "nil";
}

}  // namespace

void ScriptedFileOperations::hold(const std::string& call, VLURLHandler handler) {
  _transcript.add("files: " + call);
  const auto shared = std::make_shared<VLURLHandler>(std::move(handler));
  results.hold([shared](NSURLPtr url, NSErrorPtr error) { (*shared)(url, error); },
               [shared](const NSErrorPtr& error) { (*shared)(nullptr, error); });
}

void ScriptedFileOperations::fp_importUnderFolder(const NSURLPtr& url, const NSURLPtr& folder,
                                                  VLURLHandler handler) {
  hold("import " + description(url) + " under " + description(folder), std::move(handler));
}

void ScriptedFileOperations::fp_createSubFolder(const NSURLPtr& url, const std::string& name,
                                                VLURLHandler handler) {
  hold("create " + inQuotes(name) + " under " + description(url), std::move(handler));
}

void ScriptedFileOperations::fp_renameWithNewName(const NSURLPtr& url, const std::string& newName,
                                                  VLURLHandler handler) {
  hold("rename " + description(url) + " to " + inQuotes(newName), std::move(handler));
}

void ScriptedFileOperations::fp_reparentUnderFolder_withNewName(const NSURLPtr& url,
                                                                const NSURLPtr& folder,
                                                                std::optional<std::string> newName,
                                                                VLURLHandler handler) {
  hold("move " + description(url) + " under " + description(folder) + " as " + inQuotes(newName),
       std::move(handler));
}

void ScriptedFileOperations::fp_reparentUnderFolder_allowBouncing(const NSURLPtr& url,
                                                                  const NSURLPtr& folder,
                                                                  bool allowBouncing,
                                                                  VLURLHandler handler) {
  hold("move " + description(url) + " under " + description(folder) +
           (allowBouncing ? ", bouncing" : ", not bouncing"),
       std::move(handler));
}

void ScriptedFileOperations::fp_deleteWithCompletionHandler(
    const NSURLPtr& url, UniqueFunction<void(NSErrorPtr)> handler) {
  _transcript.add("files: delete " + description(url));
  const auto shared = std::make_shared<UniqueFunction<void(NSErrorPtr)>>(std::move(handler));
  const auto answer = [shared](const NSErrorPtr& error) { (*shared)(error); };
  deletions.hold(answer, answer);
}

void ScriptedFileOperations::fp_coordinatedDeleteWithHandler(const NSURLPtr& url,
                                                             VLURLHandler handler) {
  _transcript.add("files: coordinate the deletion of " + description(url));
  handler(coordinatedURL ? *coordinatedURL : url, coordinationError);
}

std::uint64_t ScriptedFileOperations::vl_capabilityToMoveToURL(const NSURLPtr& url,
                                                               const NSURLPtr& toURL,
                                                               NSErrorOut error) {
  _transcript.add("files: may " + description(url) + " become " + description(toURL));
  if (capabilityError) error.store(capabilityError);
  return capability;
}

bool ScriptedFileOperations::vl_setTagNames(const NSURLPtr& url,
                                            const std::vector<std::string>& names,
                                            NSErrorOut error) {
  _transcript.add("files: tag " + description(url) + " " + description(names));
  if (url && tagError) error.store(tagError);
  return url && setsTags;
}

NSURLPtr ScriptedFileOperations::vl_physicalURL(const NSURLPtr& url) {
  return valueAt(physicalURLs, url);
}

bool ScriptedFileOperations::vl_isPromiseURL(const NSURLPtr& url) {
  return url && promises.contains(url->path());
}

std::shared_ptr<const VLContainer> ScriptedFileOperations::vl_vellumContainer(const NSURLPtr& url) {
  return valueAt(containers, url);
}

bool ScriptedFileOperations::checkResourceIsReachable(const NSURLPtr& url, NSErrorOut /*error*/) {
  return url && reachable.contains(url->path());
}

bool ScriptedFileManager::evictUbiquitousItemAtURL(const NSURLPtr& url, NSErrorOut error) {
  _transcript.add("file manager: evict " + description(url));
  if (evictError) error.store(evictError);
  return url && !evictError;
}

bool ScriptedFileManager::vl_trashItemAtURL(const NSURLPtr& url, NSURLPtr* resultingURL,
                                            NSErrorOut error) {
  _transcript.add("file manager: trash " + description(url));
  if (resultingURL != nullptr) *resultingURL = trashedURL;
  if (trashError) error.store(trashError);
  return trashes;
}

NSURLPtr ScriptedFileManager::vl_putBackURLForTrashedItemAtURL(const NSURLPtr& url,
                                                               NSErrorOut error) {
  _transcript.add("file manager: where was " + description(url));
  if (putBackError) error.store(putBackError);
  return valueAt(putBackURLs, url);
}

void ScriptedFileManager::vl_setLastOpenDate(std::optional<NSDate> date,
                                             const NSURLPtr& onItemAtURL) {
  _transcript.add("file manager: date " + description(date) + " on " + description(onItemAtURL));
}

void ScriptedFileManager::vl_setFavoriteRank(std::optional<std::int64_t> rank,
                                             const NSURLPtr& onItemAtURL) {
  _transcript.add("file manager: rank " + description(rank) + " on " + description(onItemAtURL));
}

void ScriptedProvidingOperation::start() {
  _transcript.add("operation: start " + _name);
  {
    MutexLock lock(_mutex);
    _running = true;
  }
  if (isCancelled()) {
    finish(NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError));
  } else if (_started) {
    _started(shared_from_this());
  }
}

void ScriptedProvidingOperation::cancel() {
  _transcript.add("operation: cancel " + _name);
  NSOperation::cancel();
  {
    MutexLock lock(_mutex);
    if (!_running) return;
  }
  finish(NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError));
}

void ScriptedProvidingOperation::setFileProvidingCompletion(
    UniqueFunction<void(NSErrorPtr)> completion) {
  MutexLock lock(_mutex);
  std::swap(_completion, completion);
}

bool ScriptedProvidingOperation::finish(const NSErrorPtr& error) {
  UniqueFunction<void(NSErrorPtr)> completion;
  {
    MutexLock lock(_mutex);
    std::swap(_completion, completion);
  }
  if (!completion) return false;
  completion(error);
  return true;
}

std::shared_ptr<VLFileProvidingOperation> ScriptedOperations::fileProvidingOperation(
    const NSURLPtr& url, std::uint64_t readingOptions) {
  _transcript.add("operation: providing " + description(url) + " options " +
                  std::to_string(readingOptions));
  auto operation =
      std::make_shared<ScriptedProvidingOperation>(description(url), _transcript, started);
  if (started) return operation;
  MutexLock lock(_mutex);
  _made.push_back(operation);
  return operation;
}

std::shared_ptr<ScriptedProvidingOperation> ScriptedOperations::next() {
  MutexLock lock(_mutex);
  if (_made.empty()) throw std::logic_error("no operation was made");
  auto operation = std::move(_made.front());
  _made.pop_front();
  return operation;
}

std::shared_ptr<const LSBundleProxy> ScriptedBundles::bundleProxyForIdentifier(
    const std::string& identifier) {
  class App final : public LSBundleProxy {
   public:
    explicit App(EntitlementValues entitlements) : _entitlements(std::move(entitlements)) {}
    EntitlementValues entitlementValuesForKeys(const std::set<std::string>& keys) const override {
      EntitlementValues values;
      for (const auto& [key, value] : _entitlements) {
        if (keys.contains(key)) values[key] = value;
      }
      return values;
    }

   private:
    const EntitlementValues _entitlements;
  };
  _transcript.add("apps: " + identifier);
  const auto found = apps.find(identifier);
  return found != apps.end() ? std::make_shared<App>(found->second) : nullptr;
}

}  // namespace skein
