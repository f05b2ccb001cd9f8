#include "linux/protocol/DaemonReferences.h"

#include <utility>

#include "linux/protocol/Answer.h"
#include "linux/protocol/LinkBreaking.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr int kMostProgressUnderWay = 16;

// Sends a push and runs `then` after it, also when it failed: what comes next is no less due.
template <class Request, class Then>
void send(DaemonService& service, Request request, Then then) {
  auto sent = request.send().ignoreResult();
  auto failed = [then](kj::Exception&&) mutable { then(); };
  service.server->tasks->add(sent.then(std::move(then), std::move(failed)));
}

}  // namespace

NSURLPtr urlFromClient(capnp::Data::Reader data) {
  std::string path = codec::text(data);
  if (path.empty() || path.front() != '/' || path.find('\0') != std::string::npos) return nullptr;
  const std::string closed = path + '/';
  if (closed.find("/./") != std::string::npos || closed.find("/../") != std::string::npos) {
    return nullptr;
  }
  return NSURL::fileURLWithPath(std::move(path));
}

// --- Receivers.

ReceiverReference::ReceiverReference(DaemonServicePtr service, wire::Receiver::Client client)
    : _service(std::move(service)),
      _client(_service->loop->own(std::make_unique<wire::Receiver::Client>(kj::mv(client)))) {}

void ReceiverReference::receiveUpdates(const VLQueryItems& items,
                                       const std::vector<std::string>& logicalExtensions,
                                       const std::vector<std::string>& physicalExtensions,
                                       Reply<> reply) {
  _service->loop->post([self = shared_from_this(), items, logicalExtensions, physicalExtensions,
                        reply = std::move(reply)]() mutable {
    auto request = self->_client->receiveUpdatesRequest();
    codec::encode(request.initItems(static_cast<unsigned>(items.size())), items);
    codec::encode(request.initLogicalExtensions(static_cast<unsigned>(logicalExtensions.size())),
                  logicalExtensions);
    codec::encode(request.initPhysicalExtensions(static_cast<unsigned>(physicalExtensions.size())),
                  physicalExtensions);
    self->_service->server->tasks->add(request.send().ignoreResult().then(
        [executor = self->_service->executor, reply = std::move(reply)]() mutable {
          executor->post([reply = std::move(reply)]() mutable { reply(); });
        }));
  });
}

void ReceiverReference::receiveProgressUpdates(const VLQueryItems& updates, Reply<>) {
  _service->loop->post([self = shared_from_this(), updates] {
    if (self->_progressUnderWay >= kMostProgressUnderWay) return;
    ++self->_progressUnderWay;
    auto request = self->_client->receiveProgressUpdatesRequest();
    codec::encode(request.initItems(static_cast<unsigned>(updates.size())), updates);
    send(*self->_service, kj::mv(request), [self] { --self->_progressUnderWay; });
  });
}

void ReceiverReference::linkDidBreak(NSErrorPtr error) {
  _service->loop->post([self = shared_from_this(), error = std::move(error)] {
    auto request = self->_client->linkDidBreakRequest();
    codec::setError(static_cast<wire::Receiver::LinkDidBreakParams::Builder&>(request), error);
    self->_service->server->tasks->add(request.send().ignoreResult());
  });
}

// --- Subscriptions.

EventsReference::EventsReference(DaemonServicePtr service, wire::Events::Client client)
    : _service(std::move(service)),
      _client(_service->loop->own(std::make_unique<wire::Events::Client>(kj::mv(client)))) {}

void EventsReference::accountDidChange(std::optional<LocalAccount> account) {
  _service->loop->post([self = shared_from_this(), account = std::move(account)]() mutable {
    self->_nextAccount = std::move(account);
    if (!self->_accountUnderWay) self->sendAccount();
  });
}

void EventsReference::sendAccount() {
  if (!_nextAccount) return;
  _accountUnderWay = true;
  auto request = _client->accountDidChangeRequest();
  if (const auto& account = *_nextAccount) codec::encode(request.initAccount(), *account);
  _nextAccount.reset();
  send(*_service, kj::mv(request), [self = shared_from_this()] {
    self->_accountUnderWay = false;
    self->sendAccount();
  });
}

void EventsReference::containerListDidChange() {
  _service->loop->post([self = shared_from_this()] {
    self->_nextContainers = true;
    if (!self->_containersUnderWay) self->sendContainers();
  });
}

void EventsReference::sendContainers() {
  if (!std::exchange(_nextContainers, false)) return;
  _containersUnderWay = true;
  send(*_service, _client->containerListDidChangeRequest(), [self = shared_from_this()] {
    self->_containersUnderWay = false;
    self->sendContainers();
  });
}

// --- Senders.

SenderObject::SenderObject(DaemonServicePtr service,
                           std::shared_ptr<VLItemNotificationSender> sender,
                           std::shared_ptr<std::size_t> living)
    : _service(std::move(service)), _sender(std::move(sender)), _living(std::move(living)) {
  ++*_living;
}

std::shared_ptr<VLItemNotificationSender> invalidatedAtTheEnd(
    std::shared_ptr<VLItemNotificationSender> sender, std::shared_ptr<Executor> executor) {
  VLItemNotificationSender* object = sender.get();
  return {object, [sender = std::move(sender), executor = std::move(executor)](auto*) mutable {
            executor->post([sender = std::move(sender)] { sender->invalidate(); });
          }};
}

kj::Promise<void> SenderObject::boostPriority(BoostPriorityContext context) {
  return answer(
      _service, context, [&](auto reply) { _sender->boostPriority(std::move(reply)); },
      [](wire::Sender::BoostPriorityResults::Builder) {});
}

kj::Promise<void> SenderObject::watchItem(WatchItemContext context) {
  const auto params = context.getParams();
  const NSURLPtr url = itemURLFromClient(params);
  const std::uint64_t options = params.getOptions();
  return answer(
      _service, context,
      [&](auto reply) {
        if (url) {
          _sender->watchItemAtURL(url, options, std::move(reply));
        } else {
          reply(vlc_errorInvalidParameter("url", codec::text(params.getUrl())));
        }
      },
      [](wire::Sender::WatchItemResults::Builder results, const NSErrorPtr& error) {
        codec::setError(results, error);
      });
}

kj::Promise<void> SenderObject::invalidate(InvalidateContext) {
  _sender->invalidate();
  return kj::READY_NOW;
}

}  // namespace skein
