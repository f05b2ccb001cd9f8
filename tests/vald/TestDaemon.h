// A daemon over a fake store, stepped by hand, and what tests see of it.
#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "linux/vald/Daemon.h"
#include "linux/vald/shares/Shares.h"
#include "tests/protocol/FakeCloud.h"
#include "tests/protocol/FakeFiles.h"
#include "tests/support/ManualExecutor.h"
#include "tests/vald/FakeStore.h"

namespace skein::vald {

// A folder of the test's own, removed with it.
class TemporaryFolder {
 public:
  TemporaryFolder() {
    std::string name = testing::TempDir() + "skein-XXXXXX";
    path = mkdtemp(name.data());
  }
  ~TemporaryFolder() { std::filesystem::remove_all(path); }
  std::string path;
};

class QuietLog final : public Log {
 public:
  void write(LogType type, std::string_view line) override {
    if (type == LogType::Error) errors.emplace_back(line);
  }
  std::vector<std::string> errors;
};

// Keeps what was pushed, and the replies until the test gives them.
class Receiver final : public VLItemNotificationReceiving {
 public:
  void receiveUpdates(const VLQueryItems& items, const std::vector<std::string>&,
                      const std::vector<std::string>&, Reply<> reply) override {
    pushes.push_back(items);
    replies.push_back(std::move(reply));
  }
  void receiveProgressUpdates(const VLQueryItems&, Reply<>) override {}

  void reply() { std::exchange(replies.back(), nullptr)(); }
  // What was pushed since the last question: identifiers, a dead item's behind a dash.
  std::vector<std::string> seen() {
    std::vector<std::string> names;
    for (const auto& push : std::exchange(pushes, {})) {
      for (const auto& item : push) {
        names.push_back((item->isDead() ? "-" : "") + item->fileObjectID().asString());
      }
    }
    return names;
  }

  std::vector<VLQueryItems> pushes;
  std::vector<Reply<>> replies;
};

// A cloud that has nothing and is not asked.
class NoRecords final : public LocalRecords {
 public:
  void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>&,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr>) override {}
  std::shared_ptr<NSProgress> fetchRecords(RecordQuery, RecordsReply) override { return nullptr; }
};

// The daemon's calls may wait for the store, which answers at once here.
class DaemonExecutor final : public Executor {
 public:
  explicit DaemonExecutor(std::shared_ptr<Executor> executor) : _executor(std::move(executor)) {}
  void post(Task task) override { _executor->post(std::move(task)); }
  void beginWait() override {}
  void endWait() override {}

 private:
  const std::shared_ptr<Executor> _executor;
};

class TestDaemon {
 public:
  explicit TestDaemon(SenderLimits limits = {}, FakeStore::Settings settings = {})
      : settings(std::move(settings)), senders(executor, limits) {
    open();
  }

  // Makes everything anew over what was kept.
  void open() {
    daemon.reset();
    store.emplace(drive.path, senders, settings);
    accounts.emplace(*store, "somebody", log);
    containers.emplace(ContainerFolders{drive.path, state.path, {applications.path}}, log);
    shares.reset();
    shareRecords.reset();  // one connection at a time
    shareRecords = std::move(*ShareRecords::open(state.path + "/shares.sqlite"));
    shares = std::make_shared<Shares>(SharesParts{executor, *store, *shareRecords, sharedItems,
                                                  *accounts, *containers, log, drive.path});
    daemon = std::make_shared<Daemon>(DaemonParts{std::make_shared<DaemonExecutor>(executor),
                                                  executor, *store, senders, *accounts, *containers,
                                                  subscribers, files, records, *shares, cloud,
                                                  faults, log, drive.path, [this] { ++stops; }});
  }

  // Makes the call that `request(daemon, reply)` makes, and runs everything; the test
  // fails unless the reply comes once, and not inside the call.
  template <class... Values, class Request>
  std::tuple<Values...> call(Request request) {
    std::optional<std::tuple<Values...>> answer;
    request(*daemon, Reply<Values...>([&answer](Values... values) {
      EXPECT_FALSE(answer) << "answered twice";
      answer.emplace(std::move(values)...);
    }));
    EXPECT_FALSE(answer) << "answered inside the call";
    executor->runAll();
    EXPECT_TRUE(answer) << "never answered";
    return answer ? std::move(*answer) : std::tuple<Values...>();
  }

  TemporaryFolder drive, state, applications;
  QuietLog log;
  std::shared_ptr<ManualExecutor> executor = std::make_shared<ManualExecutor>();
  FakeStore::Settings settings;
  ItemUpdateSenders senders;
  EventSubscribers subscribers{executor};
  FakeFiles files;
  FakeCloud cloud;
  FaultInjector faults{true};
  NoRecords records;
  std::optional<FakeStore> store;
  std::optional<Accounts> accounts;
  std::optional<Containers> containers;
  SharedItems sharedItems;
  std::unique_ptr<ShareRecords> shareRecords;
  std::shared_ptr<Shares> shares;
  std::shared_ptr<Daemon> daemon;
  int stops = 0;
};

}  // namespace skein::vald
