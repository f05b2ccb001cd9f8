// The cloud's records, as far as thumbnails need them.
#pragma once

#include <compare>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <variant>
#include <vector>

#include "platform/foundation/NSError.h"
#include "platform/foundation/NSURL.h"

namespace skein {

// The owner name of one's own zones.
inline constexpr char CKCurrentUserDefaultName[] = "__defaultOwner__";

// A zone and a record by name: values that work as keys.
struct CKRecordZoneID {
  std::string zoneName;
  std::string ownerName;
  friend auto operator<=>(const CKRecordZoneID&, const CKRecordZoneID&) = default;
};
struct CKRecordID {
  std::string recordName;
  CKRecordZoneID zoneID;
  friend auto operator<=>(const CKRecordID&, const CKRecordID&) = default;
};

// A record's file; `fileURL` is null when it was not fetched.
struct CKAsset {
  NSURLPtr fileURL;
};

// A fetched record. Immutable.
class CKRecord {
 public:
  using Value = std::variant<std::string, std::int64_t, std::shared_ptr<const CKAsset>>;

  CKRecord(CKRecordID recordID, std::map<std::string, Value> fields)
      : _recordID(std::move(recordID)), _fields(std::move(fields)) {}

  const CKRecordID& recordID() const { return _recordID; }
  // nullptr when the record has no such field.
  const Value* objectForKey(const std::string& key) const {
    const auto found = _fields.find(key);
    return found == _fields.end() ? nullptr : &found->second;
  }

 private:
  const CKRecordID _recordID;
  const std::map<std::string, Value> _fields;
};

// Ties operations together for the cloud's accounting.
class CKOperationGroup {
 public:
  explicit CKOperationGroup(std::string name) : _name(std::move(name)) {}
  const std::string& name() const { return _name; }

 private:
  const std::string _name;
};

// A request for records. Filled by the caller, then given to a database, which calls the
// blocks on threads of its own: the first once per record (it may block), the second
// exactly once and last, also after cancel().
class CKFetchRecordsOperation {
 public:
  struct Configuration {
    int discretionaryNetworkBehavior = 1;
    bool automaticallyRetryNetworkFailures = true;
  };

  virtual ~CKFetchRecordsOperation() = default;

  std::vector<CKRecordID> recordIDs;
  std::vector<std::string> desiredKeys;
  int qualityOfService = 0;
  Configuration configuration;
  std::shared_ptr<CKOperationGroup> group;
  std::function<void(std::shared_ptr<const CKRecord>, const CKRecordID&, NSErrorPtr)>
      perRecordCompletionBlock;
  std::function<void(NSErrorPtr)> fetchRecordsCompletionBlock;

  // Any thread, any state.
  virtual void cancel() = 0;
};

class CKDatabase {
 public:
  virtual ~CKDatabase() = default;
  // Makes an operation that this database understands; nothing runs yet.
  virtual std::shared_ptr<CKFetchRecordsOperation> fetchRecordsOperation() = 0;
  // Returns at once and holds the operation until it is done.
  virtual void addOperation(std::shared_ptr<CKFetchRecordsOperation> operation) = 0;
};

class CKContainer {
 public:
  virtual ~CKContainer() = default;
  virtual CKDatabase& privateCloudDatabase() = 0;
  virtual CKDatabase& sharedCloudDatabase() = 0;
};

}  // namespace skein
