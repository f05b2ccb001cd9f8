#pragma once

#include <atomic>
#include <memory>
#include <type_traits>

#include "linux/host/Deadline.h"
#include "linux/host/FileProviderHost.h"
#include "linux/host/ItemPaths.h"
#include "linux/host/WorkingSetWatch.h"
#include "linux/protocol/HostService.h"
#include "platform/log/Log.h"
#include "vellum/VLContainer.h"

namespace skein {

// What the command line may ask of this process: the extension's operations through the
// host, and vald's own through its connection. Every request is answered by the deadline.
class HostRequests final : public HostService, public std::enable_shared_from_this<HostRequests> {
 public:
  // The references outlive it.
  HostRequests(std::shared_ptr<FileProviderHost> host, DaemonProxies daemon,
               VLContainers& containers, Log& log);

  void list(HostTarget container, HostOrder order,
            Reply<std::shared_ptr<HostListing>, NSErrorPtr> reply) override;
  void item(HostTarget target, Reply<HostItem, NSErrorPtr> reply) override;
  void identifierForPath(std::string path, Reply<std::string, NSErrorPtr> reply) override;
  void pathForIdentifier(std::string identifier, Reply<std::string, NSErrorPtr> reply) override;
  void watch(HostTarget container, Reply<std::shared_ptr<HostWatch>, NSErrorPtr> reply) override;
  void changesSince(std::optional<NSData> token, Reply<HostChangeBatch, NSErrorPtr> reply) override;
  void account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) override;
  void logIn(LocalAccount account, Reply<NSErrorPtr> reply) override;
  void logOut(Reply<NSErrorPtr> reply) override;
  void status(Reply<HostStatus, NSErrorPtr> reply) override;
  void check(Reply<std::shared_ptr<HostCheck>, NSErrorPtr> reply) override;
  void setDebugLog(bool enabled, Reply<NSErrorPtr> reply) override;

 private:
  template <class... Values>
  using Timed = std::shared_ptr<TimedReply<Values...>>;

  // Runs `work(timed)` on the executor. The first time it waits until vald has told where
  // the drive is: the extension asks that once and keeps the answer, so asking it while
  // vald cannot be reached would leave the process without a drive.
  template <class... Values, class Work>
  void withDrive(std::type_identity_t<Reply<Values..., NSErrorPtr>> reply, Work work);
  std::optional<NSFileProviderItemIdentifier> resolve(const HostTarget& target, NSErrorOut error);

  const std::shared_ptr<FileProviderHost> _host;
  const DaemonProxies _daemon;
  const ItemPaths _paths;
  Log& _log;
  std::atomic<bool> _driveIsKnown{false};
};

}  // namespace skein
