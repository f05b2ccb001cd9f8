#include "linux/framework/DriveState.h"

#include <algorithm>
#include <utility>

#include "linux/framework/LocalContainer.h"

namespace skein {
namespace {

bool sameContainer(const VLContainer& a, const VLContainer& b) {
  return a.containerID() == b.containerID() && isEqualURL(a.documentsURL(), b.documentsURL()) &&
         a.displayName() == b.displayName() && a.icon() == b.icon() &&
         a.isIconUndecorated() == b.isIconUndecorated();
}

bool sameContainers(const VLContainersByID& a, const VLContainersByID& b) {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](const auto& x, const auto& y) {
    return sameContainer(*x.second, *y.second);
  });
}

std::shared_ptr<const VLAccount> vellumAccount(const std::optional<LocalAccount>& account) {
  if (!account) return nullptr;
  return std::make_shared<const VLAccount>(account->name, account->perAppAccountIdentifier);
}

}  // namespace

DriveState::DriveState(DaemonAccess access, NSNotificationCenter& notificationCenter)
    : _access(std::move(access)), _notificationCenter(notificationCenter) {}

void DriveState::attach() {
  _access.client->setConnectedHandler([weak = weak_from_this()] {
    if (const auto self = weak.lock()) self->connected();
  });
}

std::shared_ptr<LocalDaemon> DriveState::daemon() const {
  // Nothing to do about a message that fails: the next connection asks again.
  return _access.client->remoteObjectProxyWithErrorHandler(nullptr);
}

void DriveState::connected() {
  daemon()->subscribe(shared_from_this(), [self = shared_from_this()](NSErrorPtr error) {
    if (error) return;
    self->fetchAccount();
    self->fetchContainers();
  });
}

void DriveState::fetchAccount() {
  std::uint64_t asked = 0;
  {
    MutexLock lock(_mutex);
    asked = _accountPushes;
  }
  daemon()->account([self = shared_from_this(), asked](Account account, NSErrorPtr error) {
    if (!error) self->setAccount(std::move(account), asked);
  });
}

void DriveState::fetchContainers() {
  const std::uint64_t number = nextQuestion();
  daemon()->containers(
      [self = shared_from_this(), number](Containers containers, NSErrorPtr error) {
        if (!error) self->setContainers(containers, number);
      });
}

std::shared_ptr<const VLAccount> DriveState::account(NSErrorOut error) {
  std::uint64_t asked = 0;
  {
    MutexLock lock(_mutex);
    if (_knowsAccount) return vellumAccount(_account);
    asked = _accountPushes;
  }
  auto [account, problem] = askDaemon<Account>(
      _access, [](LocalDaemon& daemon, auto reply) { daemon.account(std::move(reply)); });
  if (problem) {
    error.store(std::move(problem));
    MutexLock lock(_mutex);
    _accountWasMissed = true;
    return nullptr;
  }
  setAccount(std::move(account), asked);
  MutexLock lock(_mutex);
  return vellumAccount(_account);
}

std::shared_ptr<const VLContainersByID> DriveState::containers() {
  {
    MutexLock lock(_mutex);
    if (_knowsContainers) return _containers;
  }
  const std::uint64_t number = nextQuestion();
  const auto [containers, problem] = askDaemon<Containers>(
      _access, [](LocalDaemon& daemon, auto reply) { daemon.containers(std::move(reply)); });
  if (problem) {
    MutexLock lock(_mutex);
    _containersWereMissed = true;
    return std::make_shared<const VLContainersByID>();
  }
  setContainers(containers, number);
  MutexLock lock(_mutex);
  return _containers;
}

void DriveState::postAccountChanges() {
  MutexLock lock(_mutex);
  _postsAccountChanges = true;
}

void DriveState::postContainerChanges() {
  MutexLock lock(_mutex);
  _postsContainerChanges = true;
}

void DriveState::accountDidChange(Account account) { setAccount(std::move(account), std::nullopt); }

void DriveState::containerListDidChange() { fetchContainers(); }

void DriveState::setAccount(Account account, std::optional<std::uint64_t> asked) {
  {
    MutexLock lock(_mutex);
    if (!asked) {
      ++_accountPushes;
    } else if (*asked != _accountPushes) {
      return;
    }
    const bool changed = !_knowsAccount || _account != account;
    const bool told = _knowsAccount || !asked || std::exchange(_accountWasMissed, false);
    _knowsAccount = true;
    _account = std::move(account);
    if (!changed || !told || !_postsAccountChanges) return;
  }
  postSoon(VLAccountTokenDidChangeNotification);
}

std::uint64_t DriveState::nextQuestion() {
  MutexLock lock(_mutex);
  return ++_lastQuestion;
}

void DriveState::setContainers(const Containers& containers, std::uint64_t number) {
  // Loaded with each list: an app that has come may have brought folders of icons.
  const auto icons = IconTheme::installed();
  VLContainersByID table;
  for (const VLContainer::Properties& container : containers) {
    table.emplace(container.containerID, std::make_shared<const LocalContainer>(container, icons));
  }
  {
    MutexLock lock(_mutex);
    if (number < std::exchange(_lastAnswered, std::max(number, _lastAnswered))) return;
    const bool missed = std::exchange(_containersWereMissed, false);
    const bool changed = missed || (_knowsContainers && !sameContainers(*_containers, table));
    _knowsContainers = true;
    _containers = std::make_shared<const VLContainersByID>(std::move(table));
    if (!changed || !_postsContainerChanges) return;
  }
  postSoon(VLContainerListDidChangeNotification);
}

// Observers may wait for their queues, so this must be nobody's queue.
void DriveState::postSoon(const char* notification) {
  _access.executor->post([&center = _notificationCenter, self = shared_from_this(), notification] {
    center.postNotificationName(notification);
  });
}

}  // namespace skein
