#include "linux/client/SkeinServices.h"

#include <unistd.h>

#include <cstdlib>
#include <sstream>

#include "base/ThreadPool.h"
#include "linux/protocol/DrivePaths.h"
#include "linux/protocol/HostClient.h"
#include "linux/protocol/ServicesClient.h"

namespace skein {
namespace {

// Beside this program, else wherever a shell would find it.
std::string folderOfHost() {
  const auto isThere = [](const std::string& folder) {
    return access((folder + "/skein-host").c_str(), X_OK) == 0;
  };
  std::string beside = folderOfThisProgram();
  if (isThere(beside)) return beside;
  const char* path = std::getenv("PATH");
  std::istringstream folders(path != nullptr ? path : "");
  for (std::string folder; std::getline(folders, folder, ':');) {
    if (isThere(folder)) return folder;
  }
  return beside;
}

SocketClient::Options optionsFor(const DrivePaths& paths) {
  SocketClient::Options options = hostClientOptions(paths);
  options.program->folder = folderOfHost();
  return options;
}

class DriveServices final : public SkeinServices {
 public:
  explicit DriveServices(const DrivePaths& paths)
      : _socket(std::make_shared<SocketClient>(RpcLoop::start("skein-services"),
                                               std::make_shared<ThreadPool>(2, "services"),
                                               optionsFor(paths))),
        _services(makeHostServicesClient(_socket)) {}
  // The program may end right after this. A connection that it closed must be closed by then,
  // or skein-host takes it for that of a client that died.
  ~DriveServices() override { _socket->settle(deadlines::kProbe); }

  std::vector<std::string> serviceNames(const std::string& item, NSErrorOut error) override {
    return ask<std::vector<std::string>>(
        [&](auto reply) { _services->serviceSources(targetOf(item), std::move(reply)); }, error);
  }

  ServiceHandle<VLSharingServiceV1> sharing(const std::string& item, NSErrorOut error) override {
    return connect(item, VLSharingServiceName, &ServiceConnection::sharing, error);
  }

  ServiceHandle<VLFileProviderQuireCollaboration> collaboration(const std::string& item,
                                                                NSErrorOut error) override {
    return connect(item, VLQuireCollaborationServiceName, &ServiceConnection::collaboration, error);
  }

 private:
  // What is no path is an identifier.
  static HostTarget targetOf(const std::string& item) {
    return item.starts_with('/') ? HostTarget::path(item) : HostTarget::identifier(item);
  }

  template <class Value, class Start>
  static Value ask(Start start, NSErrorOut out) {
    auto [value, error] = awaitReply<Value>(std::move(start));
    if (error) out.store(std::move(error));
    return std::move(value);
  }

  template <class Service>
  ServiceHandle<Service> connect(const std::string& item, const char* serviceName,
                                 std::shared_ptr<Service> (ServiceConnection::*exported)(),
                                 NSErrorOut error) {
    const auto endpoint = ask<std::shared_ptr<ServiceEndpoint>>(
        [&](auto reply) { _services->endpoint(targetOf(item), serviceName, std::move(reply)); },
        error);
    if (!endpoint) return {};
    auto connection = ask<std::shared_ptr<ServiceConnection>>(
        [&](auto reply) { endpoint->connect(std::move(reply)); }, error);
    if (!connection) return {};
    auto service = (connection.get()->*exported)();
    // The socket lives as long as somebody holds the services, or a connection of theirs.
    return {std::move(service),
            [connection = std::move(connection), services = _services] { connection->close(); }};
  }

  const std::shared_ptr<SocketClient> _socket;
  const std::shared_ptr<HostServices> _services;
};

}  // namespace

std::unique_ptr<SkeinServices> SkeinServices::open(const std::string& store, NSErrorOut error) {
  const DrivePaths paths = DrivePaths::forStore(store, error);
  if (paths.store.empty()) return nullptr;
  return std::make_unique<DriveServices>(paths);
}

}  // namespace skein
