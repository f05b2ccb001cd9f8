#pragma once

#include <map>
#include <memory>
#include <string>

#include "base/Mutex.h"
#include "linux/vald/Store.h"
#include "linux/vald/StoreWriter.h"
#include "linux/vald/index/IndexReader.h"

namespace skein::vald {

// The store over a real folder. Reads are answered from the index on the calling thread;
// what has to be looked at first goes through the writer.
class FolderStore final : public Store {
 public:
  // As Store::open.
  static std::unique_ptr<FolderStore> openFolder(StoreOptions options, StoreListener& listener,
                                                 Log& log, NSErrorOut error);

  Page listFolder(std::optional<VLFileObjectID> folder, SortOrder order, std::uint64_t offset,
                  std::uint64_t limit, NSErrorOut error) override;
  Page listAllFolders(SortOrder order, std::uint64_t offset, std::uint64_t limit,
                      NSErrorOut error) override;
  VLQueryItemPtr itemWithID(VLFileObjectID id, NSErrorOut error) override;
  VLQueryItemPtr itemAtPath(const std::string& path, bool scanFirst, NSErrorOut error) override;
  std::optional<std::string> pathForID(VLFileObjectID id, NSErrorOut error) override;
  std::uint64_t currentRank() override { return _writer->rank(); }
  ChangePage changesSince(std::uint64_t rank, std::uint64_t limit, NSErrorOut error) override
      SKEIN_EXCLUDES(_mutex);
  std::string journalID() override { return _journalID; }
  void retainFolderWatch(VLFileObjectID folder) override;
  void releaseFolderWatch(VLFileObjectID folder) override;
  void setContainers(std::vector<StoreRoot> containers) override;
  void tellAnew(VLFileObjectID id, bool withContents) override;
  void status(LocalDaemonStatus& status) override { _writer->status(status); }
  std::vector<IndexDifference> check(std::uint64_t limit) override;
  std::optional<std::string> setting(const std::string& key) override;
  void setSetting(const std::string& key, std::optional<std::string> value) override;
  bool settle(std::chrono::milliseconds deadline) override { return _writer->settle(deadline); }

  // For tests: as the kernel does when its queue is full.
  void loseEvents(bool on) { _writer->watcher().loseEvents(on); }

 private:
  FolderStore(StoreOptions options, RootFolder drive, std::string journalID);

  // Looks at a folder that was not read yet, or is not watched. False with an error when
  // it cannot be read.
  bool ensureRead(const FolderRow& folder, bool isFirstPage, NSErrorOut error);
  Page list(const FolderRow& folder, SortOrder order, std::uint64_t offset, std::uint64_t limit,
            NSErrorOut error);
  std::optional<std::string> pathOfFolder(IndexReader& reader, FolderKey folder);
  bool storeFailure(IndexReaders::Lease& reader, NSErrorOut error);
  bool rootIsThere(NSErrorOut error);

  const StoreOptions _options;
  const RootFolder _drive;
  const std::string _journalID;
  IndexReaders _readers;
  ListingPlaces _places;

  Mutex _mutex;
  // Full listings through the journal that are under way below the oldest valid rank: the
  // rank that each has reached, and the newest rank when it began.
  std::map<std::uint64_t, std::uint64_t> _listings SKEIN_GUARDED_BY(_mutex);
  std::unique_ptr<StoreWriter> _writer;
};

}  // namespace skein::vald
