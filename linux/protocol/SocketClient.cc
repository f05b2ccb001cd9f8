#include "linux/protocol/SocketClient.h"

#include <kj/debug.h>

#include <cerrno>
#include <cstring>
#include <list>
#include <map>
#include <utility>
#include <vector>

#include "base/Fault.h"
#include "base/Mutex.h"
#include "linux/protocol/RpcConnection.h"
#include "linux/protocol/UnixSocket.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// How long a peer that let a deadline pass has to answer a probe.
constexpr auto kProbeTime = deadlines::kProbe.count() * kj::MILLISECONDS;
constexpr auto kBetweenConnects = 10 * kj::MILLISECONDS;
// How often a peer is probed while it takes its time.
constexpr auto kBetweenProbes = 500 * kj::MILLISECONDS;

}  // namespace

// Lives on the loop's thread.
struct SocketClient::Core final : std::enable_shared_from_this<Core>,
                                  private kj::TaskSet::ErrorHandler {
  // A message under way. It fails at most once, and only while it is not answered.
  struct Message {
    Fail fail;  // empty: answered, or failed
    bool failsOnLoop = false;
    std::uint64_t connection = 0;
    kj::Canceler canceler;
    std::list<std::shared_ptr<Message>>::iterator place;
  };
  using MessagePtr = std::shared_ptr<Message>;

  Core(std::shared_ptr<RpcLoop> rpcLoop, std::shared_ptr<Executor> runner, Options settings)
      : loop(std::move(rpcLoop)),
        executor(std::move(runner)),
        options(std::move(settings)),
        tasks(*this) {}
  ~Core() { close(); }

  // Ends when there is a connection, or `lastError` says why there is none.
  kj::Promise<void> connected();
  kj::Promise<void> connect();
  void connectNow(int& code);
  kj::Promise<void> startProgramAndConnect();
  void lose(const NSErrorPtr& error);
  void close();

  MessagePtr newMessage(Fail fail);
  void run(const MessagePtr& message, kj::Promise<Task> sending, Patience patience);
  kj::Promise<void> deadlineOf(const MessagePtr& message, Patience patience);
  kj::Promise<void> probeForEver(std::uint64_t number);
  kj::Promise<void> probe(std::uint64_t number, kj::Duration time);
  void finish(const MessagePtr& message, const NSErrorPtr& error);
  NSErrorPtr errorFor(const kj::Exception& exception) const;
  NSErrorPtr unreachable(const std::string& what) const;
  NSErrorPtr deadlineError() const;
  NSErrorPtr lostError() const;
  void taskFailed(kj::Exception&& exception) override;

  const std::shared_ptr<RpcLoop> loop;
  const std::shared_ptr<Executor> executor;
  const Options options;
  std::function<void()> connectedHandler;

  // The connection, and while there is none, why the last one ended.
  kj::Own<RpcConnection> connection;
  kj::Maybe<capnp::Capability::Client> server;
  std::uint64_t number = 0;
  NSErrorPtr lastError;
  NSErrorPtr closed;  // set for good by close()
  kj::Promise<void> ending = nullptr;
  bool connecting = false;
  kj::ForkedPromise<void> connectingNow = nullptr;

  // Told when nothing is under way.
  struct Settled {
    Mutex mutex;
    CondVar came;
    bool isSo SKEIN_GUARDED_BY(mutex) = false;
  };
  void tellIfSettled();
  std::vector<std::shared_ptr<Settled>> settling;

  std::list<MessagePtr> messages;
  struct Watcher {
    std::uint64_t connection;
    Lost lost;
  };
  std::map<std::uint64_t, Watcher> watchers;
  std::uint64_t lastWatcher = 0;
  kj::TaskSet tasks;
};

NSErrorPtr SocketClient::Core::unreachable(const std::string& what) const {
  std::string text = options.peer + ' ' + what;
  if (options.program && !options.program->logPath.empty()) {
    text += " Its log is " + options.program->logPath + ".";
  }
  return vl_errorDaemonUnreachable(text);
}

NSErrorPtr SocketClient::Core::deadlineError() const {
  return unreachable("did not answer within " + std::to_string(options.deadline.count()) +
                     " ms; it is stopped or too busy.");
}

NSErrorPtr SocketClient::Core::lostError() const {
  return unreachable("closed the connection; it has ended or was restarted. Try again.");
}

NSErrorPtr SocketClient::Core::errorFor(const kj::Exception& exception) const {
  switch (exception.getType()) {
    case kj::Exception::Type::DISCONNECTED: return lostError();
    case kj::Exception::Type::UNIMPLEMENTED:
      return unreachable(
          "does not know this request; it is of another version. Stop it and try "
          "again.");
    default:
      return unreachable("gave no answer: " + std::string(exception.getDescription().cStr()) + ".");
  }
}

// --- The connection.

