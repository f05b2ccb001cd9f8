#include "linux/protocol/SocketServer.h"

#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <map>
#include <utility>

#include "base/Mutex.h"
#include "linux/protocol/RpcConnection.h"
#include "linux/protocol/UnixSocket.h"

namespace skein {
namespace {

// How many are accepted before the peers that are there get their turn.
constexpr int kMostPerTurn = 16;
constexpr auto kRestWhenExhausted = 100 * kj::MILLISECONDS;

}  // namespace

// Lives on the loop's thread.
struct SocketServer::Core final : private kj::TaskSet::ErrorHandler {
  struct Peer {
    Peer(RpcIo& io, FileDescriptor socket, capnp::Capability::Client bootstrap)
        : connection(io, std::move(socket), RpcLimits::ofServer(), kj::mv(bootstrap)) {}

    RpcConnection connection;
    // Both as of the last look: how much the peer has said, and when that was seen.
    std::uint64_t messages = 0;
    std::uint64_t heardAt = 0;
    kj::Promise<void> ending = nullptr;
    kj::Promise<void> finishing = nullptr;
  };

  Core(FileDescriptor socket, Bootstrap make, Log& logHandle, Options settings)
      : listener(std::move(socket)),
        bootstrap(std::move(make)),
        log(logHandle),
        options(settings),
        tasks(kj::heap<kj::TaskSet>(static_cast<kj::TaskSet::ErrorHandler&>(*this))) {}

  void start(RpcIo& io);
  void close();
  void finish();
  kj::Promise<void> acceptSome();
  kj::Promise<void> acceptWhenReadable();
  void admit(FileDescriptor socket);
  void makeRoom();
  void remove(std::uint64_t number);
  void removeSoon(std::uint64_t number);
  void tellIfFinished();
  void taskFailed(kj::Exception&& exception) override;

  FileDescriptor listener;
  Bootstrap bootstrap;
  Log& log;
  const Options options;
  RpcIo* io = nullptr;
  kj::Own<kj::UnixEventPort::FdObserver> observer;
  std::map<std::uint64_t, kj::Own<Peer>> peers;
  std::uint64_t lastNumber = 0;
  kj::Own<kj::TaskSet> tasks;  // goes first: its promises name the peers

