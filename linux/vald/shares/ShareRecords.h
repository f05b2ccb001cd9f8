#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/cloud/CloudDatabase.h"
#include "platform/cloudkit/CKShare.h"
#include "platform/cloudkit/CloudKit.h"
#include "vellum/VLFileObjectID.h"

namespace skein::vald {

// A share as the cloud has it.
struct ShareRecord {
  VLFileObjectID item = VLFileObjectID::documentWithRawID(0);
  std::string ownerName = CKCurrentUserDefaultName;  // of the zone that the item is in
  CKShare share;  // known to the server, with its URL; its root record is the item
  std::string shareToken;

  bool isOwn() const { return ownerName == CKCurrentUserDefaultName; }
};

// A zone of somebody else's, attached as a folder of the drive.
struct ZoneRecord {
  VLFileObjectID folder = VLFileObjectID::folderOrAliasWithRawID(0);
  CKRecordZoneID zone;
};

// The cloud's shares and the zones of others, by the items' identifiers. Durable when a call
// returns. Any thread; calls block.
//
// A share whose item is gone stays: a document may come back under its identifier, and then
// it is shared as it was. Each change of a share leaves a note, so that after a crash it is
// known whose items the store has not yet told of.
class ShareRecords {
 public:
  static Outcome<std::unique_ptr<ShareRecords>> open(const std::string& path);

  // Nil without an error when the item has no share of its own.
  Outcome<std::optional<ShareRecord>> share(VLFileObjectID item) SKEIN_EXCLUDES(_mutex);
  Outcome<std::vector<ShareRecord>> shares() SKEIN_EXCLUDES(_mutex);
  // The item of the share that a URL leads to; nil when none does.
  Outcome<std::optional<VLFileObjectID>> itemOfURL(const std::string& url) SKEIN_EXCLUDES(_mutex);
  // Replaces the item's share.
  NSErrorPtr put(const ShareRecord& record) SKEIN_EXCLUDES(_mutex);
  NSErrorPtr remove(VLFileObjectID item) SKEIN_EXCLUDES(_mutex);

  // The token by which an item's contents are known, drawn when it is first asked for; it
  // stays the same through every share that the item has.
  Outcome<std::string> baseToken(VLFileObjectID item) SKEIN_EXCLUDES(_mutex);

  Outcome<std::vector<ZoneRecord>> zones() SKEIN_EXCLUDES(_mutex);
  // With the share by which the zone's owner lets one into it; both or neither.
  NSErrorPtr putZone(const ZoneRecord& zone, const ShareRecord& share) SKEIN_EXCLUDES(_mutex);
  NSErrorPtr removeZone(VLFileObjectID folder) SKEIN_EXCLUDES(_mutex);

  // Items whose share changed since they were last told of.
  Outcome<std::vector<VLFileObjectID>> untold() SKEIN_EXCLUDES(_mutex);
  NSErrorPtr didTell(VLFileObjectID item) SKEIN_EXCLUDES(_mutex);

 private:
  explicit ShareRecords(std::unique_ptr<CloudDatabase> database) : _database(std::move(database)) {}

  Outcome<ShareRecord> read(CloudStatement& row) SKEIN_REQUIRES(_mutex);
  NSErrorPtr write(const ShareRecord& record) SKEIN_REQUIRES(_mutex);
  NSErrorPtr erase(VLFileObjectID item) SKEIN_REQUIRES(_mutex);
  // Runs `sql`, whose one parameter is the item.
  NSErrorPtr run(const char* sql, VLFileObjectID item) SKEIN_REQUIRES(_mutex);

  Mutex _mutex;
  const std::unique_ptr<CloudDatabase> _database SKEIN_PT_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
