// Moving between the drive and an app's container on another volume: each item stays who it is.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <iterator>
#include <map>

#include "tests/vald/DriveFixture.h"

namespace skein::vald {
namespace {

class DriveAcross : public DriveFixture {
 protected:
  void SetUp() override {
    DriveFixture::SetUp();
    std::string pattern = "/dev/shm/skein-container-XXXXXX";
    struct stat own {};
    struct stat other {};
    if (mkdtemp(pattern.data()) == nullptr) GTEST_SKIP() << "no second volume";
    container = pattern;
    ASSERT_EQ(stat(root.c_str(), &own), 0);
    ASSERT_EQ(stat(container.c_str(), &other), 0);
    if (own.st_dev == other.st_dev) GTEST_SKIP() << "no second volume";
    options.store.containers = {{container, "org.example.app", "App"}};
    write("tree/kept.txt", "kept");
    write("tree/sub/deep/one.txt", "one");
    write("tree/away.txt", "away");
    ASSERT_EQ(symlink("kept.txt", at("tree/alias").c_str()), 0);
    open();
    EXPECT_EQ(tagged("tree/kept.txt", {"Red"}), "");
    EXPECT_EQ(tagged("tree/away.txt", {"Blue"}), "");
    EXPECT_EQ(tagged("tree/sub", {"Folder"}), "");
    EXPECT_EQ(ranked("tree/sub/deep", 3), "");
    EXPECT_EQ(ranked("tree/sub/deep/one.txt", 4), "");
    EXPECT_TRUE(uploaded("tree/away.txt"));
    EXPECT_EQ(evicted("tree/away.txt"), "");
  }
  void TearDown() override {
    DriveFixture::TearDown();
    if (!container.empty()) std::filesystem::remove_all(container);
  }
  // Of everything in the tree, wherever it is, by the names in it.
  std::map<std::string, std::string> portraits(const std::string& tree) {
    std::map<std::string, std::string> all;
    for (const char* name :
         {"", "/kept.txt", "/sub", "/sub/deep", "/sub/deep/one.txt", "/away.txt"}) {
      all[name] = portrait(tree + name);
      if (const VLQueryItemPtr found = item(tree + name)) {
        const auto made = found->creationDate().value_or(NSDate()).time_since_epoch().count();
        const auto saved = found->contentModificationDate();
        all[name] += " made " + std::to_string(made);
        // The folders' own dates change with what is moved in them.
        if (saved && !found->isFolder()) {
          all[name] += " saved " + std::to_string(saved->time_since_epoch().count());
        }
      }
    }
    return all;
  }

  std::string container;
};

TEST_F(DriveAcross, EverythingInATreeStaysWhoItIs) {
  const auto before = portraits("tree");
  const std::string alias = id("tree/alias");
  const std::string there = container + "/tree";
  ASSERT_EQ(moved("tree", container), there);
  EXPECT_EQ(portraits(there), before);
  EXPECT_EQ(id(there + "/alias"), alias);
  EXPECT_EQ(item("tree"), nullptr);
  EXPECT_FALSE(exists("tree"));
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(root), {}), 0) << "nothing left over";
  EXPECT_TRUE(differences().empty());
  EXPECT_FALSE(item(there + "/away.txt")->isDownloaded());
  // The folders that it has now are the ones that are watched.
  write(there + "/sub/deep/new.txt");
  settle();
  EXPECT_EQ(listed(there + "/sub/deep"), (std::vector<std::string>{"new.txt", "one.txt"}));
  reopen();
  EXPECT_EQ(portraits(there), before);
  EXPECT_EQ(id(there + "/alias"), alias);
  EXPECT_EQ(downloaded(there + "/away.txt"), "");
  EXPECT_EQ(read(there + "/away.txt"), "away");

  // A document that is not there, alone and to another name; and out of the trash.
  ASSERT_TRUE(uploaded(there + "/away.txt"));
  ASSERT_EQ(evicted(there + "/away.txt"), "");
  const std::string away = portrait(there + "/away.txt");
  write("away.txt");
  settle();
  EXPECT_EQ(moved(there + "/away.txt", ""), "!516");
  EXPECT_EQ(moved(there + "/away.txt", "", true), "away 2.txt");
  EXPECT_EQ(portrait("away 2.txt"), away);
  const std::string inTrash = trashed("away 2.txt");
  EXPECT_EQ(moved(inTrash, container), container + "/away 2.txt");
  EXPECT_EQ(portrait(container + "/away 2.txt"), away);
  EXPECT_EQ(downloaded(container + "/away 2.txt"), "");
  EXPECT_EQ(read(container + "/away 2.txt"), "away");
  EXPECT_TRUE(differences().empty());
}

TEST_F(DriveAcross, AKillAtAnyStepLeavesEachItemWhoItIs) {
  const auto before = portraits("tree");
  const std::string there = container + "/tree";
  bool isDone = false;
  bool wasMoved = false;
  for (std::uint64_t step = 1; !isDone; ++step) {
    ASSERT_LT(step, 200U);
    SCOPED_TRACE(step);
    close();
    const pid_t child = fork();
    if (child == 0) {
      open();
      layer.crashAt(step);
      moved("tree", container);
      _exit(0);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    isDone = WEXITSTATUS(status) == 0;
    ASSERT_TRUE(isDone || WEXITSTATUS(status) == FaultyFileLayer::kCrashStatus);
    open();
    const bool isMoved = item("tree") == nullptr;
    EXPECT_EQ(portraits(isMoved ? there : "tree"), before);
    EXPECT_EQ(item(there) != nullptr, isMoved);
    wasMoved = wasMoved || isMoved;
    EXPECT_TRUE(isMoved || !isDone);
    if (isMoved) {
      ASSERT_EQ(moved(there, ""), "tree");
      ASSERT_EQ(portraits("tree"), before);
    }
    EXPECT_TRUE(differences().empty());
  }
  EXPECT_TRUE(wasMoved);
}

TEST_F(DriveAcross, WhatFailsLeavesEachItemWhoItIs) {
  const auto before = portraits("tree");
  const std::string there = container + "/tree";
  bool isMoved = false;
  for (std::uint64_t step = 1; !isMoved; ++step) {
    ASSERT_LT(step, 200U);
    SCOPED_TRACE(step);
    layer.failAt(step, EIO);
    const std::string answer = moved("tree", container);
    layer.failAt(0, 0);
    isMoved = answer == there;
    EXPECT_EQ(portraits(isMoved ? there : "tree"), before);
    settle();
    EXPECT_EQ(portraits(isMoved ? there : "tree"), before);
  }
  EXPECT_TRUE(differences().empty());
}

}  // namespace
}  // namespace skein::vald
