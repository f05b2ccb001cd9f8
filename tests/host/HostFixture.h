// A host around an extension that the test writes: answers are held until the test gives
// them, time passes when the test says so, and work runs when it is stepped.
#pragma once

#include <gtest/gtest.h>

#include <deque>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "linux/host/FileProviderHost.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "tests/support/ManualExecutor.h"
#include "vellum/VLErrors.h"
#include "vellum/VLQueryItem.h"

namespace skein {

class ManualTimers final : public Timers {
 public:
  explicit ManualTimers(std::shared_ptr<Executor> executor) : _executor(std::move(executor)) {}
  Key after(std::chrono::milliseconds delay, Task task) override {
    _tasks.emplace(std::pair(_now + delay, ++_last), std::move(task));
    return _last;
  }
  void cancel(Key key) override {
    std::erase_if(_tasks, [key](const auto& entry) { return entry.first.second == key; });
  }
  void advance(std::chrono::milliseconds time) {
    _now += time;
    while (!_tasks.empty() && _tasks.begin()->first.first <= _now) {
      _executor->post(std::move(_tasks.begin()->second));
      _tasks.erase(_tasks.begin());
    }
  }

 private:
  const std::shared_ptr<Executor> _executor;
  std::chrono::milliseconds _now{0};
  Key _last = 0;
  std::map<std::pair<std::chrono::milliseconds, Key>, Task> _tasks;
};

class NoLog final : public Log {
 public:
  void write(LogType, std::string_view) override {}
};

inline NSFileProviderItemPtr item(std::uint64_t id, std::string name, std::uint64_t size = 0) {
  VLQueryItem::Properties properties;
  properties.fileObjectID = VLFileObjectID::documentWithRawID(id);
  properties.itemIdentifier = properties.fileObjectID.asString();
  properties.filename = std::move(name);
  properties.size = size;
  return std::make_shared<const VLQueryItem>(std::move(properties));
}
inline std::string idOf(std::uint64_t id) {
  return VLFileObjectID::documentWithRawID(id).asString();
}
inline NSData tokenOf(std::string_view text) { return NSData(text); }
inline NSErrorPtr expired() {
  return NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorSyncAnchorExpired);
}

// Records what it is asked in one list, and holds the observers.
class FakeEnumerator final : public NSFileProviderEnumerator,
                             public NSFileProviderChangeEnumerating {
 public:
  FakeEnumerator(std::vector<std::string>& calls, std::string anchor)
      : anchor(std::move(anchor)), _calls(calls) {}

  void enumerateItemsForObserver(std::shared_ptr<NSFileProviderEnumerationObserver> observer,
                                 std::optional<NSFileProviderPage> page) override {
    const bool initial = page == NSFileProviderInitialPageSortedByName();
    _calls.push_back("list " + (initial ? "start" : std::string(page->view())));
    listings.push_back(std::move(observer));
  }
  void enumerateChangesForObserver(std::shared_ptr<NSFileProviderChangeObserver> observer,
                                   std::optional<NSFileProviderSyncAnchor> from) override {
    _calls.push_back("changes " + std::string(from ? from->view() : "nil"));
    rounds.push_back(std::move(observer));
  }
  void currentSyncAnchorWithCompletionHandler(
      UniqueFunction<void(std::optional<NSFileProviderSyncAnchor>)> handler) override {
    _calls.push_back("anchor");
    handler(tokenOf(anchor));
  }
  void invalidate() override { _calls.push_back("invalidate"); }

  // Answers to the oldest held request. Without `next` the page is the last.
  void givePage(const NSFileProviderItems& items, const std::string& next = "") {
    const auto observer = take(listings);
    observer->didEnumerateItems(items);
    if (next.empty()) {
      observer->finishEnumeratingUpToPage(std::nullopt);
    } else {
      observer->finishEnumeratingUpToPage(tokenOf(next));
    }
  }
  void giveChanges(const NSFileProviderItems& updates, const std::vector<std::string>& deletions,
                   const std::string& to, bool more = false) {
    const auto observer = take(rounds);
    observer->didUpdateItems(updates);
    observer->didDeleteItemsWithIdentifiers(deletions);
    observer->finishEnumeratingChangesUpToSyncAnchor(tokenOf(to), more);
  }
  void failChanges(NSErrorPtr error) { take(rounds)->finishEnumeratingWithError(std::move(error)); }

  std::string anchor;
  std::deque<std::shared_ptr<NSFileProviderEnumerationObserver>> listings;
  std::deque<std::shared_ptr<NSFileProviderChangeObserver>> rounds;

 private:
  template <class T>
  static T take(std::deque<T>& held) {
    if (held.empty()) throw std::logic_error("nothing was asked that could be answered");
    T taken = std::move(held.front());
    held.pop_front();
    return taken;
  }

  std::vector<std::string>& _calls;
};

