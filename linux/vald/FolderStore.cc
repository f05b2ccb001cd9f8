#include "linux/vald/FolderStore.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <unordered_map>

#include "base/Numbers.h"
#include "linux/protocol/AnswerRoom.h"
#include "linux/vald/DrivePath.h"
#include "linux/vald/RandomToken.h"
#include "linux/vald/files/DatabaseFile.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/index/IndexFile.h"
#include "linux/vald/scan/StoreNames.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

constexpr char kJournalID[] = "journal";
constexpr std::size_t kMostListings = 1024;
// How long a listing waits for what changed: its caller waits little longer. A folder of which
// nothing is known yet is waited for.
constexpr auto kLongestCatchUp = std::chrono::seconds(3);
constexpr auto kLongestRead = std::chrono::seconds(60);

bool isOnDisk(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0;
}

std::string suffixOfRoot(std::uint64_t inode, std::uint32_t generation) {
  return ".of-" + std::to_string(inode) + "-" + std::to_string(generation);
}

// Volumes that take turns are few.
constexpr std::size_t kMostOfOtherFolders = 4;

// An index belongs to one folder. Found beside another (the volume is not mounted, a
// backup took the folder's place), it is put away under its folder's number, and taken
// back when that folder is there again.
std::unique_ptr<SqliteDatabase> openIndexOf(const RootFolder& drive, const std::string& path,
                                            Log& log, NSErrorOut error) {
  auto database = openIndexFile(path, log, error);
  if (!database) return nullptr;
  const auto inode = static_cast<std::uint64_t>(
      database->integer("SELECT inode FROM root WHERE container IS NULL"));
  const auto generation = static_cast<std::uint32_t>(
      database->integer("SELECT generation FROM root WHERE container IS NULL"));
  if (inode == 0 || (inode == drive.key.inode && generation == drive.key.generation)) {
    return database;
  }
  database.reset();
  const std::string suffix = suffixOfRoot(inode, generation);
  const std::string own = suffixOfRoot(drive.key.inode, drive.key.generation);
  VL_NOTICE(log, "[NOTICE] %@ is not the folder that the index knows; the index is kept as %@",
            drive.path, path + suffix);
  if (!setIndexFileAside(path, suffix)) {
    error.store(vl_errorWithPOSIXCode(
        errno, "The index of another folder at " + path + " could not be renamed."));
    return nullptr;
  }
  takeIndexFileBack(path, own);
  pruneSetAside(path, ".of-", kMostOfOtherFolders);
  return openIndexFile(path, log, error);
}

}  // namespace

std::unique_ptr<Store> Store::open(StoreOptions options, StoreListener& listener, Log& log,
                                   NSErrorOut error) {
  return FolderStore::openFolder(std::move(options), listener, log, error);
}

std::unique_ptr<FolderStore> FolderStore::openFolder(StoreOptions options, StoreListener& listener,
                                                     Log& log, NSErrorOut error) {
  int code = 0;
  const auto drive = findRoot(options.drive.path, code);
  if (!drive) {
    error.store(vl_errorWithPOSIXCode(code, "The drive's folder " + options.drive.path +
                                                " cannot be opened: " + std::strerror(code) + "."));
    return nullptr;
  }
  auto database = openIndexOf(*drive, options.databasePath, log, error);
  if (!database) return nullptr;
  IndexWriter index(*database);
  auto journalID = index.setting(kJournalID);
  const bool mayLackCommits = mayIndexLackCommits(*database);
  if (mayLackCommits) {
    VL_NOTICE(log,
              "[NOTICE] the machine went down while the index was open; whoever follows changes "
              "lists afresh");
  }
  if (!journalID || mayLackCommits) {
    journalID = randomToken();
    index.setSetting(kJournalID, journalID);
  }
  markIndexOpen(*database);
  if (database->failed()) {
    error.store(vl_errorWithPOSIXCode(
        indexLacksRoom(*database) ? ENOSPC : EIO,
        "The index " + options.databasePath + " cannot be used: " + database->message()));
    return nullptr;
  }
  auto store = std::unique_ptr<FolderStore>(new FolderStore(options, *drive, *journalID));
  std::vector<StoreWriter::Copy> copies;
  for (const auto& [from, to] : options.copies) {
    if (auto copy = store->copyOf(from, to)) copies.push_back(std::move(*copy));
  }
  store->_writer = std::make_unique<StoreWriter>(std::move(options), *drive, std::move(database),
                                                 std::move(copies), listener, log);
  // The roots stand in the index from here on.
  store->_writer->perform([] {});
  return store;
}

