// The store as the operations on files see it.
#include "linux/vald/DrivePath.h"
#include "linux/vald/FolderStore.h"
#include "linux/vald/scan/StoreNames.h"
#include "vellum/VLErrors.h"

namespace skein::vald {

std::optional<StoreWriter::Place> FolderStore::placeOf(IndexReader& reader,
                                                       const std::string& path) {
  std::string rest;
  std::optional<FolderRow> folder = rootAbove(reader, path, rest);
  for (std::size_t start = 0; folder && folder->scanned && !rest.empty();) {
    const std::size_t end = rest.find('/', start);
    const std::string name = rest.substr(start, end - start);
    if (end == std::string::npos) return StoreWriter::Place{folder->number, name};
    const auto found = reader.itemNamed(folder->number, name);
    if (!found || found->row.containerID) break;
    folder = reader.folder(found->row.folder);
    start = end + 1;
  }
  return std::nullopt;
}

std::function<void()> FolderStore::beginLookAtPaths(const std::vector<std::string>& paths) {
  std::vector<StoreWriter::Place> places;
  {
    auto reader = _readers.lease();
    if (!reader) return [] {};
    for (const std::string& path : paths) {
      if (auto place = placeOf(*reader.get(), path)) places.push_back(std::move(*place));
    }
  }
  auto posted = _writer->post([this, places = std::move(places)] { _writer->lookAtNames(places); });
  return [this, posted = std::move(posted)] { _writer->wait(posted); };
}

std::optional<StoreWriter::Copy> FolderStore::copyOf(const std::string& from,
                                                     const std::string& to) {
  auto reader = _readers.lease();
  if (!reader) return std::nullopt;
  auto here = placeOf(*reader.get(), from);
  auto there = placeOf(*reader.get(), to);
  if (!here || !there) return std::nullopt;
  return StoreWriter::Copy{std::move(*here), std::move(*there)};
}

std::optional<StoreWriter::Copy> FolderStore::expectCopy(const std::string& from,
                                                         const std::string& to) {
  auto copy = copyOf(from, to);
  if (copy) _writer->perform([this, copy] { _writer->expectCopy(*copy); });
  return copy;
}

bool FolderStore::takeCopy(const StoreWriter::Copy& copy) {
  const auto isTaken = std::make_shared<bool>(false);
  // A tree takes as long as it takes.
  return _writer->perform([this, copy, isTaken] { *isTaken = _writer->takeCopy(copy); },
                          std::chrono::hours(1)) &&
         *isTaken;
}

void FolderStore::forgetCopy(const StoreWriter::Copy& copy) {
  _writer->perform([this, copy] { _writer->forgetCopy(copy); });
}

void FolderStore::catchUp(const std::string& path) {
  std::optional<StoreWriter::Place> place;
  if (auto reader = _readers.lease()) place = placeOf(*reader.get(), path);
  _writer->perform([this, folder = place ? place->folder : kNoFolder] {
    int error = 0;
    _writer->catchUp(folder, error);
  });
}

std::optional<FolderStore::KnownItem> FolderStore::knownItem(VLFileObjectID id) {
  auto reader = _readers.lease();
  const auto found = reader ? reader->itemWithID(id) : std::nullopt;
  if (!found || found->row.containerID) return std::nullopt;
  const auto folder = pathOfFolder(*reader.get(), found->row.parent);
  if (!folder) return std::nullopt;
  return KnownItem{found->item(), *folder + '/' + found->row.name, found->row.state.key};
}

NSErrorPtr FolderStore::changeDetails(VLFileObjectID id, std::function<void(ItemDetails&)> change) {
  {
    // What it has already is not written.
    auto reader = _readers.lease();
    const auto found = reader ? reader->itemWithID(id) : std::nullopt;
    if (found) {
      ItemDetails details = found->details;
      change(details);
      if (details == found->details) return nullptr;
    }
  }
  struct Ended {
    bool isChanged = false;
    std::string failure;
    bool lacksRoom = false;
  };
  auto outcome = std::make_shared<Ended>();
  // Why it failed is asked at once: the writer may be trying again when this goes on.
  const bool isDone = _writer->perform([this, id, change = std::move(change), outcome] {
    *outcome = {_writer->changeDetails(id, change), _writer->failure(), _writer->lacksRoom()};
  });
  if (!isDone) return vl_errorWithPOSIXCode(ETIMEDOUT, "The index could not be written in time.");
  if (outcome->isChanged) return nullptr;
  if (outcome->failure.empty()) return noSuchFile("There is no item " + id.asString() + ".");
  return vl_errorWithPOSIXCode(outcome->lacksRoom ? ENOSPC : EIO,
                               "Nothing was changed, since " + outcome->failure + ".");
}

ItemDetails FolderStore::details(VLFileObjectID id) {
  auto reader = _readers.lease();
  const auto found = reader ? reader->itemWithID(id) : std::nullopt;
  return found ? found->details : ItemDetails();
}

std::vector<std::pair<std::string, std::uint64_t>> FolderStore::tagsInUse(
    const std::string& after) {
  auto reader = _readers.lease();
  return reader ? reader->tags(after) : std::vector<std::pair<std::string, std::uint64_t>>();
}

std::vector<FolderStore::Trashed> FolderStore::trashedItems(NSErrorOut error) {
  std::vector<Trashed> trashed;
  auto reader = _readers.lease();
  if (storeFailure(reader, error)) return trashed;
  for (const FolderRow& trash : reader->trashes()) {
    for (const ItemRow& row : reader->children(trash.number)) {
      trashed.push_back({row.id, row.state.changed});
    }
  }
  if (storeFailure(reader, error)) trashed.clear();
  return trashed;
}

std::vector<FolderStore::Removal> FolderStore::removalsAt(const std::string& path,
                                                          std::uint64_t limit) {
  std::vector<Removal> removals;
  auto reader = _readers.lease();
  if (!reader) return removals;
  const auto place = placeOf(*reader.get(), path);
  if (!place) return removals;
  for (const Tombstone& tombstone : reader->tombstonesAt(place->folder, place->name, limit)) {
    removals.push_back({tombstone.id, NSDate(std::chrono::milliseconds(tombstone.died))});
  }
  return removals;
}

std::vector<FolderStore::Unsettled> FolderStore::unsettledAfter(std::uint64_t& rank,
                                                                std::uint64_t limit) {
  std::vector<Unsettled> documents;
  auto reader = _readers.lease();
  if (!reader) return documents;
  for (const ItemRow& row : reader->unsettledAfter(rank, limit)) {
    rank = row.rank;
    // What is thrown away is not sent anywhere; put back, it is looked at again.
    if (reader->isTrashed(row.parent)) continue;
    const auto folder = pathOfFolder(*reader.get(), row.parent);
    if (folder) documents.push_back({row.id, *folder + '/' + row.name, row.state.size});
  }
  return documents;
}

bool FolderStore::isSettled(VLFileObjectID id) {
  auto reader = _readers.lease();
  const auto found = reader ? reader->itemWithID(id) : std::nullopt;
  return found && found->row.isSettled;
}

void FolderStore::noteUploads(std::vector<UploadedFile> files) {
  _writer->perform([this, files = std::move(files)] { _writer->noteUploads(files); });
}

}  // namespace skein::vald
