// Feeds what clients send to both sockets, vald's and skein-host's, each with a fake behind it.
// The first byte of an input chooses the socket, the rest is what a client writes before it
// closes its end. "wire_fuzz --make-corpus FOLDER" writes what to start from: a call of each
// method, and of each method of what it answers.
#include <capnp/dynamic.h>
#include <capnp/message.h>
#include <capnp/rpc.capnp.h>
#include <capnp/schema.h>
#include <capnp/serialize.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <string_view>

#include "base/ThreadPool.h"
#include "linux/protocol/DaemonServer.h"
#include "linux/protocol/HostServer.h"
#include "linux/protocol/UnixSocket.h"
#include "linux/protocol/daemon.capnp.h"
#include "linux/protocol/host.capnp.h"
#include "linux/protocol/services.capnp.h"
#include "tests/fuzz/FakeHost.h"
#include "tests/protocol/FakeDaemon.h"

namespace skein {
namespace {

#define REQUIRE(condition) \
  if (!(condition)) abort()

class NoLog final : public Log {
 public:
  void write(LogType, std::string_view) override {}
};

// Both servers; made anew now and then, since the fakes note what they are asked.
class Servers {
 public:
  Servers() {
    char name[] = "/tmp/skein-fuzz-XXXXXX";
    REQUIRE(mkdtemp(name) != nullptr);
    _folder = name;
    NSErrorPtr error;
    _daemonServer = DaemonServer::listen(_loop, _executor, _daemon, path(0), _log, &error);
    REQUIRE(_daemonServer);
    _hostServer = HostServer::listen(_loop, _executor, _host, _host, path(1), _log, &error);
    REQUIRE(_hostServer);
  }
  ~Servers() {
    _daemonServer.reset();
    _hostServer.reset();
    std::filesystem::remove_all(_folder);
  }
  std::string path(int which) const { return _folder + (which == 0 ? "/vald" : "/host"); }

