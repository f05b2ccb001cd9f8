// Shares and resource values, as a test writes them. Operations are held until the test
// finishes them; the rest answers from public fields. All of it goes into the transcript.
#pragma once

#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <utility>

#include "base/Mutex.h"
#include "tests/support/Transcript.h"
#include "vellum/VLResourceValues.h"
#include "vellum/VLSharingOperations.h"

namespace skein {

// Reports once: when the test finishes it, or when it was cancelled, at its start or, once
// it runs, on the canceller's thread.
template <class Operation, class... Values>
class ScriptedShareOperation : public Operation {
 public:
  ScriptedShareOperation(std::string name, Transcript& transcript)
      : _name(std::move(name)), _transcript(transcript) {}

  void start() override SKEIN_EXCLUDES(_mutex) {
    _transcript.add("start " + _name);
    {
      MutexLock lock(_mutex);
      _running = true;
    }
    if (this->isCancelled()) {
      reportCancelled();
    } else if (onStart) {
      onStart();
    }
  }
  void cancel() override SKEIN_EXCLUDES(_mutex) {
    _transcript.add("cancel " + _name);
    NSOperation::cancel();
    {
      MutexLock lock(_mutex);
      if (!_running) return;
    }
    reportCancelled();
  }

  // False when it had reported before.
  bool finish(Values... values, NSErrorPtr error) SKEIN_EXCLUDES(_mutex) {
    Block block;
    {
      MutexLock lock(_mutex);
      std::swap(_block, block);
    }
    if (!block) return false;
    block(std::move(values)..., std::move(error));
    return true;
  }

  void reportCancelled() {
    finish(Values()..., NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError));
  }

  // Called as it starts; set before it is queued.
  std::function<void()> onStart;

 protected:
  using Block = UniqueFunction<void(Values..., NSErrorPtr)>;
  void setBlock(Block block) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    std::swap(_block, block);
  }

 private:
  const std::string _name;
  Transcript& _transcript;
  Mutex _mutex;
  bool _running SKEIN_GUARDED_BY(_mutex) = false;
  Block _block SKEIN_GUARDED_BY(_mutex);
};

struct ScriptedShareCopy final
    : ScriptedShareOperation<VLShareCopyOperation, CKSharePtr, std::optional<std::string>> {
  using ScriptedShareOperation::ScriptedShareOperation;
  void setRootShareCopyCompletionBlock(Block block) override { setBlock(std::move(block)); }
};
struct ScriptedCopyShareURL final : ScriptedShareOperation<VLShareCopyShareURLOperation, NSURLPtr> {
  using ScriptedShareOperation::ScriptedShareOperation;
  void setCopyShareURLCompletionBlock(Block block) override { setBlock(std::move(block)); }
};
struct ScriptedShareSave final : ScriptedShareOperation<VLShareSaveOperation, CKSharePtr> {
  using ScriptedShareOperation::ScriptedShareOperation;
  void setShareSaveCompletionBlock(Block block) override { setBlock(std::move(block)); }
};
struct ScriptedShareDestroy final : ScriptedShareOperation<VLShareDestroyOperation> {
  using ScriptedShareOperation::ScriptedShareOperation;
  void setShareDestroyCompletionBlock(Block block) override { setBlock(std::move(block)); }
};
struct ScriptedCopyToken final
    : ScriptedShareOperation<VLSharingCopyShareTokenOperation, std::optional<std::string>,
                             std::optional<std::string>> {
  using ScriptedShareOperation::ScriptedShareOperation;
  void setShareAndBaseTokenCompletionBlock(Block block) override { setBlock(std::move(block)); }
};

// The operations of one kind that were made, oldest first. Any thread.
template <class Operation>
class MadeOperations {
 public:
  void add(const std::shared_ptr<Operation>& operation) SKEIN_EXCLUDES(_mutex) {
    if (made) made(operation);
    MutexLock lock(_mutex);
    _operations.push_back(operation);
  }
  // Takes the oldest one. Throws when there is none.
  std::shared_ptr<Operation> next() SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    if (_operations.empty()) throw std::logic_error("no such operation was made");
    auto operation = std::move(_operations.front());
    _operations.pop_front();
    return operation;
  }

  // Those that are left report that they were cancelled.
  void drop() SKEIN_EXCLUDES(_mutex) {
    std::deque<std::shared_ptr<Operation>> left;
    {
      MutexLock lock(_mutex);
      left.swap(_operations);
    }
    for (const auto& operation : left) operation->reportCancelled();
  }

  // Called with each as it is made; set before threads are.
  std::function<void(const std::shared_ptr<Operation>&)> made;

 private:
  Mutex _mutex;
  std::deque<std::shared_ptr<Operation>> _operations SKEIN_GUARDED_BY(_mutex);
};

class ScriptedSharing final : public VLSharingOperations {
 public:
  explicit ScriptedSharing(Transcript& transcript) : _transcript(transcript) {}

  std::shared_ptr<VLShareCopyOperation> shareCopyOperation(const NSURLPtr& url) override;
  std::shared_ptr<VLShareCopyShareURLOperation> shareCopyShareURLOperation(
      const NSURLPtr& fileURL, const std::string& documentType) override;
  std::shared_ptr<VLShareSaveOperation> shareSaveOperation(CKSharePtr share) override;
  std::shared_ptr<VLShareDestroyOperation> shareDestroyOperation(CKSharePtr share) override;
  std::shared_ptr<VLSharingCopyShareTokenOperation> copyShareTokenOperation(
      const NSURLPtr& url) override;
  CKSharePtr VLSharingCreateShareForItemAtURL(const NSURLPtr& url, NSErrorOut error) override;

  // Every operation that is left reports.
  void drop() {
    copies.drop();
    urls.drop();
    saves.drop();
    destroys.drop();
    tokens.drop();
  }

  MadeOperations<ScriptedShareCopy> copies;
  MadeOperations<ScriptedCopyShareURL> urls;
  MadeOperations<ScriptedShareSave> saves;
  MadeOperations<ScriptedShareDestroy> destroys;
  MadeOperations<ScriptedCopyToken> tokens;

  CKSharePtr createdShare;
  NSErrorPtr createError;
  CKSharePtr lastSaved;  // what the newest save was made with

 private:
  template <class Operation>
  std::shared_ptr<Operation> make(MadeOperations<Operation>& made, const std::string& name);

  Transcript& _transcript;
};

class ScriptedResourceValues final : public VLResourceValues {
 public:
  explicit ScriptedResourceValues(Transcript& transcript) : _transcript(transcript) {}

  std::optional<bool> getResourceValue(const NSURLPtr& url, std::string_view forKey,
                                       NSErrorOut error) override;
  std::optional<bool> getPromisedItemResourceValue(const NSURLPtr& url, std::string_view forKey,
                                                   NSErrorOut error) override;
  std::optional<std::string> vl_typeIdentifierWithError(const NSURLPtr& url,
                                                        NSErrorOut error) override;

  std::map<std::string, bool> flags;         // by key and path: "KEY PATH"; NO when missing
  std::map<std::string, std::string> types;  // by path; "public.text" when missing
  NSErrorPtr error;                          // what every read fails with, when set

 private:
  std::optional<bool> flag(const NSURLPtr& url, std::string_view key, NSErrorOut out);

  Transcript& _transcript;
};

}  // namespace skein
