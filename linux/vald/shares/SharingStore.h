#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/Store.h"
#include "linux/vald/shares/SharedItems.h"

namespace skein::vald {

// Hands on what a store tells, with the shared items marked. Made before the store, whose
// listener it is, and outlives it. `shared` and `listener` outlive this.
class SharingListener final : public StoreListener {
 public:
  SharingListener(SharedItems& shared, StoreListener& listener)
      : _shared(shared), _listener(listener) {}

  // Where folders are looked up; null when the store is about to go. Without one, what is
  // below a shared folder is not marked.
  void setStore(Store* store) SKEIN_EXCLUDES(_mutex);
  // Called on the store's writer thread with a folder that was moved into or out of a shared
  // one: whether what it holds is shared has changed, of which the store knows nothing.
  void setCoverageHandler(std::function<void(VLFileObjectID)> handler) SKEIN_EXCLUDES(_mutex);

  void storeDidChange(const std::vector<StoreChange>& changes) override SKEIN_EXCLUDES(_mutex);
  void storeDidOverflow(std::optional<VLFileObjectID> folder) override {
    _listener.storeDidOverflow(folder);
  }

 private:
  SharedItems& _shared;
  StoreListener& _listener;
  Mutex _mutex;
  Store* _store SKEIN_GUARDED_BY(_mutex) = nullptr;
  std::function<void(VLFileObjectID)> _coverageHandler SKEIN_GUARDED_BY(_mutex);
};

// A store whose items are marked as shared where they are; all else it hands on.
class SharingStore final : public Store {
 public:
  // `listener` is the store's; all three outlive this.
  SharingStore(Store& store, SharingListener& listener, SharedItems& shared);
  ~SharingStore() override;

  Page listFolder(std::optional<VLFileObjectID> folder, SortOrder order, std::uint64_t offset,
                  std::uint64_t limit, NSErrorOut error) override;
  Page listAllFolders(SortOrder order, std::uint64_t offset, std::uint64_t limit,
                      NSErrorOut error) override;
  VLQueryItemPtr itemWithID(VLFileObjectID id, NSErrorOut error) override;
  VLQueryItemPtr itemAtPath(const std::string& path, bool scanFirst, NSErrorOut error) override;
  ChangePage changesSince(std::uint64_t rank, std::uint64_t limit, NSErrorOut error) override;

  std::optional<std::string> pathForID(VLFileObjectID id, NSErrorOut error) override {
    return _store.pathForID(id, error);
  }
  std::vector<std::optional<std::string>> pathsForIDs(const std::vector<VLFileObjectID>& ids,
                                                      NSErrorOut error) override {
    return _store.pathsForIDs(ids, error);
  }
  std::uint64_t currentRank() override { return _store.currentRank(); }
  std::string journalID() override { return _store.journalID(); }
  void retainFolderWatch(VLFileObjectID folder) override { _store.retainFolderWatch(folder); }
  void releaseFolderWatch(VLFileObjectID folder) override { _store.releaseFolderWatch(folder); }
  void setContainers(std::vector<StoreRoot> containers) override {
    _store.setContainers(std::move(containers));
  }
  void tellAnew(VLFileObjectID id, bool withContents) override {
    _store.tellAnew(id, withContents);
  }
  void status(LocalDaemonStatus& status) override { _store.status(status); }
  std::vector<IndexDifference> check(std::uint64_t limit) override { return _store.check(limit); }
  std::optional<std::string> setting(const std::string& key) override {
    return _store.setting(key);
  }
  void setSetting(const std::string& key, std::optional<std::string> value) override {
    _store.setSetting(key, std::move(value));
  }
  bool settle(std::chrono::milliseconds deadline) override { return _store.settle(deadline); }

 private:
  SharedMarks marks() { return {_store, _shared.now()}; }

  SharingListener& _listener;
  SharedItems& _shared;
  Store& _store;
};

}  // namespace skein::vald
