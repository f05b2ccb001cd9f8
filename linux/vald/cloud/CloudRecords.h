#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/cloud/CloudContents.h"
#include "linux/vald/cloud/CloudDatabase.h"
#include "linux/vald/cloud/UploadStamp.h"
#include "platform/cloudkit/CloudKit.h"
#include "vellum/VLFileObjectID.h"

namespace skein::vald {

// The zone of one's own documents, unless they were put into another.
inline constexpr char kDocumentsZone[] = "documents";

// What the cloud has of a document.
struct CloudRecord {
  VLFileObjectID document = VLFileObjectID::documentWithRawID(0);
  CKRecordZoneID zone{kDocumentsZone, CKCurrentUserDefaultName};
  HashedContents contents;
  NSDate modified;
  std::optional<NSDate> created;
  NSDate uploaded;
  std::int64_t revision = 0;             // 1 for the first upload; given by the records
  std::optional<std::string> thumbnail;  // an asset file's path; gone with a new revision

  // The record's name is the document's identifier.
  CKRecordID recordID() const { return {document.asString(), zone}; }
};

// The cloud's records, one per uploaded document, and what this machine knows of them: as
// which file a document was uploaded, which are pinned, and which files are being evicted or
// downloaded at the moment. Durable when a call returns. Any thread; calls block.
//
// A record is written after its contents are durable and while they are held, so that it
// never refers to contents that are not there.
class CloudRecords {
 public:
  static Outcome<std::unique_ptr<CloudRecords>> open(const std::string& path);

  // Writes the document's record and the file that it was uploaded as, both or neither.
  // New contents get the next revision and lose the thumbnail; the same contents keep both
  // and only get the new times. The contents must be durable: the hold says so.
  Outcome<CloudRecord> put(CloudRecord record, const UploadStamp& stamp,
                           const CloudContents::Hold& hold) SKEIN_EXCLUDES(_mutex);
  // Nil without an error when there is none.
  Outcome<std::optional<CloudRecord>> record(VLFileObjectID document) SKEIN_EXCLUDES(_mutex);
  // Those that are there, in any order.
  Outcome<std::vector<CloudRecord>> records(const std::vector<VLFileObjectID>& documents)
      SKEIN_EXCLUDES(_mutex);
  Outcome<std::vector<CloudRecord>> recordsInZone(const CKRecordZoneID& zone)
      SKEIN_EXCLUDES(_mutex);
  // Forgets all about the document. Its contents are unreferenced from now on, unless another
  // record refers to them.
  NSErrorPtr remove(VLFileObjectID document) SKEIN_EXCLUDES(_mutex);
  // Only while the record still is of these contents: a thumbnail takes a while to make. A
  // power cut may lose it: it is then missing, and made again.
  NSErrorPtr setThumbnail(VLFileObjectID document, const ContentHash& contents,
                          const std::optional<std::string>& path) SKEIN_EXCLUDES(_mutex);
  // At most `limit` documents, in the records' own order after `last` (nil: from the start).
  Outcome<std::vector<VLFileObjectID>> documentsWithoutThumbnail(std::optional<VLFileObjectID> last,
                                                                 std::size_t limit)
      SKEIN_EXCLUDES(_mutex);

  // How many records refer to the contents.
  Outcome<std::uint64_t> references(const ContentHash& hash) SKEIN_EXCLUDES(_mutex);
  // What one's own documents take, equal contents counted for each: the quota's measure.
  std::uint64_t usedBytes() SKEIN_EXCLUDES(_mutex);

