// Tags, dates and ranks; what is in the trash; what was done.
#include <algorithm>
#include <cerrno>
#include <ctime>
#include <utility>

#include "linux/protocol/AnswerRoom.h"
#include "linux/vald/Files.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/TrashInfo.h"

namespace skein::vald {
namespace {

constexpr std::uint64_t kMostTrashed = 1000;
constexpr std::uint64_t kMostHistory = 1000;
constexpr auto kSameRemoval = std::chrono::minutes(1);
constexpr char kByAnother[] = "another program";

// Each folder above is asked for, so a path that is far deeper than any item's is not.
bool mayHaveHistory(const std::string& path) {
  return !path.empty() &&
         static_cast<std::size_t>(std::count(path.begin(), path.end(), '/')) <= 2 * kDeepestTree;
}

std::size_t bytesOf(const FileHistoryEntry& entry) {
  return entry.origin.size() + entry.identifier.size() + entry.path.size() +
         entry.destination.size();
}

std::optional<std::int64_t> nanoseconds(const std::optional<NSDate>& date) {
  if (!date) return std::nullopt;
  return date->time_since_epoch().count();
}

}  // namespace

bool Files::writeHint(const Subject& subject) {
  const VLFileObjectID id = subject.item->fileObjectID();
  return !id.isFolderOrAliasID() &&
         _parts.operations.writeHint(subject.place.physical, id.rawID(), subject.file);
}

NSErrorPtr Files::changeDetails(const Subject& subject, std::function<void(ItemDetails&)> change) {
  if (!subject.item) return fileError(ENOENT, "can't find", subject.place.path);
  return _parts.store.changeDetails(subject.item->fileObjectID(), std::move(change));
}

void Files::answerDetails(const NSURLPtr& url, std::function<void(ItemDetails&)> change,
                          Reply<NSErrorPtr> reply) {
  answer("url", url, std::move(reply), [=, this](Reply<NSErrorPtr>& answered) {
    const Subject subject = subjectAt(url);
    if (subject.error) return answered(subject.error);
    NSErrorPtr error = changeDetails(subject, change);
    if (!error && writeHint(subject)) _parts.store.lookAtPaths({subject.place.path});
    answered(std::move(error));
  });
}

void Files::setTagNames(NSURLPtr url, std::vector<std::string> names, Reply<NSErrorPtr> reply) {
  answer("url", url, std::move(reply), [=, this](Reply<NSErrorPtr>& answered) {
    Subject subject = subjectAt(url);
    if (subject.error) return answered(subject.error);
    // Before the tags, so that one look at the file sees both.
    if (subject.item) writeHint(subject);
    const TagResult earlier = _parts.operations.tags(subject.place.physical);
    // The store looks while the disk is still written to.
    std::function<void()> waitForStore;
    const TagResult result = _parts.operations.setTags(
        subject.place.physical, names,
        [&] { waitForStore = _parts.store.beginLookAtPaths({subject.place.path}); }, subject.file);
    if (waitForStore) waitForStore();
    if (result.storage == TagStorage::Failed) {
      lookAgainAfter(result.error, subject);
      return answered(result.error);
    }
    if (!subject.item) subject = subjectAt(url);
    // Also where the file has them: an index that was told is not behind.
    const bool isOnFile = result.storage == TagStorage::Kept;
    const std::string tags = joinTags(names);
    NSErrorPtr error = changeDetails(subject, [tags, isOnFile](ItemDetails& details) {
      details.tags = tags;
      details.tagsAreOnFile = isOnFile && !tags.empty();
    });
    // Who is told that nothing was changed finds the file as it was.
    if (error && isOnFile && earlier.storage == TagStorage::Kept) {
      _parts.operations.setTags(subject.place.physical, earlier.names, nullptr, subject.file);
    }
    answered(std::move(error));
  });
}

void Files::setLastOpenDate(NSURLPtr url, std::optional<NSDate> date, Reply<NSErrorPtr> reply) {
  answerDetails(
      url, [used = nanoseconds(date)](ItemDetails& details) { details.used = used; },
      std::move(reply));
}

void Files::setFavoriteRank(NSURLPtr url, std::optional<std::int64_t> rank,
                            Reply<NSErrorPtr> reply) {
  answerDetails(
      url, [rank](ItemDetails& details) { details.favorite = rank; }, std::move(reply));
}

void Files::tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) {
  postAnswer(*_parts.executor, std::move(reply), [this, after = std::move(after)](auto& answered) {
    std::vector<TagUse> tags;
    for (auto& [name, items] : _parts.store.tagsInUse(after))
      tags.push_back({std::move(name), items});
    answered(std::move(tags), nullptr);
  });
}

// ---- the trash

std::optional<NSDate> Files::dateOfTrashing(const std::string& path) const {
  const auto info = _parts.operations.trashInfo(path);
  std::tm time{};
  if (!info || strptime(info->deletionDate.c_str(), "%Y-%m-%dT%H:%M:%S", &time) == nullptr) {
    return std::nullopt;
  }
  time.tm_isdst = -1;
  const std::time_t seconds = std::mktime(&time);
  if (seconds == -1) return std::nullopt;
  return NSDate(std::chrono::seconds(seconds));
}

TrashListings::Items Files::trashInOrder(NSErrorOut error) {
  std::vector<FolderStore::Trashed> found = _parts.store.trashedItems(error);
  // The time of change is the moment of the renaming, unless something was done since:
  // close enough for an order that costs no look at a file.
  std::sort(found.begin(), found.end(), [](const auto& a, const auto& b) {
    return a.changed != b.changed ? a.changed > b.changed : a.id.rawID() < b.id.rawID();
  });
  auto items = std::make_shared<std::vector<VLFileObjectID>>();
  items->reserve(found.size());
  for (const FolderStore::Trashed& one : found) items->push_back(one.id);
  return items;
}

