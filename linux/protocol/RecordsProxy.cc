#include "linux/protocol/RecordsProxy.h"

#include <utility>

#include "linux/protocol/DaemonCalls.h"
#include "linux/protocol/RecordsCodec.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

struct FetchOutcome {
  std::vector<FetchedRecord> records;
  NSErrorPtr error;
};

// The client's end of one fetch, on the loop's thread but for where it says otherwise.
class FetchReference final : public std::enable_shared_from_this<FetchReference> {
 public:
  // Any thread, once. Cancelling it goes to vald, weakly: a caller may keep it for ever.
  std::shared_ptr<NSProgress> makeProgress(const std::shared_ptr<RpcLoop>& loop) {
    _progress = NSProgress::progressWithTotalUnitCount(0);
    _progress->setCancellationHandler([loop, weak = weak_from_this()] {
      loop->post([weak] {
        if (const auto self = weak.lock()) self->cancel();
      });
    });
    return _progress;
  }

  // The records of the fetch that `started`, the promise of its first answer, has begun.
  // Nothing waits for that answer: the records are asked for along with the fetch.
  template <class Started>
  kj::Promise<FetchOutcome> recordsOf(Started started, CKRecordZoneID zone) {
    auto fetch = started.getFetch();
    auto records = fetch.recordsRequest().send().then([zone = std::move(zone)](auto&& results) {
      FetchOutcome outcome;
      outcome.records.reserve(results.getRecords().size());
      for (const auto record : results.getRecords()) {
        outcome.records.push_back(codec::decode(record, zone));
      }
      outcome.error = codec::errorOf(results);
      return outcome;
    });
    _fetch = kj::mv(fetch);
    // What was cancelled before it was sent is begun all the same: vald answers for it.
    if (_progress->isCancelled()) cancel();
    return started
        .then([records = kj::mv(records)](auto&& answer) mutable -> kj::Promise<FetchOutcome> {
          if (answer.hasError()) return FetchOutcome{{}, codec::errorOf(answer)};
          return kj::mv(records);
        })
        .attach(kj::defer([self = shared_from_this()] { self->_fetch = nullptr; }));
  }

 private:
  void cancel() {
    KJ_IF_MAYBE (fetch, _fetch) {
      // Where this does not arrive, the fetch has ended or ends with its connection.
      fetch->cancelRequest().send().detach([](kj::Exception&&) {});
    }
  }

  std::shared_ptr<NSProgress> _progress;
  kj::Maybe<wire::RecordFetch::Client> _fetch;
};

class RecordsProxy final : public LocalRecords {
 public:
  explicit RecordsProxy(DaemonCalls calls) : _calls(std::move(calls)) {}

  void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>& fileObjectIDs,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) override {
    if (fileObjectIDs.size() > kMostRecords) {
      refuse([reply = std::move(reply)](
                 NSErrorPtr error) mutable { reply(std::nullopt, std::move(error)); },
             fileObjectIDs.size());
      return;
    }
    _calls.call<wire::Records>(
        [fileObjectIDs](wire::Records::Client& records) {
          auto request = records.contentRecordIDsRequest();
          codec::encode(request.initDocuments(static_cast<unsigned>(fileObjectIDs.size())),
                        fileObjectIDs);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return [reply = std::move(reply), recordIDs = codec::decode(results),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(recordIDs), std::move(error));
          };
        });
  }

  std::shared_ptr<NSProgress> fetchRecords(RecordQuery query, RecordsReply reply) override {
    auto reference = std::make_shared<FetchReference>();
    auto progress = reference->makeProgress(_calls.socket()->loop());
    if (query.recordNames.size() > kMostRecords) {
      refuse([reply = std::move(reply)](NSErrorPtr error) mutable { reply({}, std::move(error)); },
             query.recordNames.size());
      return progress;
    }
    // A cloud takes the time it takes.
    _calls.call<wire::Records>(
        [query = std::move(query), reference](wire::Records::Client& records) {
          auto request = records.fetchRecordsRequest();
          codec::encode(request.initQuery(), query);
          return reference->recordsOf(request.send(), query.zone);
        },
        [reply = std::move(reply)](FetchOutcome& outcome) mutable -> Task {
          return [reply = std::move(reply), outcome = std::move(outcome)]() mutable {
            reply(std::move(outcome.records), std::move(outcome.error));
          };
        },
        Patience::WhilePeerLives);
    return progress;
  }

 private:
  void refuse(UniqueFunction<void(NSErrorPtr)> reply, std::size_t count) {
    _calls.socket()->executor()->post([reply = std::move(reply), count]() mutable {
      reply(vlc_errorInvalidParameter("number of records", std::to_string(count)));
    });
  }

  const DaemonCalls _calls;
};

}  // namespace

std::unique_ptr<LocalRecords> makeRecordsProxy(DaemonCalls calls) {
  return std::make_unique<RecordsProxy>(std::move(calls));
}

}  // namespace skein
