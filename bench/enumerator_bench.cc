// How fast a folder's enumerator takes pushed updates, in process: 1,000 distinct items,
// one update in ten a deletion, with a host that asks for changes whenever it is signalled,
// and with one that never asks; and deletions alone, which count each time and so reach the
// cap. The baseline is the same updates put into a plain std::unordered_map under a
// std::mutex, its host swapping the map away.
//
// Bar: 100,000 pushed updates per second, and never more than 5,000 changes pending.
#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <functional>
#include <mutex>
#include <random>
#include <thread>
#include <unordered_map>

#include "enumeration/VLFileEnumerator.h"
#include "tests/support/TestEnvironment.h"

namespace skein {
namespace {

constexpr std::size_t kDistinct = 1000;
constexpr std::size_t kUpdates = 1'000'000;
constexpr double kLeastPerSecond = 100'000;
constexpr std::size_t kMostPending = 5000;

// The host's ear. Nothing else of the world is asked here.
struct Signals final : NSFileProviderManager {
  void signalEnumeratorForContainerItemIdentifier(const std::string&,
                                                  Completion<NSErrorPtr> completion) override {
    {
      std::lock_guard lock(mutex);
      signalled = true;
    }
    came.notify_one();
    completion(nullptr);
  }
  // False when the pushing has ended.
  bool wait() {
    std::unique_lock lock(mutex);
    came.wait(lock, [&] { return signalled || ended; });
    signalled = false;
    return !ended;
  }
  void end() {
    {
      std::lock_guard lock(mutex);
      ended = true;
    }
    came.notify_one();
  }
  std::mutex mutex;
  std::condition_variable came;
  bool signalled = false, ended = false;
};

// The updates, grouped into pushes; one in `deletionEvery` is a deletion.
std::vector<VLQueryItems> makePushes(std::size_t perPush, unsigned deletionEvery) {
  std::vector<VLQueryItemPtr> live, dead;
  for (std::size_t i = 0; i < kDistinct; ++i) {
    VLQueryItem::Properties properties;
    properties.fileObjectID = VLFileObjectID::documentWithRawID(0x9e3779b97f4a7c15 * (i + 1));
    properties.itemIdentifier = properties.fileObjectID.asString();
    live.push_back(std::make_shared<VLQueryItem>(properties));
    properties.isDead = true;
    dead.push_back(std::make_shared<VLQueryItem>(properties));
  }
  std::mt19937 random(1);
  std::vector<VLQueryItems> pushes(kUpdates / perPush);
  for (VLQueryItems& push : pushes) {
    for (std::size_t i = 0; i < perPush; ++i) {
      push.push_back((random() % deletionEvery == 0 ? dead : live)[random() % kDistinct]);
    }
  }
  return pushes;
}

struct Result {
  double perSecond = 0;
  std::size_t mostPending = 0;
};

// Pushes everything on this thread while `host` runs on another one.
Result measure(const std::vector<VLQueryItems>& pushes, Signals& signals,
               const std::function<std::size_t(const VLQueryItems&)>& push,
               const std::function<void()>& round) {
  std::thread host([&] {
    while (signals.wait()) round();
  });
  Result result;
  const auto start = std::chrono::steady_clock::now();
  for (const VLQueryItems& items : pushes) {
    result.mostPending = std::max(result.mostPending, push(items));
  }
  const std::chrono::duration<double> took = std::chrono::steady_clock::now() - start;
  signals.end();
  host.join();
  result.perSecond = static_cast<double>(pushes.size() * pushes.front().size()) / took.count();
  return result;
}

struct Batch final : NSFileProviderChangeObserver {
  void didUpdateItems(const NSFileProviderItems&) override {}
  void didDeleteItemsWithIdentifiers(const std::vector<std::string>&) override {}
  void finishEnumeratingChangesUpToSyncAnchor(NSData upTo, bool) override {
    anchor = std::move(upTo);
  }
  void finishEnumeratingWithError(NSErrorPtr) override { anchor = NSData(); }
  NSData anchor;
};

Result measureEnumerator(const std::vector<VLQueryItems>& pushes, bool asks) {
  Signals signals;
  TestEnvironment env(nullptr, &signals);
  env.log.setEnabled(LogType::Debug, false);
  const auto enumerator = VLFileEnumerator::initWithFileObjectID(
      std::nullopt, NSURL::fileURLWithPath("/store"), "root", false, env.environment);

  const auto batch = std::make_shared<Batch>();
  return measure(
      pushes, signals,
      [&](const VLQueryItems& push) {
        enumerator->receiveUpdates(push, {}, {}, [] {});
        return enumerator->pendingChangeCount();
      },
      [&] {
        if (!asks) return;
        if (batch->anchor.length() == 0) {
          enumerator->currentSyncAnchorWithCompletionHandler(
              [&](const auto& current) { batch->anchor = current.value(); });
        }
        enumerator->enumerateChangesForObserver(batch, batch->anchor);
      });
}

Result measureBaseline(const std::vector<VLQueryItems>& pushes, bool asks) {
  Signals signals;
  std::mutex mutex;
  std::unordered_map<VLFileObjectID, VLQueryItemPtr> pending;
  return measure(
      pushes, signals,
      [&](const VLQueryItems& push) {
        {
          std::lock_guard lock(mutex);
          for (const VLQueryItemPtr& item : push) {
            pending.insert_or_assign(item->fileObjectID(), item);
          }
        }
        signals.signalEnumeratorForContainerItemIdentifier("", [](const NSErrorPtr&) {});
        std::lock_guard lock(mutex);
        return pending.size();
      },
      [&] {
        if (!asks) return;
        std::unordered_map<VLFileObjectID, VLQueryItemPtr> taken;
        std::lock_guard lock(mutex);
        taken.swap(pending);
      });
}

int run() {
  const struct {
    const char* label;
    std::size_t perPush;
    unsigned deletionEvery;
    bool asks;
  } kCases[] = {
      {"1 a push, host asks when signalled", 1, 10, true},
      {"1 a push, host never asks", 1, 10, false},
      {"50 a push, host asks when signalled", 50, 10, true},
      {"50 a push, host never asks", 50, 10, false},
      {"1 a push, deletions, never asks", 1, 1, false},
  };
  bool met = true;
  std::printf("%zu updates of %zu items\n%-36s %11s %11s %6s %13s\n", kUpdates, kDistinct, "",
              "updates/s", "plain map/s", "ratio", "most pending");
  for (const auto& [label, perPush, deletionEvery, asks] : kCases) {
    const auto pushes = makePushes(perPush, deletionEvery);
    // Once to warm up.
    measureEnumerator(pushes, asks);
    const Result ours = measureEnumerator(pushes, asks);
    measureBaseline(pushes, asks);
    const Result baseline = measureBaseline(pushes, asks);
    std::printf("%-36s %11.0f %11.0f %6.2f %13zu\n", label, ours.perSecond, baseline.perSecond,
                ours.perSecond / baseline.perSecond, ours.mostPending);
    met = met && ours.perSecond >= kLeastPerSecond && ours.mostPending <= kMostPending;
  }
  std::printf("bar (at least %.0f/s, at most %zu pending): %s\n", kLeastPerSecond, kMostPending,
              met ? "met" : "MISSED");
  return met ? 0 : 1;
}

}  // namespace
}  // namespace skein

int main() { return skein::run(); }
