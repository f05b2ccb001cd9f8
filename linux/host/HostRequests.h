#pragma once

#include <memory>
#include <type_traits>

#include "linux/host/DriveRequests.h"
#include "linux/host/ThumbnailRequests.h"
#include "linux/protocol/HostService.h"
#include "platform/log/Log.h"

namespace skein {

// What the command line may ask of this process: the extension's operations through the
// host, and vald's own through its connection. Every request is answered by the deadline.
class HostRequests final : public HostService, public std::enable_shared_from_this<HostRequests> {
 public:
  // The log outlives it.
  HostRequests(std::shared_ptr<DriveRequests> drive, std::unique_ptr<HostFiles> files, Log& log);

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
  void cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) override;
  void setCloudConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) override;
  void setCloudKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) override;
  // Without a deadline of the host's: vald looks at the whole drive.
  void collectCloud(Reply<LocalCloudCollection, NSErrorPtr> reply) override;
  void check(bool quick, Reply<std::shared_ptr<HostCheck>, NSErrorPtr> reply) override;
  void setDebugLog(bool enabled, Reply<NSErrorPtr> reply) override;
  HostFiles& files() override { return *_files; }
  HostThumbnails& thumbnails() override { return _thumbnails; }

 private:
  template <class... Values>
  using Timed = std::shared_ptr<TimedReply<Values...>>;

  template <class... Values, class Work>
  void withDrive(std::type_identity_t<Reply<Values..., NSErrorPtr>> reply, Work work) {
    _drive->withDrive<Values...>(std::move(reply), std::move(work));
  }

  const std::shared_ptr<DriveRequests> _drive;
  const std::unique_ptr<HostFiles> _files;
  ThumbnailRequests _thumbnails{_drive};
  const std::shared_ptr<FileProviderHost> _host;
  const DaemonProxies _daemon;
  Log& _log;
};

}  // namespace skein
