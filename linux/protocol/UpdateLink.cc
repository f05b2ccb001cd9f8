#include "linux/protocol/UpdateLink.h"

#include <kj/debug.h>

#include <utility>

#include "linux/protocol/DocumentURL.h"

namespace skein {
namespace {

// Holds the link for the sender and all its proxies.
class LinkHold {
 public:
  explicit LinkHold(std::shared_ptr<UpdateLink> link) : _link(std::move(link)) {}
  ~LinkHold() { _link->release(); }
  LinkHold(const LinkHold&) = delete;
  LinkHold& operator=(const LinkHold&) = delete;
  UpdateLink& operator*() const { return *_link; }
  UpdateLink* operator->() const { return _link.get(); }

 private:
  const std::shared_ptr<UpdateLink> _link;
};

class SendingProxy final : public VLItemNotificationSender {
 public:
  SendingProxy(std::shared_ptr<LinkHold> link, std::function<void(NSErrorPtr)> errorHandler)
      : _link(std::move(link)), _handler(std::make_shared<UpdateLink::Handler>()) {
    _handler->call = std::move(errorHandler);
    if (_handler->call) (*_link)->add(_handler);
  }

  void boostPriority(Reply<> reply) override {
    (*_link)->send(
        [reply = std::move(reply)](wire::Sender::Client& sender) mutable {
          return sender.boostPriorityRequest().send().then(
              [reply = std::move(reply)](auto&&) mutable -> Task { return std::move(reply); });
        },
        // A vald that is busy answers it late, and the link is no worse for that.
        _handler, SocketClient::Patience::WhilePeerLives);
  }

  void watchItemAtURL(const NSURLPtr& url, std::uint64_t options,
                      Reply<NSErrorPtr> gatherReply) override {
    (*_link)->send(
        [url, options, reply = std::move(gatherReply)](wire::Sender::Client& sender) mutable {
          auto request = sender.watchItemRequest();
          if (url) request.setUrl(codec::bytes(url->path()));
          request.setOptions(options);
          if (const auto item = fileObjectIDOfDocumentURL(url)) {
            codec::encode(request.initItem(), *item);
          }
          return request.send().then([reply = std::move(reply)](auto&& results) mutable -> Task {
            return [reply = std::move(reply), error = codec::errorOf(results)]() mutable {
              reply(std::move(error));
            };
          });
        },
        _handler, SocketClient::Patience::WhilePeerLives);
  }

  void invalidate() override {
    (*_link)->end();
    // Whether the message arrives does not matter: without the connection vald's object
    // ends as well.
    (*_link)->send(
        [](wire::Sender::Client& sender) {
          return sender.invalidateRequest().send().then([](auto&&) -> Task { return [] {}; });
        },
        nullptr, SocketClient::Patience::Deadline);
  }

  std::shared_ptr<VLItemNotificationSending> remoteObjectProxyWithErrorHandler(
      std::function<void(NSErrorPtr)> errorHandler) override {
    return std::make_shared<SendingProxy>(_link, std::move(errorHandler));
  }

 private:
  const std::shared_ptr<LinkHold> _link;
  const std::shared_ptr<UpdateLink::Handler> _handler;
};

class ReceiverObject final : public wire::Receiver::Server {
 public:
  explicit ReceiverObject(std::shared_ptr<UpdateLink> link) : _link(std::move(link)) {}

  kj::Promise<void> receiveUpdates(ReceiveUpdatesContext context) override {
    const auto params = context.getParams();
    return _link->deliver(codec::decodeItems(params.getItems()),
                          codec::decode(params.getLogicalExtensions()),
                          codec::decode(params.getPhysicalExtensions()));
  }
  kj::Promise<void> receiveProgressUpdates(ReceiveProgressUpdatesContext context) override {
    _link->deliverProgress(codec::decodeItems(context.getParams().getItems()));
    return kj::READY_NOW;
  }
  kj::Promise<void> linkDidBreak(LinkDidBreakContext context) override {
    _link->breakWith(codec::errorOf(context.getParams()));
    return kj::READY_NOW;
  }