 private:
  NoLog _log;
  std::string _folder;
  std::shared_ptr<FakeDaemon> _daemon = std::make_shared<FakeDaemon>();
  std::shared_ptr<FakeHost> _host = std::make_shared<FakeHost>();
  std::shared_ptr<RpcLoop> _loop = RpcLoop::start("fuzz");
  std::shared_ptr<ThreadPool> _executor = std::make_shared<ThreadPool>(2, "fuzz");
  std::unique_ptr<DaemonServer> _daemonServer;
  std::unique_ptr<HostServer> _hostServer;
};

// Says `bytes` and listens until the server closes, which it must do.
void talk(const std::string& path, std::string_view bytes) {
  constexpr int kLongestSilence = 20'000;  // milliseconds
  int code = 0;
  FileDescriptor socket = connectToUnixSocket(path, code);
  while (!socket && code == EAGAIN) socket = connectToUnixSocket(path, code);
  REQUIRE(socket);
  char answer[65536];
  for (bool isOpen = true;;) {
    pollfd state{socket.get(), static_cast<short>(POLLIN | (bytes.empty() ? 0 : POLLOUT)), 0};
    REQUIRE(poll(&state, 1, kLongestSilence) > 0);
    if (!bytes.empty() && (state.revents & POLLOUT) != 0) {
      const ssize_t sent =
          send(socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
      if (sent < 0 && errno != EAGAIN) return;
      if (sent > 0) bytes.remove_prefix(static_cast<std::size_t>(sent));
    }
    if (bytes.empty() && std::exchange(isOpen, false)) shutdown(socket.get(), SHUT_WR);
    if ((state.revents & (POLLIN | POLLHUP | POLLERR)) == 0) continue;
    const ssize_t got = recv(socket.get(), answer, sizeof answer, MSG_DONTWAIT);
    if (got == 0 || (got < 0 && errno != EAGAIN)) return;
  }
}

// ---- what to start from

namespace rpc = capnp::rpc;

void fill(capnp::DynamicStruct::Builder to, int depth);

capnp::Data::Reader bytesFor(std::string_view field) {
  const std::string_view text = field.find("dentifier") != std::string_view::npos ||
                                        field.find("ID") != std::string_view::npos
                                    ? "d0000000000000001"
                                    : "/a";
  return {reinterpret_cast<const kj::byte*>(text.data()), text.size()};
}

void fillElement(capnp::DynamicList::Builder list, capnp::Type type, std::string_view name,
                 int depth) {
  if (type.isStruct()) {
    fill(list[0].as<capnp::DynamicStruct>(), depth - 1);
  } else if (type.isData()) {
    list.set(0, bytesFor(name));
  } else if (!type.isList() && !type.isInterface() && !type.isText()) {
    list.set(0, 1);
  }
}

// Sets every field to something.
void fill(capnp::DynamicStruct::Builder to, int depth) {
  for (const auto field : to.getSchema().getFields()) {
    const capnp::Type type = field.getType();
    const auto name = field.getProto().getName();
    const std::string_view words(name.begin(), name.size());
    if (type.isStruct()) {
      if (depth > 0) fill(to.init(field).as<capnp::DynamicStruct>(), depth - 1);
    } else if (type.isList()) {
      fillElement(to.init(field, 1).as<capnp::DynamicList>(), type.asList().getElementType(), words,
                  depth);
    } else if (type.isData()) {
      to.set(field, bytesFor(words));
    } else if (type.isInterface()) {
      to.set(field, capnp::Capability::Client(KJ_EXCEPTION(DISCONNECTED, "the fuzzer's"))
                        .castAs<capnp::DynamicCapability>(type.asInterface()));
    } else if (type.isBool()) {
      to.set(field, true);
    } else if (!type.isText() && !type.isAnyPointer() && !type.isVoid()) {
      to.set(field, 1);
    }
  }
}

std::string flat(capnp::MessageBuilder& message) {
  const auto words = capnp::messageToFlatArray(message);
  const auto bytes = words.asBytes();
  return {reinterpret_cast<const char*>(bytes.begin()), bytes.size()};
}

std::string bootstrap() {
  capnp::MallocMessageBuilder message;
  message.initRoot<rpc::Message>().initBootstrap().setQuestionId(0);
  return flat(message);
}

// A call on what question `of` answers: the object itself, or a pointer of its struct.
std::string callOf(capnp::InterfaceSchema::Method method, std::uint32_t question, std::uint32_t of,
                   std::optional<std::uint16_t> pointer) {
  capnp::MallocMessageBuilder message;
  capnp::BuilderCapabilityTable capabilities;
  auto call =
      capabilities.imbue(message.getRoot<capnp::AnyPointer>()).initAs<rpc::Message>().initCall();
  call.setQuestionId(question);
  auto target = call.initTarget().initPromisedAnswer();
  target.setQuestionId(of);
  if (pointer) target.initTransform(1)[0].setGetPointerField(*pointer);
  call.setInterfaceId(method.getContainingInterface().getProto().getId());
  call.setMethodId(method.getIndex());
  fill(call.initParams().getContent().initAs<capnp::DynamicStruct>(method.getParamType()), 3);
  const auto count = static_cast<unsigned>(capabilities.getTable().size());
  auto table = call.getParams().initCapTable(count);
  for (unsigned at = 0; at < count; ++at) table[at].setSenderHosted(at);
  return flat(message);
}

// The methods of an interface and of those that it extends.
void forEachMethod(capnp::InterfaceSchema interface,
                   const std::function<void(capnp::InterfaceSchema::Method)>& use) {
  for (const auto method : interface.getMethods()) use(method);
  for (const auto base : interface.getSuperclasses()) forEachMethod(base, use);
}

void makeCorpus(const std::string& folder) {
  std::filesystem::create_directories(folder);
  const capnp::InterfaceSchema sockets[] = {capnp::Schema::from<wire::Daemon>(),
                                            capnp::Schema::from<wire::Host>()};
  for (int which = 0; which < 2; ++which) {
    forEachMethod(sockets[which], [&](capnp::InterfaceSchema::Method method) {
      std::string bytes(1, static_cast<char>(which));
      bytes += bootstrap() + callOf(method, 1, 0, std::nullopt);
      std::uint32_t question = 1;
      for (const auto field : method.getResultType().getFields()) {
        const capnp::Type type = field.getType();
        if (!type.isInterface() && !type.isAnyPointer()) continue;
        const auto answered =
            type.isInterface() ? type.asInterface() : capnp::Schema::from<wire::Services>();
        const auto pointer = static_cast<std::uint16_t>(field.getProto().getSlot().getOffset());
        forEachMethod(answered, [&](capnp::InterfaceSchema::Method next) {
          bytes += callOf(next, ++question, 1, pointer);
        });
      }
      const auto name = method.getProto().getName();
      std::ofstream(folder + "/" + std::to_string(which) + "-" +
                    std::string(name.begin(), name.size()))
          << bytes;
    });
  }
}

}  // namespace
}  // namespace skein

extern "C" int LLVMFuzzerInitialize(int* count, char*** arguments) {
  if (*count == 3 && std::string_view((*arguments)[1]) == "--make-corpus") {
    skein::makeCorpus((*arguments)[2]);
    std::_Exit(0);
  }
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  constexpr int kInputsPerServer = 500;
  static std::unique_ptr<skein::Servers> servers;
  static int inputs = 0;
  if (size == 0) return 0;
  if (!servers || ++inputs % kInputsPerServer == 0) {
    servers.reset();
    servers = std::make_unique<skein::Servers>();
  }
  skein::talk(servers->path(data[0] % 2), {reinterpret_cast<const char*>(data + 1), size - 1});
  return 0;
}
