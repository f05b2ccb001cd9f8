#include "tests/vald/FakeStore.h"

#include <algorithm>
#include <memory>
#include <utility>

#include "linux/vald/DrivePath.h"

namespace skein::vald {

FakeStore::FakeStore(std::string root, StoreListener& listener, Settings& settings)
    : _path(std::move(root)), _listener(listener), _settings(settings) {
  Node node{{}, _root};
  node.item.fileObjectID = _root;
  node.item.itemIdentifier = NSFileProviderRootContainerItemIdentifier;
  node.item.kind = VLQueryItem::Kind::Folder;
  _nodes.emplace(_root, node);
}

VLFileObjectID FakeStore::addFolder(const std::string& name, VLFileObjectID parent) {
  return add(name, parent, VLQueryItem::Kind::Folder);
}

VLFileObjectID FakeStore::addFile(const std::string& name, VLFileObjectID parent) {
  return add(name, parent, VLQueryItem::Kind::Document);
}

VLFileObjectID FakeStore::add(const std::string& name, VLFileObjectID parent,
                              VLQueryItem::Kind kind) {
  const VLFileObjectID id = kind == VLQueryItem::Kind::Folder
                                ? VLFileObjectID::folderOrAliasWithRawID(++_lastRawID)
                                : VLFileObjectID::documentWithRawID(++_lastRawID);
  Node node{{}, parent};
  node.item.fileObjectID = id;
  node.item.itemIdentifier = id.asString();
  node.item.filename = name;
  node.item.kind = kind;
  _nodes.emplace(id, node);
  record(node.item, parent, parent);
  return id;
}

void FakeStore::touch(VLFileObjectID id) {
  Node& node = _nodes.at(id);
  ++node.item.size;
  record(node.item, node.parent, node.parent);
}

void FakeStore::tellAnew(VLFileObjectID id, bool withContents) {
  const auto found = _nodes.find(id);
  if (found == _nodes.end()) return;
  record(found->second.item, found->second.parent, found->second.parent);
  if (!withContents) return;
  for (const auto& [child, node] : _nodes) {
    if (node.parent == id && child != id) tellAnew(child, true);
  }
}

void FakeStore::move(VLFileObjectID id, VLFileObjectID to) {
  Node& node = _nodes.at(id);
  const VLFileObjectID from = std::exchange(node.parent, to);
  record(node.item, to, from);
}

void FakeStore::remove(VLFileObjectID id) {
  const Node node = _nodes.at(id);
  _nodes.erase(id);
  VLQueryItem::Properties dead;
  dead.fileObjectID = id;
  dead.itemIdentifier = node.item.itemIdentifier;
  dead.isDead = true;
  record(dead, node.parent, node.parent);
}

void FakeStore::record(VLQueryItem::Properties item, VLFileObjectID folder,
                       VLFileObjectID previous) {
  _journal.push_back({_journal.size() + 1, std::make_shared<const VLQueryItem>(std::move(item)),
                      folder, previous});
  _listener.storeDidChange({_journal.back()});
}

Page FakeStore::page(const std::map<std::string, VLQueryItemPtr>& sorted, std::uint64_t offset,
                     std::uint64_t limit) {
  lastLimit = limit;
  Page page;
  std::uint64_t at = 0;
  for (const auto& [name, item] : sorted) {
    if (at >= offset && at < offset + limit) page.items.push_back(item);
    ++at;
  }
  if (offset + limit < at) page.nextOffset = offset + limit;
  return page;
}

Page FakeStore::listFolder(std::optional<VLFileObjectID> folder, SortOrder, std::uint64_t offset,
                           std::uint64_t limit, NSErrorOut error) {
  if (folder && !itemWithID(*folder, error)) return {};
  std::map<std::string, VLQueryItemPtr> sorted;
  for (const auto& [id, node] : _nodes) {
    if (id != _root && node.parent == folder.value_or(_root)) {
      sorted[node.item.filename] = std::make_shared<const VLQueryItem>(node.item);
    }
  }
  return page(sorted, offset, limit);
}

Page FakeStore::listAllFolders(SortOrder, std::uint64_t offset, std::uint64_t limit, NSErrorOut) {
  std::map<std::string, VLQueryItemPtr> sorted;
  for (const auto& [id, node] : _nodes) {
    if (node.item.kind == VLQueryItem::Kind::Folder && id != _root) {
      sorted[node.item.filename] = std::make_shared<const VLQueryItem>(node.item);
    }
  }
  return page(sorted, offset, limit);
}

VLQueryItemPtr FakeStore::itemWithID(VLFileObjectID id, NSErrorOut error) {
  const auto found = _nodes.find(id);
  if (found != _nodes.end()) return std::make_shared<const VLQueryItem>(found->second.item);
  error.store(noSuchFile("no item " + id.asString()));
  return nullptr;
}

VLQueryItemPtr FakeStore::itemAtPath(const std::string& path, bool, NSErrorOut error) {
  for (const auto& [id, node] : _nodes) {
    if (pathForID(id, nullptr) == path) return std::make_shared<const VLQueryItem>(node.item);
  }
  error.store(noSuchFile("no item at " + path));
  return nullptr;
}

std::optional<std::string> FakeStore::pathForID(VLFileObjectID id, NSErrorOut error) {
  if (id == _root) return _path;
  const auto found = _nodes.find(id);
  if (found == _nodes.end()) {
    error.store(noSuchFile("no item " + id.asString()));
    return std::nullopt;
  }
  const auto parent = pathForID(found->second.parent, error);
  if (!parent) return std::nullopt;
  return *parent + '/' + found->second.item.filename;
}

std::vector<std::optional<std::string>> FakeStore::pathsForIDs(
    const std::vector<VLFileObjectID>& ids, NSErrorOut) {
  std::vector<std::optional<std::string>> paths;
  paths.reserve(ids.size());
  for (const VLFileObjectID& id : ids) paths.push_back(pathForID(id, nullptr));
  return paths;
}

ChangePage FakeStore::changesSince(std::uint64_t rank, std::uint64_t limit, NSErrorOut) {
  lastLimit = limit;
  ChangePage page;
  page.newestRank = rank;
  page.expired = rank != 0 && rank < _forgotten;
  for (std::size_t at = rank; at < _journal.size() && page.changes.size() < limit; ++at) {
    const StoreChange& change = _journal[at];
    const bool hasLater =
        std::any_of(_journal.begin() + static_cast<std::ptrdiff_t>(at) + 1, _journal.end(),
                    [&change](const StoreChange& later) {
                      return later.item->fileObjectID() == change.item->fileObjectID();
                    });
    if (!hasLater) page.changes.push_back(change);
    page.newestRank = change.rank;
  }
  return page;
}

std::vector<IndexDifference> FakeStore::check(std::uint64_t limit) {
  lastLimit = limit;
  return {};
}

std::optional<std::string> FakeStore::setting(const std::string& key) {
  const auto found = _settings.find(key);
  if (found == _settings.end()) return std::nullopt;
  return found->second;
}

void FakeStore::setSetting(const std::string& key, std::optional<std::string> value) {
  if (value) {
    _settings[key] = *value;
  } else {
    _settings.erase(key);
  }
}

}  // namespace skein::vald
