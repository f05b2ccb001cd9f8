// From a Reply, which any thread may call or drop, to the promise of an RPC method.
#pragma once

#include <kj/async.h>
#include <kj/debug.h>

#include <memory>
#include <tuple>
#include <utility>

#include "linux/protocol/DaemonReferences.h"

namespace skein {

// A call that vald has to answer. Lives on the loop's thread.
template <class Context>
struct UnansweredCall {
  UnansweredCall(DaemonServicePtr servicePtr, Context callContext,
                 kj::Own<kj::PromiseFulfiller<void>> own)
      : service(std::move(servicePtr)), context(callContext), fulfiller(kj::mv(own)) {
    ++service->unanswered;
  }
  ~UnansweredCall() { --service->unanswered; }
  UnansweredCall(const UnansweredCall&) = delete;
  UnansweredCall& operator=(const UnansweredCall&) = delete;

  const DaemonServicePtr service;
  Context context;  // valid while the fulfiller is waited for
  kj::Own<kj::PromiseFulfiller<void>> fulfiller;
};

// Calls start(reply) and answers the promise of the call, on the loop's thread. `reply`
// takes what `encode` takes after the results' builder, and `encode` runs on the loop's
// thread. When `reply` is dropped uncalled, the call fails.
template <class Context, class Start, class Encode>
kj::Promise<void> answer(const DaemonServicePtr& service, Context context, Start start,
                         Encode encode) {
  constexpr std::size_t kMostUnanswered = 8192;
  KJ_REQUIRE(service->unanswered < kMostUnanswered, "too many calls are unanswered");
  auto paf = kj::newPromiseAndFulfiller<void>();
  using Call = UnansweredCall<Context>;
  auto call = service->loop->own(std::make_unique<Call>(service, context, kj::mv(paf.fulfiller)));
  start([call = std::move(call), loop = service->loop,
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
