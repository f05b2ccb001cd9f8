// How documents keep their numbers.
//
// The disk tells names and inodes; which document is which is ours to settle. A file is
// known by its inode and generation (FileKey). Where that does not settle it:
//
//  1. A known file at another name is the same document: it was renamed or moved.
//  2. A name that now holds another file keeps its document when the old file is gone, or
//     lives on only under a backup's or a temporary name (BackupNames), or under the name
//     of a stand-in: it was saved. The backup gets a number of its own. When the old
//     file lives on under any other name, it is the document, and the name's is new.
//     A file that is known as another document's, as a hard link is, or was when that died,
//     is no save: the name's document is gone, and no number goes to another document's file.
//  3. A young document (it came within the last minute) that is renamed over another hands
//     its file over and dies: the name keeps its document. An old document renamed over
//     another moves, and the replaced one dies. Neither holds when the other's file lives on
//     elsewhere (rule 2): then both moved.
//  4. Two names that exchanged their files: the documents moved, unless one of the two was a
//     stand-in. A stand-in is the new file of a save that was seen before the save was done:
//     a young document with a temporary or a hidden name, or one with any name that came
//     within the grace window and after the last time that somebody looked a document up by its
//     path or listed a folder (so nobody who asked has its number). It hands its file over and
//     dies, and the old file that has its name now gets a number of its own.
//  5. A document that vanished keeps its number for the grace window: what comes to its
//     name within it takes the number up. The deletion is journalled at once all the same.
//     So does a document that left its name for a backup's within the window. A file that is
//     known already takes it up only if it was a stand-in.
//  6. Two hard links are two documents. When the first goes while the second is young, the
//     number goes with it: that was a rename. When the second goes, the first stays.
//  7. A file that comes back (its tombstone is still kept) takes its number up again.
//  8. What was moved to another volume is the item that it is a copy of; whoever moved it says so
//     (expectCopy, takeCopy).
//  9. A marker is its document, not present: evicting and downloading are rule 2. A marker,
//     or a file with a hint, that nothing is known of is the document that it names, unless
//     that lives: then it is a copy, and new.
//
// Folders and aliases are their inodes: rules 1 and 7 hold for them, and nothing else.
#pragma once

#include <atomic>
#include <chrono>
#include <functional>
#include <list>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <utility>
#include <vector>

#include "linux/vald/scan/Details.h"
#include "linux/vald/scan/Disk.h"
#include "linux/vald/scan/Journal.h"

namespace skein::vald {

// Makes the index equal to what was seen of the disk. Differences are gathered first and
// decided together, since one save touches several names. On the writer thread, inside a
// transaction, with the secondary indexes built.
class Reconciler {
 public:
  using Clock = std::function<std::int64_t()>;  // milliseconds since 1970
  struct Place {
    FolderKey folder = kNoFolder;
    std::string name;

    friend bool operator==(const Place&, const Place&) = default;
  };

  Reconciler(IndexWriter& index, Journal& journal, FolderTable& folders, Disk& disk,
             Details& details, std::chrono::milliseconds graceWindow, Clock clock);

  // Gathers how a folder, read as a whole, differs from the index. `isOld`: the folder was
  // read a while ago, and what was done in it since may stand in the index already; so what
  // differs is looked at again, name by name. False when the folder cannot be opened for that;
  // then nothing was gathered.
  bool addFolder(FolderKey folder, const FolderSnapshot& snapshot, bool isOld = false);
  // Gathers how one name differs. `state` nil: there is nothing.
  void addName(FolderKey folder, const std::string& name, const std::optional<FileState>& state);
  // Whether the file at a name is another than the name's document has, or had until a moment ago.
  bool isReplacement(FolderKey folder, const std::string& name, const FileState& state);
  // Marks the point that gatherAgain() returns to: it drops what was gathered since.
  void beginGathering();
  void gatherAgain();
  // Whether something that was gathered since may be a save. Then all that happened up to now
  // should be gathered before it is decided: a file that is not seen where it went seems gone.
  bool mayBeSave();
  // What was gathered is not all, since the disk goes on: for the next decision what is not seen
  // may be anywhere, and only stand-ins hand their files over.
  void noteThatItGoesOn() { _goesOn = true; }
  // Somebody was told of documents that he asked for by path, or by listing. Any thread.
  void noteAsked() { _asked = _clock(); }
  // The folder's own dates, or its count of children, may have changed.
  void addSelf(FolderKey folder) { _selves.insert(folder); }

  // Decides what was gathered. While a round goes over the whole store, what vanished or
  // was replaced waits for its end: the file may yet turn up in a folder still to be read.
  // The own rows of folders that `isFollowed` are left to the watcher, which tells of such a
  // folder shortly, and once for many changes in it.
  using IsFollowed = std::function<bool(FolderKey)>;
  void decide(bool inRound, const IsFollowed& isFollowed = nullptr);
  void endRound();

  // From now on until forgetCopy(), that nothing is at `from`, or something at `to`, means nothing.
  void expectCopy(const Place& from, const Place& to) { _expected.emplace_back(from, to); }
  void forgetCopy(const Place& from) {
    std::erase_if(_expected, [&](const auto& copy) { return copy.first == from; });
  }
  // What is seen at `to` is a copy of the item whose place was `from`, and is the item from now on.
  // False when no item of its kind has gone from there.
  bool takeCopy(const Place& from, const Place& to, const FileState& state);
  // The same for what is in a folder that was taken so, name by name.
  void takeCopies(FolderKey folder, const FolderSnapshot& snapshot);
  // Folders that are other folders on the disk since this was last asked, with the same items.
  std::vector<FolderKey> takeCopiedFolders() { return std::exchange(_copiedFolders, {}); }