 private:
  const std::shared_ptr<UpdateLink> _link;
};

}  // namespace

UpdateLink::UpdateLink(std::shared_ptr<SocketClient> socket,
                       std::shared_ptr<VLItemNotificationReceiving> receiver)
    : _socket(std::move(socket)),
      _deliveries("vald-updates", _socket->executor()),
      _receiver(std::move(receiver)) {}

UpdateLink::~UpdateLink() { end(); }

wire::Receiver::Client UpdateLink::exportReceiver() {
  return kj::heap<ReceiverObject>(shared_from_this());
}

void UpdateLink::attach(wire::Sender::Client sender) {
  _sender = kj::mv(sender);
  _connection = _socket->currentConnection();
  _lostKey = _socket->whenLost(_connection, [weak = weak_from_this()](const NSErrorPtr& error) {
    const auto self = weak.lock();
    if (!self) return;
    self->_sender = nullptr;
    self->breakWith(error);
  });
}

void UpdateLink::release() {
  end();
  _socket->loop()->post([self = shared_from_this()] {
    self->_socket->forget(self->_lostKey);
    self->_sender = nullptr;
  });
}

void UpdateLink::add(const std::shared_ptr<Handler>& handler) {
  NSErrorPtr broken;
  {
    MutexLock lock(_mutex);
    broken = _broken;
    if (!broken) {
      std::erase_if(_handlers, [](const auto& weak) { return weak.expired(); });
      _handlers.push_back(handler);
    }
  }
  if (broken) executor()->post([handler, broken] { handler->call(broken); });
}

void UpdateLink::send(UniqueFunction<kj::Promise<Task>(wire::Sender::Client&)> send,
                      std::shared_ptr<Handler> handler, SocketClient::Patience patience) {
  _socket->loop()->post([self = shared_from_this(), send = std::move(send),
                         handler = std::move(handler), patience]() mutable {
    self->_socket->sendOver(
        self->_connection,
        [self, send = std::move(send)]() mutable -> kj::Promise<Task> {
          KJ_IF_MAYBE (sender, self->_sender) {
            return send(*sender);
          }
          return KJ_EXCEPTION(DISCONNECTED, "the link was released");
        },
        [self, handler = std::move(handler)](NSErrorPtr error) {
          if (!handler || !handler->call) return;
          handler->lastError = error;
          self->executor()->post([handler, error = std::move(error)] { handler->call(error); });
        },
        patience);
  });
}

std::shared_ptr<VLItemNotificationReceiving> UpdateLink::receiver() {
  MutexLock lock(_mutex);
  return _receiver;
}

// The receiver's destructor is its owner's code: it does not run here, where the caller
// may hold a lock or be the loop's thread.
void UpdateLink::end() {
  std::shared_ptr<VLItemNotificationReceiving> leaving;
  {
    MutexLock lock(_mutex);
    leaving = std::move(_receiver);
    _receiver = nullptr;
  }
  if (leaving) executor()->post([leaving = std::move(leaving)] {});
}

kj::Promise<void> UpdateLink::deliver(VLQueryItems items,
                                      std::vector<std::string> logicalExtensions,
                                      std::vector<std::string> physicalExtensions) {
  auto paf = kj::newPromiseAndFulfiller<void>();
  auto loop = _socket->loop();
  auto fulfiller =
      loop->own(std::make_unique<kj::Own<kj::PromiseFulfiller<void>>>(kj::mv(paf.fulfiller)));
  _deliveries.async([self = shared_from_this(), loop = std::move(loop),
                     fulfiller = std::move(fulfiller), items = std::move(items),
                     logicalExtensions = std::move(logicalExtensions),
                     physicalExtensions = std::move(physicalExtensions)]() mutable {
    const auto receiver = self->receiver();
    if (!receiver) return;  // the push fails, as its link ended
    receiver->receiveUpdates(
        items, logicalExtensions, physicalExtensions,
        [loop = std::move(loop), fulfiller = std::move(fulfiller)]() mutable {
          loop->post([fulfiller = std::move(fulfiller)] { (*fulfiller)->fulfill(); });
        });
  });
  return kj::mv(paf.promise);
}

void UpdateLink::deliverProgress(VLQueryItems items) {
  _deliveries.async([self = shared_from_this(), items = std::move(items)] {
    if (const auto receiver = self->receiver()) receiver->receiveProgressUpdates(items, [] {});
  });
}

void UpdateLink::breakWith(const NSErrorPtr& error) {
  std::vector<std::weak_ptr<Handler>> handlers;
  {
    MutexLock lock(_mutex);
    if (_broken || !error) return;
    _broken = error;
    handlers.swap(_handlers);
  }
  for (const auto& weak : handlers) {
    const auto handler = weak.lock();
    if (!handler || handler->lastError == error) continue;
    executor()->post([handler, error] { handler->call(error); });
  }
  end();
}

std::shared_ptr<VLItemNotificationSender> makeSender(std::shared_ptr<UpdateLink> link) {
  return std::make_shared<SendingProxy>(std::make_shared<LinkHold>(std::move(link)), nullptr);
}

}  // namespace skein
