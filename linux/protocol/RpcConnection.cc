#include "linux/protocol/RpcConnection.h"

#include <capnp/rpc.capnp.h>

#include <utility>

namespace skein {
namespace {

// What the library holds outgoing messages against. Those that come in have a limit of their
// own, where they are read.
capnp::ReaderOptions optionsForSending(const RpcLimits& limits) {
  capnp::ReaderOptions options;
  options.traversalLimitInWords = limits.sentWords;
  return options;
}

constexpr auto kBetweenLooks = 2 * kj::MILLISECONDS;

kj::Own<kj::AsyncIoStream> wrap(RpcIo& io, FileDescriptor socket) {
  return io.provider.wrapSocketFd(socket.release(),
                                  kj::LowLevelAsyncIoProvider::TAKE_OWNERSHIP |
                                      kj::LowLevelAsyncIoProvider::ALREADY_CLOEXEC |
                                      kj::LowLevelAsyncIoProvider::ALREADY_NONBLOCK);
}

}  // namespace

BoundedMessageStream::BoundedMessageStream(kj::Own<kj::AsyncIoStream> stream,
                                           const RpcLimits& limits)
    : _limits(limits), _stream(kj::mv(stream)), _inner(*_stream), _end(nullptr) {
  auto paf = kj::newPromiseAndFulfiller<void>();
  _endFulfiller = kj::mv(paf.fulfiller);
  _end = paf.promise.fork();
}

kj::Promise<void> BoundedMessageStream::whenPeerReads() {
  if (_network == nullptr || _network->getCurrentQueueSize() <= _limits.unreadBytes) {
    return kj::READY_NOW;
  }
  auto paf = kj::newPromiseAndFulfiller<void>();
  _peerReads = kj::mv(paf.fulfiller);
  return kj::mv(paf.promise);
}

void BoundedMessageStream::wroteSome() {
  if (_peerReads == nullptr) return;
  // Last: the library takes what was written off its queue only after this call.
  _look = kj::evalLast([this] {
            KJ_IF_MAYBE (waiting, _peerReads) {
              if (_network->getCurrentQueueSize() > _limits.unreadBytes) return;
              auto fulfiller = kj::mv(*waiting);
              _peerReads = nullptr;
              fulfiller->fulfill();
            }
          }).eagerlyEvaluate(nullptr);
}

void BoundedMessageStream::count(capnp::MessageReader& message) {
  ++_messagesRead;
  switch (message.getRoot<capnp::rpc::Message>().which()) {
    case capnp::rpc::Message::CALL:
    case capnp::rpc::Message::BOOTSTRAP:
      KJ_REQUIRE(++_openCalls <= _limits.openCalls, "the peer finishes none of its calls");
      break;
    case capnp::rpc::Message::FINISH:
      if (_openCalls > 0) --_openCalls;
      break;
    default: break;
  }
}

kj::Promise<kj::Maybe<capnp::MessageReaderAndFds>> BoundedMessageStream::tryReadMessage(
    kj::ArrayPtr<kj::AutoCloseFd> fdSpace, capnp::ReaderOptions options,
    kj::ArrayPtr<capnp::word> scratchSpace) {
  options.traversalLimitInWords = _limits.readWords;
  return whenPeerReads()
      .then([this, fdSpace, options, scratchSpace] {
        return _inner.tryReadMessage(fdSpace, options, scratchSpace);
      })
      .then(
          [this](kj::Maybe<capnp::MessageReaderAndFds> message) {
            KJ_IF_MAYBE (present, message) {
              KJ_ON_SCOPE_FAILURE(_endFulfiller->fulfill());
              count(*present->reader);
            } else {
              _endFulfiller->fulfill();
            }
            return message;
          },
          [this](kj::Exception&& exception) -> kj::Maybe<capnp::MessageReaderAndFds> {
            _endFulfiller->fulfill();
            kj::throwFatalException(kj::mv(exception));
          });
}

kj::Promise<void> BoundedMessageStream::afterWriting(kj::Promise<void> writing) {
  return writing.then([this] { wroteSome(); },
                      [this](kj::Exception&& exception) {
                        // Nothing is read either once a write failed.
                        _endFulfiller->fulfill();
                        kj::throwFatalException(kj::mv(exception));
                      });
}

kj::Promise<void> BoundedMessageStream::writeMessage(
    kj::ArrayPtr<const int> fds, kj::ArrayPtr<const kj::ArrayPtr<const capnp::word>> segments) {
  return afterWriting(_inner.writeMessage(fds, segments));
}

kj::Promise<void> BoundedMessageStream::writeMessages(
    kj::ArrayPtr<kj::ArrayPtr<const kj::ArrayPtr<const capnp::word>>> messages) {
  return afterWriting(_inner.writeMessages(messages));
}

RpcConnection::RpcConnection(RpcIo& io, FileDescriptor socket, const RpcLimits& limits,
                             capnp::Capability::Client bootstrap)
    : _stream(wrap(io, std::move(socket)), limits),
      _network(_stream, capnp::rpc::twoparty::Side::SERVER, optionsForSending(limits)),
      _system(capnp::makeRpcServer(_network, kj::mv(bootstrap))) {
  _stream.watchQueueOf(_network);
  _system.setFlowLimit(limits.unansweredWords);
}

RpcConnection::RpcConnection(RpcIo& io, FileDescriptor socket, const RpcLimits& limits)
    : _stream(wrap(io, std::move(socket)), limits),
      _network(_stream, capnp::rpc::twoparty::Side::CLIENT, optionsForSending(limits)),
      _system(capnp::makeRpcClient(_network)) {
  _stream.watchQueueOf(_network);
  _system.setFlowLimit(limits.unansweredWords);
}

// The peer may end the stream, or break the protocol inside well-formed messages; then
// the RPC system is the one that ends.
kj::Promise<void> RpcConnection::onEnd() {
  return _stream.onEnd().exclusiveJoin(_network.onDisconnect());
}

kj::Promise<void> RpcConnection::finish(kj::Timer& timer) {
  // Last, so that what was just answered is among what is sent.
  return kj::evalLast([this, &timer]() -> kj::Promise<void> {
    if (_network.getCurrentQueueSize() == 0) return _stream.end();
    return timer.afterDelay(kBetweenLooks).then([this, &timer] { return finish(timer); });
  });
}

capnp::Capability::Client RpcConnection::bootstrap() {
  capnp::MallocMessageBuilder message;
  auto server = message.initRoot<capnp::rpc::twoparty::VatId>();
  server.setSide(capnp::rpc::twoparty::Side::SERVER);
  return _system.bootstrap(server);
}

}  // namespace skein