TrashedItem Files::trashedItem(VLQueryItemPtr item, const std::string& path) const {
  TrashedItem trashed{std::move(item), NSURL::fileURLWithPath(path), nullptr, std::nullopt};
  const DocumentPlace place = findDocument(_parts.operations.roots(), path);
  const FileResult origin = _parts.operations.putBackPath(place.physical);
  if (!origin.error) {
    trashed.putBackURL = NSURL::fileURLWithPath(
        place.isEvicted() ? documentPath(nullptr, origin.path) : origin.path);
  }
  trashed.trashed = dateOfTrashing(place.physical);
  return trashed;
}

void Files::trashedItems(std::uint64_t offset, std::uint64_t limit,
                         Reply<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr> reply) {
  postAnswer(*_parts.executor, std::move(reply), [=, this](auto& answered) {
    auto place = TrashListings::Place::of(offset);
    TrashListings::Items items = _trashListings.find(place);
    if (!items) {
      NSErrorPtr error;
      items = trashInOrder(&error);
      if (error) return answerError(answered, error);
      _trashListings.begin(items, place);
    }
    std::vector<TrashedItem> page;
    AnswerRoom room;
    for (; place.position < items->size() && page.size() < std::min(limit, kMostTrashed);
         ++place.position) {
      const VLFileObjectID id = (*items)[place.position];
      NSErrorPtr error;
      const VLQueryItemPtr item = _parts.store.itemWithID(id, &error);
      const auto path = item ? _parts.store.pathForID(id, &error) : std::nullopt;
      if (error && error->domain() != NSCocoaErrorDomain) return answerError(answered, error);
      // What was put back or removed meanwhile is in the trash no more.
      if (!item || !path || !item->isTrashed()) continue;
      // The path that it had is about as long.
      if (!room.take(bytesOf(item) + 2 * path->size())) break;
      page.push_back(trashedItem(item, *path));
    }
    const bool hasEnded = place.position >= items->size();
    if (hasEnded) _trashListings.end(place);
    answered(std::move(page), hasEnded ? 0 : place.offset(), nullptr);
  });
}

// ---- provenance

std::vector<FileHistoryEntry> Files::historyOf(const std::string& path,
                                               const std::string& identifier, std::size_t limit,
                                               NSErrorOut error) {
  OperationJournal& journal = _parts.operations.journal();
  std::vector<OperationEntry> entries;
  const auto add = [&](std::vector<OperationEntry> more) {
    entries.insert(entries.end(), std::make_move_iterator(more.begin()),
                   std::make_move_iterator(more.end()));
  };
  if (mayHaveHistory(path)) {
    add(journal.historyOfPath(path, limit, error));
    const std::string marker = MarkerNames(nameOfPath(path)).marker;
    add(journal.historyOfPath(joinPath(parentOfPath(path), marker), limit, error));
  }
  add(journal.historyOfDocument(identifier, limit, error));
  std::sort(entries.begin(), entries.end(),
            [](const auto& a, const auto& b) { return a.id > b.id; });
  entries.erase(std::unique(entries.begin(), entries.end(),
                            [](const auto& a, const auto& b) { return a.id == b.id; }),
                entries.end());
  std::vector<FileHistoryEntry> history;
  history.reserve(entries.size());
  for (const OperationEntry& entry : entries) {
    history.push_back({entry.when, operationName(entry.kind), entry.origin, entry.document,
                       documentPath(nullptr, entry.path), documentPath(nullptr, entry.destination),
                       entry.state == OperationState::Undone});
  }
  return history;
}

// What the store saw go although nobody asked vald to remove or to move it.
void Files::addRemovalsByOthers(const std::string& path, std::size_t limit,
                                std::vector<FileHistoryEntry>& entries) {
  const auto isAsked = [&](const FolderStore::Removal& removal) {
    return std::any_of(entries.begin(), entries.end(), [&](const FileHistoryEntry& entry) {
      const auto apart = removal.when - entry.when;
      return !entry.undone && entry.origin != kByAnother && entry.path == path &&
             apart < kSameRemoval && apart > -kSameRemoval;
    });
  };
  for (const FolderStore::Removal& removal : _parts.store.removalsAt(path, limit)) {
    if (isAsked(removal)) continue;
    entries.push_back({removal.when,
                       operationName(OperationKind::Remove),
                       kByAnother,
                       removal.id.asString(),
                       path,
                       {},
                       false});
  }
  std::stable_sort(entries.begin(), entries.end(),
                   [](const auto& a, const auto& b) { return a.when > b.when; });
}

void Files::history(std::string path, std::string identifier, std::uint64_t limit,
                    Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) {
  postAnswer(*_parts.executor, std::move(reply), [=, this](auto& answered) {
    const std::size_t most = std::min(limit, kMostHistory);
    NSErrorPtr error;
    std::vector<FileHistoryEntry> entries = historyOf(path, identifier, most, &error);
    if (error) return answerError(answered, error);
    if (mayHaveHistory(path)) addRemovalsByOthers(path, most, entries);
    AnswerRoom room(kAnswerBytes);
    std::size_t count = 0;
    while (count < std::min(entries.size(), most) && room.take(bytesOf(entries[count]))) ++count;
    entries.resize(count);
    answered(std::move(entries), nullptr);
  });
}

}  // namespace skein::vald
