// The client's end of one watch: a receiver, and proxies of its sender. Include this in
// few files: it costs seconds to compile.
#pragma once

#include <memory>
#include <vector>

#include "base/Mutex.h"
#include "base/SerialQueue.h"
#include "linux/protocol/DaemonCodec.h"
#include "linux/protocol/SocketClient.h"

namespace skein {

// Joins what the framework holds (proxies) to what vald calls (the receiver).
//
// The link holds the receiver until it ends: by invalidate(), with the last proxy, when
// vald breaks it or when the connection is lost. In the last two cases each proxy's error
// handler is called once, unless it was by a message that the lost connection cost. Pushes
// reach the receiver one at a time on the link's own queue, and none after the end.
class UpdateLink final : public std::enable_shared_from_this<UpdateLink> {
 public:
  // One proxy's error handler; the link knows those whose proxies live.
  struct Handler {
    std::function<void(NSErrorPtr)> call;
    NSErrorPtr lastError;  // on the loop's thread
  };

  UpdateLink(std::shared_ptr<SocketClient> socket,
             std::shared_ptr<VLItemNotificationReceiving> receiver);
  ~UpdateLink();

  // The object that vald calls. On the loop's thread.
  wire::Receiver::Client exportReceiver();
  // vald's answer, on the connection that is current. On the loop's thread.
  void attach(wire::Sender::Client sender);
  // Ends the link and gives vald's object back. Any thread.
  void release();

  // --- For the proxies. Any thread.

  void add(const std::shared_ptr<Handler>& handler) SKEIN_EXCLUDES(_mutex);
  // Sends to vald's object; see SocketClient::sendOver.
  void send(UniqueFunction<kj::Promise<Task>(wire::Sender::Client&)> send,
            std::shared_ptr<Handler> handler, SocketClient::Patience patience);
  // Lets go of the receiver: nothing is delivered from now on.
  void end() SKEIN_EXCLUDES(_mutex);
  const std::shared_ptr<Executor>& executor() const { return _socket->executor(); }

  // --- For the exported receiver. On the loop's thread.

  kj::Promise<void> deliver(VLQueryItems items, std::vector<std::string> logicalExtensions,
                            std::vector<std::string> physicalExtensions);
  void deliverProgress(VLQueryItems items);
  void breakWith(const NSErrorPtr& error) SKEIN_EXCLUDES(_mutex);

 private:
  std::shared_ptr<VLItemNotificationReceiving> receiver() SKEIN_EXCLUDES(_mutex);

  const std::shared_ptr<SocketClient> _socket;
  SerialQueue _deliveries;
  // On the loop's thread.
  kj::Maybe<wire::Sender::Client> _sender;
  std::uint64_t _connection = 0;
  std::uint64_t _lostKey = 0;

  Mutex _mutex;
  std::shared_ptr<VLItemNotificationReceiving> _receiver SKEIN_GUARDED_BY(_mutex);
  std::vector<std::weak_ptr<Handler>> _handlers SKEIN_GUARDED_BY(_mutex);
  NSErrorPtr _broken SKEIN_GUARDED_BY(_mutex);
};

// The sender as the framework gets it. Its last reference and that of its proxies
// release the link.
std::shared_ptr<VLItemNotificationSender> makeSender(std::shared_ptr<UpdateLink> link);

}  // namespace skein
