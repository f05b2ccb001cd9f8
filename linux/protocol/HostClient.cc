#include "linux/protocol/HostClient.h"

#include <utility>

#include "linux/protocol/CloudCodec.h"
#include "linux/protocol/HostCalls.h"
#include "linux/protocol/HostCodec.h"
#include "linux/protocol/HostFilesProxy.h"
#include "linux/protocol/HostThumbnailsProxy.h"

namespace skein {
namespace {

Task decodePage(const auto& results, const SharedReply<NSFileProviderItems, bool>& reply) {
  return [reply, items = codec::decodeProviderItems(results.getItems()), last = results.getLast(),
          error = codec::errorOf(results)]() mutable {
    (*reply)(std::move(items), last, std::move(error));
  };
}

Task decodeChanges(const auto& results, const SharedReply<std::vector<HostChange>>& reply) {
  std::vector<HostChange> changes;
  changes.reserve(results.getChanges().size());
  for (const auto change : results.getChanges()) changes.push_back(codec::decode(change));
  return [reply, changes = std::move(changes), error = codec::errorOf(results)]() mutable {
    (*reply)(std::move(changes), std::move(error));
  };
}

Task decodeStep(const auto& results, const SharedReply<HostCheckStep>& reply) {
  HostCheckStep step;
  for (const auto difference : results.getDifferences()) {
    step.differences.push_back(codec::decode(difference));
  }
  step.folders = results.getFolders();
  step.items = results.getItems();
  step.verified = results.getVerified();
  step.verifiedBytes = results.getVerifiedBytes();
  step.finished = results.getFinished();
  return [reply, step = std::move(step), error = codec::errorOf(results)]() mutable {
    (*reply)(std::move(step), std::move(error));
  };
}

class HostProxy final : public HostService, private HostCalls<wire::Host> {
 public:
  explicit HostProxy(std::shared_ptr<SocketClient> socket)
      : HostCalls(socket),
        _files(makeHostFilesProxy(socket)),
        _thumbnails(makeHostThumbnailsProxy(std::move(socket))) {}
  ~HostProxy() override { _socket->close(); }

  void list(HostTarget container, HostOrder order,
            Reply<std::shared_ptr<HostListing>, NSErrorPtr> reply) override {
    call<std::shared_ptr<HostListing>>(
        [container = std::move(container), order](wire::Host::Client& host) {
          auto request = host.listRequest();
          codec::encode(request.initContainer(), container);
          request.setOrder(static_cast<std::uint8_t>(order));
          return request.send();
        },
        [socket = _socket](auto& results) -> std::shared_ptr<HostListing> {
          if (!results.hasListing()) return nullptr;
          return makeStream<NSFileProviderItems, bool>(
              socket, results.getListing(),
              [](const auto& page, const auto& next) { return decodePage(page, next); });
        },
        reply);
  }

  void item(HostTarget target, Reply<HostItem, NSErrorPtr> reply) override {
    call<HostItem>(
        [target = std::move(target)](wire::Host::Client& host) {
          auto request = host.itemRequest();
          codec::encode(request.initTarget(), target);
          return request.send();
        },
        [](auto& results) { return codec::decode(results.getItem()); }, reply);
  }

  void identifierForPath(std::string path, Reply<std::string, NSErrorPtr> reply) override {
    call<std::string>(
        [path = std::move(path)](wire::Host::Client& host) {
          auto request = host.identifierForPathRequest();
          request.setPath(codec::bytes(path));
          return request.send();
        },
        [](auto& results) { return codec::text(results.getIdentifier()); }, reply);
  }

  void pathForIdentifier(std::string identifier, Reply<std::string, NSErrorPtr> reply) override {
    call<std::string>(
        [identifier = std::move(identifier)](wire::Host::Client& host) {
          auto request = host.pathForIdentifierRequest();
          request.setIdentifier(codec::bytes(identifier));
          return request.send();
        },
        [](auto& results) { return codec::text(results.getPath()); }, reply);
  }

  void watch(HostTarget container, Reply<std::shared_ptr<HostWatch>, NSErrorPtr> reply) override {
    call<std::shared_ptr<HostWatch>>(
        [container = std::move(container)](wire::Host::Client& host) {
          auto request = host.watchRequest();
          codec::encode(request.initContainer(), container);
          return request.send();
        },
        [socket = _socket](auto& results) -> std::shared_ptr<HostWatch> {
          if (!results.hasWatch()) return nullptr;
          return makeStream<std::vector<HostChange>>(
              socket, results.getWatch(),
              [](const auto& changes, const auto& next) { return decodeChanges(changes, next); });
        },
        reply);
  }