FolderStore::FolderStore(StoreOptions options, RootFolder drive, std::string journalID)
    : _options(std::move(options)),
      _drive(std::move(drive)),
      _journalID(std::move(journalID)),
      _readers(_options.databasePath) {}

bool FolderStore::storeFailure(IndexReaders::Lease& reader, NSErrorOut error) {
  if (reader && !reader->failed()) return false;
  error.store(vl_errorWithPOSIXCode(EIO, "The index " + _options.databasePath + " cannot be read" +
                                             (reader ? ": " + reader->message() : "") + "."));
  return true;
}

bool FolderStore::rootIsThere(NSErrorOut error) {
  struct stat status {};
  if (::stat(_drive.path.c_str(), &status) == 0 && status.st_ino == _drive.key.inode) return true;
  error.store(vl_errorWithPOSIXCode(
      ENOENT, "The drive's folder " + _drive.path +
                  " is missing: it was deleted, moved or unmounted. Put it back, or open the "
                  "drive where it is now."));
  return false;
}

// ---- listing

bool FolderStore::ensureRead(const FolderRow& folder, bool isFirstPage, NSErrorOut error) {
  if (folder.scanned && !isFirstPage) return true;
  Look look = Look::Unreadable;
  int code = EIO;
  auto answer = std::make_shared<std::pair<Look, int>>(look, code);
  const bool isDone = _writer->perform(
      [this, answer, key = folder.number, isScanned = folder.scanned] {
        answer->first = isScanned ? _writer->catchUp(key, answer->second)
                                  : _writer->lookAtFolder(key, answer->second);
      },
      folder.scanned ? kLongestCatchUp : kLongestRead);
  if (!isDone) {
    error.store(vl_errorWithPOSIXCode(
        ETIMEDOUT, "vald is still reading what changed in the drive; list the folder " +
                       folder.name + " again in a moment."));
    return false;
  }
  if (answer->first == Look::Seen) return true;
  if (answer->first == Look::Gone) {
    error.store(noSuchFile("The folder " + folder.name + " is gone."));
  } else {
    error.store(vl_errorWithPOSIXCode(
        answer->second,
        "The folder " + folder.name + " cannot be read: " + std::strerror(answer->second) + "."));
  }
  return false;
}

