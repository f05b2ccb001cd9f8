#include "linux/host/HostRequests.h"

#include <unistd.h>

#include <utility>

#include "linux/host/StoreCheck.h"
#include "linux/host/WatchStream.h"
#include "platform/fileprovider/NSFileProviderError.h"

namespace skein {
namespace {

class ListingStream final : public HostListing {
 public:
  explicit ListingStream(std::shared_ptr<Listing> listing) : _listing(std::move(listing)) {}
  ~ListingStream() override { _listing->cancel(); }
  void next(Reply<NSFileProviderItems, bool, NSErrorPtr> reply) override {
    _listing->next(std::move(reply));
  }

 private:
  const std::shared_ptr<Listing> _listing;
};

}  // namespace

HostRequests::HostRequests(std::shared_ptr<DriveRequests> drive, std::unique_ptr<HostFiles> files,
                           Log& log)
    : _drive(std::move(drive)),
      _files(std::move(files)),
      _host(_drive->sharedHost()),
      _daemon(_drive->daemon()),
      _log(log) {}

void HostRequests::list(HostTarget container, HostOrder order,
                        Reply<std::shared_ptr<HostListing>, NSErrorPtr> reply) {
  withDrive<std::shared_ptr<HostListing>>(
      std::move(reply), [self = shared_from_this(), container = std::move(container),
                         order](Timed<std::shared_ptr<HostListing>> timed) {
        NSErrorPtr error;
        const auto identifier = self->_drive->resolve(container, &error);
        if (!identifier) {
          (*timed)(nullptr, error);
          return;
        }
        self->_host->list(*identifier,
                          order == HostOrder::Date ? NSFileProviderInitialPageSortedByDate()
                                                   : NSFileProviderInitialPageSortedByName(),
                          [timed](std::shared_ptr<Listing> listing, NSErrorPtr problem) {
                            std::shared_ptr<HostListing> stream;
                            if (listing) stream = std::make_shared<ListingStream>(listing);
                            (*timed)(std::move(stream), std::move(problem));
                          });
      });
}

void HostRequests::item(HostTarget target, Reply<HostItem, NSErrorPtr> reply) {
  withDrive<HostItem>(std::move(reply), [self = shared_from_this(),
                                         target = std::move(target)](Timed<HostItem> timed) {
    NSErrorPtr error;
    HostItem answer;
    if (const auto identifier = self->_drive->resolve(target, &error)) {
      NSFileProviderExtension& extension = self->_host->extension();
      answer.item = extension.itemForIdentifier(*identifier, &error);
      if (!answer.item && !error) {
        error = fileProviderErrorForNonExistentItemWithIdentifier(*identifier);
      }
      if (answer.item) {
        error = nullptr;
        const NSURLPtr url = extension.URLForItemWithPersistentIdentifier(*identifier);
        if (url) answer.url = url->absoluteString();
        answer.path = target.kind == HostTarget::Kind::Path
                          ? ItemPaths::normalised(target.text, nullptr).value_or("")
                          : self->_drive->paths().pathForURL(url).value_or("");
      }
    }
    (*timed)(std::move(answer), std::move(error));
  });
}

void HostRequests::identifierForPath(std::string path, Reply<std::string, NSErrorPtr> reply) {
  withDrive<std::string>(std::move(reply), [self = shared_from_this(),
                                            path = std::move(path)](Timed<std::string> timed) {
    NSErrorPtr error;
    auto identifier = self->_drive->paths().identifierForPath(path, &error);
    (*timed)(std::move(identifier).value_or(""), std::move(error));
  });
}

void HostRequests::pathForIdentifier(std::string identifier, Reply<std::string, NSErrorPtr> reply) {
  withDrive<std::string>(
      std::move(reply),
      [self = shared_from_this(), identifier = std::move(identifier)](Timed<std::string> timed) {
        NSErrorPtr error;
        auto path = self->_drive->paths().pathForIdentifier(identifier, &error);
        (*timed)(std::move(path).value_or(""), std::move(error));
      });
}

void HostRequests::watch(HostTarget container,
                         Reply<std::shared_ptr<HostWatch>, NSErrorPtr> reply) {
  // Only finding the container is timed here: the watch times its own steps, and the first
  // listing of a large folder takes as long as it takes.
  auto shared = std::make_shared<Reply<std::shared_ptr<HostWatch>, NSErrorPtr>>(std::move(reply));
  _drive->findIdentifier(
      std::move(container),
      [self = shared_from_this(), shared](const std::string& identifier, NSErrorPtr error) {
        if (error) {
          (*shared)(nullptr, std::move(error));
        } else {
          WatchStream::begin(self->_drive->host(), identifier, std::move(*shared));
        }
      });
}

void HostRequests::changesSince(std::optional<NSData> token,
                                Reply<HostChangeBatch, NSErrorPtr> reply) {
  withDrive<HostChangeBatch>(
      std::move(reply),
      [self = shared_from_this(), token = std::move(token)](Timed<HostChangeBatch> timed) {
        self->_host->workingSetChanges(token, [timed](HostChangeBatch batch, NSErrorPtr error) {
          (*timed)(std::move(batch), std::move(error));
        });
      });
}

void HostRequests::account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) {
  auto timed = TimedReply<std::optional<LocalAccount>>::begin(_host->tools(), std::move(reply));
  _daemon(failing(timed))->account([timed](std::optional<LocalAccount> account, NSErrorPtr error) {
    (*timed)(std::move(account), std::move(error));
  });
}

