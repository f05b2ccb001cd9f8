// The journal equals the store at every moment; lost events, spent budgets and a missing
// folder are visible and cost nothing but time.
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <filesystem>
#include <random>

#include "tests/vald/StoreFixture.h"

namespace skein::vald {
namespace {

class StoreChanges : public StoreFixture {
 protected:
  // One random thing that people and programs do.
  void act(std::mt19937& random) {
    const auto pick = [&](std::size_t count) { return random() % count; };
    std::vector<std::string> files;
    std::vector<std::string> folders{""};
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root)) {
      const std::string path = entry.path().string().substr(root.size() + 1);
      (entry.is_directory() ? folders : files).push_back(path);
    }
    const std::string place = folders[pick(folders.size())];
    const std::string name = (place.empty() ? "" : place + '/') + "n" + std::to_string(pick(30));
    const std::string some = files.empty() ? "" : files[pick(files.size())];
    const bool isFree = !std::filesystem::exists(at(name));
    switch (some.empty() ? 0 : pick(8)) {
      case 0: write(isFree ? name : name + "x"); break;
      case 1: write(some, std::string(pick(100), 'w')); break;
      case 2:
        if (isFree) rename(some, name);
        break;
      case 3:
        write(some + ".tmp", "saved");
        rename(some + ".tmp", some);
        break;
      case 4: remove(some); break;
      case 5:
        if (isFree && folders.size() < 12) makeFolder(name);
        break;
      case 6:
        if (!place.empty() && pick(4) == 0) remove(place);
        break;
      case 7:
        if (!place.empty() && isFree && !name.starts_with(place + '/')) rename(place, name);
        break;
    }
  }
};

TEST_F(StoreChanges, ReplayingFromAnyRankEqualsTheListing) {
  std::mt19937 random(20261124);
  open();
  struct Consumer {
    Tree tree;
    std::uint64_t rank = 0;
  };
  Consumer steady;
  Consumer lazy;
  for (int round = 0; round < 25; ++round) {
    const bool isOffline = round % 6 == 5;
    if (isOffline) close();
    for (int i = 0; i < 12; ++i) act(random);
    if (isOffline) open();
    settle();
    const Tree expected = listed();
    ASSERT_TRUE(replay(steady.tree, steady.rank));
    ASSERT_EQ(steady.tree, expected) << "round " << round;
    if (round % 5 == 0) {
      ASSERT_TRUE(replay(lazy.tree, lazy.rank));
      ASSERT_EQ(lazy.tree, expected) << "round " << round;
    }
    Consumer fresh;
    ASSERT_TRUE(replay(fresh.tree, fresh.rank));
    ASSERT_EQ(fresh.tree, expected) << "round " << round;
    ASSERT_TRUE(store->check(1).empty()) << store->check(1)[0].path;
  }
}

TEST_F(StoreChanges, AnOldRankExpiresOnceAndAListingFromTheStartConverges) {
  options.journalRetention = 5;
  for (int i = 0; i < 20; ++i) write("old" + std::to_string(i));
  open();
  Tree tree;
  std::uint64_t rank = 0;
  ASSERT_TRUE(replay(tree, rank));
  for (int i = 0; i < 12; ++i) write("gone" + std::to_string(i));
  settle();
  for (int i = 0; i < 12; ++i) remove("gone" + std::to_string(i));
  settle();
  EXPECT_FALSE(replay(tree, rank));
  // The listing's own pages lie below the oldest valid rank.
  tree.clear();
  rank = 0;
  ASSERT_TRUE(replay(tree, rank, 3));
  EXPECT_EQ(tree, listed());
  EXPECT_TRUE(store->changesSince(rank + 1, 10, nullptr).expired);
  LocalDaemonStatus status;
  store->status(status);
  EXPECT_GT(status.oldestTokenRank, 0U);
  EXPECT_EQ(status.rank, rank);
}

TEST_F(StoreChanges, AKillLosesNoIdentityAndNoChange) {
  write("doc");
  open();
  const std::string doc = id("doc");
  Tree tree;
  std::uint64_t rank = 0;
  ASSERT_TRUE(replay(tree, rank));
  close();
  std::mt19937 random(7);
  for (int round = 0; round < 4; ++round) {
    const pid_t child = fork();
    if (child == 0) {
      NSErrorPtr error;
      auto victim = FolderStore::openFolder(options, listener, log, &error);
      for (int i = 0; i < 200; ++i) act(random);
      raise(SIGKILL);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFSIGNALED(status));
    random.discard(1000);
    write("doc-" + std::to_string(round));
    open();
    ASSERT_TRUE(replay(tree, rank));
    ASSERT_EQ(tree, listed()) << "round " << round;
    ASSERT_TRUE(store->check(1).empty());
    close();
  }
}

TEST_F(StoreChanges, ATreeThatIsUnpackedIsSeenWhole) {
  open();
  // Folders are filled before their watch can stand.
  for (int folder = 0; folder < 40; ++folder) {
    const std::string path = "a" + std::to_string(folder % 4) + "/b" + std::to_string(folder);
    makeFolder(path);
    for (int file = 0; file < 25; ++file) write(path + "/f" + std::to_string(file));
  }
  settle();
  EXPECT_EQ(listed().size(), 1000U + 44U);
  EXPECT_TRUE(store->check(1).empty());
  Tree told;
  for (const StoreChange& change : listener.take()) {
    told[change.item->itemIdentifier()] = change.item->filename();
  }
  EXPECT_EQ(told.size(), 1044U);
}