  // Removes a folder's item and everything below it.
  void buryTree(const ItemRow& row);
  void forget();

  // Folders that came since this was last asked: they are to be scanned.
  std::vector<FolderKey> takeNewFolders() { return std::exchange(_newFolders, {}); }
  // Folders that went.
  std::vector<FolderKey> takeRemovedFolders() { return std::exchange(_removedFolders, {}); }

 private:
  struct Difference {
    Place place;
    FileState state;
  };
  struct Departure {
    std::int64_t when = 0;
    VLFileObjectID id = VLFileObjectID::documentWithRawID(0);
  };
  enum class Whereabouts : std::uint8_t { StillThere, Gone, Displaced, Unknown };

  void decideOnce(bool inRound);
  // Of what appeared, the first document that is this file; null: none is.
  const Difference* appearedDocument(const FileKey& file) const;
  // Whether the document's file has come to the name of another one, and not as its backup.
  bool hasReplacedAnother(const ItemRow& row);
  // Whether the item's file is another, or looks otherwise. A folder's dates are its own matter.
  static bool differs(const ItemRow& row, const FileState& state);
  void compare(const ItemRow& row, const FileState& state);
  void appeared(const Difference& difference);
  void replaced(const Difference& difference);
  void vanished(const ItemRow& seen);
  void refreshSelves(const IsFollowed& isFollowed);

  bool handBack(const Place& place, const FileState& state, const std::optional<ItemRow>& mover);
  bool returned(const Place& place, const FileState& state);
  std::optional<Tombstone> deadWith(const FileState& state);
  bool wasAnother(const FileState& state, const std::string& name);
  void insertNew(const Place& place, const FileState& state);
  // The folder whose item the row is, of which nothing is known yet.
  void addFolderOf(ItemRow& row);
  void move(ItemRow row, const Place& place, const FileState& state);
  void retarget(ItemRow row, const FileState& state);
  void becomeCopy(ItemRow row, const Place& place, const FileState& state);
  // The row takes the file's state, which may be another file's.
  void take(ItemRow& row, const FileState& state);
  void recordDeparture(const ItemRow& row, const Place& to);

  std::optional<ItemRow> rowAt(const Place& place);
  std::optional<ItemRow> moverTo(const Place& place, const FileState& state);
  // Whether the item, whose file this is, left its name for `place`; or why not.
  enum class Move : std::uint8_t { Moved, KeepsItsName, DidNotLeave };
  Move moveTo(const Place& place, const FileState& state, const ItemRow& row);
  std::optional<ItemRow> youngLinkOf(const ItemRow& row, FileState& there);
  bool isKnownAsAnother(const Place& place, const FileState& state,
                        const std::vector<std::optional<ItemRow>>& these);
  Whereabouts whereabouts(const ItemRow& row, FileState& there);
  bool nameKeeps(const ItemRow& row, const FileState& there, const Place& candidate);
  bool isYoung(const ItemRow& row) const;
  // Whether the document is the new file of a save of `name` (rule 4).
  bool isStandIn(const ItemRow& row, const std::string& name) const;
  VLFileObjectID newID(const FileState& state);

  IndexWriter& _index;
  Journal& _journal;
  FolderTable& _folders;
  Disk& _disk;
  Details& _details;
  const std::int64_t _grace;
  const Clock _clock;

  std::vector<Difference> _appeared;
  std::vector<Difference> _deciding;  // what appeared, of the decisions under way
  // The first document of each inode, of what appeared and of what was replaced.
  std::unordered_map<std::uint64_t, const Difference*> _appearedByInode;
  std::unordered_map<std::uint64_t, const Difference*> _replacedByInode;
  std::vector<Difference> _replaced;
  // Of files with many links, those that were not at their names when the pass came to the file.
  std::unordered_map<std::uint64_t, std::list<VLFileObjectID>> _left;
  // Of files that vanished from a name, the young documents and when they came, youngest last.
  struct YoungLink {
    std::int64_t seen = 0;
    VLFileObjectID id = VLFileObjectID::documentWithRawID(0);
  };
  std::unordered_map<std::uint64_t, std::vector<YoungLink>> _youngLinks;
  std::size_t _appearedBefore = 0;  // what stood there before gathering began
  std::size_t _replacedBefore = 0;
  std::size_t _vanishedBefore = 0;
  bool _goesOn = false;
  std::vector<ItemRow> _vanished;
  std::vector<ItemRow> _vanishedInRound;
  std::vector<Place> _replacedInRound;
  std::unordered_set<FolderKey> _selves;
  std::vector<FolderKey> _newFolders;
  std::vector<FolderKey> _removedFolders;
  std::vector<FolderKey> _copiedFolders;
  std::vector<std::pair<Place, Place>> _expected;  // copies that are being made: from, to
  // Documents that left a name for a backup's, by folder and name.
  std::unordered_map<std::string, Departure> _departures;
  std::int64_t _now = 0;
  std::atomic<std::int64_t> _asked{0};
};

}  // namespace skein::vald
