#include "linux/vald/FaultingDaemon.h"

#include <utility>

#include "linux/vald/Replies.h"

namespace skein::vald {
namespace {

NSErrorPtr injectedError(const FaultInjection& fault) {
  return NSError::errorWithDomain(
      fault.errorDomain, fault.errorCode,
      {{NSLocalizedDescriptionKey, "A fault that was asked for: " + fault.method + "."}});
}

}  // namespace

FaultingDaemon::FaultingDaemon(Parts parts) : _parts(std::move(parts)), _injector(_parts.allowed) {}

template <class R, class Call>
void FaultingDaemon::intercept(const char* method, R reply, Call call) {
  const std::optional<FaultInjection> fault = _injector.take(method);
  if (!fault) {
    call(std::move(reply));
    return;
  }
  switch (fault->action) {
    case FaultInjection::Action::DropConnection:
      // The reply dies uncalled, with its connection.
      _parts.dropConnections();
      return;
    case FaultInjection::Action::AnswerError:
      _parts.executor->post([reply = std::move(reply), error = injectedError(*fault)]() mutable {
        answerError(reply, error);
      });
      return;
    case FaultInjection::Action::Delay:
      _parts.executor->post([self = shared_from_this(), reply = std::move(reply),
                             call = std::move(call), delay = fault->delayMilliseconds]() mutable {
        self->_parts.sleep(std::chrono::milliseconds(delay));
        call(std::move(reply));
      });
      return;
  }
}

void FaultingDaemon::enumerateItemsInFolder(std::optional<VLFileObjectID> folder,
                                            std::uint8_t sortOrder, std::uint64_t offset,
                                            std::uint64_t limit, ItemsReply completion) {
  intercept("enumerateItemsInFolder", std::move(completion),
            [daemon = _parts.daemon, folder, sortOrder, offset, limit](ItemsReply reply) {
              daemon->enumerateItemsInFolder(folder, sortOrder, offset, limit, std::move(reply));
            });
}

void FaultingDaemon::enumerateAllFoldersWithSortOrder(std::uint8_t sortOrder, std::uint64_t offset,
                                                      std::uint64_t limit, ItemsReply completion) {
  intercept("enumerateAllFoldersWithSortOrder", std::move(completion),
            [daemon = _parts.daemon, sortOrder, offset, limit](ItemsReply reply) {
              daemon->enumerateAllFoldersWithSortOrder(sortOrder, offset, limit, std::move(reply));
            });
}

void FaultingDaemon::currentNotifRankWithReply(Reply<std::uint64_t, NSErrorPtr> reply) {
  intercept("currentNotifRankWithReply", std::move(reply), [daemon = _parts.daemon](auto answer) {
    daemon->currentNotifRankWithReply(std::move(answer));
  });
}

void FaultingDaemon::enumerateWorkingSetChangesFromChangeToken(
    std::optional<NSData> changeToken, std::uint64_t limit,
    Reply<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>
        completion) {
  intercept("enumerateWorkingSetChangesFromChangeToken", std::move(completion),
            [daemon = _parts.daemon, token = std::move(changeToken), limit](auto reply) {
              daemon->enumerateWorkingSetChangesFromChangeToken(token, limit, std::move(reply));
            });
}

void FaultingDaemon::getItemUpdateSenderWithReceiver(
    std::shared_ptr<VLItemNotificationReceiving> receiver,
    Reply<std::shared_ptr<VLItemNotificationSender>, NSErrorPtr> reply) {
  intercept("getItemUpdateSenderWithReceiver", std::move(reply),
            [daemon = _parts.daemon, receiver = std::move(receiver)](auto answer) {
              daemon->getItemUpdateSenderWithReceiver(receiver, std::move(answer));
            });
}

void FaultingDaemon::URLForFileObjectID(VLFileObjectID fileObjectID,
                                        Reply<NSURLPtr, NSErrorPtr> reply) {
  intercept("URLForFileObjectID", std::move(reply),
            [daemon = _parts.daemon, fileObjectID](auto answer) {
              daemon->URLForFileObjectID(fileObjectID, std::move(answer));
            });
}

void FaultingDaemon::queryItemForURL(NSURLPtr url, bool scanFirst,
                                     Reply<VLQueryItemPtr, NSErrorPtr> reply) {
  intercept("queryItemForURL", std::move(reply),
            [daemon = _parts.daemon, url = std::move(url), scanFirst](auto answer) {
              daemon->queryItemForURL(url, scanFirst, std::move(answer));
            });
}

void FaultingDaemon::account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) {
  intercept("account", std::move(reply),
            [daemon = _parts.daemon](auto answer) { daemon->account(std::move(answer)); });
}

void FaultingDaemon::logIn(LocalAccount account, Reply<NSErrorPtr> reply) {
  intercept("logIn", std::move(reply),
            [daemon = _parts.daemon, account = std::move(account)](auto answer) {
              daemon->logIn(account, std::move(answer));
            });
}

void FaultingDaemon::logOut(Reply<NSErrorPtr> reply) {
  intercept("logOut", std::move(reply),
            [daemon = _parts.daemon](auto answer) { daemon->logOut(std::move(answer)); });
}

void FaultingDaemon::containers(Reply<std::vector<VLContainer::Properties>, NSErrorPtr> reply) {
  intercept("containers", std::move(reply),
            [daemon = _parts.daemon](auto answer) { daemon->containers(std::move(answer)); });
}

void FaultingDaemon::subscribe(std::shared_ptr<LocalDaemonEvents> events, Reply<NSErrorPtr> reply) {
  intercept("subscribe", std::move(reply),
            [daemon = _parts.daemon, events = std::move(events)](auto answer) {
              daemon->subscribe(events, std::move(answer));
            });
}

void FaultingDaemon::status(Reply<LocalDaemonStatus, NSErrorPtr> reply) {
  intercept("status", std::move(reply),
            [daemon = _parts.daemon](auto answer) { daemon->status(std::move(answer)); });
}

void FaultingDaemon::checkIndex(std::uint64_t limit,
                                Reply<std::vector<IndexDifference>, NSErrorPtr> reply) {
  _parts.daemon->checkIndex(limit, std::move(reply));
}

void FaultingDaemon::injectFault(FaultInjection fault, Reply<NSErrorPtr> reply) {
  NSErrorPtr error = _injector.plan(std::move(fault));
  _parts.executor->post(
      [reply = std::move(reply), error = std::move(error)]() mutable { reply(error); });
}

void FaultingDaemon::stop(Reply<NSErrorPtr> reply) { _parts.daemon->stop(std::move(reply)); }

}  // namespace skein::vald
