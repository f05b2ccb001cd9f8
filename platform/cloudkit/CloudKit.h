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

std::string description(const CKRecordZoneID& zoneID);
std::string description(const CKRecordID& recordID);

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
  const std::map<std::string, Value>& fields() const { return _fields; }
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

// How soon work is wanted; a database may do what is more urgent first.
inline constexpr int NSQualityOfServiceUtility = 17;

// Whether a transfer may wait for a better moment.
inline constexpr int CKDiscretionaryNetworkBehaviorNonDiscretionary = 0;
inline constexpr int CKDiscretionaryNetworkBehaviorDefault = 1;

// A request for records. Filled by the caller, then given to a database, which calls the
// blocks on threads of its own: the first once per record that was asked for (it may block,
// so one of them must not keep others waiting that it may need), the second exactly once and
// last, also after cancel(). The database then lets go of both.
class CKFetchRecordsOperation {
 public:
  struct Configuration {
    int discretionaryNetworkBehavior = CKDiscretionaryNetworkBehaviorDefault;
    bool automaticallyRetryNetworkFailures = true;
  };

  virtual ~CKFetchRecordsOperation() = default;

  std::vector<CKRecordID> recordIDs;
  std::vector<std::string> desiredKeys;
  int qualityOfService = 0;
  Configuration configuration;
  std::shared_ptr<CKOperationGroup> group;
  // The record is null with an error.
  std::function<void(std::shared_ptr<const CKRecord>, const CKRecordID&, NSErrorPtr)>
      perRecordCompletionBlock;
  std::function<void(NSErrorPtr)> fetchRecordsCompletionBlock;

  // Any thread, any state.
  virtual void cancel() = 0;
};

// How the log shows it: "<CKFetchRecordsOperation: 3 records>".
std::string description(const CKFetchRecordsOperation& operation);

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

// The container class's own method. Any thread.
class CKContainers {
 public:
  virtual ~CKContainers() = default;
  // containerWithIdentifier: never null.
  virtual std::shared_ptr<CKContainer> containerWithIdentifier(const std::string& identifier) = 0;
};

}  // namespace skein