kj::Promise<void> SocketClient::Core::connected() {
  if (connection.get() != nullptr || closed) return kj::READY_NOW;
  if (!connecting) {
    connecting = true;
    connectingNow = connect().then([this] { connecting = false; }).fork();
  }
  return connectingNow.addBranch();
}

kj::Promise<void> SocketClient::Core::connect() {
  int code = 0;
  connectNow(code);
  if (options.program && (code == ENOENT || code == ECONNREFUSED)) {
    return startProgramAndConnect();
  }
  // Too many wait to be accepted; as long as somebody waits here, it is tried again.
  if (code == EAGAIN && !messages.empty()) {
    return loop->io().timer.afterDelay(kBetweenConnects).then([this] { return connect(); });
  }
  return kj::READY_NOW;
}

void SocketClient::Core::connectNow(int& code) {
  if (closed) return;
  FileDescriptor socket = connectToUnixSocket(options.socketPath, code);
  if (!socket) {
    const bool notThere = code == ENOENT || code == ECONNREFUSED;
    lastError = unreachable(notThere ? "does not run."
                                     : "cannot be reached at " + options.socketPath + ": " +
                                           std::strerror(code) + ".");
    return;
  }
  connection = kj::heap<RpcConnection>(loop->io(), std::move(socket), RpcLimits::ofClient());
  server = connection->bootstrap();
  const std::uint64_t mine = ++number;
  ending = connection->onEnd()
               .then([this, mine] {
                 // Not from inside the connection's own promise.
                 tasks.add(kj::evalLater([this, mine] {
                   if (number == mine && connection.get() != nullptr) lose(lostError());
                 }));
               })
               .eagerlyEvaluate(nullptr);
  if (connectedHandler) executor->post([handler = connectedHandler] { handler(); });
}

kj::Promise<void> SocketClient::Core::startProgramAndConnect() {
  auto paf = kj::newPromiseAndFulfiller<void>();
  auto fulfiller =
      loop->own(std::make_unique<kj::Own<kj::PromiseFulfiller<void>>>(kj::mv(paf.fulfiller)));
  auto result = std::make_shared<NSErrorPtr>();
  executor->post([fulfiller = std::move(fulfiller), result, program = *options.program, loop = loop,
                  executor = executor] {
    ScopedWait wait(*executor);
    *result = startProgram(program);
    loop->post([fulfiller] { (*fulfiller)->fulfill(); });
  });
  return paf.promise.then([this, result] {
    int code = 0;
    if (*result) {
      lastError = *result;
    } else {
      connectNow(code);
    }
  });
}

void SocketClient::Core::lose(const NSErrorPtr& error) {
  const std::uint64_t lost = number;
  lastError = error;
  std::vector<MessagePtr> failing;
  for (const MessagePtr& message : messages) {
    if (message->connection == lost) failing.push_back(message);
  }
  for (const MessagePtr& message : failing) {
    finish(message, error);
    message->canceler.cancel("the connection was lost");
  }
  std::vector<Lost> told;
  for (auto at = watchers.begin(); at != watchers.end();) {
    if (at->second.connection == lost) {
      told.push_back(std::move(at->second.lost));
      at = watchers.erase(at);
    } else {
      ++at;
    }
  }
  for (Lost& watcher : told) watcher(error);
  server = nullptr;
  ending = nullptr;
  connection = nullptr;
}

void SocketClient::Core::close() {
  const NSErrorPtr error = vl_errorDaemonUnreachable("The connection to " + options.peer +
                                                     " was closed by this program.");
  closed = error;
  if (connection.get() != nullptr) lose(error);
  while (!messages.empty()) {
    const MessagePtr message = messages.front();
    finish(message, error);
    message->canceler.cancel("the client was closed");
  }
}

// --- Messages.

SocketClient::Core::MessagePtr SocketClient::Core::newMessage(Fail fail) {
  auto message = std::make_shared<Message>();
  message->fail = std::move(fail);
  message->place = messages.insert(messages.end(), message);
  return message;
}

void SocketClient::Core::finish(const MessagePtr& message, const NSErrorPtr& error) {
  if (!message->fail) return;
  Fail fail = std::exchange(message->fail, nullptr);
  messages.erase(message->place);
  tellIfSettled();
  if (!error) return;
  if (message->failsOnLoop) {
    fail(error);
    return;
  }
  executor->post([fail = std::move(fail), error]() mutable { fail(error); });
}

void SocketClient::Core::tellIfSettled() {
  if (!messages.empty()) return;
  for (const auto& one : std::exchange(settling, {})) {
    MutexLock lock(one->mutex);
    one->isSo = true;
    one->came.notifyAll();
  }
}

void SocketClient::Core::run(const MessagePtr& message, kj::Promise<Task> sending,
                             Patience patience) {
  auto answered = sending.then([this, message](Task handOn) {
    if (!message->fail) return;
    finish(message, nullptr);
    executor->post(std::move(handOn));
  });
  tasks.add(message->canceler.wrap(answered.exclusiveJoin(deadlineOf(message, patience)))
                .catch_([this, message](kj::Exception&& exception) {
                  finish(message, errorFor(exception));
                }));
}

