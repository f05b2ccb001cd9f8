// What is listed, how, and under which names; containers; the index itself.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>

#include "linux/vald/index/IndexFile.h"
#include "tests/vald/StoreFixture.h"
#include "tests/vald_cloud/DiskWaits.h"

namespace skein::vald {
namespace {

class StoreListing : public StoreFixture {
 protected:
  static constexpr std::size_t kMostNames = 10'000;  // more than any folder here has

  std::vector<std::string> names(std::optional<VLFileObjectID> folder, SortOrder order,
                                 std::uint64_t limit) {
    std::vector<std::string> names;
    std::uint64_t offset = 0;
    do {
      NSErrorPtr error;
      const Page page = store->listFolder(folder, order, offset, limit, &error);
      EXPECT_EQ(error, nullptr);
      for (const VLQueryItemPtr& item : page.items) names.push_back(item->filename());
      const bool goesOn =
          page.nextOffset == 0 || (page.nextOffset > offset && names.size() < kMostNames);
      EXPECT_TRUE(goesOn) << "from " << offset << " to " << page.nextOffset;
      offset = goesOn ? page.nextOffset : 0;
    } while (offset != 0);
    return names;
  }
};

TEST_F(StoreListing, EveryNameOnceInByteOrderWhateverItsBytes) {
  std::vector<std::string> expected = {"a\nb",
                                       "\xff\xfe",
                                       std::string(255, 'n'),
                                       "Case",
                                       "case",
                                       "caf\xc3\xa9",
                                       "cafe\xcc\x81",
                                       " blank ",
                                       "-dash",
                                       "~",
                                       "\x01"};
  for (const std::string& name : expected) write(name);
  std::sort(expected.begin(), expected.end());
  for (int pass = 0; pass < 2; ++pass) {
    pass == 0 ? open() : reopen();
    EXPECT_EQ(names(std::nullopt, SortOrder::Name, 3), expected);
    for (const std::string& name : expected) {
      const VLQueryItemPtr found = item(name);
      ASSERT_NE(found, nullptr);
      EXPECT_EQ(store->pathForID(found->fileObjectID(), nullptr), at(name));
    }
  }
}

TEST_F(StoreListing, PagesByNameAndByDateAreWholeAtAnyPageSize) {
  makeFolder("f");
  std::vector<std::string> byName;
  for (int i = 0; i < 57; ++i) {
    const std::string name = "n" + std::to_string(i * 37 % 100);
    write("f/" + name);
    // Several of one date, so that names settle the rest.
    const timespec times[2] = {{1000 + i / 3, 0}, {1000 + i / 3, 0}};
    utimensat(AT_FDCWD, at("f/" + name).c_str(), times, 0);
    byName.push_back(name);
  }
  open();
  const VLFileObjectID folder = item("f")->fileObjectID();
  std::vector<std::string> byDate = byName;
  std::sort(byDate.begin(), byDate.end(), [&](const std::string& a, const std::string& b) {
    const auto dateA = *item("f/" + a)->contentModificationDate();
    const auto dateB = *item("f/" + b)->contentModificationDate();
    return dateA != dateB ? dateA > dateB : a < b;
  });
  std::sort(byName.begin(), byName.end());
  for (const std::uint64_t limit : {1, 7, 57, 200}) {
    EXPECT_EQ(names(folder, SortOrder::Name, limit), byName);
    EXPECT_EQ(names(folder, SortOrder::Date, limit), byDate);
  }
  // An offset that no listing led to.
  const Page cold = store->listFolder(folder, SortOrder::Name, 13, 4, nullptr);
  EXPECT_EQ(cold.items.front()->filename(), byName[13]);
  EXPECT_EQ(cold.nextOffset, 17U);
  EXPECT_EQ(item("f")->childItemCount(), 57U);
}

// However much there is of each item, a page is no longer than can be sent.
TEST_F(StoreListing, PagesEndEarlyWhereItemsAreLong) {
  constexpr std::size_t kItems = 150;
  const std::string tag(60'000, 't');
  std::vector<std::string> expected;
  for (std::size_t number = 0; number < kItems; ++number) {
    expected.push_back("file" + std::to_string(1000 + number));
    write(expected.back());
  }
  open();
  for (const std::string& name : expected) {
    ASSERT_EQ(store->changeDetails(item(name)->fileObjectID(),
                                   [&](ItemDetails& details) { details.tags = tag; }),
              nullptr);
  }
  const auto isShort = [](const std::vector<VLQueryItemPtr>& items) {
    return items.size() * 60'000 < (6 << 20);
  };
  const Page first = store->listFolder(std::nullopt, SortOrder::Name, 0, 1000, nullptr);
  EXPECT_TRUE(isShort(first.items)) << first.items.size();
  EXPECT_EQ(first.items.front()->tagData()->length(), tag.size() + 4);
  EXPECT_EQ(names(std::nullopt, SortOrder::Name, 1000), expected);
  auto byDate = names(std::nullopt, SortOrder::Date, 1000);
  std::sort(byDate.begin(), byDate.end());
  EXPECT_EQ(byDate, expected);

  // The journal's pages too, also where deletions are among the changes.
  const std::uint64_t before = store->currentRank();
  for (std::size_t number = 0; number < kItems; ++number) {
    if (number % 3 == 0) {
      remove(expected[number]);
    } else {
      store->tellAnew(item(expected[number])->fileObjectID(), false);
    }
  }
  settle();
  std::size_t changes = 0;
  for (std::uint64_t rank = before;;) {
    NSErrorPtr error;
    const ChangePage page = store->changesSince(rank, 1000, &error);
    ASSERT_EQ(error, nullptr);
    ASSERT_FALSE(page.expired);
    if (page.changes.empty()) break;
    std::vector<VLQueryItemPtr> items;
    for (const StoreChange& change : page.changes) {
      if (!change.item->isDead()) items.push_back(change.item);
    }
    EXPECT_TRUE(isShort(items)) << items.size();
    changes += page.changes.size();
    rank = page.newestRank;
  }
  EXPECT_EQ(changes, kItems);
}

TEST_F(StoreListing, AListingUnderWaySkipsNothingWhenItemsBeforeItGo) {
  for (const char* name : {"a", "b", "c", "d", "e"}) write(name);
  open();
  const Page first = store->listFolder(std::nullopt, SortOrder::Name, 0, 2, nullptr);
  remove("a");
  settle();
  const Page second =
      store->listFolder(std::nullopt, SortOrder::Name, first.nextOffset, 2, nullptr);
  ASSERT_EQ(second.items.size(), 2U);
  EXPECT_EQ(second.items[0]->filename(), "c");
}

// Each goes on where it was, whatever the others saw at the same index.
TEST_F(StoreListing, ListingsOfOneFolderBeforeBetweenAndAfterChangesDoNotMix) {
  makeFolder("away");
  makeFolder("f");
  const auto name = [](int number) { return "n" + std::to_string(100 + number); };
  std::vector<std::string> all;
  for (int i = 0; i < 40; ++i) {
    write("f/" + name(i));
    const timespec times[2] = {{1000 - i, 0}, {1000 - i, 0}};
    utimensat(AT_FDCWD, at("f/" + name(i)).c_str(), times, 0);
    all.push_back(name(i));
  }
  open();
  const VLFileObjectID folder = item("f")->fileObjectID();
  for (const SortOrder order : {SortOrder::Name, SortOrder::Date}) {
    const auto left = [&] { return std::vector<std::string>(all.begin(), all.end()); };
    const auto goOn = [&](std::vector<std::string>& seen, std::uint64_t offset) {
      const Page page = store->listFolder(folder, order, offset, 4, nullptr);
      for (const VLQueryItemPtr& item : page.items) seen.push_back(item->filename());
      return page.nextOffset;
    };
    EXPECT_EQ(names(folder, order, 4), left());
    std::vector<std::vector<std::string>> seen(4);
    std::vector<std::vector<std::string>> expected(4);
    std::vector<std::uint64_t> offsets(4, 0);
    // Each begins after another item went, and has two pages when the next begins.
    for (std::size_t i = 0; i < seen.size(); ++i) {
      expected[i] = left();
      for (std::size_t j = 0; j <= i; ++j) offsets[j] = goOn(seen[j], offsets[j]);
      rename("f/" + all.front(), "away/" + all.front());
      all.erase(all.begin());
      settle();
    }
    for (std::size_t i = 0; i < seen.size(); ++i) {
      while (offsets[i] != 0) offsets[i] = goOn(seen[i], offsets[i]);
      EXPECT_EQ(seen[i], expected[i]) << i;
    }
    EXPECT_EQ(names(folder, order, 4), left());
  }
}

TEST_F(StoreListing, AnItemThatChangesBetweenTwoPagesIsListedOnce) {
  for (const char* name : {"a", "b", "c", "d"}) write(name);
  open();
  Page page = store->listFolder(std::nullopt, SortOrder::Name, 0, 2, nullptr);
  // As an upload does: the item is told of anew, at its place in the folder.
  store->tellAnew(page.items.back()->fileObjectID(), false);
  settle();
  page = store->listFolder(std::nullopt, SortOrder::Name, page.nextOffset, 2, nullptr);
  ASSERT_EQ(page.items.size(), 2U);
  EXPECT_EQ(page.items[0]->filename(), "c");
  EXPECT_EQ(page.items[1]->filename(), "d");
}

TEST(ListingPlaces, OneThatWaitsOutlivesManyThatWentOn) {
  ListingPlaces places;
  const auto place = [](std::uint64_t number) {
    return ListingPlace{0, "n" + std::to_string(number), number};
  };
  const std::uint64_t waiting = places.remember(2, SortOrder::Name, 0, 200, place(1));
  EXPECT_EQ(waiting, 200U);
  const std::uint64_t apart = places.remember(2, SortOrder::Name, 0, 200, place(2));
  EXPECT_NE(apart, waiting);
  EXPECT_EQ(ListingPlaces::index(apart), 200U);
  std::uint64_t offset = 0;
  for (std::uint64_t i = 0; i < 20'000; ++i) {
    offset = places.remember(3, SortOrder::Date, offset, 200, place(i));
    EXPECT_EQ(places.find(3, SortOrder::Date, offset), place(i));
  }
  EXPECT_EQ(offset, 4'000'000U);
  EXPECT_EQ(places.find(3, SortOrder::Date, 200), std::nullopt);  // bounded
  EXPECT_EQ(places.find(2, SortOrder::Name, waiting), place(1));
  EXPECT_EQ(places.find(2, SortOrder::Name, apart), place(2));
  EXPECT_EQ(places.find(2, SortOrder::Date, waiting), std::nullopt);
}

TEST_F(StoreListing, OnlyFilesFoldersAndAliasesAndNothingBehindAnAlias) {
  makeFolder("folder");
  makeFolder(".Trash-1000/files");
  write("folder/inside");
  write(".hidden");
  ASSERT_EQ(mkfifo(at("pipe").c_str(), 0600), 0);
  ASSERT_EQ(symlink("/etc", at("alias").c_str()), 0);
  open();
  EXPECT_EQ(names(std::nullopt, SortOrder::Name, 10),
            (std::vector<std::string>{".hidden", "alias", "folder"}));
  const VLQueryItemPtr alias = item("alias");
  EXPECT_EQ(alias->properties().kind, VLQueryItem::Kind::Alias);
  EXPECT_EQ(alias->typeIdentifier(), "inode/symlink");
  EXPECT_EQ(item("alias/passwd"), nullptr);
  EXPECT_EQ(item("folder/../.hidden"), nullptr);
  EXPECT_EQ(item("folder")->typeIdentifier(), "inode/directory");
  NSErrorPtr error;
  store->listFolder(alias->fileObjectID(), SortOrder::Name, 0, 10, &error);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), NSFileNoSuchFileError);
  // The folder of the drive goes by the reserved name, for itself and its children.
  EXPECT_EQ(item("")->itemIdentifier(), NSFileProviderRootContainerItemIdentifier);
  EXPECT_EQ(item("folder")->parentItemIdentifier(), NSFileProviderRootContainerItemIdentifier);
  EXPECT_EQ(item("folder/inside")->parentItemIdentifier(), id("folder"));
  EXPECT_EQ(item("folder/inside")->typeIdentifier(), "application/octet-stream");
  // Adopting a folder writes nothing into it.
  EXPECT_EQ(std::distance(std::filesystem::recursive_directory_iterator(root), {}), 7);
}

TEST_F(StoreListing, AnAliasListsTheFolderThatItLeadsTo) {
  makeFolder("folder/deep");
  write("folder/deep/inside");
  ASSERT_EQ(symlink("deep", at("folder/alias").c_str()), 0);
  ASSERT_EQ(symlink("folder/alias", at("second").c_str()), 0);
  ASSERT_EQ(symlink(".", at("self").c_str()), 0);
  ASSERT_EQ(symlink("folder/deep/inside", at("file").c_str()), 0);
  ASSERT_EQ(symlink("/", at("out").c_str()), 0);
  ASSERT_EQ(symlink("nothing", at("broken").c_str()), 0);
  open();
  const auto listed = [&](const std::string& alias) {
    return names(item(alias)->fileObjectID(), SortOrder::Name, 10);
  };
  const std::vector<std::string> inside{"inside"};
  EXPECT_EQ(listed("folder/alias"), inside);
  EXPECT_EQ(listed("second"), inside);
  EXPECT_EQ(listed("self"), names(std::nullopt, SortOrder::Name, 10));
  for (const char* nowhere : {"file", "out", "broken"}) {
    NSErrorPtr error;
    store->listFolder(item(nowhere)->fileObjectID(), SortOrder::Name, 0, 10, &error);
    ASSERT_TRUE(error) << nowhere;
    EXPECT_EQ(error->code(), NSFileNoSuchFileError);
  }
}

TEST_F(StoreListing, ContainersAreListedAtTheRootAndJournalled) {
  write("doc");
  const std::string container = root + "-app";
  std::filesystem::create_directory(container);
  std::ofstream(container + "/note.txt") << "x";
  options.containers = {{container, "com.example.Notes", "Notes"}};
  open();
  EXPECT_EQ(names(std::nullopt, SortOrder::Name, 10), (std::vector<std::string>{"Notes", "doc"}));
  const Page page = store->listFolder(std::nullopt, SortOrder::Name, 0, 10, nullptr);
  const VLQueryItemPtr notes = page.items[0];
  EXPECT_EQ(notes->properties().containerID, "com.example.Notes");
  EXPECT_EQ(store->pathForID(notes->fileObjectID(), nullptr), container);
  const Page inside = store->listFolder(notes->fileObjectID(), SortOrder::Name, 0, 10, nullptr);
  ASSERT_EQ(inside.items.size(), 1U);
  const VLFileObjectID note = inside.items[0]->fileObjectID();
  reopen();
  EXPECT_EQ(names(std::nullopt, SortOrder::Name, 10), (std::vector<std::string>{"Notes", "doc"}));
  EXPECT_NE(store->itemWithID(note, nullptr), nullptr);

  Tree tree;
  std::uint64_t rank = 0;
  ASSERT_TRUE(replay(tree, rank));
  EXPECT_EQ(tree, listed());
  store->setContainers({});
  ASSERT_TRUE(replay(tree, rank));
  EXPECT_EQ(tree, listed());
  EXPECT_EQ(tree.size(), 1U);
  std::filesystem::remove_all(container);
}

// By vald or by anybody else, while the store is open or not. A folder that is merely away
// is waited for.
TEST_F(StoreListing, AContainersFolderThatWasMadeAnewIsTheContainerFromThenOn) {
  const std::string container = root + "-app";
  const auto makeAnew = [&](const char* file) {
    std::filesystem::remove_all(container);
    std::filesystem::create_directory(container);
    std::ofstream(container + '/' + file) << "x";
  };
  const auto inside = [&] {
    const VLQueryItemPtr folder = store->itemAtPath(container, false, nullptr);
    std::vector<std::string> names;
    if (folder == nullptr) return names;
    for (const auto& item :
         store->listFolder(folder->fileObjectID(), SortOrder::Name, 0, 10, nullptr).items) {
      names.push_back(item->filename());
    }
    return names;
  };
  const auto becomes = [&](const std::vector<std::string>& wanted) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (inside() != wanted && std::chrono::steady_clock::now() < deadline) {
      store->settle(std::chrono::seconds(1));
    }
    return inside() == wanted;
  };
  makeAnew("first");
  options.containers = {{container, "com.example.Notes", "Notes"}};
  open();
  EXPECT_TRUE(becomes({"first"}));
  makeAnew("second");
  EXPECT_TRUE(becomes({"second"}));
  makeAnew("third");
  store->setContainers(options.containers);
  EXPECT_TRUE(becomes({"third"}));
  close();
  makeAnew("fourth");
  open();
  EXPECT_TRUE(becomes({"fourth"}));

