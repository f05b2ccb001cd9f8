// Shares over a real store in a temporary folder, stepped by hand, and opened again at will.
#pragma once

#include <gtest/gtest.h>
#include <sys/xattr.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <string>
#include <tuple>
#include <utility>

#include "linux/vald/shares/Shares.h"
#include "linux/vald/shares/SharingStore.h"
#include "platform/cloudkit/CKError.h"
#include "tests/support/ManualExecutor.h"
#include "tests/vald/StoreFixture.h"
#include "tests/vald/TestDaemon.h"
#include "vellum/VLErrors.h"

namespace skein::vald {

class SharesRig : public testing::Test {
 protected:
  SharesRig() {
    std::ofstream(applications.path + "/app.desktop")
        << "[Desktop Entry]\nType=Application\nName=App\nX-Skein-Containers=org.app\n";
    open();
  }
  ~SharesRig() override { close(); }

  void open() {
    containers.emplace(ContainerFolders{drive.path, data.path, {applications.path}}, log);
    StoreOptions options;
    options.databasePath = state.path + "/index.sqlite";
    options.drive.path = drive.path;
    options.containers = containers->storeRoots();
    shared.emplace();
    sharing.emplace(*shared, listener);
    NSErrorPtr error;
    folders = Store::open(options, *sharing, log, &error);
    ASSERT_TRUE(folders) << error->localizedDescription();
    store = std::make_unique<SharingStore>(*folders, *sharing, *shared);
    accounts.emplace(*store, "me", log);
    auto opened = ShareRecords::open(state.path + "/shares.sqlite");
    ASSERT_TRUE(opened) << opened.error()->localizedDescription();
    records = std::move(*opened);
    shares = std::make_shared<Shares>(
        SharesParts{executor, *store, *records, *shared, *accounts, *containers, log, drive.path,
                    [this](const std::string&, std::uint64_t document) { hinted = document; }});
    sharing->setCoverageHandler(
        [weak = std::weak_ptr(shares)](VLFileObjectID id) { weak.lock()->coverageDidChange(id); });
    ASSERT_FALSE(shares->load());
    executor->runAll();
    settle();
  }
  void close() {
    store.reset();
    folders.reset();
    shares.reset();
    records.reset();  // one connection at a time
  }
  void reopen() {
    close();
    open();
  }
  void settle() { ASSERT_TRUE(store->settle(std::chrono::seconds(20))); }

  NSURLPtr url(const std::string& name) { return NSURL::fileURLWithPath(drive.path + '/' + name); }
  void makeFolder(const std::string& name) {
    std::filesystem::create_directories(drive.path + '/' + name);
    settle();
  }
  void makeFile(const std::string& name) {
    std::ofstream(drive.path + '/' + name) << "text";
    settle();
  }
  void move(const std::string& from, const std::string& to) {
    std::filesystem::rename(drive.path + '/' + from, drive.path + '/' + to);
    settle();
    executor->runAll();
  }
  VLFileObjectID id(const std::string& name) {
    return store->itemAtPath(drive.path + '/' + name, true, nullptr)->fileObjectID();
  }
  // As a listing of the folder that it is in shows it.
  bool isShared(const std::string& name) {
    const std::filesystem::path path(name);
    std::optional<VLFileObjectID> folder;
    if (path.has_parent_path()) folder = id(path.parent_path());
    for (const auto& item : store->listFolder(folder, SortOrder::Name, 0, 100, nullptr).items) {
      if (item->filename() == path.filename()) return item->isShared();
    }
    ADD_FAILURE() << name << " is not listed";
    return false;
  }
  // The names of those that were told as changed since this was last asked, the shared ones
  // with a plus.
  std::set<std::string> told() {
    std::set<std::string> names;
    for (const StoreChange& change : listener.take()) {
      names.insert((change.item->isShared() ? "+" : "") + change.item->filename());
    }
    return names;
  }

  // Makes the call that `request(shares, reply)` makes, and runs everything.
  template <class... Values, class Request>
  std::tuple<Values...> call(Request request) {
    std::optional<std::tuple<Values...>> answer;
    request(*shares, Reply<Values...>([&answer](Values... values) {
      EXPECT_FALSE(answer) << "answered twice";
      answer.emplace(std::move(values)...);
    }));
    EXPECT_FALSE(answer) << "answered inside the call";
    executor->runAll();
    EXPECT_TRUE(answer) << "never answered";
    return answer ? std::move(*answer) : std::tuple<Values...>();
  }

  using Answer = std::pair<CKSharePtr, NSErrorPtr>;
  Answer fresh(const std::string& name) {
    auto [share, error] = call<CKSharePtr, NSErrorPtr>(
        [&](auto& to, auto reply) { to.newShare(url(name), std::move(reply)); });
    return {share, error};
  }
  Answer save(CKShare share) {
    auto [saved, error] = call<CKSharePtr, NSErrorPtr>(
        [&](auto& to, auto reply) { to.saveShare(std::move(share), std::move(reply)); });
    return {saved, error};
  }
  // Shares the item with these people, who may read.
  CKShare create(const std::string& name, const std::vector<std::string>& people = {}) {
    CKShare share = *fresh(name).first;
    for (const std::string& person : people) share.participants.push_back({person});
    const auto [saved, error] = save(share);
    EXPECT_TRUE(saved) << error->localizedDescription();
    return *saved;
  }
  NSErrorPtr destroy(const CKShare& share) {
    return std::get<0>(
        call<NSErrorPtr>([&](auto& to, auto reply) { to.destroyShare(share, std::move(reply)); }));
  }
  std::tuple<CKSharePtr, std::optional<std::string>, NSErrorPtr> copy(const std::string& name) {
    return call<CKSharePtr, std::optional<std::string>, NSErrorPtr>(
        [&](auto& to, auto reply) { to.copyShare(url(name), std::move(reply)); });
  }
  bool isShareable(VLFileObjectID item) {
    return std::get<0>(call<bool, NSErrorPtr>(
        [&](auto& to, auto reply) { to.isShareable(item, std::move(reply)); }));
  }
  NSErrorPtr attach(const std::string& name, const std::string& owner) {
    return std::get<0>(call<NSErrorPtr>([&](auto& to, auto reply) {
      to.attachZone(url(name), {"zone", owner}, CKShareParticipantPermissionReadOnly,
                    std::move(reply));
    }));
  }
  NSErrorPtr detach(const std::string& name) {
    return std::get<0>(call<NSErrorPtr>(
        [&](auto& to, auto reply) { to.detachZone(url(name), std::move(reply)); }));
  }
  // Domain and code; empty for no error.
  static std::string codeOf(const NSErrorPtr& error) {
    return error ? error->domain() + ' ' + std::to_string(error->code()) : "";
  }

  TemporaryFolder drive, state, data, applications;
  SilentLog log;
  RecordingListener listener;
  std::shared_ptr<ManualExecutor> executor = std::make_shared<ManualExecutor>();
  std::optional<Containers> containers;
  std::optional<SharedItems> shared;
  std::optional<SharingListener> sharing;
  std::unique_ptr<ShareRecords> records;
  std::unique_ptr<Store> folders;
  std::unique_ptr<SharingStore> store;
  std::optional<Accounts> accounts;
  std::shared_ptr<Shares> shares;
  std::uint64_t hinted = 0;  // the document that last got a hint
};

}  // namespace skein::vald
