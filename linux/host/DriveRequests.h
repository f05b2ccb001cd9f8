#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <type_traits>
#include <utility>

#include "linux/host/Deadline.h"
#include "linux/host/FileProviderHost.h"
#include "linux/host/ItemPaths.h"
#include "linux/host/RequestTurns.h"
#include "linux/host/WorkingSetWatch.h"
#include "linux/protocol/HostTypes.h"

namespace skein {

// What the requests of the command line share: the drive is known before the extension is
// asked, targets become identifiers, and items get their places. Any thread.
class DriveRequests final : public std::enable_shared_from_this<DriveRequests> {
 public:
  template <class... Values>
  using Timed = std::shared_ptr<TimedReply<Values...>>;

  // `containers` outlives it.
  DriveRequests(std::shared_ptr<FileProviderHost> host, DaemonProxies daemon,
                VLContainers& containers)
      : _host(std::move(host)),
        _daemon(std::move(daemon)),
        _paths(_host->extension(), containers),
        _turns(std::make_shared<RequestTurns>(_host->tools().executor)) {}

  FileProviderHost& host() const { return *_host; }
  const std::shared_ptr<FileProviderHost>& sharedHost() const { return _host; }
  NSFileProviderExtension& extension() const { return _host->extension(); }
  const HostTools& tools() const { return _host->tools(); }
  const DaemonProxies& daemon() const { return _daemon; }
  const ItemPaths& paths() const { return _paths; }

  // Runs `work(timed)` on the executor, after vald has answered: the extension's lookups take
  // a vald that cannot be reached for an item that is not there, and its root URL, which is
  // asked once and kept, for a drive without one. So whoever asks after vald was lost waits
  // here until it is back, or hears that it is not. Then it waits for its turn; work whose
  // deadline has passed by then is not begun.
  template <class... Values, class Work>
  void withDrive(std::type_identity_t<Reply<Values..., NSErrorPtr>> reply, Work work) {
    withDrive<Values...>(std::move(reply), std::move(work), tools().deadline);
  }
  // The same with another deadline than the usual one.
  template <class... Values, class Work>
  void withDrive(std::type_identity_t<Reply<Values..., NSErrorPtr>> reply, Work work,
                 std::chrono::milliseconds deadline);

  // The identifier of what `target` names: of a reference, not of what it refers to.
  void findIdentifier(HostTarget target, Reply<std::string, NSErrorPtr> reply);

  // The rest is synchronous and may ask vald.

  // Nil with an error that says why.
  std::optional<NSFileProviderItemIdentifier> resolve(const HostTarget& target,
                                                      NSErrorOut error) const;
  // The item with its URL and its path, each empty where that is not known.
  HostItem place(NSFileProviderItemPtr item) const;

 private:
  static constexpr int kTries = 4;

  // Calls `then` once vald has answered, or with the error of the last of `tries`: a vald that
  // is just ending, or coming, closes the connection of whoever asks it.
  void reachVald(int tries, UniqueFunction<void(NSErrorPtr)> then);

  const std::shared_ptr<FileProviderHost> _host;
  const DaemonProxies _daemon;
  const ItemPaths _paths;
  const std::shared_ptr<RequestTurns> _turns;
};

// For calls that go straight to vald: its answer, or the connection's error.
template <class... Values>
std::function<void(NSErrorPtr)> failing(const std::shared_ptr<TimedReply<Values...>>& timed) {
  return [timed](NSErrorPtr error) { (*timed)(Values()..., std::move(error)); };
}

template <class... Values, class Work>
void DriveRequests::withDrive(std::type_identity_t<Reply<Values..., NSErrorPtr>> reply, Work work,
                              std::chrono::milliseconds deadline) {
  HostTools timing = tools();
  timing.deadline = deadline;
  auto timed = TimedReply<Values...>::begin(timing, std::move(reply));
  reachVald(kTries, [timed, work = std::move(work), turns = _turns](NSErrorPtr error) mutable {
    if (error) {
      (*timed)(Values()..., std::move(error));
      return;
    }
    turns->take(
        [timed = std::move(timed), work = std::move(work)](RequestTurns::Turn turn) mutable {
          // Held here too: an answer at the deadline leaves the work's thread waiting.
          if (timed->keep(turn)) work(std::move(timed));
        });
  });
}

}  // namespace skein
