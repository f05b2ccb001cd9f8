// What is done to documents, through a whole drive: nothing that a person gave a document is
// lost on any way, and every answer is what the store says from then on.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <tuple>

#include "linux/protocol/DocumentURL.h"
#include "tests/vald/DriveFixture.h"
#include "tests/vald_cloud/DiskWaits.h"

namespace skein::vald {
namespace {

class DriveTest : public DriveFixture {
 protected:
  // A document that has all that must survive. Its portrait.
  std::string makePrecious(const std::string& path) {
    write(path);
    settle();
    EXPECT_EQ(tagged(path, {"Red", "Tax 2024"}), "");
    EXPECT_EQ(ranked(path, 7), "");
    EXPECT_EQ(used(path, NSDate(std::chrono::seconds(1'700'000'000))), "");
    std::string all = portrait(path);
    EXPECT_NE(all.find("Red,Tax 2024 7 1700000000"), std::string::npos) << all;
    return all;
  }
};

TEST_F(DriveTest, EverySafeSaveKeepsIdentityTagsRankAndDate) {
  using Step = std::function<void()>;
  const auto old = [&] { return at("doc.txt"); };
  const std::vector<std::vector<Step>> saves = {
      // In place.
      {[&] { write("doc.txt", "newer"); }},
      // Through a temporary file.
      {[&] { write("doc.txt.tmp", "newer"); }, [&] { rename("doc.txt.tmp", "doc.txt"); }},
      // With a backup.
      {[&] { rename("doc.txt", "doc.txt~"); }, [&] { write("doc.txt", "newer"); },
       [&] { ::unlink((old() + "~").c_str()); }},
      // By exchange.
      {[&] { write("new.tmp", "newer"); },
       [&] {
         ASSERT_EQ(
             renameat2(AT_FDCWD, at("new.tmp").c_str(), AT_FDCWD, old().c_str(), RENAME_EXCHANGE),
             0);
       },
       [&] { ::unlink(at("new.tmp").c_str()); }},
      // Deleted and made again.
      {[&] { ::unlink(old().c_str()); }, [&] { write("doc.txt", "newer"); }},
      // Through a hard link.
      {[&] { write("t.tmp", "newer"); }, [&] { ::unlink(old().c_str()); },
       [&] { ASSERT_EQ(::link(at("t.tmp").c_str(), old().c_str()), 0); },
       [&] { ::unlink(at("t.tmp").c_str()); }},
  };
  open();
  for (std::size_t number = 0; number < saves.size(); ++number) {
    for (const bool isSeenStepByStep : {true, false}) {
      const std::string before = makePrecious("doc.txt");
      for (const Step& step : saves[number]) {
        step();
        if (isSeenStepByStep) settle();
      }
      settle();
      EXPECT_EQ(portrait("doc.txt"), before) << "save " << number;
      EXPECT_EQ(read("doc.txt"), "newer");
      EXPECT_EQ(listed(), std::vector<std::string>{"doc.txt"}) << "save " << number;
      reopen();
      EXPECT_EQ(portrait("doc.txt"), before) << "save " << number << ", after a restart";
      EXPECT_EQ(removed("doc.txt"), "");
    }
  }
  EXPECT_TRUE(differences().empty());
}

TEST_F(DriveTest, TagsFollowTheFileWhoeverSetsThem) {
  write("folder/doc.txt");
  open();
  ASSERT_EQ(setxattr(at("folder/doc.txt").c_str(), kTagsAttribute, "Blue,Two", 8, 0), 0);
  settle();
  EXPECT_EQ(tags("folder/doc.txt"), (std::vector<std::string>{"Blue", "Two"}));
  EXPECT_EQ(tagged("folder", {"Two"}), "");
  EXPECT_EQ(tags("folder"), std::vector<std::string>{"Two"});
  const auto usedAfter = [&](const std::string& after) {
    return std::get<0>(ask<std::vector<TagUse>, NSErrorPtr>(
        [&](LocalFiles& files, auto reply) { files.tagsInUse(after, std::move(reply)); }));
  };
  const auto use = usedAfter("");
  ASSERT_EQ(use.size(), 2U);
  EXPECT_EQ(usedAfter("Blue").front().name, "Two");
  EXPECT_TRUE(usedAfter("Two").empty());
  EXPECT_EQ(use[1].name, "Two");
  EXPECT_EQ(use[1].items, 2U);
  // Taken away by another program, and while vald is down.
  ASSERT_EQ(removexattr(at("folder/doc.txt").c_str(), kTagsAttribute), 0);
  settle();
  EXPECT_TRUE(tags("folder/doc.txt").empty());
  close();
  ASSERT_EQ(setxattr(at("folder/doc.txt").c_str(), kTagsAttribute, "Away", 4, 0), 0);
  open();
  EXPECT_EQ(tags("folder/doc.txt"), std::vector<std::string>{"Away"});
  // What it has already is not written.
  ASSERT_EQ(tagged("folder/doc.txt", {"Here"}), "");
  struct stat first {};
  ASSERT_EQ(stat(at("folder/doc.txt").c_str(), &first), 0);
  EXPECT_EQ(tagged("folder/doc.txt", {"Here"}), "");
  struct stat second {};
  ASSERT_EQ(stat(at("folder/doc.txt").c_str(), &second), 0);
  EXPECT_EQ(std::tie(first.st_ctim.tv_sec, first.st_ctim.tv_nsec),
            std::tie(second.st_ctim.tv_sec, second.st_ctim.tv_nsec));
  EXPECT_EQ(tags("folder/doc.txt"), std::vector<std::string>{"Here"});
  // A link has no attributes: the index keeps its tags.
  EXPECT_EQ(path([&](LocalFiles& files, auto reply) {
              files.makeAlias(url(""), "alias", at("folder"), "test", std::move(reply));
            }),
            "alias");
  EXPECT_EQ(tagged("alias", {"Link"}), "");
  EXPECT_EQ(renamed("alias", "alias 2"), "alias 2");
  reopen();
  EXPECT_EQ(tags("alias 2"), std::vector<std::string>{"Link"});
  EXPECT_EQ(tagged("folder/doc.txt", {"a,b"}), "!514");
  EXPECT_EQ(tagged("nothing", {"a"}), "!4");
}

TEST_F(DriveTest, AFirstScanFindsTagsAndNumbersLater) {
  open();
  const std::string before = makePrecious("doc.txt");
  // What the index alone knows is on the disk when it is answered.
  for (const std::int64_t rank : {8, 7}) {
    const std::uint64_t waits = diskWaits();
    EXPECT_EQ(ranked("doc.txt", rank), "");
    EXPECT_NE(diskWaits(), waits);
  }
  const std::string copied = id("doc.txt");
  close();
  // The index is lost; the file has kept its tags and its number.
  for (const char* part : {"", "-wal", "-shm"}) {
    std::filesystem::remove(options.store.databasePath + part);
  }
  open();
  EXPECT_TRUE(eventually([&] { return id("doc.txt") == copied && !tags("doc.txt").empty(); }));
  // A copy is another document.
  std::filesystem::copy_file(at("doc.txt"), at("copy.txt"));
  char hint[128];
  const ssize_t size = getxattr(at("doc.txt").c_str(), "user.skein.document", hint, sizeof hint);
  ASSERT_GT(size, 0);
  ASSERT_EQ(setxattr(at("copy.txt").c_str(), "user.skein.document", hint,
                     static_cast<std::size_t>(size), 0),
            0);
  settle();
  EXPECT_NE(id("copy.txt"), copied);
  EXPECT_EQ(id("doc.txt"), copied);

  // Also when the index is lost then, whichever is read first; and a copy that is all there is
  // left is the document.
  rename("copy.txt", "a copy.txt");
  const auto loseIndex = [&] {
    for (const char* part : {"", "-wal", "-shm"}) {
      std::filesystem::remove(options.store.databasePath + part);
    }
  };
  close();
  loseIndex();
  open();
  EXPECT_TRUE(eventually([&] { return !drive->store().isReadingAttributes(); }));
  EXPECT_EQ(id("doc.txt"), copied);
  EXPECT_NE(id("a copy.txt"), copied);
  close();
  loseIndex();
  std::filesystem::remove(at("doc.txt"));
  open();
  EXPECT_TRUE(eventually([&] { return id("a copy.txt") == copied; }));
}

TEST_F(DriveTest, AnEvictedDocumentIsTheSameOneOnAllItsWays) {
  write("other/kept.txt");
  open();
  const std::string before = makePrecious("doc.txt");
  ASSERT_TRUE(uploaded("doc.txt"));
  const VLQueryItemPtr present = item("doc.txt");
  ASSERT_EQ(evicted("doc.txt"), "");
  EXPECT_FALSE(exists("doc.txt"));
  EXPECT_TRUE(exists(".doc.txt.skein"));

  const VLQueryItemPtr away = item("doc.txt");
  ASSERT_NE(away, nullptr);
  EXPECT_FALSE(away->isDownloaded());
  EXPECT_TRUE(away->isUploaded());
  VLQueryItem::Properties expected = present->properties();
  expected.isDownloaded = false;
  EXPECT_EQ(away->properties(), expected);
  EXPECT_EQ(listed(), (std::vector<std::string>{"doc.txt", "other"}));

  // Its name is taken.
  EXPECT_EQ(path([&](LocalFiles& files, auto reply) {
              files.createFolder(url(""), "doc.txt", "test", std::move(reply));
            }),
            "!516");
  EXPECT_EQ(moved("other/kept.txt", ""), "kept.txt");
  EXPECT_EQ(renamed("kept.txt", "doc.txt"), "!516");
  EXPECT_EQ(renamed("doc.txt", "kept.txt"), "!516");

  EXPECT_EQ(renamed("doc.txt", "renamed.txt"), "renamed.txt");
  EXPECT_EQ(portrait("renamed.txt"), before);
  EXPECT_EQ(moved("renamed.txt", "other"), "other/renamed.txt");
  EXPECT_EQ(portrait("other/renamed.txt"), before);
  // By another program, live and while vald is down.
  rename("other/.renamed.txt.skein", "other/.again.txt.skein");
  settle();
  EXPECT_EQ(portrait("other/again.txt"), before);
  close();
  rename("other/.again.txt.skein", ".doc.txt.skein");
  open();
  EXPECT_EQ(portrait("doc.txt"), before);

  EXPECT_EQ(trashed("doc.txt"), ".Trash-" + std::to_string(geteuid()) + "/files/doc.txt");
  EXPECT_EQ(item("doc.txt"), nullptr);
  const std::string inTrash = ".Trash-" + std::to_string(geteuid()) + "/files/doc.txt";
  EXPECT_EQ(portrait(inTrash), before);
  EXPECT_TRUE(item(inTrash)->isTrashed());
  EXPECT_EQ(path([&](LocalFiles& files, auto reply) {
              files.putBackURL(url(inTrash), std::move(reply));
            }),
            "doc.txt");
  EXPECT_EQ(moved(inTrash, ""), "doc.txt");
  EXPECT_EQ(portrait("doc.txt"), before);
  EXPECT_EQ(tagged("doc.txt", {"Green"}), "");
  EXPECT_EQ(tags("doc.txt"), std::vector<std::string>{"Green"});
  EXPECT_TRUE(differences().empty());

  EXPECT_EQ(downloaded("doc.txt"), "");
  EXPECT_EQ(read("doc.txt"), "contents");
  EXPECT_EQ(item("doc.txt")->itemIdentifier(), present->itemIdentifier());
  EXPECT_EQ(item("doc.txt")->contentModificationDate(), present->contentModificationDate());
  EXPECT_EQ(item("doc.txt")->creationDate(), present->creationDate());
  EXPECT_TRUE(item("doc.txt")->isDownloaded());
  EXPECT_TRUE(item("doc.txt")->isUploaded());
  EXPECT_EQ(tags("doc.txt"), std::vector<std::string>{"Green"});
  EXPECT_EQ(evicted("other"),
            "!" + std::to_string(static_cast<int>(EvictionRefusal::NotADocument)));
  ASSERT_TRUE(uploaded("doc.txt"));
  ASSERT_EQ(evicted("doc.txt"), "");
  EXPECT_EQ(removed("doc.txt"), "");
  EXPECT_FALSE(exists(".doc.txt.skein"));
  EXPECT_EQ(item("doc.txt"), nullptr);
  EXPECT_TRUE(differences().empty());
}

TEST_F(DriveTest, AKillAtAnyStepLeavesAnEvictedDocumentWholeAtOneOfItsPlaces) {
  std::filesystem::create_directory(at("folder"));
  open();
  std::string before = makePrecious("doc.txt");
  ASSERT_TRUE(uploaded("doc.txt"));
  ASSERT_EQ(evicted("doc.txt"), "");
  const std::string inTrash = ".Trash-" + std::to_string(geteuid()) + "/files/doc.txt";

  // Makes the request `go` on `from` with a kill at each of its steps. By then the document
  // is as it was, or at `to` (nowhere when that is empty), with the portrait `after`. Then
  // `back` undoes it.
  struct Way {
    std::string from, to, after;
    std::function<void()> go, back;
  };
  const auto kill = [&](const Way& way) {
    bool isDone = false;
    for (std::uint64_t step = 1; !isDone; ++step) {
      ASSERT_LT(step, 100U);
      SCOPED_TRACE(way.from + " to " + way.to + ", step " + std::to_string(step));
      close();
      const pid_t child = fork();
      if (child == 0) {
        open();
        layer.crashAt(step);
        way.go();
        _exit(0);
      }
      int status = 0;
      ASSERT_EQ(waitpid(child, &status, 0), child);
      ASSERT_TRUE(WIFEXITED(status));
      isDone = WEXITSTATUS(status) == 0;
      ASSERT_TRUE(isDone || WEXITSTATUS(status) == FaultyFileLayer::kCrashStatus);
      open();
      EXPECT_TRUE(differences().empty());
      if (way.from == way.to) {
        const std::string now = portrait(way.from);
        EXPECT_TRUE(now == way.after || (!isDone && now == before)) << now;
        way.back();
        continue;
      }
      const bool isBefore = item(way.from) != nullptr;
      EXPECT_FALSE(isDone && isBefore);
      if (!way.to.empty()) {
        EXPECT_EQ(portrait(way.to), isBefore ? "none" : way.after);
      }
      if (!isBefore) way.back();
      ASSERT_EQ(portrait(way.from), before);
    }
  };

  kill({"doc.txt", "new.txt", before, [&] { renamed("doc.txt", "new.txt"); },
        [&] { renamed("new.txt", "doc.txt"); }});
  kill({"doc.txt", "folder/doc.txt", before, [&] { moved("doc.txt", "folder"); },
        [&] { moved("folder/doc.txt", ""); }});
  kill({"doc.txt", inTrash, before, [&] { trashed("doc.txt"); }, [&] { moved(inTrash, ""); }});
  trashed("doc.txt");
  kill({inTrash, "doc.txt", before, [&] { moved(inTrash, ""); }, [&] { trashed("doc.txt"); }});
  ASSERT_EQ(moved(inTrash, ""), "doc.txt");
  std::string blue = before;
  blue.replace(blue.find("Red,Tax 2024"), 12, "Blue");
  kill({"doc.txt", "doc.txt", blue, [&] { tagged("doc.txt", {"Blue"}); },
        [&] {
          tagged("doc.txt", {"Red", "Tax 2024"});
        }});
  const auto evict = [&] {
    if (item("doc.txt")->isDownloaded()) {
      EXPECT_TRUE(uploaded("doc.txt"));
      EXPECT_EQ(evicted("doc.txt"), "");
    }
  };
  kill({"doc.txt", "doc.txt", before, [&] { downloaded("doc.txt"); }, evict});
  const auto download = [&] {
    EXPECT_EQ(downloaded("doc.txt"), "");
    EXPECT_EQ(read("doc.txt"), "contents");
    EXPECT_TRUE(uploaded("doc.txt"));
  };
  download();
  kill({"doc.txt", "doc.txt", before, [&] { evicted("doc.txt"); }, download});
  evict();
  kill({"doc.txt",
        "",
        {},
        [&] { removed("doc.txt"); },
        [&] {
          EXPECT_TRUE(listed() == std::vector<std::string>{"folder"});
          before = makePrecious("doc.txt");
          EXPECT_TRUE(uploaded("doc.txt"));
          EXPECT_EQ(evicted("doc.txt"), "");
        }});
  download();
}

TEST_F(DriveTest, WhatTheDiskRefusesIsTakenBackWhereverItFails) {
  options.cloud.policy.uploads = LocalCloudStatus::Uploads::Off;
  std::filesystem::create_directory(at("folder"));
  open();
  const std::string before = makePrecious("doc.txt");
  struct Change {
    std::string to;
    std::function<std::string()> go, back;
  };
  const Change changes[] = {
      {"new.txt", [&] { return renamed("doc.txt", "new.txt"); },
       [&] { return renamed("new.txt", "doc.txt"); }},
      {"folder/doc.txt", [&] { return moved("doc.txt", "folder"); },
       [&] { return moved("folder/doc.txt", ""); }},
      {"doc.txt", [&] { return tagged("doc.txt", {"Blue"}) + "doc.txt"; },
       [&] {
         return tagged("doc.txt", {"Red", "Tax 2024"}) + "doc.txt";
       }},
  };
  for (const Change& change : changes) {
    bool isMet = true;
    for (std::uint64_t step = 1; isMet; ++step) {
      ASSERT_LT(step, 100U);
      SCOPED_TRACE(change.to + ", step " + std::to_string(step));
      layer.failAt(step, EIO);
      const std::string answer = change.go();
      isMet = layer.met();
      layer.failAt(0, 0);
      // The store knows where it is when the answer comes, either way.
      const bool isRefused = answer.starts_with('!');
      EXPECT_TRUE(isRefused || answer == change.to) << answer;
      if (change.to != "doc.txt") {
        EXPECT_EQ(portrait(isRefused ? "doc.txt" : change.to), before);
        EXPECT_EQ(item(isRefused ? change.to : "doc.txt"), nullptr);
      }
      settle();
      EXPECT_TRUE(differences().empty());
      if (!isRefused || change.to == "doc.txt") {
        ASSERT_EQ(change.back(), "doc.txt");
      }
      EXPECT_EQ(portrait("doc.txt"), before);
    }
  }
}

// Named by its item, also when it was replaced so lately that nobody knows yet.
TEST_F(DriveTest, WhatIsDoneToADocumentIsDoneToThatOneAndNoOther) {
  open();
  const auto of = [&](const std::string& path, const VLFileObjectID& id) {
    return documentURL(at(path), id);
  };
  using Request = std::function<std::string(const NSURLPtr&)>;
  const auto answered = [this](auto request) {
    return Request([this, request](const NSURLPtr& url) {
      return outcome([&](LocalFiles& files, auto reply) { request(files, url, std::move(reply)); });
    });
  };
  const auto placed = [this](auto request) {
    return Request([this, request](const NSURLPtr& url) {
      return path([&](LocalFiles& files, auto reply) { request(files, url, std::move(reply)); });
    });
  };
  const std::vector<Request> requests = {
      answered(
          [](auto& files, auto& url, auto reply) { files.remove(url, "t", std::move(reply)); }),
      placed([](auto& files, auto& url, auto reply) { files.trash(url, "t", std::move(reply)); }),
      placed([](auto& files, auto& url, auto reply) {
        files.coordinateDeletion(url, std::move(reply));
      }),
      placed([](auto& files, auto& url, auto reply) {
        files.rename(url, "z", "t", std::move(reply));
      }),
      placed([this](auto& files, auto& url, auto reply) {
        files.move(url, this->url("folder"), std::nullopt, true, "t", std::move(reply));
      }),
      answered([](auto& files, auto& url, auto reply) {
        files.setTagNames(url, {"t"}, std::move(reply));
      }),
      answered([](auto& files, auto& url, auto reply) {
        files.setFavoriteRank(url, 3, std::move(reply));
      }),
      answered(
          [](auto& files, auto& url, auto reply) { files.setPinned(url, true, std::move(reply)); }),
      answered([](auto& files, auto& url, auto reply) { files.evict(url, std::move(reply)); }),
      answered(
          [](auto& files, auto& url, auto reply) { files.download(url, false, std::move(reply)); }),
  };
  std::filesystem::create_directory(at("folder"));
  for (std::size_t i = 0; i < requests.size(); ++i) {
    write("a", "meant");
    write("c", "other");
    settle();
    const VLFileObjectID meant = item("a")->fileObjectID();
    const VLFileObjectID other = item("c")->fileObjectID();
    rename("a", "b");
    rename("c", "a");
    EXPECT_EQ(requests[i](of("a", meant)), "!4") << i;
    EXPECT_EQ(read("a"), "other") << i;
    EXPECT_EQ(read("b"), "meant") << i;
    // It is known by now where each is.
    EXPECT_EQ(id("b"), meant.asString()) << i;
    EXPECT_EQ(id("a"), other.asString()) << i;
    EXPECT_TRUE(tags("a").empty());
    EXPECT_EQ(answered([](auto& files, auto& url, auto reply) {
                files.remove(url, "t", std::move(reply));
              })(of("b", meant)),
              "");
    EXPECT_FALSE(exists("b"));
    EXPECT_EQ(removed("a"), "");
  }

  // One that was saved is the same document, and not another.
  write("doc");
  settle();
  const VLFileObjectID doc = item("doc")->fileObjectID();
  write("doc.tmp", "saved");
  rename("doc.tmp", "doc");
  EXPECT_EQ(placed([](auto& files, auto& url, auto reply) {
              files.rename(url, "new", "t", std::move(reply));
            })(of("doc", doc)),
            "new");
  EXPECT_EQ(id("new"), doc.asString());
  EXPECT_EQ(read("new"), "saved");
}

TEST_F(DriveTest, WhatIsTrashedKeepsItsIdentifierWhoeverTrashesIt) {
  const std::string trash = ".Trash-" + std::to_string(geteuid());
  open();
  const std::string before = makePrecious("folder/doc.txt");
  const VLFileObjectID folder = item("folder")->fileObjectID();
  const std::string inFolder = id("folder/doc.txt");
  // As another tool does it, which makes the trash for it.
  std::filesystem::create_directories(at(trash + "/files"));
  std::filesystem::create_directories(at(trash + "/info"));
  write(trash + "/info/doc.txt.trashinfo",
        "[Trash Info]\nPath=folder/doc.txt\nDeletionDate=2024-03-01T10:00:00\n");
  rename("folder/doc.txt", trash + "/files/doc.txt");
  settle();
  EXPECT_EQ(portrait(trash + "/files/doc.txt"), before);
  const VLQueryItemPtr known =
      drive->store().itemWithID(item(trash + "/files/doc.txt")->fileObjectID(), nullptr);
  ASSERT_NE(known, nullptr);
  EXPECT_TRUE(known->isTrashed());
  EXPECT_NE(drive->store().itemWithID(
                *VLFileObjectID::fileObjectIDWithString(known->parentItemIdentifier()), nullptr),
            nullptr);
  EXPECT_TRUE(listed("folder").empty());
  EXPECT_EQ(listed(), std::vector<std::string>{"folder"});

  EXPECT_EQ(trashed("folder"), trash + "/files/folder");
  EXPECT_EQ(drive->store().pathForID(folder, nullptr), at(trash + "/files/folder"));
  EXPECT_TRUE(drive->store().listAllFolders(SortOrder::Name, 0, 10, nullptr).items.empty());
  const auto [items, next, error] = ask<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr>(
      [](LocalFiles& files, auto reply) { files.trashedItems(0, 1, std::move(reply)); });
  ASSERT_EQ(items.size(), 1U);
  EXPECT_EQ(items[0].url->path(), at(trash + "/files/folder"));
  EXPECT_EQ(items[0].putBackURL->path(), at("folder"));
  EXPECT_TRUE(items[0].trashed);
  // The next page is of the same moment, whatever is trashed or goes meanwhile.
  write("later.txt");
  settle();
  EXPECT_EQ(trashed("later.txt"), trash + "/files/later.txt");
  const auto page = [this](std::uint64_t from, std::uint64_t limit) {
    return ask<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr>(
        [=](LocalFiles& f, auto reply) { f.trashedItems(from, limit, std::move(reply)); });
  };
  const auto [others, end, none] = page(next, 10);
  ASSERT_EQ(others.size(), 1U);
  EXPECT_EQ(others[0].url->path(), at(trash + "/files/doc.txt"));
  EXPECT_EQ(end, 0U);
  EXPECT_EQ(std::get<0>(page(0, 10)).size(), 3U);
  const std::uint64_t again = std::get<1>(page(0, 1));
  EXPECT_EQ(removed(trash + "/files/later.txt"), "");
  EXPECT_EQ(std::get<0>(page(again, 10)).size(), 2U);

  // Put back by either.
  EXPECT_EQ(moved(trash + "/files/folder", ""), "folder");
  rename(trash + "/files/doc.txt", "folder/doc.txt");
  settle();
  EXPECT_EQ(portrait("folder/doc.txt"), before);
  EXPECT_FALSE(item("folder/doc.txt")->isTrashed());
  // Emptying is a deletion.
  EXPECT_EQ(trashed("folder"), trash + "/files/folder");
  std::filesystem::remove_all(at(trash));
  EXPECT_TRUE(eventually([&] { return !drive->store().itemWithID(folder, nullptr); }));
  EXPECT_TRUE(differences().empty());
  const auto history = std::get<0>(ask<std::vector<FileHistoryEntry>, NSErrorPtr>(
      [&](LocalFiles& files, auto r) { files.history(at("folder"), {}, 10, std::move(r)); }));
  ASSERT_FALSE(history.empty());
  EXPECT_EQ(history[0].operation, "trash");
  EXPECT_EQ(history[0].origin, "test");
  EXPECT_EQ(history[0].identifier, folder.asString());
}

TEST_F(DriveTest, AnOlderVersionDoesNotComeBackWhenTheNewerFileLeaves) {
  std::filesystem::create_directory(at("folder"));
  open();
  const std::function<std::string()> ways[] = {
      [&] { return renamed("doc.txt", "other.txt"); }, [&] { return moved("doc.txt", "folder"); },
      [&] { return trashed("doc.txt"); }, [&] { return removed("doc.txt"); }};
  for (const auto& leave : ways) {
    write("doc.txt", "old");
    settle();
    ASSERT_TRUE(uploaded("doc.txt"));
    const std::string before = id("doc.txt");
    ASSERT_EQ(evicted("doc.txt"), "");
    write("doc.txt", "a newer version by another program");
    settle();
    ASSERT_TRUE(eventually([&] { return id("doc.txt") == before && exists("doc.txt"); }));
    const std::string answer = leave();
    EXPECT_FALSE(answer.starts_with('!')) << answer;
    settle();
    EXPECT_FALSE(exists(".doc.txt.skein")) << answer;
    EXPECT_FALSE(item("doc.txt")) << answer;
    // It may have been another document's: what was evicted is still there.
    ASSERT_TRUE(eventually([&] { return item("doc 2.txt") != nullptr; })) << answer;
    EXPECT_NE(id("doc 2.txt"), before);
    EXPECT_EQ(downloaded("doc 2.txt"), "");
    EXPECT_EQ(read("doc 2.txt"), "old");
    EXPECT_EQ(removed("doc 2.txt"), "");
  }
}

TEST_F(DriveTest, HistoryTellsRequestsFromRemovalsByOthers) {
  write("mine.txt");
  write("theirs.txt");
  open();
  const std::string theirs = id("theirs.txt");
  EXPECT_EQ(removed("mine.txt"), "");
  ::unlink(at("theirs.txt").c_str());
  settle();
  const auto historyOf = [&](const std::string& name) {
    return std::get<0>(ask<std::vector<FileHistoryEntry>, NSErrorPtr>(
        [&](LocalFiles& files, auto reply) { files.history(at(name), {}, 10, std::move(reply)); }));
  };
  const auto mine = historyOf("mine.txt");
  ASSERT_EQ(mine.size(), 1U);
  EXPECT_EQ(mine[0].operation, "remove");
  EXPECT_EQ(mine[0].origin, "test");
  const auto other = historyOf("theirs.txt");
  ASSERT_EQ(other.size(), 1U);
  EXPECT_EQ(other[0].origin, "another program");
  EXPECT_EQ(other[0].identifier, theirs);
}

TEST_F(DriveTest, WhatIsNotSafelyUploadedIsNotEvicted) {
  const auto code = [](EvictionRefusal why) {
    return "!" + std::to_string(static_cast<std::int64_t>(why));
  };
  options.cloud.policy = {LocalCloudStatus::Uploads::Bounded, 100};
  write("big.bin", std::string(200, 'x'));
  write("small.txt");
  open();
  ASSERT_TRUE(uploaded("small.txt"));
  // Only where copies take room is there a bound.
  const auto status = [&] {
    auto answer = std::make_shared<std::promise<LocalCloudStatus>>();
    auto future = answer->get_future();
    drive->cloud().cloudStatus(
        [answer](LocalCloudStatus now, NSErrorPtr) { answer->set_value(std::move(now)); });
    return future.get();
  };
  if (!status().sharesBlocks) {
    EXPECT_TRUE(eventually([&] { return status().leftOut == 1; }));
    const auto error = std::get<0>(ask<NSErrorPtr>(
        [&](LocalFiles& files, auto reply) { files.evict(url("big.bin"), std::move(reply)); }));
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->code(), static_cast<std::int64_t>(EvictionRefusal::NotUploaded));
    EXPECT_NE(error->localizedDescription().find("SKEIN_UPLOADS"), std::string::npos);
  }
  EXPECT_EQ(outcome([&](LocalFiles& files, auto reply) {
              files.setPinned(url("small.txt"), true, std::move(reply));
            }),
            "");
  EXPECT_EQ(evicted("small.txt"), code(EvictionRefusal::Pinned));
  EXPECT_EQ(outcome([&](LocalFiles& files, auto reply) {
              files.setPinned(url("small.txt"), false, std::move(reply));
            }),
            "");
  EXPECT_EQ(evicted("small.txt"), "");
  EXPECT_EQ(evicted("small.txt"), code(EvictionRefusal::AlreadyEvicted));

  // The cloud is away; a cancelled download leaves nothing.
  LocalCloudConditions conditions;
  conditions.offline = true;
  drive->cloud().setConditions(conditions, [](NSErrorPtr error) { EXPECT_FALSE(error); });
  EXPECT_TRUE(eventually([&] { return drive->cloud().conditions().settings().offline; }));
  EXPECT_NE(downloaded("small.txt"), "");
  conditions = {};
  conditions.delayMilliseconds = 60'000;
  drive->cloud().setConditions(conditions, [](NSErrorPtr) {});
  EXPECT_TRUE(eventually([&] { return !drive->cloud().conditions().settings().offline; }));
  std::shared_ptr<NSProgress> progress;
  const auto error = std::get<0>(ask<NSErrorPtr>([&](LocalFiles& files, auto reply) {
    progress = files.download(url("small.txt"), false, std::move(reply));
    progress->cancel();
  }));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), NSUserCancelledError);
  EXPECT_EQ(listed(), (std::vector<std::string>{"big.bin", "small.txt"}));
  EXPECT_FALSE(exists(".small.txt.skein-part"));
  EXPECT_FALSE(item("small.txt")->isDownloaded());
  EXPECT_TRUE(differences().empty());
}

TEST_F(DriveTest, AnImportThatIsCancelledLeavesNothingAndOneThatIsNotIsThereAtOnce) {
  open();
  std::filesystem::create_directories(base + "/from/inner");
  std::ofstream(base + "/from/inner/a.txt") << "a";
  const auto import = [&](bool isCancelled) {
    return path([&](LocalFiles& files, auto reply) {
      const auto progress = files.importDocument(NSURL::fileURLWithPath(base + "/from"), url(""),
                                                 std::nullopt, "test", std::move(reply));
      if (isCancelled) progress->cancel();
    });
  };
  EXPECT_EQ(import(false), "from");
  EXPECT_NE(item("from/inner/a.txt"), nullptr);
  EXPECT_EQ(import(false), "!516");
  EXPECT_TRUE(differences().empty());
}

}  // namespace
}  // namespace skein::vald
