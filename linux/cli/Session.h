#pragma once

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <tuple>
#include <utility>

#include "base/Mutex.h"
#include "base/ThreadPool.h"
#include "linux/cli/Interruption.h"
#include "linux/protocol/DriveIdentity.h"
#include "linux/protocol/DrivePaths.h"
#include "linux/protocol/HostClient.h"

namespace skein::cli {

// The drive that a command is about: $SKEIN_STORE or --store, else ~/Skein.
struct DriveChoice {
  std::string store;  // as --store gave it: a folder, or a drive's identity; may be empty

  // Opens the folder as a drive. The first time it says so, with what will be copied where;
  // on a terminal it asks before anything is made. Stores an error that says what to do when
  // there is no such folder, or the answer was no.
  DrivePaths paths(NSErrorOut error) const;
  // Of a drive that was opened before; nothing is made. Stores an error when it was not. Of a
  // drive that is named by its identity, and whose folder is gone, only what its state holds.
  DrivePaths known(NSErrorOut error) const;
  // The drive whose identity was given, as "skein drives" shows it; nil when it is none.
  std::optional<NotedDrive> noted() const;

 private:
  std::string folder(NSErrorOut error) const;
};

// An answer that a command waits for.
template <class... Values>
class Awaited {
 public:
  // What to give the service. The first answer counts.
  Reply<Values..., NSErrorPtr> reply() {
    return [state = _state](Values... values, NSErrorPtr error) {
      MutexLock lock(state->mutex);
      if (state->values) return;
      state->values = std::tuple<Values..., NSErrorPtr>(std::move(values)..., std::move(error));
      state->came.notifyAll();
    };
  }

  std::tuple<Values..., NSErrorPtr> wait() {
    MutexLock lock(_state->mutex);
    while (!_state->values) _state->came.wait(_state->mutex);
    return std::move(*_state->values);
  }

  // Nothing when the moment passed first.
  std::optional<std::tuple<Values..., NSErrorPtr>> waitUntil(
      std::optional<std::chrono::steady_clock::time_point> moment) {
    if (!moment) return wait();
    MutexLock lock(_state->mutex);
    while (!_state->values) {
      if (!_state->came.waitUntil(_state->mutex, *moment) && !_state->values) return std::nullopt;
    }
    return std::move(*_state->values);
  }

 private:
  struct State {
    Mutex mutex;
    CondVar came;
    std::optional<std::tuple<Values..., NSErrorPtr>> values SKEIN_GUARDED_BY(mutex);
  };
  std::shared_ptr<State> _state = std::make_shared<State>();
};

// A command's connection to the drive's skein-host, which is started when it does not run.
class Session {
 public:
  // Null with an error: no such drive.
  static std::unique_ptr<Session> open(const DriveChoice& drive, NSErrorOut error);

  HostService& host() { return *_host; }

 private:
  explicit Session(const DrivePaths& paths);

  const std::shared_ptr<RpcLoop> _loop;
  const std::shared_ptr<Executor> _executor;
  const std::shared_ptr<HostService> _host;
};

// Whether a question that began at `begin` and got `error` is worth asking once more: vald
// or skein-host was about to end when it was asked, and will be started again. An error that
// took long is an answer of its own.
bool isWorthAnotherTry(const NSErrorPtr& error, std::chrono::steady_clock::time_point begin);

// Calls start(reply) and waits for the answer, also when the command is interrupted: for changes.
template <class... Values, class Start>
std::tuple<Values..., NSErrorPtr> awaitOnce(Start& start) {
  Awaited<Values...> answer;
  start(answer.reply());
  return answer.wait();
}

// For questions, whose answer nobody needs when the command is interrupted: interruptedError()
// then.
template <class... Values, class Start>
std::tuple<Values..., NSErrorPtr> awaitUnlessInterrupted(Start& start) {
  Awaited<Values...> answer;
  const OnInterruption interrupted(
      [answer]() mutable { answer.reply()(Values()..., interruptedError()); });
  start(answer.reply());
  return answer.wait();
}

// The same, with another try where that is worth it; `start` may be called twice.
template <class... Values, class Start>
std::tuple<Values..., NSErrorPtr> await(Start start) {
  const auto begin = std::chrono::steady_clock::now();
  auto answer = awaitUnlessInterrupted<Values...>(start);
  if (isWorthAnotherTry(std::get<NSErrorPtr>(answer), begin)) {
    answer = awaitUnlessInterrupted<Values...>(start);
  }
  return answer;
}

}  // namespace skein::cli
