// The cloud's records, as one connection sees them. Include this in few files: it costs
// seconds to compile.
#pragma once

#include <cstddef>
#include <memory>

#include "linux/protocol/DaemonService.h"
#include "linux/protocol/RecordsCodec.h"

namespace skein {

// The part of vald's object that has to do with records. Lives on the loop's thread.
class RecordsObject : public virtual wire::Records::Server {
 public:
  explicit RecordsObject(DaemonServicePtr service) : _service(std::move(service)) {}

  kj::Promise<void> contentRecordIDs(ContentRecordIDsContext context) override;
  kj::Promise<void> fetchRecords(FetchRecordsContext context) override;

 private:
  const DaemonServicePtr _service;
  const std::shared_ptr<std::size_t> _fetches = std::make_shared<std::size_t>(0);
};

// A client's reference to one fetch; with the last one the fetch is cancelled.
class RecordFetchObject : public wire::RecordFetch::Server {
 public:
  // `living`: counts the connection's fetches.
  RecordFetchObject(DaemonServicePtr service, RecordQuery query,
                    std::shared_ptr<std::size_t> living);
  ~RecordFetchObject();

  kj::Promise<void> records(RecordsContext context) override;
  kj::Promise<void> cancel(CancelContext context) override;

 private:
  void cancelSoon();

  const DaemonServicePtr _service;
  RecordQuery _query;
  const std::shared_ptr<std::size_t> _living;
  bool _hasBegun = false;
  bool _isCancelled = false;
  std::shared_ptr<NSProgress> _progress;  // once it has begun
};

}  // namespace skein
