// The cloud, as a test writes it: operations are held until the test hands out their records
// and ends them. All of it goes into the transcript.
#pragma once

#include <deque>
#include <memory>
#include <string>

#include "base/Mutex.h"
#include "platform/cloudkit/CloudKit.h"
#include "platform/quicklook/QLThumbnailStoreRetrievalOperation.h"
#include "tests/support/HeldCalls.h"
#include "tests/support/Transcript.h"
#include "vellum/VLThumbnailTransfer.h"

namespace skein {

class ScriptedFetch final : public CKFetchRecordsOperation {
 public:
  explicit ScriptedFetch(Transcript& transcript) : _transcript(transcript) {}

  void cancel() override;

  // A record of the operation's, or the error of fetching it, on this thread.
  void record(const std::string& name, std::map<std::string, CKRecord::Value> fields);
  void fail(const std::string& name, const NSErrorPtr& error);
  // The operation's end. Like a database, lets go of the blocks.
  void finish(const NSErrorPtr& error = nullptr);
  int cancellations = 0;

 private:
  CKRecordID recordID(const std::string& name) const;

  Transcript& _transcript;
};

class ScriptedDatabase final : public CKDatabase {
 public:
  ScriptedDatabase(std::string name, Transcript& transcript)
      : _name(std::move(name)), _transcript(transcript) {}
  std::shared_ptr<CKFetchRecordsOperation> fetchRecordsOperation() override;
  void addOperation(std::shared_ptr<CKFetchRecordsOperation> operation) override;

  // Takes the oldest operation. Throws when there is none.
  std::shared_ptr<ScriptedFetch> next();

 private:
  const std::string _name;
  Transcript& _transcript;
  std::deque<std::shared_ptr<ScriptedFetch>> _operations;
};

class ScriptedCloud final : public CKContainers {
 public:
  explicit ScriptedCloud(Transcript& transcript);
  std::shared_ptr<CKContainer> containerWithIdentifier(const std::string& identifier) override;

  ScriptedDatabase& privateDatabase;
  ScriptedDatabase& sharedDatabase;

 private:
  struct Container;
  explicit ScriptedCloud(std::shared_ptr<Container> container, Transcript& transcript);

  const std::shared_ptr<Container> _container;
  Transcript& _transcript;
};

// What decides whether a file is downloaded for its thumbnail, and the download. Starts are
// answered at once, on the asking thread, unless the test holds them.
class ScriptedThumbnailTransfer final : public QLThumbnailStoreRetrievalOperation,
                                        public VLRemoteUserDefaults,
                                        public VLDownloads {
 public:
  ScriptedThumbnailTransfer(Transcript& transcript, CallLedger& ledger)
      : starts(ledger), _transcript(transcript) {}

  bool canMostRecentClientsGenerateThumbnailsForUTI(
      const std::optional<std::string>& typeIdentifier) override;
  std::int64_t minFileSizeForThumbnailTransfer() override { return largestFile; }
  void VLStartDownloadForItemsWithOptions(const std::vector<NSURLPtr>& items, std::uint64_t options,
                                          UniqueFunction<void(NSErrorPtr)> completion) override;

  std::string renderableType = "text/plain";
  std::int64_t largestFile = 100;
  bool holdsStarts = false;
  NSErrorPtr startError;
  HeldCalls<NSErrorPtr> starts;

 private:
  Transcript& _transcript;
};

}  // namespace skein