  // Whether every peer is gone, for who waits in finish().
  struct Finished {
    Mutex mutex;
    CondVar came;
    bool isSo SKEIN_GUARDED_BY(mutex) = false;
  };
  std::shared_ptr<Finished> finished;
};

void SocketServer::Core::start(RpcIo& loopIo) {
  io = &loopIo;
  observer = kj::heap<kj::UnixEventPort::FdObserver>(io->port, listener.get(),
                                                     kj::UnixEventPort::FdObserver::OBSERVE_READ);
  tasks->add(acceptSome());
}

void SocketServer::Core::close() {
  tasks = nullptr;
  peers.clear();
  observer = nullptr;
  listener.reset();
  bootstrap = nullptr;
}

kj::Promise<void> SocketServer::Core::acceptWhenReadable() {
  return observer->whenBecomesReadable().then([this] { return acceptSome(); });
}

kj::Promise<void> SocketServer::Core::acceptSome() {
  for (int accepted = 0; accepted < kMostPerTurn; ++accepted) {
    FileDescriptor socket(accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (socket) {
      admit(std::move(socket));
      continue;
    }
    if (errno == EAGAIN || errno == EWOULDBLOCK) return acceptWhenReadable();
    if (errno == EINTR || errno == ECONNABORTED) continue;
    // No descriptors or no memory: the peers that are there may give some back.
    VL_ERROR(log, "[ERROR] a connection cannot be accepted: %s", std::strerror(errno));
    return io->timer.afterDelay(kRestWhenExhausted).then([this] { return acceptSome(); });
  }
  return kj::evalLater([this] { return acceptSome(); });
}

void SocketServer::Core::admit(FileDescriptor socket) {
  const std::optional<uid_t> user = peerUserOfSocket(socket.get());
  if (user != geteuid()) {
    VL_ERROR(log, "[ERROR] a connection of user %lld was refused",
             user ? static_cast<long long>(*user) : -1LL);
    return;
  }
  if (peers.size() >= options.mostConnections) makeRoom();
  const std::uint64_t number = ++lastNumber;
  auto peer = kj::heap<Peer>(*io, std::move(socket), bootstrap());
  peer->heardAt = number;
  Peer& entry = *peer;
  auto stayedSilent = io->timer.afterDelay(options.firstMessage.count() * kj::MILLISECONDS)
                          .then([&entry]() -> kj::Promise<void> {
                            if (entry.connection.messagesRead() == 0) return kj::READY_NOW;
                            return kj::NEVER_DONE;
                          });
  peer->ending =
      entry.connection.onEnd()
          .exclusiveJoin(kj::mv(stayedSilent))
          .then([this, number] { removeSoon(number); })
          .eagerlyEvaluate([this](kj::Exception&& exception) { taskFailed(kj::mv(exception)); });
  peers.emplace(number, kj::mv(peer));
}

// A connection that never spoke goes before any that did; among equals the one that has
// been silent for longest. How long is told by comparing with the last time there was no
// room: nothing is noted per message.
void SocketServer::Core::makeRoom() {
  auto leaving = peers.end();
  for (auto at = peers.begin(); at != peers.end(); ++at) {
    Peer& peer = *at->second;
    const std::uint64_t messages = peer.connection.messagesRead();
    if (messages != std::exchange(peer.messages, messages)) peer.heardAt = lastNumber;
    if (leaving == peers.end()) {
      leaving = at;
      continue;
    }
    const auto rank = [](const Peer& one) { return std::pair(one.messages > 0, one.heardAt); };
    if (rank(peer) < rank(*leaving->second)) leaving = at;
  }
  if (leaving == peers.end()) return;
  VL_ERROR(log, "[ERROR] too many connections (%lu), the most silent one is closed",
           static_cast<unsigned long>(peers.size()));
  remove(leaving->first);
}

void SocketServer::Core::remove(std::uint64_t number) {
  peers.erase(number);
  tellIfFinished();
}

void SocketServer::Core::finish() {
  for (auto& [number, peer] : peers) {
    peer->finishing = peer->connection.finish(io->timer).eagerlyEvaluate([](kj::Exception&&) {});
  }
  tellIfFinished();
}

void SocketServer::Core::tellIfFinished() {
  if (!finished || !peers.empty()) return;
  MutexLock lock(finished->mutex);
  finished->isSo = true;
  finished->came.notifyAll();
}

// A promise of the peer's own ends here, so the peer has to outlive the moment.
void SocketServer::Core::removeSoon(std::uint64_t number) {
  tasks->add(kj::evalLater([this, number] { remove(number); }));
}

void SocketServer::Core::taskFailed(kj::Exception&& exception) {
  VL_ERROR(log, "[ERROR] accepting connections failed: %s", exception.getDescription().cStr());
}

std::shared_ptr<SocketServer> SocketServer::listen(const std::shared_ptr<RpcLoop>& loop,
                                                   const std::string& path, Bootstrap bootstrap,
                                                   Log& log, Options options, NSErrorOut error) {
  FileDescriptor socket = listenOnUnixSocket(path, error);
  if (!socket) return nullptr;
  auto core =
      loop->own(std::make_unique<Core>(std::move(socket), std::move(bootstrap), log, options));
  loop->post([core, loop = loop.get()] { core->start(loop->io()); });
  return std::shared_ptr<SocketServer>(new SocketServer(loop, path, std::move(core)));
}

SocketServer::SocketServer(std::shared_ptr<RpcLoop> loop, std::string path,
                           std::shared_ptr<Core> core)
    : _loop(std::move(loop)), _path(std::move(path)), _core(std::move(core)) {}

SocketServer::~SocketServer() {
  unlink(_path.c_str());
  _loop->postAndWait([core = _core] { core->close(); });
}

void SocketServer::finish(std::chrono::milliseconds patience) {
  const auto deadline = std::chrono::steady_clock::now() + patience;
  const auto finished = std::make_shared<Core::Finished>();
  _loop->post([core = _core, finished] {
    core->finished = finished;
    core->finish();
  });
  MutexLock lock(finished->mutex);
  while (!finished->isSo && finished->came.waitUntil(finished->mutex, deadline)) {
  }
}

void SocketServer::dropConnections() {
  _loop->post([core = _core] { core->peers.clear(); });
}

}  // namespace skein
