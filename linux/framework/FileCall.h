// How the framework's file operations go to vald.
#pragma once

#include <chrono>
#include <memory>
#include <tuple>
#include <utility>

#include "linux/framework/RequestOrigin.h"
#include "linux/framework/RequestProgress.h"
#include "linux/framework/SyncCall.h"
#include "linux/protocol/LocalFiles.h"

namespace skein {

// Calls start(files, origin, reply). `handler`, whose last value is an error, runs once, on
// the executor: with what came, or with the error that nothing will. It has the calling
// thread's origin, which `start` gets too, and its progress.
template <class... Values, class Start>
void callFiles(const DaemonAccess& access, UniqueFunction<void(Values...)> handler, Start start) {
  const RequestOrigin origin = RequestOriginScope::current();
  const auto reply = [handler =
                          std::make_shared<UniqueFunction<void(Values...)>>(std::move(handler)),
                      origin, progress = RequestProgressScope::current()](Values... values) {
    const RequestOriginScope originScope(origin);
    const RequestProgressScope progressScope(progress);
    (*handler)(std::move(values)...);
  };
  const auto daemon = access.client->remoteObjectProxyWithErrorHandler([reply](NSErrorPtr error) {
    std::tuple<Values...> values;
    std::get<sizeof...(Values) - 1>(values) = std::move(error);
    std::apply(reply, std::move(values));
  });
  start(daemon->files(), origin, reply);
}

// The same for a thread that waits: the reply takes a value and an error.
template <class T, class Start>
std::pair<T, NSErrorPtr> askFiles(const DaemonAccess& access, Start start) {
  const auto call = [&](LocalDaemon& daemon, auto reply) {
    start(daemon.files(), RequestOriginScope::current(), std::move(reply));
  };
  return askDaemon<T>(access, call, deadlines::kChange);
}

// For calls whose reply takes an error alone.
template <class Start>
NSErrorPtr askFilesForError(const DaemonAccess& access, Start start) {
  const auto call = [&](LocalFiles& files, RequestOrigin origin, auto reply) {
    start(files, std::move(origin),
          [reply = std::move(reply)](NSErrorPtr error) mutable { reply(true, std::move(error)); });
  };
  return askFiles<bool>(access, call).second;
}

}  // namespace skein
