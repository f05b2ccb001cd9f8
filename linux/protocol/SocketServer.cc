#include "linux/protocol/SocketServer.h"

#include <sys/inotify.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
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

// The file of a socket that this process listens on.
class Address {
 public:
  // As it is now: the socket was just bound.
  explicit Address(std::string path) : _path(std::move(path)) {
    if (lstat(_path.c_str(), &_own) != 0) _own = {};
  }

  const std::string& path() const { return _path; }
  bool isOwn() const {
    struct stat found {};
    return lstat(_path.c_str(), &found) == 0 && found.st_dev == _own.st_dev &&
           found.st_ino == _own.st_ino;
  }
  void remove() const {
    if (isOwn()) unlink(_path.c_str());
  }

  // Becomes readable when something in the socket's folder comes or goes, or a folder above it,
  // as far as those can be watched, moves.
  FileDescriptor watch() const {
    constexpr std::uint32_t kItself = IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
    FileDescriptor watch(inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
    std::string folder = _path.substr(0, _path.rfind('/'));
    if (watch && inotify_add_watch(watch.get(), folder.c_str(),
                                   IN_CREATE | IN_DELETE | IN_MOVE | kItself) < 0) {
      watch.reset();
    }
    while (watch && (folder.resize(folder.rfind('/')), !folder.empty())) {
      inotify_add_watch(watch.get(), folder.c_str(), kItself);
    }
    return watch;
  }

 private:
  const std::string _path;
  struct stat _own {};
};

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

  Core(FileDescriptor socket, const std::string& path, Bootstrap make, Log& logHandle,
       Options settings, std::function<void()> lost)
      : listener(std::move(socket)),
        address(path),
        watch(address.watch()),
        addressLost(std::move(lost)),
        bootstrap(std::move(make)),
        log(logHandle),
        options(settings),
        tasks(kj::heap<kj::TaskSet>(static_cast<kj::TaskSet::ErrorHandler&>(*this))) {}

  void start(RpcIo& io);
  void close();
  void finish();
  kj::Promise<void> watchAddress();
  kj::Promise<void> acceptSome();
  kj::Promise<void> acceptWhenReadable();
  void admit(FileDescriptor socket);
  void makeRoom();
  void remove(std::uint64_t number);
  void removeSoon(std::uint64_t number);
  void tellIfFinished();
  void taskFailed(kj::Exception&& exception) override;

  FileDescriptor listener;
  const Address address;
  FileDescriptor watch;
  std::function<void()> addressLost;
  Bootstrap bootstrap;
  Log& log;
  const Options options;
  RpcIo* io = nullptr;
  kj::Own<kj::UnixEventPort::FdObserver> observer;
  kj::Own<kj::UnixEventPort::FdObserver> watchObserver;
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
  if (!watch) {
    VL_ERROR(log, "[ERROR] %@ cannot be watched: %s", address.path(), std::strerror(errno));
    return;
  }
  watchObserver = kj::heap<kj::UnixEventPort::FdObserver>(
      io->port, watch.get(), kj::UnixEventPort::FdObserver::OBSERVE_READ);
  tasks->add(watchAddress());
}

void SocketServer::Core::close() {
  address.remove();
  tasks = nullptr;
  watchObserver = nullptr;
  watch.reset();
  peers.clear();
  observer = nullptr;
  listener.reset();
  bootstrap = nullptr;
}

// What happened is not read, only that something did: the file is looked at.
kj::Promise<void> SocketServer::Core::watchAddress() {
  std::array<char, 4096> events{};
  while (read(watch.get(), events.data(), events.size()) > 0) {
  }
  if (address.isOwn()) {
    return watchObserver->whenBecomesReadable().then([this] { return watchAddress(); });
  }
  VL_ERROR(log, "[ERROR] %@ is gone or another process's", address.path());
  if (addressLost) addressLost();
  return kj::READY_NOW;
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
  const auto who = peerOfSocket(socket.get());
  if (!who || who->uid != geteuid()) {
    VL_ERROR(log, "[ERROR] a connection of user %lld was refused",
             who ? static_cast<long long>(who->uid) : -1LL);
    return;
  }
  if (peers.size() >= options.mostConnections) makeRoom();
  const std::uint64_t number = ++lastNumber;
  auto peer = kj::heap<Peer>(*io, std::move(socket), bootstrap(who->pid));
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
                                                   Log& log, Options options, NSErrorOut error,
                                                   std::function<void()> addressLost) {
  FileDescriptor socket = listenOnUnixSocket(path, error);
  if (!socket) return nullptr;
  auto core = loop->own(std::make_unique<Core>(std::move(socket), path, std::move(bootstrap), log,
                                               options, std::move(addressLost)));
  loop->post([core, loop = loop.get()] { core->start(loop->io()); });
  return std::shared_ptr<SocketServer>(new SocketServer(loop, std::move(core)));
}

SocketServer::SocketServer(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Core> core)
    : _loop(std::move(loop)), _core(std::move(core)) {}

SocketServer::~SocketServer() {
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
