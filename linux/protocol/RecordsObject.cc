#include "linux/protocol/RecordsObject.h"

#include <utility>

#include "linux/protocol/Answer.h"
#include "linux/protocol/WithFaults.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr std::size_t kMostFetches = 256;

NSErrorPtr tooMany(std::size_t count) {
  return vlc_errorInvalidParameter("number of records", std::to_string(count));
}

}  // namespace

kj::Promise<void> RecordsObject::contentRecordIDs(ContentRecordIDsContext context) {
  std::vector<VLFileObjectID> documents;
  const auto params = context.getParams();
  for (const auto document : params.getDocuments()) documents.push_back(codec::decode(document));
  context.releaseParams();
  return answer(
      _service, context,
      [&](auto reply) {
        if (documents.size() > LocalRecords::kMostRecords) {
          reply(std::optional<VLContentRecordIDs>(), tooMany(documents.size()));
        } else {
          _service->server->daemon->records().resolveFileObjectIDsToContentRecordIDs(
              documents, std::move(reply));
        }
      },
      [](auto results, const std::optional<VLContentRecordIDs>& recordIDs,
         const NSErrorPtr& error) {
        codec::encode(results, recordIDs);
        codec::setError(results, error);
      });
}

kj::Promise<void> RecordsObject::fetchRecords(FetchRecordsContext context) {
  KJ_REQUIRE(*_fetches < kMostFetches, "this client fetches too much at a time");
  RecordQuery query = codec::decode(context.getParams().getQuery());
  context.releaseParams();
  if (query.recordNames.size() > LocalRecords::kMostRecords) {
    codec::setError(context.getResults(), tooMany(query.recordNames.size()));
  } else {
    context.getResults().setFetch(
        kj::heap<WithFaults<RecordFetchObject>>(_service, std::move(query), _fetches));
  }
  return kj::READY_NOW;
}

RecordFetchObject::RecordFetchObject(DaemonServicePtr service, RecordQuery query,
                                     std::shared_ptr<std::size_t> living)
    : _service(std::move(service)), _query(std::move(query)), _living(std::move(living)) {
  ++*_living;
}

RecordFetchObject::~RecordFetchObject() {
  --*_living;
  cancelSoon();
}

kj::Promise<void> RecordFetchObject::records(RecordsContext context) {
  KJ_REQUIRE(!_hasBegun, "the records of a fetch come once");
  _hasBegun = true;
  // Otherwise this call would keep the fetch of a client that is gone.
  context.allowCancellation();
  return answer(
      _service, context,
      [&](auto reply) {
        _progress =
            _service->server->daemon->records().fetchRecords(std::move(_query), std::move(reply));
        if (_isCancelled) cancelSoon();
      },
      [](auto results, const std::vector<FetchedRecord>& records, const NSErrorPtr& error) {
        auto list = results.initRecords(static_cast<unsigned>(records.size()));
        unsigned at = 0;
        for (const FetchedRecord& record : records) codec::encode(list[at++], record);
        codec::setError(results, error);
      });
}

kj::Promise<void> RecordFetchObject::cancel(CancelContext) {
  _isCancelled = true;
  cancelSoon();
  return kj::READY_NOW;
}

void RecordFetchObject::cancelSoon() {
  if (!_progress) return;
  // What the cancellation runs is vald's, and may wait.
  _service->executor->post([progress = _progress] { progress->cancel(); });
}

}  // namespace skein
