// The server's ends of object references: what a client gave vald to call back, and what
// vald gave a client. Include this in few files: it costs seconds to compile.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Executor.h"
#include "linux/protocol/DaemonCodec.h"
#include "linux/protocol/DaemonService.h"

namespace skein {

// A client's receiver, as vald pushes to it. Any thread; replies come on the executor.
class ReceiverReference final : public VLItemNotificationReceiving,
                                public std::enable_shared_from_this<ReceiverReference> {
 public:
  // On the loop's thread.
  ReceiverReference(DaemonServicePtr service, wire::Receiver::Client client);

  // The reply is destroyed uncalled when the push could not be made: the client is gone, or
  // what it was to receive cannot be sent.
  void receiveUpdates(const VLQueryItems& items, const std::vector<std::string>& logicalExtensions,
                      const std::vector<std::string>& physicalExtensions, Reply<> reply) override;
  // Never answered; dropped while too many are on their way.
  void receiveProgressUpdates(const VLQueryItems& updates, Reply<> reply) override;
  void linkDidBreak(NSErrorPtr error);

 private:
  const DaemonServicePtr _service;
  const std::shared_ptr<wire::Receiver::Client> _client;
  int _progressUnderWay = 0;  // on the loop's thread
};

// A client's subscription, as vald pushes to it. Any thread. While an event is on its way,
// later ones of its kind are joined into one.
class EventsReference final : public LocalDaemonEvents,
                              public std::enable_shared_from_this<EventsReference> {
 public:
  // On the loop's thread.
  EventsReference(DaemonServicePtr service, wire::Events::Client client);

  void accountDidChange(std::optional<LocalAccount> account) override;
  void containerListDidChange() override;

 private:
  void sendAccount();
  void sendContainers();

  const DaemonServicePtr _service;
  const std::shared_ptr<wire::Events::Client> _client;
  // On the loop's thread.
  bool _accountUnderWay = false;
  bool _containersUnderWay = false;
  std::optional<std::optional<LocalAccount>> _nextAccount;
  bool _nextContainers = false;
};

// vald's update sender, as its client calls it. Lives on the loop's thread; the client's
// last reference ends it.
class SenderObject : public wire::Sender::Server {
 public:
  // `living`: counts the connection's senders.
  SenderObject(DaemonServicePtr service, std::shared_ptr<VLItemNotificationSender> sender,
               std::shared_ptr<std::size_t> living);
  ~SenderObject() { --*_living; }

  kj::Promise<void> boostPriority(BoostPriorityContext context) override;
  kj::Promise<void> watchItem(WatchItemContext context) override;
  kj::Promise<void> invalidate(InvalidateContext context) override;

 private:
  const DaemonServicePtr _service;
  const std::shared_ptr<VLItemNotificationSender> _sender;
  const std::shared_ptr<std::size_t> _living;
};

// `sender`, so that its last reference invalidates and releases it on the executor,
// wherever that reference goes.
std::shared_ptr<VLItemNotificationSender> invalidatedAtTheEnd(
    std::shared_ptr<VLItemNotificationSender> sender, std::shared_ptr<Executor> executor);

}  // namespace skein
