#include "linux/framework/LocalCloudKit.h"

#include <algorithm>
#include <atomic>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "linux/protocol/LocalRecords.h"
#include "platform/cloudkit/CKError.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// How many records of one operation are handed out at a time.
constexpr std::size_t kMostAtATime = 2;

enum class Scope : std::uint8_t { Private, Shared };

NSErrorPtr cancelled() {
  return NSError::errorWithDomain(
      CKErrorDomain, CKErrorOperationCancelled,
      {{NSLocalizedDescriptionKey, std::string("The thumbnails were no longer wanted.")}});
}

class LocalFetch final : public CKFetchRecordsOperation,
                         public std::enable_shared_from_this<LocalFetch> {
 public:
  void cancel() override SKEIN_EXCLUDES(_mutex) {
    std::shared_ptr<NSProgress> request;
    {
      MutexLock lock(_mutex);
      _isCancelled = true;
      request = _request;
    }
    if (request) request->cancel();
  }

  void start(const DaemonAccess& access, Scope scope) SKEIN_EXCLUDES(_mutex) {
    if (NSErrorPtr error = problem(scope)) {
      endLater(access, std::move(error));
      return;
    }
    auto self = shared_from_this();
    auto request =
        access.client
            ->remoteObjectProxyWithErrorHandler([self](NSErrorPtr error) { self->end(error); })
            ->records()
            .fetchRecords(query(), [self, executor = access.executor](
                                       std::vector<FetchedRecord> records, NSErrorPtr error) {
              self->handOut(*executor, std::move(records), std::move(error));
            });
    bool wasCancelled = false;
    {
      MutexLock lock(_mutex);
      _request = request;
      wasCancelled = _isCancelled;
    }
    if (wasCancelled) request->cancel();
  }

 private:
  // The records of one request, on their way to the callback.
  struct Delivery {
    std::vector<FetchedRecord> records;
    NSErrorPtr error;
    std::atomic<std::size_t> next{0};
    std::atomic<std::size_t> hands{0};  // that are still at it
  };

  NSErrorPtr problem(Scope scope) const {
    const auto isForeign = [&](const CKRecordID& id) {
      const bool isOwn = id.zoneID.ownerName == CKCurrentUserDefaultName;
      return id.zoneID != recordIDs.front().zoneID || isOwn != (scope == Scope::Private);
    };
    const auto foreign = std::find_if(recordIDs.begin(), recordIDs.end(), isForeign);
    if (foreign == recordIDs.end()) return nullptr;
    return vlc_errorInvalidParameter("zone", description(foreign->zoneID));
  }

  RecordQuery query() const {
    RecordQuery query;
    if (!recordIDs.empty()) query.zone = recordIDs.front().zoneID;
    query.recordNames.reserve(recordIDs.size());
    for (const CKRecordID& id : recordIDs) query.recordNames.push_back(id.recordName);
    query.desiredKeys = desiredKeys;
    query.qualityOfService = qualityOfService;
    query.configuration = configuration;
    if (group) query.group = group->name();
    return query;
  }

  void handOut(Executor& executor, std::vector<FetchedRecord> records, NSErrorPtr error) {
    const auto delivery = std::make_shared<Delivery>();
    delivery->hands = std::clamp<std::size_t>(records.size(), 1, kMostAtATime);
    delivery->records = std::move(records);
    delivery->error = std::move(error);
    const std::size_t hands = delivery->hands;
    for (std::size_t hand = 1; hand < hands; ++hand) {
      executor.post([self = shared_from_this(), delivery] { self->handOutSome(*delivery); });
    }
    handOutSome(*delivery);
  }

  void handOutSome(Delivery& delivery) SKEIN_EXCLUDES(_mutex) {
    while (!isCancelled()) {
      const std::size_t at = delivery.next++;
      if (at >= delivery.records.size()) break;
      const FetchedRecord& fetched = delivery.records[at];
      if (perRecordCompletionBlock) {
        perRecordCompletionBlock(fetched.record, fetched.recordID, fetched.error);
      }
    }
    if (--delivery.hands > 0) return;
    const bool isComplete = delivery.next >= delivery.records.size();
    end(delivery.error || isComplete ? delivery.error : cancelled());
  }

  void endLater(const DaemonAccess& access, NSErrorPtr error) {
    access.executor->post(
        [self = shared_from_this(), error = std::move(error)] { self->end(error); });
  }

  // Once, after the last record. The blocks hold whoever made them, so they go.
  void end(const NSErrorPtr& error) SKEIN_EXCLUDES(_mutex) {
    {
      MutexLock lock(_mutex);
      _request = nullptr;
    }
    perRecordCompletionBlock = nullptr;
    if (const auto completion = std::exchange(fetchRecordsCompletionBlock, nullptr)) {
      completion(error);
    }
  }

  bool isCancelled() const SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    return _isCancelled;
  }

  mutable Mutex _mutex;
  bool _isCancelled SKEIN_GUARDED_BY(_mutex) = false;
  std::shared_ptr<NSProgress> _request SKEIN_GUARDED_BY(_mutex);
};

class LocalDatabase final : public CKDatabase {
 public:
  LocalDatabase(DaemonAccess access, Scope scope) : _access(std::move(access)), _scope(scope) {}

  std::shared_ptr<CKFetchRecordsOperation> fetchRecordsOperation() override {
    return std::make_shared<LocalFetch>();
  }
  void addOperation(std::shared_ptr<CKFetchRecordsOperation> operation) override {
    std::static_pointer_cast<LocalFetch>(operation)->start(_access, _scope);
  }

 private:
  const DaemonAccess _access;
  const Scope _scope;
};

class LocalCKContainer final : public CKContainer {
 public:
  explicit LocalCKContainer(const DaemonAccess& access)
      : _private(access, Scope::Private), _shared(access, Scope::Shared) {}

  CKDatabase& privateCloudDatabase() override { return _private; }
  CKDatabase& sharedCloudDatabase() override { return _shared; }

 private:
  LocalDatabase _private;
  LocalDatabase _shared;
};

}  // namespace

LocalCloudKit::LocalCloudKit(const DaemonAccess& access)
    : _container(std::make_shared<LocalCKContainer>(access)) {}

std::shared_ptr<CKContainer> LocalCloudKit::containerWithIdentifier(
    const std::string& /*identifier*/) {
  return _container;
}

}  // namespace skein
