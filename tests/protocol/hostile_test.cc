// Peers that do not keep to the rules: each costs its own connection, a bounded amount of
// memory, and nobody else anything.
#include <capnp/message.h>
#include <capnp/rpc.capnp.h>
#include <capnp/schema.h>
#include <capnp/serialize.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <random>
#include <type_traits>

#include "linux/protocol/SocketServer.h"
#include "linux/protocol/UnixSocket.h"
#include "linux/protocol/daemon.capnp.h"
#include "linux/protocol/files.capnp.h"
#include "tests/fuzz/FakeHost.h"
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

// The fuzzers are compiled by a preset of their own; their host follows the interface all the same.
static_assert(!std::is_abstract_v<FakeHost>);

std::string flat(capnp::MessageBuilder& message) {
  const auto words = capnp::messageToFlatArray(message);
  const auto bytes = words.asBytes();
  return {reinterpret_cast<const char*>(bytes.begin()), bytes.size()};
}

std::string bootstrapMessage(std::uint32_t question) {
  capnp::MallocMessageBuilder message;
  message.initRoot<capnp::rpc::Message>().initBootstrap().setQuestionId(question);
  return flat(message);
}

// A listing, called on the bootstrap object that question 0 asked for.
std::string listMessage(std::uint32_t question) {
  capnp::MallocMessageBuilder message;
  auto call = message.initRoot<capnp::rpc::Message>().initCall();
  call.setQuestionId(question);
  call.initTarget().initPromisedAnswer().setQuestionId(0);
  call.setInterfaceId(capnp::typeId<wire::Daemon>());
  call.setMethodId(0);
  call.initParams().getContent().initAs<wire::Daemon::EnumerateItemsInFolderParams>().setLimit(200);
  return flat(message);
}

// A file operation of number `method`, without parameters, on the same object.
std::string emptyFilesMessage(std::uint32_t question, std::uint16_t method) {
  capnp::MallocMessageBuilder message;
  auto call = message.initRoot<capnp::rpc::Message>().initCall();
  call.setQuestionId(question);
  call.initTarget().initPromisedAnswer().setQuestionId(0);
  call.setInterfaceId(capnp::typeId<wire::Files>());
  call.setMethodId(method);
  call.initParams();
  return flat(message);
}