class FakeExtension final : public NSFileProviderExtension {
 public:
  std::shared_ptr<NSFileProviderEnumerator> enumeratorForContainerItemIdentifier(
      const NSFileProviderItemIdentifier& identifier, NSErrorOut out) override {
    calls.push_back("open " + identifier);
    if (error) {
      out.store(error);
      return nullptr;
    }
    enumerators.push_back(
        std::make_shared<FakeEnumerator>(calls, "a" + std::to_string(enumerators.size())));
    return enumerators.back();
  }

  // An alias has the URL of what it leads to.
  NSURLPtr URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier) override {
    const auto target = aliases.find(identifier);
    return NSURL::fileURLWithPath('/' + (target != aliases.end() ? target->second : identifier));
  }
  std::optional<NSFileProviderItemIdentifier> persistentIdentifierForItemAtURL(
      const NSURLPtr& url) override {
    return url->lastPathComponent();
  }

  NSErrorPtr error;
  std::map<std::string, std::string> aliases;
  std::vector<std::string> calls;
  std::vector<std::shared_ptr<FakeEnumerator>> enumerators;
};

// News that a test tells; counts who listens.
class FakeNews final : public WorkingSetNews {
 public:
  std::shared_ptr<void> begin(std::function<void()> handler) override {
    handlers.push_back(std::move(handler));
    return std::make_shared<Listening>(listeners);
  }

  std::vector<std::function<void()>> handlers;
  int listeners = 0;

 private:
  struct Listening {
    explicit Listening(int& count) : listeners(count) { ++listeners; }
    ~Listening() { --listeners; }
    int& listeners;
  };
};

// Keeps what it hears as words: "+id name", "~id name", "-id name", "begin", "end code".
class Watcher final : public ContainerWatcher {
 public:
  void watchDidBegin() override { heard.push_back("begin"); }
  void containerDidChange(const std::vector<HostChange>& changes) override {
    for (const HostChange& change : changes) {
      const char sign = change.kind == HostChange::Kind::Created   ? '+'
                        : change.kind == HostChange::Kind::Deleted ? '-'
                                                                   : '~';
      heard.push_back(sign + change.filename +
                      (change.previousFilename ? " was " + *change.previousFilename : ""));
    }
  }
  void watchDidEnd(NSErrorPtr error) override {
    heard.push_back("end " + std::to_string(error ? error->code() : 0));
  }
  std::vector<std::string> take() {
    auto taken = std::exchange(heard, {});
    return taken;
  }
  std::vector<std::string> heard;
};

class HostTest : public testing::Test {
 protected:
  using Words = std::vector<std::string>;

  HostTest() { host->setExtension(extension); }
  // What a test left unanswered holds the watch, which holds the enumerator.
  ~HostTest() override {
    run();
    for (const auto& held : extension->enumerators) {
      held->listings.clear();
      held->rounds.clear();
    }
  }

  void run() { executor->runAll(); }
  Words calls() {
    run();
    return std::exchange(extension->calls, {});
  }
  FakeEnumerator& enumerator(std::size_t index = 0) { return *extension->enumerators.at(index); }
  // Watches a folder that holds `items`, and has it go live.
  std::shared_ptr<FileProviderHost::Subscription> watchLive(const std::shared_ptr<Watcher>& watcher,
                                                            const NSFileProviderItems& items,
                                                            const std::string& container = "i1") {
    auto subscription = host->watch(container, watcher);
    run();
    enumerator().givePage(items);
    run();
    enumerator().giveChanges({}, {}, enumerator().anchor);
    run();
    extension->calls.clear();
    watcher->heard.clear();
    return subscription;
  }
  void signal() { host->signalEnumeratorForContainerItemIdentifier("i1", nullptr); }

  const std::shared_ptr<ManualExecutor> executor = std::make_shared<ManualExecutor>();
  const std::shared_ptr<ManualTimers> timers = std::make_shared<ManualTimers>(executor);
  NoLog log;
  const std::shared_ptr<FakeExtension> extension = std::make_shared<FakeExtension>();
  FakeNews* const news = new FakeNews;  // the host's
  const std::shared_ptr<FileProviderHost> host = std::make_shared<FileProviderHost>(
      HostTools{executor, timers}, std::unique_ptr<WorkingSetNews>(news), log);
  const std::shared_ptr<Watcher> watcher = std::make_shared<Watcher>();
};

}  // namespace skein
