#include "linux/vald/cloud/Downloader.h"

#include <algorithm>
#include <map>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/cloud/CloudErrors.h"

namespace skein::vald {

struct Downloader::Core {
  struct Waiter {
    DownloadTransfer::Progress progress;
    Completion<NSErrorPtr> completion;
  };
  using WaiterPtr = std::shared_ptr<Waiter>;
  // A marker that was copied names its original's document, at a place of its own.
  using Key = std::pair<VLFileObjectID, std::string>;

  struct Download {
    Key key{VLFileObjectID::documentWithRawID(0), {}};
    std::unique_ptr<DownloadTransfer> transfer;
    // Guarded by the core's mutex; whoever takes a waiter out answers it.
    std::vector<WaiterPtr> waiters;
  };
  using DownloadPtr = std::shared_ptr<Download>;

  Core(CloudPlaces where, CloudConditions& how, CloudClock& when)
      : places(std::move(where)), conditions(how), clock(when) {}

  void run(const DownloadPtr& download) SKEIN_EXCLUDES(mutex) {
    NSErrorPtr error = download->transfer->run();
    std::vector<WaiterPtr> waiters;
    {
      MutexLock lock(mutex);
      forget(download);
      waiters.swap(download->waiters);
    }
    for (const WaiterPtr& waiter : waiters) waiter->completion(error);
  }

  void cancel(const DownloadPtr& download, const WaiterPtr& waiter) SKEIN_EXCLUDES(mutex) {
    bool last = false;
    {
      MutexLock lock(mutex);
      if (download->waiters.size() == 1 && download->waiters.front() == waiter) {
        // Who asks from now on starts anew.
        last = true;
        forget(download);
      }
    }
    if (last && !download->transfer->abandon()) return;  // it is there, and run() says so
    if (takeOut(download, waiter)) waiter->completion(cancelledError());
  }

  void cancelAll() SKEIN_EXCLUDES(mutex) {
    std::vector<DownloadPtr> all;
    {
      MutexLock lock(mutex);
      for (const auto& [key, download] : downloads) all.push_back(download);
      downloads.clear();
    }
    for (const DownloadPtr& download : all) {
      if (!download->transfer->abandon()) continue;
      std::vector<WaiterPtr> waiters;
      {
        MutexLock lock(mutex);
        waiters.swap(download->waiters);
      }
      for (const WaiterPtr& waiter : waiters) waiter->completion(cancelledError());
    }
  }

  void tellProgress(Download& download, std::uint64_t bytes, std::uint64_t total)
      SKEIN_EXCLUDES(mutex) {
    std::vector<WaiterPtr> waiters;
    {
      MutexLock lock(mutex);
      waiters = download.waiters;
    }
    for (const WaiterPtr& waiter : waiters) {
      if (waiter->progress) waiter->progress(bytes, total);
    }
  }

  bool takeOut(const DownloadPtr& download, const WaiterPtr& waiter) SKEIN_EXCLUDES(mutex) {
    MutexLock lock(mutex);
    return std::erase(download->waiters, waiter) != 0;
  }

  void forget(const DownloadPtr& download) SKEIN_REQUIRES(mutex) {
    const auto found = downloads.find(download->key);
    if (found != downloads.end() && found->second == download) downloads.erase(found);
  }

  const CloudPlaces places;
  CloudConditions& conditions;
  CloudClock& clock;
  Mutex mutex;
  std::map<Key, DownloadPtr> downloads SKEIN_GUARDED_BY(mutex);
};

class Downloader::WaiterTicket final : public Ticket {
 public:
  WaiterTicket(std::shared_ptr<Core> core, Core::DownloadPtr download, Core::WaiterPtr waiter)
      : _core(std::move(core)), _download(std::move(download)), _waiter(std::move(waiter)) {}

  void cancel() override { _core->cancel(_download, _waiter); }

 private:
  const std::shared_ptr<Core> _core;
  const Core::DownloadPtr _download;
  const Core::WaiterPtr _waiter;
};

Downloader::Downloader(CloudPlaces places, CloudConditions& conditions, CloudClock& clock,
                       std::shared_ptr<Executor> executor, std::size_t limit)
    : _core(std::make_shared<Core>(std::move(places), conditions, clock)),
      _runner(std::move(executor), limit) {}

Downloader::~Downloader() { _core->cancelAll(); }

std::shared_ptr<Downloader::Ticket> Downloader::download(Request request) {
  const auto waiter = std::make_shared<Core::Waiter>();
  waiter->progress = std::move(request.progress);
  waiter->completion = std::move(request.completion);

  const auto fresh = std::make_shared<Core::Download>();
  fresh->key = {request.document, request.path};
  fresh->transfer = std::make_unique<DownloadTransfer>(
      _core->places, _core->conditions, _core->clock, request.document, std::move(request.path),
      request.isCopy,
      // The transfer belongs to the download, and runs only while that lives.
      [core = _core.get(), download = fresh.get()](std::uint64_t bytes, std::uint64_t total) {
        core->tellProgress(*download, bytes, total);
      });
  Core::DownloadPtr download = fresh;
  {
    MutexLock lock(_core->mutex);
    download = _core->downloads.emplace(fresh->key, fresh).first->second;
    download->waiters.push_back(waiter);
  }
  if (download == fresh) {
    _runner.post([core = _core, download] { core->run(download); });
  }
  return std::make_shared<WaiterTicket>(_core, download, waiter);
}

}  // namespace skein::vald
