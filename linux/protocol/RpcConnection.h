// One connection under the RPC library. Include this in few files: it costs seconds to
// compile.
#pragma once

#include <capnp/rpc-twoparty.h>
#include <capnp/serialize-async.h>
#include <kj/async-io.h>
#include <kj/async-unix.h>

#include <cstddef>
#include <cstdint>

#include "linux/protocol/FileDescriptor.h"
#include "linux/protocol/RpcLoop.h"

namespace skein {

// What the loop's thread works with.
struct RpcIo {
  kj::LowLevelAsyncIoProvider& provider;
  kj::Timer& timer;
  kj::UnixEventPort& port;
};

// How much one peer may make this process hold.
struct RpcLimits {
  // The longest message that is read, in words of 8 bytes; a longer one closes the connection.
  std::uint64_t readWords;
  // The longest that is sent: no more than the other side reads. A longer one fails alone.
  std::uint64_t sentWords;
  // Calls that are not answered yet, in words; beyond it the peer is not read from.
  std::size_t unansweredWords;
  // Calls that the peer has not declared finished; beyond it the connection is closed.
  std::size_t openCalls;
  // Answers that the peer does not read, in bytes; beyond it the peer is not read from.
  std::size_t unreadBytes;

  static constexpr std::uint64_t kRequestWords = std::uint64_t{64} * 1024;
  static constexpr std::uint64_t kAnswerWords = std::uint64_t{8} * 1024 * 1024;

  // For a server, whose peers may be anybody who runs as the same user.
  static RpcLimits ofServer() { return {kRequestWords, kAnswerWords, 16 * 1024, 4096, 4 << 20}; }
  // For a client, who reads whatever its server sends (or both would wait for each other).
  static RpcLimits ofClient() {
    return {kAnswerWords, kRequestWords, 1024 * 1024, 65536, SIZE_MAX};
  }
};

// The message stream of one peer, within limits. Ends the stream at the first message
// that breaks them.
class BoundedMessageStream final : public capnp::MessageStream {
 public:
  BoundedMessageStream(kj::Own<kj::AsyncIoStream> stream, const RpcLimits& limits);

  // Says whose queue of unsent messages counts against `unreadBytes`.
  void watchQueueOf(capnp::TwoPartyVatNetwork& network) { _network = &network; }
  // Resolves when nothing more comes from the peer.
  kj::Promise<void> onEnd() { return _end.addBranch(); }
  // How many messages came so far.
  std::uint64_t messagesRead() const { return _messagesRead; }

  kj::Promise<kj::Maybe<capnp::MessageReaderAndFds>> tryReadMessage(
      kj::ArrayPtr<kj::AutoCloseFd> fdSpace, capnp::ReaderOptions options,
      kj::ArrayPtr<capnp::word> scratchSpace) override;
  kj::Promise<void> writeMessage(
      kj::ArrayPtr<const int> fds,
      kj::ArrayPtr<const kj::ArrayPtr<const capnp::word>> segments) override;
  kj::Promise<void> writeMessages(
      kj::ArrayPtr<kj::ArrayPtr<const kj::ArrayPtr<const capnp::word>>> messages) override;
  kj::Maybe<int> getSendBufferSize() override { return _inner.getSendBufferSize(); }
  kj::Promise<void> end() override { return _inner.end(); }

 private:
  kj::Promise<void> whenPeerReads();
  void count(capnp::MessageReader& message);
  kj::Promise<void> afterWriting(kj::Promise<void> writing);
  void wroteSome();

  const RpcLimits _limits;
  kj::Own<kj::AsyncIoStream> _stream;
  capnp::AsyncIoMessageStream _inner;
  capnp::TwoPartyVatNetwork* _network = nullptr;
  std::uint64_t _messagesRead = 0;
  std::size_t _openCalls = 0;
  kj::Maybe<kj::Own<kj::PromiseFulfiller<void>>> _peerReads;
  kj::Own<kj::PromiseFulfiller<void>> _endFulfiller;
  kj::ForkedPromise<void> _end;
  kj::Promise<void> _look = nullptr;  // at what is still unread
};

// A connected socket with the RPC system on it. Lives on the loop's thread. Its end
// fails every outstanding call and releases every reference.
class RpcConnection {
 public:
  // Serves `bootstrap` to the peer.
  RpcConnection(RpcIo& io, FileDescriptor socket, const RpcLimits& limits,
                capnp::Capability::Client bootstrap);
  // Speaks to a server.
  RpcConnection(RpcIo& io, FileDescriptor socket, const RpcLimits& limits);

  // The server's bootstrap object. Each call asks for it anew, so that it also tells
  // whether the server's loop is alive.
  capnp::Capability::Client bootstrap();

  // Resolves when the connection is of no more use.
  kj::Promise<void> onEnd();
  // Says that nothing more comes, once everything was written that was to be sent.
  kj::Promise<void> finish(kj::Timer& timer);
  // How many messages the peer has sent.
  std::uint64_t messagesRead() const { return _stream.messagesRead(); }

 private:
  BoundedMessageStream _stream;
  capnp::TwoPartyVatNetwork _network;
  capnp::RpcSystem<capnp::rpc::twoparty::VatId> _system;
};

}  // namespace skein