class Hostile : public ProtocolTest {
 protected:
  FileDescriptor connectRaw() {
    int code = 0;
    FileDescriptor socket = connectToUnixSocket(socketPath, code);
    for (; code == EAGAIN; socket = connectToUnixSocket(socketPath, code)) expectServed();
    EXPECT_TRUE(socket) << code;
    return socket;
  }
  // How much of `bytes` the system takes at once.
  static std::size_t sendSome(const FileDescriptor& socket, std::string_view bytes) {
    const ssize_t sent =
        send(socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    return sent > 0 ? static_cast<std::size_t>(sent) : 0;
  }
  // Whether the other end closes by the deadline; what it says before is skipped.
  static bool closes(const FileDescriptor& socket) {
    const auto deadline = testDeadline();
    char buffer[65536];
    while (std::chrono::steady_clock::now() < deadline) {
      pollfd waiting{socket.get(), POLLIN, 0};
      poll(&waiting, 1, 1000);
      const ssize_t got = recv(socket.get(), buffer, sizeof buffer, MSG_DONTWAIT);
      if (got == 0 || (got < 0 && errno == ECONNRESET)) return true;
    }
    return false;
  }
  void expectServed() {
    const auto [rank, error] = ask<std::uint64_t, NSErrorPtr>(
        *client,
        [](LocalDaemon& proxy, auto reply) { proxy.currentNotifRankWithReply(std::move(reply)); });
    EXPECT_EQ(error, nullptr);
  }
  // Sends what `next(n)` gives for n = 1, 2, ... until the server has stopped reading, which
  // is so when others are served again and again while not a byte is taken. Answers n.
  template <class Next>
  std::uint32_t floodUntilNotRead(const FileDescriptor& socket, Next next) {
    constexpr std::uint32_t kMost = 400'000;
    std::string pending;
    std::uint32_t sent = 0;
    for (int idle = 0; idle < 50 && sent < kMost;) {
      while (pending.size() < 65536) pending += next(++sent);
      const std::size_t taken = sendSome(socket, pending);
      pending.erase(0, taken);
      idle = taken > 0 ? 0 : idle + 1;
      if (taken == 0) expectServed();
    }
    EXPECT_LT(sent, kMost) << "the server takes whatever it is sent";
    return sent;
  }
};

TEST_F(Hostile, GarbageClosesItsConnectionAndNothingElse) {
  std::mt19937 random(1);
  std::vector<std::string> garbage = {
      std::string(4096, '\xff'),                     // 2^32 segments
      std::string("\0\0\0\0\xff\xff\xff\x7f", 8),    // one segment of 16 GiB
      std::string("\0\0\0\0\x01\0\x02\0", 8),        // one beyond the limit
      std::string(16, '\0') + "GET / HTTP/1.0\r\n",  // an empty message first
  };
  for (int i = 0; i < 50; ++i) {
    std::string noise(8 + random() % 512, '\0');
    for (char& c : noise) c = static_cast<char>(random());
    noise[0] = noise[1] = noise[2] = noise[3] = '\0';      // one segment,
    noise[4] = static_cast<char>((noise.size() - 8) / 8);  // of the length that follows
    noise[5] = noise[6] = noise[7] = '\0';
    garbage.push_back(noise);
  }
  // Well-formed, and against the protocol: nothing was asked for as question 0.
  garbage.push_back(listMessage(1));
  expectServed();
  for (const std::string& bytes : garbage) {
    const FileDescriptor socket = connectRaw();
    sendSome(socket, bytes);
    shutdown(socket.get(), SHUT_WR);
    EXPECT_TRUE(closes(socket));
    expectServed();
  }
}

TEST_F(Hostile, FileOperationsWithoutWhatTheyNeedCostNothing) {
  daemon->fakeFiles.error = vlc_errorInvalidParameter("url", "(null)");
  const FileDescriptor socket = connectRaw();
  std::string bytes = bootstrapMessage(0);
  const auto methods = capnp::Schema::from<wire::Files>().getMethods().size();
  // One more than there are: unknown to the server.
  for (unsigned method = 0; method <= methods; ++method) {
    bytes += emptyFilesMessage(method + 1, static_cast<std::uint16_t>(method));
  }
  EXPECT_EQ(sendSome(socket, bytes), bytes.size());
  // All but the four transfers, for which nobody could be told of, reach the daemon.
  EXPECT_TRUE(daemon->fakeFiles.asked.waitForCount(methods - 4));
  expectServed();
  EXPECT_EQ(daemon->fakeFiles.transfers.count(), 0U);
}

TEST_F(Hostile, HalfMessageIsWaitedForWithoutHoldingOthersUp) {
  const FileDescriptor socket = connectRaw();
  const std::string message = bootstrapMessage(0);
  for (std::size_t at = 0; at + 1 < message.size(); ++at) {
    sendSome(socket, message.substr(at, 1));
    expectServed();
  }
}

TEST_F(Hostile, CallsThatAreNeverAnsweredStopTheReading) {
  daemon->holds = true;
  const FileDescriptor socket = connectRaw();
  sendSome(socket, bootstrapMessage(0));
  floodUntilNotRead(socket, listMessage);
  EXPECT_LT(daemon->held.count(), 2000U) << "calls in flight on one connection";
  EXPECT_GT(daemon->held.count(), 100U);
}

TEST_F(Hostile, AnswersThatAreNeverReadStopTheReading) {
  VLQueryItem::Properties properties;
  properties.filename = std::string(255, 'x');
  daemon->items.assign(200, std::make_shared<const VLQueryItem>(properties));
  const FileDescriptor socket = connectRaw();
  sendSome(socket, bootstrapMessage(0));
  floodUntilNotRead(socket, listMessage);
  // 4 MiB may wait, and what was in flight when they did.
  std::size_t served = 0;
  while (daemon->asked.count() > 0) served += daemon->asked.take()->starts_with("items") ? 1 : 0;
  EXPECT_LT(served, 2000U);
  EXPECT_GT(served, 20U);
}

TEST_F(Hostile, QuestionsThatAreNeverFinishedCloseTheConnection) {
  const FileDescriptor socket = connectRaw();
  std::string pending;
  for (std::uint32_t question = 0; question < 5000; ++question) {
    pending += bootstrapMessage(question);
  }
  char answers[65536];
  for (std::size_t sent = 0; sent < pending.size();) {
    const ssize_t taken = send(socket.get(), pending.data() + sent, pending.size() - sent,
                               MSG_NOSIGNAL | MSG_DONTWAIT);
    if (taken < 0 && errno != EAGAIN) break;
    sent += taken > 0 ? static_cast<std::size_t>(taken) : 0;
    while (recv(socket.get(), answers, sizeof answers, MSG_DONTWAIT) > 0) {
    }
  }
  EXPECT_TRUE(closes(socket));
  expectServed();
}

TEST_F(Hostile, AConnectionThatFinishesItsQuestionsMayAskAnyNumber) {
  for (int question = 0; question < 5000; ++question) expectServed();
}

TEST_F(Hostile, WhoCameWhileThereWereNoDescriptorsIsAcceptedOnceThereAre) {
#if defined(__clang__) && defined(__has_feature)
#if __has_feature(undefined_behavior_sanitizer)
  GTEST_SKIP() << "this sanitizer takes an object for a wrong one when there are no descriptors";
#endif
#endif
  expectServed();
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socketPath.copy(address.sun_path, sizeof address.sun_path - 1);
  const FileDescriptor waiting(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  rlimit before{};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &before), 0);
  const rlimit few{256, before.rlim_max};
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &few), 0);
  std::vector<FileDescriptor> all;
  while (all.empty() || all.back()) all.emplace_back(dup(waiting.get()));
  ASSERT_EQ(connect(waiting.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  EXPECT_NE(log.lines.take()->find("cannot be accepted"), std::string::npos);
  all.clear();
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &before), 0);
  // Nobody else comes, who could wake the server.
  sendSome(waiting, bootstrapMessage(0));
  pollfd answer{waiting.get(), POLLIN, 0};
  EXPECT_EQ(poll(&answer, 1, 20'000), 1);
}

TEST_F(Hostile, CrowdOfSilentConnectionsIsThinnedOut) {
  expectServed();
  std::vector<FileDescriptor> crowd;
  for (int i = 0; i < 200; ++i) crowd.push_back(connectRaw());
  expectServed();  // over the connection from before, which spoke
  EXPECT_TRUE(closes(crowd.front()));
  client = newClient();
  expectServed();
}

TEST_F(Hostile, ConnectionThatNeverSpeaksIsClosed) {
  SocketServer::Options options;
  options.firstMessage = std::chrono::milliseconds(20);
  const std::string path = folder + "/other";
  const auto other = SocketServer::listen(
      loop, path, [](pid_t) -> capnp::Capability::Client { return nullptr; }, log, options,
      nullptr);
  ASSERT_TRUE(other);
  int code = 0;
  EXPECT_TRUE(closes(connectToUnixSocket(path, code)));
}

TEST_F(Hostile, AnotherUserIsRefused) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can become another user";
  ASSERT_EQ(chmod(folder.c_str(), 0755), 0);
  ASSERT_EQ(chmod(socketPath.c_str(), 0666), 0);
  const std::string message = bootstrapMessage(0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socketPath.copy(address.sun_path, sizeof address.sun_path - 1);

  // System calls alone: the child has this process's locks as they stood.
  const pid_t child = fork();
  if (child == 0) {
    char answer[16];
    const int descriptor = socket(AF_UNIX, SOCK_STREAM, 0);
    if (setresuid(65534, 65534, 65534) != 0) _exit(2);
    if (connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
      _exit(3);
    }
    send(descriptor, message.data(), message.size(), MSG_NOSIGNAL);
    const ssize_t got = recv(descriptor, answer, sizeof answer, 0);
    _exit(got > 0 ? 4 : 0);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(WEXITSTATUS(status), 0) << "2: cannot change user, 3: cannot connect, 4: was served";
  EXPECT_NE(log.lines.take()->find("65534"), std::string::npos);
  expectServed();
}

}  // namespace
}  // namespace skein