kj::Promise<void> SocketClient::Core::deadlineOf(const MessagePtr& message, Patience patience) {
  auto& timer = loop->io().timer;
  const auto time = options.deadline.count() * kj::MILLISECONDS;
  if (patience == Patience::Deadline) {
    return timer.afterDelay(time).then([this, message] {
      finish(message, deadlineError());
      const std::uint64_t suspect = message->connection;
      if (suspect == number && connection.get() != nullptr) {
        tasks.add(probe(suspect, kProbeTime));
      }
    });
  }
  return timer.afterDelay(kBetweenProbes).then([this, message] {
    return probeForEver(message->connection);
  });
}

// Loses the connection when the peer's loop does not answer in time.
kj::Promise<void> SocketClient::Core::probe(std::uint64_t suspect, kj::Duration time) {
  if (suspect != number || connection.get() == nullptr) return kj::READY_NOW;
  auto answer = connection->bootstrap().whenResolved().then([] { return true; },
                                                            [](kj::Exception&&) { return true; });
  auto late = loop->io().timer.afterDelay(time).then([] { return false; });
  return answer.exclusiveJoin(kj::mv(late)).then([this, suspect](bool lives) {
    if (lives) return;
    tasks.add(kj::evalLater([this, suspect] {
      if (number == suspect && connection.get() != nullptr) lose(deadlineError());
    }));
  });
}

kj::Promise<void> SocketClient::Core::probeForEver(std::uint64_t suspect) {
  const auto time = options.deadline.count() * kj::MILLISECONDS - kBetweenProbes;
  return probe(suspect, time).then([this, suspect] {
    return loop->io().timer.afterDelay(kBetweenProbes).then([this, suspect] {
      return probeForEver(suspect);
    });
  });
}

void SocketClient::Core::taskFailed(kj::Exception&& exception) {
  reportFault(std::string("a message's promise failed: ") + exception.getDescription().cStr());
}

// --- The face.

SocketClient::SocketClient(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Executor> executor,
                           Options options)
    : _loop(loop),
      _executor(executor),
      _core(loop->own(std::make_unique<Core>(loop, executor, std::move(options)))) {}

SocketClient::~SocketClient() { close(); }

void SocketClient::close() {
  _loop->post([core = _core] { core->close(); });
}

void SocketClient::settle(std::chrono::milliseconds patience) {
  const auto deadline = std::chrono::steady_clock::now() + patience;
  const auto settled = std::make_shared<Core::Settled>();
  _loop->post([core = _core, settled] {
    core->settling.push_back(settled);
    core->tellIfSettled();
  });
  MutexLock lock(settled->mutex);
  while (!settled->isSo && settled->came.waitUntil(settled->mutex, deadline)) {
  }
}

void SocketClient::setConnectedHandler(std::function<void()> handler) {
  _loop->post([core = _core, handler = std::move(handler)]() mutable {
    core->connectedHandler = std::move(handler);
  });
}

void SocketClient::send(Send send, Fail fail, Patience patience) {
  _loop->post([core = _core.get(), keep = _core, send = std::move(send), fail = std::move(fail),
               patience]() mutable {
    auto message = core->newMessage(std::move(fail));
    auto sending = core->connected().then(
        [core, message, send = std::move(send)]() mutable -> kj::Promise<Task> {
          if (core->connection.get() == nullptr) {
            core->finish(message, core->closed ? core->closed : core->lastError);
            return Task();
          }
          message->connection = core->number;
          KJ_IF_MAYBE (server, core->server) {
            return send(*server);
          }
          return KJ_EXCEPTION(DISCONNECTED, "there is no connection");
        });
    core->run(message, kj::mv(sending), patience);
  });
}

std::uint64_t SocketClient::currentConnection() const { return _core->number; }

void SocketClient::sendOver(std::uint64_t number, UniqueFunction<kj::Promise<Task>()> send,
                            Fail fail, Patience patience) {
  auto message = _core->newMessage(std::move(fail));
  message->connection = number;
  message->failsOnLoop = true;
  if (number != _core->number || _core->connection.get() == nullptr) {
    _core->finish(message, _core->lastError ? _core->lastError : _core->lostError());
    return;
  }
  _core->run(message, kj::evalNow([&] { return send(); }), patience);
}

std::uint64_t SocketClient::whenLost(std::uint64_t number, Lost lost) {
  const std::uint64_t key = ++_core->lastWatcher;
  if (number != _core->number || _core->connection.get() == nullptr) {
    lost(_core->lastError ? _core->lastError : _core->lostError());
    return key;
  }
  _core->watchers.emplace(key, Core::Watcher{number, std::move(lost)});
  return key;
}

void SocketClient::forget(std::uint64_t key) { _core->watchers.erase(key); }

}  // namespace skein
