// From a Reply, which any thread may call or drop, to the promise of an RPC method.
#pragma once

#include <kj/async.h>
#include <kj/debug.h>

#include <cstddef>
#include <memory>
#include <tuple>
#include <utility>

namespace skein {

// A call that a peer has to answer. Lives on the loop's thread.
//
// A peer is what the objects of one connection or service share: its `loop`, the number of
// `unanswered` calls (on the loop's thread) and `kMostUnanswered`.
template <class Peer, class Context>
struct UnansweredCall {
  UnansweredCall(std::shared_ptr<Peer> callPeer, Context callContext,
                 kj::Own<kj::PromiseFulfiller<void>> own)
      : peer(std::move(callPeer)), context(callContext), fulfiller(kj::mv(own)) {
    ++peer->unanswered;
  }
  ~UnansweredCall() { --peer->unanswered; }
  UnansweredCall(const UnansweredCall&) = delete;
  UnansweredCall& operator=(const UnansweredCall&) = delete;

  const std::shared_ptr<Peer> peer;
  Context context;  // valid while the fulfiller is waited for
  kj::Own<kj::PromiseFulfiller<void>> fulfiller;
};

// Calls start(reply) and answers the promise of the call, on the loop's thread. `reply`
// takes what `encode` takes after the results' builder, and `encode` runs on the loop's
// thread. When `reply` is dropped uncalled, the call fails.
template <class Peer, class Context, class Start, class Encode>
kj::Promise<void> answer(const std::shared_ptr<Peer>& peer, Context context, Start start,
                         Encode encode) {
  KJ_REQUIRE(peer->unanswered < Peer::kMostUnanswered, "too many calls are unanswered");
  auto paf = kj::newPromiseAndFulfiller<void>();
  using Call = UnansweredCall<Peer, Context>;
  auto call = peer->loop->own(std::make_unique<Call>(peer, context, kj::mv(paf.fulfiller)));
  start([call = std::move(call), loop = peer->loop,
         encode = std::move(encode)](auto&&... values) mutable {
    loop->post([call = std::move(call), encode = std::move(encode),
                values = std::make_tuple(std::forward<decltype(values)>(values)...)]() mutable {
      if (!call->fulfiller->isWaiting()) return;  // the client is gone
      call->fulfiller->rejectIfThrows([&] {
        std::apply([&](auto&... value) { encode(call->context.getResults(), value...); }, values);
        call->fulfiller->fulfill();
      });
    });
  });
  return kj::mv(paf.promise);
}

}  // namespace skein