  void changesSince(std::optional<NSData> token,
                    Reply<HostChangeBatch, NSErrorPtr> reply) override {
    call<HostChangeBatch>(
        [token = std::move(token)](wire::Host::Client& host) {
          auto request = host.changesSinceRequest();
          if (token) request.setToken(codec::bytes(*token));
          return request.send();
        },
        [](auto& results) {
          HostChangeBatch batch;
          batch.updates = codec::decodeProviderItems(results.getUpdates());
          batch.deletions = codec::decode(results.getDeletions());
          const auto data = results.getToken();
          batch.token = NSData(std::span(data.begin(), data.size()));
          batch.moreComing = results.getMoreComing();
          return batch;
        },
        reply);
  }

  void account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) override {
    call<std::optional<LocalAccount>>(
        [](wire::Host::Client& host) { return host.accountRequest().send(); },
        [](auto& results) -> std::optional<LocalAccount> {
          if (!results.hasAccount()) return std::nullopt;
          return codec::decode(results.getAccount());
        },
        reply);
  }

  void logIn(LocalAccount account, Reply<NSErrorPtr> reply) override {
    callForError(
        [account = std::move(account)](wire::Host::Client& host) {
          auto request = host.logInRequest();
          codec::encode(request.initAccount(), account);
          return request.send();
        },
        reply);
  }

  void logOut(Reply<NSErrorPtr> reply) override {
    callForError([](wire::Host::Client& host) { return host.logOutRequest().send(); }, reply);
  }

  void status(Reply<HostStatus, NSErrorPtr> reply) override {
    call<HostStatus>([](wire::Host::Client& host) { return host.statusRequest().send(); },
                     [](auto& results) { return codec::decode(results.getStatus()); }, reply);
  }

  void cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) override {
    call<LocalCloudStatus>(
        [](wire::Host::Client& host) { return host.cloudStatusRequest().send(); },
        [](auto& results) { return codec::decode(results.getStatus()); }, reply);
  }

  void setCloudConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) override {
    callForError(
        [conditions](wire::Host::Client& host) {
          auto request = host.setCloudConditionsRequest();
          codec::encode(request.initConditions(), conditions);
          return request.send();
        },
        reply);
  }

  void setCloudKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) override {
    callForError(
        [keeping](wire::Host::Client& host) {
          auto request = host.setCloudKeepingRequest();
          codec::encode(request.initKeeping(), keeping);
          return request.send();
        },
        reply);
  }

  void collectCloud(Reply<LocalCloudCollection, NSErrorPtr> reply) override {
    call<LocalCloudCollection>(
        [](wire::Host::Client& host) { return host.collectCloudRequest().send(); },
        [](auto& results) { return codec::decode(results.getCollection()); }, reply);
  }

  void check(bool quick, Reply<std::shared_ptr<HostCheck>, NSErrorPtr> reply) override {
    call<std::shared_ptr<HostCheck>>(
        [quick](wire::Host::Client& host) {
          auto request = host.checkRequest();
          request.setQuick(quick);
          return request.send();
        },
        [socket = _socket](auto& results) -> std::shared_ptr<HostCheck> {
          if (!results.hasCheck()) return nullptr;
          return makeStream<HostCheckStep>(
              socket, results.getCheck(),
              [](const auto& step, const auto& next) { return decodeStep(step, next); });
        },
        reply);
  }

  void setDebugLog(bool enabled, Reply<NSErrorPtr> reply) override {
    callForError(
        [enabled](wire::Host::Client& host) {
          auto request = host.setDebugLogRequest();
          request.setEnabled(enabled);
          return request.send();
        },
        reply);
  }

  HostFiles& files() override { return *_files; }
  HostThumbnails& thumbnails() override { return *_thumbnails; }

 private:
  const std::unique_ptr<HostFiles> _files;
  const std::unique_ptr<HostThumbnails> _thumbnails;
};

}  // namespace

SocketClient::Options hostClientOptions(const DrivePaths& paths) {
  SocketClient::Options options;
  options.peer = "skein-host";
  options.socketPath = paths.hostSocket;
  ProgramToStart program;
  program.program = "skein-host";
  program.arguments = {"--store", paths.store};
  program.socketPath = paths.hostSocket;
  program.logPath = paths.hostLog;
  options.program = std::move(program);
  return options;
}

std::shared_ptr<HostService> makeHostClient(std::shared_ptr<RpcLoop> loop,
                                            std::shared_ptr<Executor> executor,
                                            SocketClient::Options options) {
  return std::make_shared<HostProxy>(
      std::make_shared<SocketClient>(std::move(loop), std::move(executor), std::move(options)));
}

}  // namespace skein
