#pragma once

#include <cstdint>
#include <memory>
#include <optional>

#include "base/Mutex.h"
#include "linux/framework/SyncCall.h"
#include "linux/protocol/LocalDaemon.h"
#include "platform/foundation/NSNotificationCenter.h"
#include "vellum/VLAccount.h"
#include "vellum/VLContainer.h"

namespace skein {

// What this process knows of the account and the containers: asked once, then kept current
// by what vald pushes. Each new connection subscribes again and compares, so that what
// changed while there was none is noticed.
//
// VLAccountTokenDidChangeNotification and VLContainerListDidChangeNotification are posted
// on a worker thread, after the new state can be read. Any thread.
class DriveState final : public LocalDaemonEvents, public std::enable_shared_from_this<DriveState> {
 public:
  // The center has to outlive the state.
  DriveState(DaemonAccess access, NSNotificationCenter& notificationCenter);

  // Has the client tell of its connections. Call it once, before the first message.
  void attach();

  // Null: nobody is logged in. Waits for vald the first time; an error when vald cannot
  // be asked.
  std::shared_ptr<const VLAccount> account(NSErrorOut error) SKEIN_EXCLUDES(_mutex);
  // Waits for vald the first time; empty when it cannot be asked. Never null.
  std::shared_ptr<const VLContainersByID> containers() SKEIN_EXCLUDES(_mutex);

  // From now on the notification is posted.
  void postAccountChanges() SKEIN_EXCLUDES(_mutex);
  void postContainerChanges() SKEIN_EXCLUDES(_mutex);

  void accountDidChange(std::optional<LocalAccount> account) override;
  void containerListDidChange() override;

 private:
  using Account = std::optional<LocalAccount>;
  using Containers = std::vector<VLContainer::Properties>;

  void connected();
  void fetchAccount();
  void fetchContainers();
  // `asked`: the number of the last push when the question was sent; a push that came
  // since then knows better.
  void setAccount(Account account, std::optional<std::uint64_t> asked) SKEIN_EXCLUDES(_mutex);
  // `number`: the question's. An answer to an earlier question than the last answered one
  // is out of date.
  void setContainers(const Containers& containers, std::uint64_t number) SKEIN_EXCLUDES(_mutex);
  std::uint64_t nextQuestion() SKEIN_EXCLUDES(_mutex);
  void postSoon(const char* notification);
  std::shared_ptr<LocalDaemon> daemon() const;

  const DaemonAccess _access;
  NSNotificationCenter& _notificationCenter;

  Mutex _mutex;
  // Somebody was told that vald cannot be asked; whatever comes to be known is news then.
  bool _accountWasMissed SKEIN_GUARDED_BY(_mutex) = false;
  bool _containersWereMissed SKEIN_GUARDED_BY(_mutex) = false;
  bool _knowsAccount SKEIN_GUARDED_BY(_mutex) = false;
  Account _account SKEIN_GUARDED_BY(_mutex);
  std::uint64_t _accountPushes SKEIN_GUARDED_BY(_mutex) = 0;
  bool _knowsContainers SKEIN_GUARDED_BY(_mutex) = false;
  // Replaced as a whole, since it is asked for with every URL.
  std::shared_ptr<const VLContainersByID> _containers SKEIN_GUARDED_BY(_mutex) =
      std::make_shared<const VLContainersByID>();
  std::uint64_t _lastQuestion SKEIN_GUARDED_BY(_mutex) = 0;
  std::uint64_t _lastAnswered SKEIN_GUARDED_BY(_mutex) = 0;
  bool _postsAccountChanges SKEIN_GUARDED_BY(_mutex) = false;
  bool _postsContainerChanges SKEIN_GUARDED_BY(_mutex) = false;
};

}  // namespace skein
