// A store without a disk: a tree in memory that a test changes, journalled and told to
// the listener as the real one does.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/Store.h"

namespace skein::vald {

// On one thread at a time, but for the folder watches.
class FakeStore final : public Store {
 public:
  // What survives a reopening.
  using Settings = std::map<std::string, std::string>;

  FakeStore(std::string root, StoreListener& listener, Settings& settings);

  VLFileObjectID root() const { return _root; }
  VLFileObjectID addFolder(const std::string& name, VLFileObjectID parent);
  VLFileObjectID addFile(const std::string& name, VLFileObjectID parent);
  void touch(VLFileObjectID id);
  void move(VLFileObjectID id, VLFileObjectID to);
  void remove(VLFileObjectID id);

  // Forgets the journal up to `rank`.
  void forgetUpTo(std::uint64_t rank) { _forgotten = rank; }

  Page listFolder(std::optional<VLFileObjectID> folder, SortOrder order, std::uint64_t offset,
                  std::uint64_t limit, NSErrorOut error) override;
  Page listAllFolders(SortOrder order, std::uint64_t offset, std::uint64_t limit,
                      NSErrorOut error) override;
  VLQueryItemPtr itemWithID(VLFileObjectID id, NSErrorOut error) override;
  VLQueryItemPtr itemAtPath(const std::string& path, bool scanFirst, NSErrorOut error) override;
  std::optional<std::string> pathForID(VLFileObjectID id, NSErrorOut error) override;
  std::vector<std::optional<std::string>> pathsForIDs(const std::vector<VLFileObjectID>& ids,
                                                      NSErrorOut error) override;
  std::uint64_t currentRank() override { return _journal.size(); }
  ChangePage changesSince(std::uint64_t rank, std::uint64_t limit, NSErrorOut error) override;
  std::string journalID() override { return journal; }
  void retainFolderWatch(VLFileObjectID folder) override { addWatch(folder, 1); }
  void releaseFolderWatch(VLFileObjectID folder) override { addWatch(folder, -1); }
  void setContainers(std::vector<StoreRoot> roots) override { containers = std::move(roots); }
  void tellAnew(VLFileObjectID id, bool withContents) override;
  void status(LocalDaemonStatus& status) override { status.documents = _nodes.size(); }
  std::vector<IndexDifference> check(std::uint64_t limit) override;
  std::optional<std::string> setting(const std::string& key) override;
  void setSetting(const std::string& key, std::optional<std::string> value) override;
  bool settle(std::chrono::milliseconds) override { return true; }

  std::string journal = "7d0c5f0e-7a55-4e0f-9a51-0a5b9f9a2f11";
  // How many watches are retained. Any thread.
  int watches(VLFileObjectID folder) { return addWatch(folder, 0); }
  std::vector<StoreRoot> containers;
  std::uint64_t lastLimit = 0;  // of the latest listing or change request

 private:
  struct Node {
    VLQueryItem::Properties item;
    VLFileObjectID parent;
  };

  int addWatch(VLFileObjectID folder, int count) SKEIN_EXCLUDES(_watchMutex) {
    MutexLock lock(_watchMutex);
    return _watches[folder] += count;
  }
  VLFileObjectID add(const std::string& name, VLFileObjectID parent, VLQueryItem::Kind kind);
  void record(VLQueryItem::Properties item, VLFileObjectID folder, VLFileObjectID previous);
  Page page(const std::map<std::string, VLQueryItemPtr>& sorted, std::uint64_t offset,
            std::uint64_t limit);

  const std::string _path;
  StoreListener& _listener;
  Settings& _settings;
  const VLFileObjectID _root = VLFileObjectID::folderOrAliasWithRawID(1);
  std::uint64_t _lastRawID = 1;
  std::uint64_t _forgotten = 0;
  std::map<VLFileObjectID, Node> _nodes;
  std::vector<StoreChange> _journal;
  Mutex _watchMutex;
  std::map<VLFileObjectID, int> _watches SKEIN_GUARDED_BY(_watchMutex);
};

}  // namespace skein::vald