  // Contents that no record refers to any more. They are kept for a while: see CloudCollector.
  struct Unreferenced {
    HashedContents contents;
    NSDate since;
    std::optional<NSDate> missed;  // when a look at the drive first saw no marker that names them
    bool givenUp = false;          // a document was evicted to them, or nobody knows
  };
  // Notes what a look at the drive that began at `look` saw: `named`, sorted, are the contents
  // that markers name, whose time begins anew. Answers all, the oldest first, as they were
  // `missed` before this look.
  Outcome<std::vector<Unreferenced>> noteLook(const std::vector<ContentHash>& named, NSDate look)
      SKEIN_EXCLUDES(_mutex);
  // Forgets those of the contents that no record refers to, and that have been so since before
  // the look: these may be removed.
  Outcome<std::vector<ContentHash>> release(const std::vector<ContentHash>& contents, NSDate look)
      SKEIN_EXCLUDES(_mutex);
  // Whether a record refers to the contents, or they are known as unreferenced.
  Outcome<bool> isKnown(const ContentHash& hash) SKEIN_EXCLUDES(_mutex);
  // Contents of which nothing is known count as given up.
  NSErrorPtr addUnknown(const HashedContents& contents, NSDate now) SKEIN_EXCLUDES(_mutex);
  // The same, once, of all contents that were there before these records.
  NSErrorPtr adopt(const std::vector<HashedContents>& contents, NSDate now) SKEIN_EXCLUDES(_mutex);
  Outcome<bool> hasAdopted() SKEIN_EXCLUDES(_mutex);

  struct Kept {
    std::uint64_t files = 0;
    std::uint64_t bytes = 0;
    std::uint64_t givenUpBytes = 0;  // of them, in contents that were given up
  };
  // What unreferenced contents take.
  Outcome<Kept> kept() SKEIN_EXCLUDES(_mutex);

  // How long they are kept, and how much of the disk they may take.
  struct Keeping {
    std::uint32_t days = 30;
    std::uint32_t percent = 10;
  };
  Outcome<Keeping> keeping() SKEIN_EXCLUDES(_mutex);
  NSErrorPtr setKeeping(const Keeping& keeping) SKEIN_EXCLUDES(_mutex);

  // The file as which the document was uploaded; nil while it is evicted, too.
  Outcome<std::optional<UploadStamp>> stamp(VLFileObjectID document) SKEIN_EXCLUDES(_mutex);
  // A power cut may lose it: the document is then looked at again.
  NSErrorPtr setStamp(VLFileObjectID document, const std::optional<UploadStamp>& stamp)
      SKEIN_EXCLUDES(_mutex);

  NSErrorPtr setPinned(VLFileObjectID document, bool pinned) SKEIN_EXCLUDES(_mutex);
  Outcome<bool> isPinned(VLFileObjectID document) SKEIN_EXCLUDES(_mutex);

  // A file whose eviction or download is under way: what recovery looks at after a crash.
  struct Work {
    std::int64_t number = 0;
    std::string path;          // of the document
    std::uint64_t folder = 0;  // the inode of its folder: where it is found after a move
    ContentHash contents;      // what the marker stands for
  };
  // From now on the contents count as given up.
  Outcome<Work> beginWork(Work work) SKEIN_EXCLUDES(_mutex);
  // A power cut may lose it: recovery then finds nothing to do.
  NSErrorPtr endWork(const Work& work) SKEIN_EXCLUDES(_mutex);
  Outcome<std::vector<Work>> unfinishedWork() SKEIN_EXCLUDES(_mutex);

 private:
  explicit CloudRecords(std::unique_ptr<CloudDatabase> database) : _database(std::move(database)) {}

  NSErrorPtr measure() SKEIN_EXCLUDES(_mutex);
  Outcome<std::optional<CloudRecord>> find(VLFileObjectID document) SKEIN_REQUIRES(_mutex);
  NSErrorPtr write(const CloudRecord& record) SKEIN_REQUIRES(_mutex);
  // The contents of a record that is gone, or has others now.
  NSErrorPtr noteUnreferenced(const HashedContents& contents, NSDate since) SKEIN_REQUIRES(_mutex);
  NSErrorPtr noteGivenUp(const ContentHash& hash) SKEIN_REQUIRES(_mutex);
  NSErrorPtr writeStamp(VLFileObjectID document, const std::optional<UploadStamp>& stamp)
      SKEIN_REQUIRES(_mutex);
  // `unset`: what it is while nobody has set it.
  Outcome<std::int64_t> setting(const char* name, std::int64_t unset) SKEIN_REQUIRES(_mutex);
  NSErrorPtr writeSetting(const char* name, std::int64_t value) SKEIN_REQUIRES(_mutex);

  Mutex _mutex;
  const std::unique_ptr<CloudDatabase> _database SKEIN_PT_GUARDED_BY(_mutex);
  std::uint64_t _usedBytes SKEIN_GUARDED_BY(_mutex) = 0;
};

}  // namespace skein::vald
