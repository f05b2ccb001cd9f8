#include "linux/vald/shares/SharingStore.h"

#include <utility>

namespace skein::vald {

// ---- what the store tells

void SharingListener::setStore(Store* store) {
  MutexLock lock(_mutex);
  _store = store;
}

void SharingListener::setCoverageHandler(std::function<void(VLFileObjectID)> handler) {
  MutexLock lock(_mutex);
  _coverageHandler.swap(handler);
}

void SharingListener::storeDidChange(const std::vector<StoreChange>& changes) {
  const auto shared = _shared.now();
  Store* store = nullptr;
  std::function<void(VLFileObjectID)> coverageHandler;
  {
    MutexLock lock(_mutex);
    store = _store;
    coverageHandler = _coverageHandler;
  }
  if (store == nullptr || shared->items.empty()) {
    _listener.storeDidChange(changes);
    return;
  }
  // The store's reading side answers on any thread, this one included.
  SharedMarks marks(*store, shared);
  std::vector<StoreChange> marked = changes;
  for (StoreChange& change : marked) {
    change.item = marks.marked(change.item);
    const bool hasMoved = change.item->isFolder() && change.previousFolder != change.folder;
    if (hasMoved && coverageHandler &&
        marks.coversChildrenOf(change.previousFolder) != marks.coversChildrenOf(change.folder)) {
      coverageHandler(change.item->fileObjectID());
    }
  }
  _listener.storeDidChange(marked);
}

// ---- what the store is asked

SharingStore::SharingStore(Store& store, SharingListener& listener, SharedItems& shared)
    : _listener(listener), _shared(shared), _store(store) {
  _listener.setStore(&_store);
}

SharingStore::~SharingStore() { _listener.setStore(nullptr); }

Page SharingStore::listFolder(std::optional<VLFileObjectID> folder, SortOrder order,
                              std::uint64_t offset, std::uint64_t limit, NSErrorOut error) {
  Page page = _store.listFolder(folder, order, offset, limit, error);
  marks().mark(page.items);
  return page;
}

Page SharingStore::listAllFolders(SortOrder order, std::uint64_t offset, std::uint64_t limit,
                                  NSErrorOut error) {
  Page page = _store.listAllFolders(order, offset, limit, error);
  marks().mark(page.items);
  return page;
}

VLQueryItemPtr SharingStore::itemWithID(VLFileObjectID id, NSErrorOut error) {
  return marks().marked(_store.itemWithID(id, error));
}

VLQueryItemPtr SharingStore::itemAtPath(const std::string& path, bool scanFirst, NSErrorOut error) {
  return marks().marked(_store.itemAtPath(path, scanFirst, error));
}

ChangePage SharingStore::changesSince(std::uint64_t rank, std::uint64_t limit, NSErrorOut error) {
  ChangePage page = _store.changesSince(rank, limit, error);
  SharedMarks marks = this->marks();
  for (StoreChange& change : page.changes) change.item = marks.marked(change.item);
  return page;
}

}  // namespace skein::vald