  const VLQueryItemPtr kept = store->itemAtPath(container + "/fourth", false, nullptr);
  ASSERT_NE(kept, nullptr);
  std::filesystem::rename(container, container + "-away");
  store->setContainers(options.containers);
  EXPECT_NE(store->itemWithID(kept->fileObjectID(), nullptr), nullptr);
  std::filesystem::rename(container + "-away", container);
  EXPECT_TRUE(becomes({"fourth"}));
  EXPECT_NE(store->itemWithID(kept->fileObjectID(), nullptr), nullptr);
  std::filesystem::remove_all(container);
}

TEST_F(StoreListing, AnIndexThatIsNoneIsKeptAsideAndMadeAnew) {
  write("doc");
  std::ofstream(options.databasePath) << std::string(20'000, 'z');
  open();
  EXPECT_NE(item("doc"), nullptr);
  EXPECT_TRUE(log.holds("cannot be used"));
  bool isKept = false;
  for (const auto& file : std::filesystem::directory_iterator(root + "/..")) {
    isKept = isKept || file.path().string().find(".set-aside-") != std::string::npos;
  }
  EXPECT_TRUE(isKept);
}

TEST_F(StoreListing, AnIndexGoesWithItsFolder) {
  write("doc");
  open();
  const std::string doc = id("doc");
  const std::string journal = store->journalID();
  close();
  // Another folder in its place, as when a volume is not mounted; then the first again.
  std::filesystem::rename(root, root + "-away");
  std::filesystem::create_directory(root);
  open();
  EXPECT_NE(store->journalID(), journal);
  close();
  std::filesystem::remove(root);
  std::filesystem::rename(root + "-away", root);
  open();
  EXPECT_EQ(store->journalID(), journal);
  EXPECT_EQ(id("doc"), doc);
}

TEST_F(StoreListing, APowerCutEndsTheJournalAndAKillDoesNot) {
  write("doc");
  open();
  const std::string doc = id("doc");
  const std::string journal = store->journalID();
  reopen();
  EXPECT_EQ(store->journalID(), journal);
  close();
  const pid_t child = fork();
  if (child == 0) {
    open();
    raise(SIGKILL);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFSIGNALED(status));
  open();
  EXPECT_EQ(store->journalID(), journal);
  close();
  // As if the machine had gone down and was started again.
  int code = 0;
  std::string message;
  const auto index = SqliteDatabase::open(options.databasePath, true, code, message);
  ASSERT_NE(index, nullptr) << message;
  ASSERT_TRUE(
      index->execute("INSERT INTO setting(name, value) "
                     "VALUES(CAST('open since' AS BLOB), CAST('an earlier start' AS BLOB))"))
      << index->message();
  open();
  const std::string next = store->journalID();
  EXPECT_NE(next, journal);
  EXPECT_TRUE(log.holds("went down"));
  EXPECT_EQ(id("doc"), doc);
  reopen();
  EXPECT_EQ(store->journalID(), next);

  // What tells it the next time is on the disk before the index is used, or left.
  NSErrorPtr error;
  const auto fresh = openIndexFile(options.databasePath + "-2", log, &error);
  ASSERT_NE(fresh, nullptr);
  const auto waits = [](const std::function<void()>& call) {
    const std::uint64_t before = diskWaits();
    call();
    return diskWaits() != before;
  };
  EXPECT_TRUE(waits([&] { markIndexOpen(*fresh); }));
  EXPECT_FALSE(waits([&] { markIndexOpen(*fresh); }));
  EXPECT_TRUE(waits([&] { markIndexClosed(*fresh); }));
}

TEST_F(StoreListing, PathsOfManyAtOnce) {
  makeFolder("folder");
  makeFolder("folder/below");
  write("folder/below/doc");
  write("folder/other");
  open();
  const auto of = [&](const std::string& path) { return item(path)->fileObjectID(); };
  const std::vector<VLFileObjectID> ids = {
      of("folder/below/doc"), VLFileObjectID::documentWithRawID(1), of("folder/below"),
      of("folder/other"), VLFileObjectID::folderOrAliasWithRawID(1)};
  NSErrorPtr error;
  const auto paths = store->pathsForIDs(ids, &error);
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(paths, (std::vector<std::optional<std::string>>{at("folder/below/doc"), std::nullopt,
                                                            at("folder/below"), at("folder/other"),
                                                            std::nullopt}));
  EXPECT_EQ(store->pathForID(ids[1], &error), std::nullopt);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), NSFileNoSuchFileError);
}