void HostRequests::logIn(LocalAccount account, Reply<NSErrorPtr> reply) {
  auto timed = TimedReply<>::begin(_host->tools(), std::move(reply));
  _daemon(failing(timed))->logIn(std::move(account), [timed](NSErrorPtr error) {
    (*timed)(std::move(error));
  });
}

void HostRequests::logOut(Reply<NSErrorPtr> reply) {
  auto timed = TimedReply<>::begin(_host->tools(), std::move(reply));
  _daemon(failing(timed))->logOut([timed](NSErrorPtr error) { (*timed)(std::move(error)); });
}

void HostRequests::status(Reply<HostStatus, NSErrorPtr> reply) {
  auto timed = TimedReply<HostStatus>::begin(_host->tools(), std::move(reply));
  _daemon(failing(timed))
      ->status([self = shared_from_this(), timed](LocalDaemonStatus daemon, NSErrorPtr error) {
        HostStatus status;
        status.daemon = std::move(daemon);
        status.processID = getpid();
        status.watchedContainers = self->_host->watchedContainers();
        status.debugLog = self->_log.enabled(LogType::Debug);
        (*timed)(std::move(status), std::move(error));
      });
}

void HostRequests::cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) {
  auto timed = TimedReply<LocalCloudStatus>::begin(_host->tools(), std::move(reply));
  _daemon(failing(timed))->cloud().cloudStatus([timed](LocalCloudStatus status, NSErrorPtr error) {
    (*timed)(std::move(status), std::move(error));
  });
}

void HostRequests::setCloudConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) {
  auto timed = TimedReply<>::begin(_host->tools(), std::move(reply));
  _daemon(failing(timed))->cloud().setConditions(conditions, [timed](NSErrorPtr error) {
    (*timed)(std::move(error));
  });
}

void HostRequests::setCloudKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) {
  auto timed = TimedReply<>::begin(_host->tools(), std::move(reply));
  _daemon(failing(timed))->cloud().setKeeping(keeping, [timed](NSErrorPtr error) {
    (*timed)(std::move(error));
  });
}

void HostRequests::collectCloud(Reply<LocalCloudCollection, NSErrorPtr> reply) {
  // Of the two, one is called.
  const auto shared = std::make_shared<Reply<LocalCloudCollection, NSErrorPtr>>(std::move(reply));
  _daemon([shared](NSErrorPtr error) { (*shared)({}, std::move(error)); })
      ->cloud()
      .collect([shared](LocalCloudCollection collection, NSErrorPtr error) {
        (*shared)(collection, std::move(error));
      });
}

void HostRequests::check(bool quick, Reply<std::shared_ptr<HostCheck>, NSErrorPtr> reply) {
  withDrive<std::shared_ptr<HostCheck>>(
      std::move(reply),
      [self = shared_from_this(), quick](Timed<std::shared_ptr<HostCheck>> timed) {
        (*timed)(std::make_shared<StoreCheck>(self->_host, self->_daemon, quick), nullptr);
      });
}

void HostRequests::setDebugLog(bool enabled, Reply<NSErrorPtr> reply) {
  _log.setEnabled(LogType::Debug, enabled);
  VL_NOTICE(_log, "[NOTICE] debug lines are %s", enabled ? "on" : "off");
  _host->tools().executor->post([reply = std::move(reply)]() mutable { reply(nullptr); });
}

}  // namespace skein
