#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

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
  std::vector<std::optional<std::string>> pathsForIDs(const std::vector<VLFileObjectID>& ids,
                                                      NSErrorOut error) override;
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

  // What the operations on files need beside reading. Any thread; waits for the writer.

  // Looks at these absolute paths as at one change, so that an answer that follows tells of
  // them as they are now. Folders that were not read yet are left to their scan.
  void lookAtPaths(const std::vector<std::string>& paths) { beginLookAtPaths(paths)(); }
  // The same; what is answered waits for it, and is called before the store goes.
  std::function<void()> beginLookAtPaths(const std::vector<std::string>& paths);
  // An item is about to be moved by copying it: from now on until one of the two below, nothing
  // that is seen at these absolute paths tells what became of it. Nil when the index does not know
  // both folders yet.
  std::optional<StoreWriter::Copy> expectCopy(const std::string& from, const std::string& to);
  // It is the item from now on, with all that is in it. False: it is another one.
  bool takeCopy(const StoreWriter::Copy& copy);
  void forgetCopy(const StoreWriter::Copy& copy);
  // Looks at what happened up to now on disk in the path's folder and in all that are watched.
  // An item that moved is found where it is thereby.
  void catchUp(const std::string& path);
  // An item that lives in a folder, and the file that it is.
  struct KnownItem {
    VLQueryItemPtr item;
    std::string path;  // absolute
    FileKey file;
  };
  std::optional<KnownItem> knownItem(VLFileObjectID id);
  // Changes what the index alone keeps of an item; durable when it returns.
  NSErrorPtr changeDetails(VLFileObjectID id, std::function<void(ItemDetails&)> change);
  ItemDetails details(VLFileObjectID id);
  // The tags after `after` with the number of their items, by name, as many as a page holds.
  std::vector<std::pair<std::string, std::uint64_t>> tagsInUse(const std::string& after);
  // What lies in the roots' trashes, unordered.
  struct Trashed {
    VLFileObjectID id = VLFileObjectID::documentWithRawID(0);
    std::int64_t changed = 0;  // the file's time of change, in nanoseconds since 1970
  };
  std::vector<Trashed> trashedItems(NSErrorOut error);
  // What the store saw go from a path, newest first.
  struct Removal {
    VLFileObjectID id = VLFileObjectID::documentWithRawID(0);
    NSDate when;
  };
  std::vector<Removal> removalsAt(const std::string& path, std::uint64_t limit);

  // Documents after `rank` in whose upload nothing is known to be in order.
  struct Unsettled {
    VLFileObjectID id = VLFileObjectID::documentWithRawID(0);
    std::string path;  // absolute
    std::uint64_t size = 0;
  };
  // `rank` moves to where to go on from; it stays when there are no more.
  std::vector<Unsettled> unsettledAfter(std::uint64_t& rank, std::uint64_t limit);
  // Whether the document is uploaded as it stands on disk.
  bool isSettled(VLFileObjectID id);
  void noteUploads(std::vector<UploadedFile> files);
  bool isReadingAttributes() const { return _writer->isReadingAttributes(); }

  // For tests: as the kernel does when its queue is full.
  void loseEvents(bool on) { _writer->watcher().loseEvents(on); }

 private:
  FolderStore(StoreOptions options, RootFolder drive, std::string journalID);

  // Looks at a folder that was not read yet; for a first page, also at what happened in it up to
  // now. False with an error when it cannot be read, or not in time.
  bool ensureRead(const FolderRow& folder, bool isFirstPage, NSErrorOut error);
  // Of the folder that an alias of this identifier leads to; nil when there is none.
  std::optional<VLFileObjectID> targetOfAlias(VLFileObjectID id);
  Page list(const FolderRow& folder, SortOrder order, std::uint64_t offset, std::uint64_t limit,
            NSErrorOut error);
  // The root, or its trash, that a path lies in, and the way from there.
  std::optional<FolderRow> rootAbove(IndexReader& reader, const std::string& path,
                                     std::string& rest);
  // The folder that a path's item is in and its name; nil for roots and for what is not read.
  std::optional<StoreWriter::Place> placeOf(IndexReader& reader, const std::string& path);
  std::optional<StoreWriter::Copy> copyOf(const std::string& from, const std::string& to);
  VLQueryItemPtr trashItem(IndexReader& reader, const FolderRow& trash);
  VLQueryItemPtr driveItem(const FolderRow& folder, NSErrorOut error);
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