TEST_F(StoreListing, WhatCameAMomentAgoIsThereAtItsPath) {
  makeFolder("old");
  open();
  store->listFolder(item("old")->fileObjectID(), SortOrder::Name, 0, 1, nullptr);
  settle();
  makeFolder("old/new");
  makeFolder("old/new/below");
  write("old/new/below/doc");
  const std::string doc = id("old/new/below/doc");
  EXPECT_NE(doc, "");
  EXPECT_EQ(id("old/new/below/none"), "");
  settle();
  EXPECT_EQ(id("old/new/below/doc"), doc);
  EXPECT_TRUE(store->check(1).empty());
}

// Whatever the store is busy with.
TEST_F(StoreListing, HasWhatWasDoneBeforeItWasAskedFor) {
  for (int i = 0; i < 200; ++i) makeFolder("folder " + std::to_string(i) + "/below");
  const auto inLast = [&] {
    return names(item("folder 99/below")->fileObjectID(), SortOrder::Name, 10);
  };
  const auto check = [&](const std::string& what) {
    const std::string path = "folder 99/below/" + what;
    write(path);
    EXPECT_EQ(inLast(), std::vector<std::string>{what});
    rename(path, path + "2");
    EXPECT_EQ(inLast(), std::vector<std::string>{what + "2"});
    remove(path + "2");
    EXPECT_TRUE(inLast().empty()) << what;
  };
  const auto openAtOnce = [&] {
    store = FolderStore::openFolder(options, listener, log, nullptr);
    ASSERT_NE(store, nullptr);
  };
  openAtOnce();
  check("in the first scan");
  settle();
  for (int i = 0; i < 5; ++i) check("at rest");
  for (const char* lost : {"lost", "lost in a rescan"}) {
    store->loseEvents(true);
    write(std::string("folder 99/below/") + lost);
    store->loseEvents(false);
    EXPECT_EQ(inLast(), std::vector<std::string>{lost});
    remove(std::string("folder 99/below/") + lost);
  }
  check("in a rescan");
  write("folder 99/below/while closed");
  close();
  openAtOnce();
  EXPECT_EQ(inLast(), std::vector<std::string>{"while closed"});
  remove("folder 99/below/while closed");
  check("while it is verified");
  close();
  options.watchBudget = 3;
  openAtOnce();
  check("without a watch");
}

TEST_F(StoreListing, SettingsSurviveARestart) {
  open();
  const std::uint64_t waits = diskWaits();
  store->setSetting("account", "anna");
  EXPECT_NE(diskWaits(), waits);
  store->setSetting("gone", "x");
  store->setSetting("gone", std::nullopt);
  reopen();
  EXPECT_EQ(store->setting("account"), "anna");
  EXPECT_EQ(store->setting("gone"), std::nullopt);
}

}  // namespace
}  // namespace skein::vald