Page FolderStore::list(const FolderRow& folder, SortOrder order, std::uint64_t offset,
                       std::uint64_t limit, NSErrorOut error) {
  auto reader = _readers.lease();
  if (storeFailure(reader, error)) return {};
  std::optional<ListingPlace> place;
  if (offset > 0) place = _places.find(folder.number, order, offset);
  const std::uint64_t most = std::min<std::uint64_t>(limit, 100'000);
  std::vector<FoundItem> items =
      reader->page(folder.number, order, place, ListingPlaces::index(offset), most + 1);
  if (storeFailure(reader, error)) return {};
  Page page;
  AnswerRoom room;
  std::size_t count = 0;
  while (count < std::min<std::size_t>(items.size(), most) && room.take(items[count].bytes())) {
    ++count;
  }
  if (items.size() > count) {
    items.erase(items.begin() + static_cast<std::ptrdiff_t>(count), items.end());
    if (!items.empty()) {
      const ItemRow& last = items.back().row;
      page.nextOffset =
          _places.remember(folder.number, order, offset, items.size(),
                           {order == SortOrder::Date ? difference(0, last.state.modified) : 0,
                            last.name, last.id.rawID()});
    }
  }
  _writer->noteAsked();
  page.items.reserve(items.size());
  for (const FoundItem& item : items) {
    // Folders in the trash are none of all folders.
    if (folder.number == kNoFolder && item.holder.isTrashed) continue;
    page.items.push_back(item.item());
  }
  return page;
}

std::optional<VLFileObjectID> FolderStore::targetOfAlias(VLFileObjectID id) {
  const VLQueryItemPtr alias = itemWithID(id, nullptr);
  if (!alias || alias->properties().kind != VLQueryItem::Kind::Alias) return std::nullopt;
  const auto path = pathForID(id, nullptr);
  if (!path) return std::nullopt;
  const std::unique_ptr<char, decltype(&std::free)> target(realpath(path->c_str(), nullptr),
                                                           &std::free);
  if (!target) return std::nullopt;
  const VLQueryItemPtr folder = itemAtPath(target.get(), false, nullptr);
  return folder && folder->isFolder() ? std::optional(folder->fileObjectID()) : std::nullopt;
}

Page FolderStore::listFolder(std::optional<VLFileObjectID> folder, SortOrder order,
                             std::uint64_t offset, std::uint64_t limit, NSErrorOut error) {
  if (!rootIsThere(error)) return {};
  std::optional<FolderRow> row;
  const auto find = [&](const std::optional<VLFileObjectID>& id) {
    auto reader = _readers.lease();
    if (storeFailure(reader, error)) return false;
    row = id ? reader->folderWithID(*id) : reader->folder(kDriveFolder);
    return !storeFailure(reader, error);
  };
  if (!find(folder)) return {};
  if (!row) {
    const auto target = folder ? targetOfAlias(*folder) : std::nullopt;
    if (target && !find(target)) return {};
  }
  if (!row) {
    error.store(noSuchFile("There is no folder " + (folder ? folder->asString() : "") + "."));
    return {};
  }
  if (!ensureRead(*row, offset == 0, error)) return {};
  return list(*row, order, offset, limit, error);
}

Page FolderStore::listAllFolders(SortOrder order, std::uint64_t offset, std::uint64_t limit,
                                 NSErrorOut error) {
  if (!rootIsThere(error)) return {};
  return list({}, order, offset, limit, error);
}

// ---- items and paths

VLQueryItemPtr FolderStore::itemWithID(VLFileObjectID id, NSErrorOut error) {
  std::optional<FolderRow> drive;
  {
    auto reader = _readers.lease();
    if (storeFailure(reader, error)) return nullptr;
    if (const auto found = reader->itemWithID(id)) return found->item();
    const auto folder = reader->folderWithID(id);
    if (folder && isTrashFolderName(folder->name)) return trashItem(*reader.get(), *folder);
    drive = reader->folder(kDriveFolder);
    if (storeFailure(reader, error)) return nullptr;
  }
  if (drive && drive->id == id) return itemAtPath(_drive.path, false, error);
  error.store(noSuchFile("There is no item " + id.asString() + "."));
  return nullptr;
}

VLQueryItemPtr FolderStore::trashItem(IndexReader& reader, const FolderRow& trash) {
  const auto root = reader.folder(trash.parent);
  if (!root) return nullptr;
  return makeTrashItem(trash.id, {root->id, root->number == kDriveFolder, true},
                       trash.scanned ? std::optional(trash.children) : std::nullopt);
}

std::optional<FolderRow> FolderStore::rootAbove(IndexReader& reader, const std::string& path,
                                                std::string& rest) {
  for (const RootRow& root : reader.roots()) {
    if (!isAtOrBelow(path, root.path)) continue;
    rest = path.size() > root.path.size() ? path.substr(root.path.size() + 1) : "";
    auto folder = reader.folder(root.folder);
    // The trash is a folder of the root by a way of two names.
    const std::string trashName = ownTrashFolderName();
    if (!isAtOrBelow(rest, trashName)) return folder;
    for (FolderRow& trash : reader.trashes()) {
      if (trash.parent != root.folder) continue;
      rest = rest.size() > trashName.size() ? rest.substr(trashName.size() + 1) : "";
      return std::move(trash);
    }
    return folder;
  }
  return std::nullopt;
}

VLQueryItemPtr FolderStore::driveItem(const FolderRow& folder, NSErrorOut error) {
  int code = 0;
  FileDescriptor handle;
  FileState state;
  if (vald::openFolder(_drive, "", _drive.key, handle, code) != Look::Seen ||
      !readSelf(handle.get(), state)) {
    rootIsThere(error);
    return nullptr;
  }
  const std::size_t slash = _drive.path.rfind('/');
  return makeDriveItem(folder.id, _drive.path.substr(slash + 1), state,
                       folder.scanned ? std::optional(folder.children) : std::nullopt);
}

VLQueryItemPtr FolderStore::itemAtPath(const std::string& path, bool scanFirst, NSErrorOut error) {
  std::optional<FolderRow> folder;
  std::string rest;
  {
    auto reader = _readers.lease();
    if (storeFailure(reader, error)) return nullptr;
    folder = rootAbove(*reader.get(), path, rest);
    if (folder && rest.empty()) {
      if (isTrashFolderName(folder->name)) return trashItem(*reader.get(), *folder);
      if (const auto found = reader->itemWithID(folder->id)) return found->item();
      return driveItem(*folder, error);
    }
    if (storeFailure(reader, error)) return nullptr;
  }
  const NSErrorPtr missing = noSuchFile("There is no item at " + path + ".");
  for (std::size_t start = 0; folder;) {
    const std::size_t end = std::min(rest.find('/', start), rest.size());
    const std::string name = rest.substr(start, end - start);
    if (name.empty() || name == "." || name == "..") break;
    const bool isLast = end == rest.size();
    if (!ensureRead(*folder, false, error)) return nullptr;
    const auto look = [&] {
      _writer->perform([this, key = folder->number, name] { _writer->lookAtName(key, name); });
    };
    std::optional<FoundItem> found;
    std::optional<FolderRow> below;
    const auto find = [&] {
      auto reader = _readers.lease();
      found = reader ? reader->itemNamed(folder->number, name) : std::nullopt;
      if (found && !isLast) below = reader->folder(found->row.folder);
      return !storeFailure(reader, error);
    };
    if (isLast && scanFirst) look();
    if (!find()) return nullptr;
    if (!found && isOnDisk(path.substr(0, path.size() - rest.size() + end))) {
      // It came a moment ago, and what the watcher tells of it still gathers.
      look();
      if (!find()) return nullptr;
    }
    // A container is at its own path, not where it is shown.
    if (!found || found->row.containerID) break;
    if (isLast) {
      _writer->noteAsked();
      return found->item();
    }
    folder = std::move(below);
    start = end + 1;
  }
  error.store(missing);
  return nullptr;
}

std::optional<std::string> FolderStore::pathOfFolder(IndexReader& reader, FolderKey folder) {
  std::string below;
  // A ring cannot be: each step leads to the folder above.
  for (int depth = 0; depth < 100'000; ++depth) {
    if (const auto root = reader.root(folder)) return root->path + below;
    const auto row = reader.folder(folder);
    if (!row) return std::nullopt;
    below.insert(0, '/' + row->name);
    folder = row->parent;
  }
  return std::nullopt;
}

std::optional<std::string> FolderStore::pathForID(VLFileObjectID id, NSErrorOut error) {
  const auto paths = pathsForIDs({id}, error);
  if (paths.empty()) return std::nullopt;
  if (!paths.front()) error.store(noSuchFile("There is no item " + id.asString() + "."));
  return paths.front();
}

std::vector<std::optional<std::string>> FolderStore::pathsForIDs(
    const std::vector<VLFileObjectID>& ids, NSErrorOut error) {
  auto reader = _readers.lease();
  if (storeFailure(reader, error)) return {};
  // Most of a batch lie in few folders.
  std::unordered_map<FolderKey, std::optional<std::string>> folders;
  const auto pathOf = [&](FolderKey folder) {
    const auto [known, isNew] = folders.try_emplace(folder);
    if (isNew) known->second = pathOfFolder(*reader.get(), folder);
    return known->second;
  };
  std::vector<std::optional<std::string>> paths;
  paths.reserve(ids.size());
  for (const VLFileObjectID& id : ids) {
    std::optional<std::string> path;
    if (const auto folder = reader->folderWithID(id)) {
      path = pathOf(folder->number);
    } else if (const auto name = reader->nameWithID(id)) {
      path = pathOf(name->folder);
      if (path) *path += '/' + name->name;
    }
    paths.push_back(std::move(path));
  }
  if (storeFailure(reader, error)) return {};
  return paths;
}

// ---- the journal

ChangePage FolderStore::changesSince(std::uint64_t rank, std::uint64_t limit, NSErrorOut error) {
  ChangePage page;
  auto reader = _readers.lease();
  if (storeFailure(reader, error)) return page;
  std::uint64_t oldest = 0;
  if (const auto text = reader->setting("oldest rank")) {
    const auto rank = parseNumber<std::uint64_t>(*text);
    if (!rank) {
      error.store(vl_errorWithPOSIXCode(
          EIO, "The index " + _options.databasePath + " is damaged: \"" + *text +
                   "\" is no rank. Stop vald and delete the index; it is made anew."));
      return page;
    }
    oldest = *rank;
  }
  const std::uint64_t newest =
      std::max({reader->number("SELECT max(rank) FROM item"),
                reader->number("SELECT max(rank) FROM tombstone"), oldest});
  // A listing from the start passes through ranks below the oldest; it has seen no item
  // that died before it began, so it lacks nothing as long as what died since is kept.
  std::uint64_t began = newest;
  page.expired = rank > newest;
  if (rank != 0 && rank < oldest) {
    MutexLock lock(_mutex);
    const auto listing = _listings.find(rank);
    page.expired = listing == _listings.end() || listing->second < oldest;
    if (!page.expired) began = listing->second;
  }
  if (page.expired) return page;

  std::vector<FoundItem> items = reader->itemsAfter(rank, limit);
  std::vector<Tombstone> dead = reader->tombstonesAfter(rank, limit);
  if (storeFailure(reader, error)) return page;
  auto item = items.begin();
  auto tombstone = dead.begin();
  page.newestRank = rank;
  AnswerRoom room;
  while (page.changes.size() < limit && (item != items.end() || tombstone != dead.end())) {
    StoreChange change;
    if (tombstone == dead.end() || (item != items.end() && item->row.rank < tombstone->rank)) {
      if (!room.take(item->bytes())) break;
      change.rank = item->row.rank;
      change.item = item->item();
      change.folder = item->holder.id;
      ++item;
    } else {
      const auto drive = reader->folder(kDriveFolder);
      const bool isDrive = drive && tombstone->folder.rawID() == drive->id.rawID();
      change.rank = tombstone->rank;
      change.item = makeDeadItem(tombstone->id, tombstone->kind, {tombstone->folder, isDrive});
      change.folder = tombstone->folder;
      ++tombstone;
    }
    change.previousFolder = change.folder;
    page.newestRank = change.rank;
    page.changes.push_back(std::move(change));
  }
  if (page.newestRank < oldest && page.newestRank != 0) {
    MutexLock lock(_mutex);
    if (_listings.size() >= kMostListings) _listings.erase(_listings.begin());
    const auto [listing, isNew] = _listings.try_emplace(page.newestRank, began);
    if (!isNew) listing->second = std::min(listing->second, began);
  }
  return page;
}

// ---- the rest

void FolderStore::retainFolderWatch(VLFileObjectID folder) {
  _writer->perform([this, folder] { _writer->retain(folder, true); });
}

void FolderStore::releaseFolderWatch(VLFileObjectID folder) {
  _writer->post([this, folder] { _writer->retain(folder, false); });
}

void FolderStore::setContainers(std::vector<StoreRoot> containers) {
  _writer->perform(
      [this, containers = std::move(containers)] { _writer->setContainers(containers); });
}

void FolderStore::tellAnew(VLFileObjectID id, bool withContents) {
  _writer->perform([this, id, withContents] { _writer->tellAnew(id, withContents); });
}

std::optional<std::string> FolderStore::setting(const std::string& key) {
  auto reader = _readers.lease();
  return reader ? reader->setting("value " + key) : std::nullopt;
}

void FolderStore::setSetting(const std::string& key, std::optional<std::string> value) {
  _writer->perform([this, key, value = std::move(value)] { _writer->setSetting(key, value); });
}

}  // namespace skein::vald