TEST_F(StoreChanges, LostEventsAreFoundByARescan) {
  makeFolder("f");
  write("f/doc");
  open();
  const std::string doc = id("f/doc");
  store->loseEvents(true);
  rename("f/doc", "moved");
  write("f/new");
  makeFolder("g");
  write("g/deep");
  store->loseEvents(false);
  settle();
  EXPECT_EQ(id("moved"), doc);
  EXPECT_NE(item("g/deep"), nullptr);
  EXPECT_TRUE(store->check(1).empty());
  LocalDaemonStatus status;
  store->status(status);
  EXPECT_EQ(status.overflows, 1U);
}

TEST_F(StoreChanges, BeyondTheBudgetFoldersAreSeenWhenListedOrRetained) {
  options.watchBudget = 2;
  for (const char* folder : {"a", "b", "c", "d"}) makeFolder(folder);
  open();
  LocalDaemonStatus status;
  store->status(status);
  EXPECT_EQ(status.watch, LocalDaemonStatus::Watch::Degraded);
  EXPECT_NE(status.watchReason.find("budget"), std::string::npos);
  EXPECT_EQ(status.watches, 2U);
  for (const char* folder : {"a", "b", "c", "d"}) {
    write(std::string(folder) + "/new");
    const Page page =
        store->listFolder(item(folder)->fileObjectID(), SortOrder::Name, 0, 10, nullptr);
    // Of a watched one the event may be on its way.
    if (page.items.empty()) settle();
    EXPECT_NE(item(std::string(folder) + "/new"), nullptr) << folder;
  }
  for (const char* folder : {"a", "b", "c", "d"}) {
    const VLFileObjectID retained = item(folder)->fileObjectID();
    store->retainFolderWatch(retained);
    store->status(status);
    EXPECT_EQ(status.watches, 2U);
    store->releaseFolderWatch(retained);
  }
}

TEST_F(StoreChanges, AMissingDriveFolderDeletesNothing) {
  makeFolder("f");
  write("f/doc");
  open();
  const std::string doc = id("f/doc");
  const std::uint64_t rank = store->currentRank();
  std::filesystem::rename(root, root + "-away");
  settle();
  NSErrorPtr error;
  store->listFolder(std::nullopt, SortOrder::Name, 0, 10, &error);
  ASSERT_NE(error, nullptr);
  EXPECT_NE(error->localizedDescription().find("missing"), std::string::npos);
  LocalDaemonStatus status;
  store->status(status);
  EXPECT_EQ(status.watch, LocalDaemonStatus::Watch::Degraded);
  EXPECT_EQ(status.documents, 1U);
  EXPECT_EQ(store->currentRank(), rank);
  std::filesystem::rename(root + "-away", root);
  // It is found again at the next look at the roots.
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  while (status.watch == LocalDaemonStatus::Watch::Degraded &&
         std::chrono::steady_clock::now() < deadline) {
    settle();
    store->status(status);
  }
  EXPECT_EQ(status.watch, LocalDaemonStatus::Watch::Complete);
  EXPECT_EQ(id("f/doc"), doc);
}

std::atomic<bool> isDiskFull{false};

ssize_t writeUnlessFull(int file, const void* bytes, std::size_t size, off64_t at) {
  if (!isDiskFull) return ::pwrite64(file, bytes, size, at);
  errno = ENOSPC;
  return -1;
}

TEST_F(StoreChanges, WhatTheDiskRefusesToTheIndexIsFoundAgainAndToldOnce) {
  sqlite3_vfs* const system = sqlite3_vfs_find(nullptr);
  for (const char* name : {"pwrite", "pwrite64"}) {
    ASSERT_EQ(system->xSetSystemCall(system, name,
                                     reinterpret_cast<sqlite3_syscall_ptr>(writeUnlessFull)),
              SQLITE_OK);
  }
  write("a");
  open();
  Tree tree;
  std::uint64_t rank = 0;
  ASSERT_TRUE(replay(tree, rank));
  listener.take();
  isDiskFull = true;
  write("b");
  remove("a");
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  while (!log.holds("the index could not be written") &&
         std::chrono::steady_clock::now() < deadline) {
    store->settle(std::chrono::milliseconds(100));
  }
  EXPECT_TRUE(log.holds("the index could not be written"));
  EXPECT_TRUE(listener.take().empty());
  isDiskFull = false;
  settle();
  EXPECT_EQ(item("a"), nullptr);
  EXPECT_NE(item("b"), nullptr);
  EXPECT_TRUE(store->check(1).empty());
  ASSERT_TRUE(replay(tree, rank));
  const Tree now = listed();
  EXPECT_EQ(tree, now);
  for (const StoreChange& change : listener.take()) {
    EXPECT_TRUE(change.item->isDead() || now.contains(change.item->itemIdentifier()));
  }
}

TEST_F(StoreChanges, AMoveTellsBothFolders) {
  makeFolder("from");
  makeFolder("to");
  write("from/doc");
  open();
  const auto from = item("from")->fileObjectID();
  const auto to = item("to")->fileObjectID();
  const std::string doc = id("from/doc");
  listener.take();
  rename("from/doc", "to/doc");
  settle();
  int told = 0;
  std::uint64_t rank = 0;
  for (const StoreChange& change : listener.take()) {
    EXPECT_GT(change.rank, rank);
    rank = change.rank;
    if (change.item->itemIdentifier() != doc) continue;
    ++told;
    EXPECT_EQ(change.previousFolder, from);
    EXPECT_EQ(change.folder, to);
    EXPECT_FALSE(change.item->isDead());
  }
  EXPECT_EQ(told, 1);
  EXPECT_EQ(item("from")->childItemCount(), 0U);
  EXPECT_EQ(item("to")->childItemCount(), 1U);
}

}  // namespace
}  // namespace skein::vald
