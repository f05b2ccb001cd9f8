// How the objects of a connection to skein-host answer. Include this in few files: it costs
// seconds to compile.
#pragma once

#include <cstddef>
#include <memory>
#include <utility>

#include "base/SerialQueue.h"
#include "linux/protocol/Answer.h"
#include "linux/protocol/Codec.h"
#include "linux/protocol/HostService.h"
#include "linux/protocol/RpcLoop.h"
#include "linux/protocol/ServiceEndpoints.h"

namespace skein {

// What the objects of one connection share.
struct HostPeer {
  // A terminal's listing has three pages under way.
  static constexpr std::size_t kMostUnanswered = 256;
  // Listings, watches, batches and transfers that are not let go of.
  static constexpr std::size_t kMostStreams = 256;

  std::shared_ptr<RpcLoop> loop;
  std::shared_ptr<Executor> executor;
  std::shared_ptr<HostService> service;
  std::shared_ptr<HostServices> services;
  pid_t process = 0;  // the client's, as the kernel says
  // On the loop's thread.
  std::size_t unanswered = 0;
  std::size_t streams = 0;
};
using HostPeerPtr = std::shared_ptr<HostPeer>;

// Answers the promise of a call whose start(reply) `run` takes off the loop's thread.
template <class Context, class Run, class Start, class Encode>
kj::Promise<void> answerThrough(Run run, const HostPeerPtr& peer, Context context, Start start,
                                Encode encode) {
  return answer(
      peer, context,
      [&run, &start](auto reply) {
        run([start = std::move(start), reply = std::move(reply)]() mutable {
          start(std::move(reply));
        });
      },
      std::move(encode));
}

template <class Context, class Start, class Encode>
kj::Promise<void> answerOnExecutor(const HostPeerPtr& peer, Context context, Start start,
                                   Encode encode) {
  return answerThrough([&](Task task) { peer->executor->post(std::move(task)); }, peer, context,
                       std::move(start), std::move(encode));
}

// One stream of a client. Its calls reach the service one after the other, as they came, or
// pages would change places. It is released on the executor, since its end asks the
// extension to let go.
template <class Stream>
class StreamOwner {
 public:
  StreamOwner(HostPeerPtr peer, std::shared_ptr<Stream> stream)
      : _peer(std::move(peer)), _stream(std::move(stream)), _queue("host-stream", _peer->executor) {
    if (_peer->streams >= HostPeer::kMostStreams) {
      release();
      KJ_FAIL_REQUIRE("this client has too many streams");
    }
    ++_peer->streams;
  }
  ~StreamOwner() {
    --_peer->streams;
    release();
  }
  StreamOwner(const StreamOwner&) = delete;
  StreamOwner& operator=(const StreamOwner&) = delete;

  template <class Context, class Encode>
  kj::Promise<void> next(Context context, Encode encode) {
    // Otherwise a call that waits for the next step would keep the stream of a client that is
    // gone, and what it began would go on until then.
    context.allowCancellation();
    return answerThrough([&](Task task) { _queue.async(std::move(task)); }, _peer, context,
                         [stream = _stream](auto reply) { stream->next(std::move(reply)); },
                         std::move(encode));
  }
  // Calls call(stream), after the calls before it.
  template <class Call>
  void run(Call call) {
    _queue.async([stream = _stream, call = std::move(call)] { call(*stream); });
  }

 private:
  void release() {
    _peer->executor->post([stream = std::move(_stream)]() mutable { stream = nullptr; });
  }

  const HostPeerPtr _peer;
  std::shared_ptr<Stream> _stream;
  SerialQueue _queue;
};

// For a result that only has an error.
inline constexpr auto encodeError = [](auto results, const NSErrorPtr& error) {
  codec::setError(results, error);
};

}  // namespace skein
