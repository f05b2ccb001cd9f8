#include "linux/vald/EventSubscribers.h"

#include <utility>

namespace skein::vald {
namespace {

constexpr std::size_t kMostSubscribers = 1024;

}  // namespace

EventSubscribers::EventSubscribers(std::shared_ptr<Executor> executor)
    : _queue("vald-events", std::move(executor)) {}

bool EventSubscribers::add(const std::shared_ptr<LocalDaemonEvents>& events) {
  MutexLock lock(_mutex);
  std::erase_if(_subscribers, [](const auto& weak) { return weak.expired(); });
  if (_subscribers.size() >= kMostSubscribers) return false;
  _subscribers.push_back(events);
  return true;
}

void EventSubscribers::accountDidChange(std::optional<LocalAccount> account) {
  _queue.async([subscribers = living(), account = std::move(account)] {
    for (const auto& subscriber : subscribers) subscriber->accountDidChange(account);
  });
}

void EventSubscribers::containerListDidChange() {
  _queue.async([subscribers = living()] {
    for (const auto& subscriber : subscribers) subscriber->containerListDidChange();
  });
}

EventSubscribers::Subscribers EventSubscribers::living() {
  MutexLock lock(_mutex);
  Subscribers subscribers;
  for (const auto& weak : _subscribers) {
    if (auto subscriber = weak.lock()) subscribers.push_back(std::move(subscriber));
  }
  return subscribers;
}

}  // namespace skein::vald
