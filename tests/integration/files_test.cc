// What a person does to documents, with the real programs.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <nlohmann/json.hpp>

#include "tests/integration/Drive.h"

namespace skein {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;
using Json = nlohmann::json;
using Lines = std::vector<std::string>;

class Files : public testing::Test {
 protected:
  // The command's output; its failure is the test's.
  Lines skein(const Arguments& arguments) {
    const Result result = drive.run(arguments);
    EXPECT_EQ(result.code, 0) << arguments.front() << ": " << result.errors;
    return result.lines();
  }
  // Its exit code, and that it says why.
  int fails(const Arguments& arguments, const std::string& reason = "skein: ") {
    const Result result = drive.run(arguments);
    EXPECT_NE(result.errors.find(reason), std::string::npos)
        << arguments.front() << ": " << result.errors;
    return result.code;
  }
  Json stat(const std::string& path) {
    const Result result = drive.run({"stat", "--json", path});
    return result.code == 0 ? Json::parse(result.output) : Json::object();
  }
  std::string id(const std::string& path) { return stat(path).value("id", ""); }
  // For what vald does by itself some time later. Each look is a program of its own.
  static bool comesTrue(const std::function<bool()>& condition) {
    const auto deadline = std::chrono::steady_clock::now() + 30s;
    while (!condition()) {
      if (std::chrono::steady_clock::now() > deadline) return false;
    }
    return true;
  }
  // Another program writes a document, and the drive knows it.
  void writeAndSee(const std::string& path, const std::string& text) {
    drive.write(path, text);
    EXPECT_TRUE(comesTrue([&] { return drive.run({"id", path}).code == 0; })) << path;
  }
  bool isUploaded(const std::string& path) {
    return comesTrue([&] { return stat(path).value("uploaded", false); });
  }
  // Whether something of an import that is not done yet lies about.
  bool isImporting() const {
    std::error_code gone;  // files go while one looks
    for (fs::recursive_directory_iterator at(drive.state(), gone), end; at != end;
         at.increment(gone)) {
      if (at->path().filename().string().starts_with(".skein-import-")) return true;
    }
    return false;
  }
  void writeHome(const std::string& name, const std::string& text) const {
    std::ofstream(drive.home() + '/' + name, std::ios::binary) << text;
  }
  static std::string contents(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
  }

  Drive drive;
};

TEST_F(Files, ImportBringsInFilesTreesAndStandardInput) {
  fs::create_directories(drive.home() + "/tree/inner");
  writeHome("tree/inner/deep.txt", "deep");
  writeHome("one.txt", "one");
  EXPECT_EQ(drive.shell("skein import one.txt tree/ ./tree/inner/deep.txt /").code, 0);
  EXPECT_EQ(drive.list("/"), (Lines{"deep.txt", "one.txt", "tree"}));
  EXPECT_EQ(contents(drive.store() + "/tree/inner/deep.txt"), "deep");
  EXPECT_EQ(contents(drive.home() + "/one.txt"), "one");

  // What fails is told, and the rest is done.
  writeHome("two.txt", "two");
  const Result partly = drive.shell("skein import --json one.txt nothing two.txt /");
  EXPECT_EQ(partly.code, 6) << partly.errors;
  ASSERT_EQ(partly.lines().size(), 3U);
  EXPECT_EQ(Json::parse(partly.lines()[0])["exitCode"], 6);
  EXPECT_EQ(Json::parse(partly.lines()[1])["exitCode"], 3);
  EXPECT_EQ(Json::parse(partly.lines()[2])["path"], "/two.txt");
  EXPECT_EQ(drive.shell("skein import one.txt /nowhere").code, 3);
  EXPECT_EQ(drive.shell("skein import one.txt /two.txt").code, 3);

  EXPECT_EQ(drive.shell("printf typed | skein import - --name typed.txt /tree").code, 0);
  EXPECT_EQ(drive.shell("skein cat /tree/typed.txt /two.txt").output, "typedtwo");
  EXPECT_EQ(drive.shell("skein import - / </dev/null").code, 2);
  EXPECT_EQ(drive.shell("skein import - --name ../x / </dev/null").code, 2);
  for (const auto& entry : fs::directory_iterator(drive.home())) {
    EXPECT_EQ(entry.path().string().find("skein-input"), std::string::npos) << entry.path();
  }
}

TEST_F(Files, AnInterruptedImportLeavesNothing) {
  skein({"ls", "/"});
  fs::create_directory(drive.home() + "/big");
  writeHome("one", std::string(4096, 'x'));
  // So many that the interrupt surely comes before the last.
  for (int i = 0; i < 10'000; ++i) {
    fs::create_hard_link(drive.home() + "/one", drive.home() + "/big/" + std::to_string(i));
  }
  const auto import = drive.start({"import", drive.home() + "/big", "/"});
  ASSERT_TRUE(comesTrue([&] { return isImporting(); }));
  sendSignal(import->pid(), SIGINT);
  // What it answers is what there is, at once. Nearly always it is in time.
  const int code = import->finish(60s);
  EXPECT_FALSE(isImporting());
  EXPECT_EQ(code, drive.list("/").empty() ? 130 : 0) << import->errors;
  EXPECT_NE(import->errors.find("interrupt"), std::string::npos) << import->errors;
  EXPECT_EQ(drive.run({"doctor"}).code, 0);
}

TEST_F(Files, ARemovalThatIsInterruptedIsWholeOrDoneAsItSays) {
  constexpr std::size_t kMany = 20'000;
  const std::string tree = drive.store() + "/tree";
  const auto count = [&] {
    std::error_code gone;
    std::size_t files = 0;
    for (fs::directory_iterator at(tree, gone), end; at != end; at.increment(gone)) ++files;
    return files;
  };
  const auto isRemoving = [&] {
    std::error_code gone;
    for (const auto& entry : fs::recursive_directory_iterator(drive.state(), gone)) {
      if (entry.path().filename().string().starts_with(".skein-removed-")) return true;
    }
    return false;
  };
  // Ctrl-C, and a command that is killed.
  for (const int signal : {SIGINT, SIGKILL}) {
    if (!fs::exists(tree)) {
      fs::create_directory(drive.home() + "/tree");
      for (std::size_t i = 0; i < kMany; ++i) {
        writeHome("tree/" + std::to_string(i), "1");
      }
      fs::rename(drive.home() + "/tree", tree);
    }
    ASSERT_TRUE(comesTrue([&] { return drive.run({"id", "/tree/19999"}).code == 0; }));
    const std::string before = id("/tree/7");
    const auto removal = drive.start({"rm", "-r", "/tree"});
    // It is out of sight from here on, and not answered for a moment.
    ASSERT_TRUE(comesTrue([&] { return !fs::exists(tree); }));
    sendSignal(removal->pid(), signal);
    const int code = removal->finish(60s);
    ASSERT_TRUE(comesTrue([&] { return !isRemoving(); }));
    const bool isWhole = fs::exists(tree);
    EXPECT_EQ(count(), isWhole ? kMany : 0);
    if (signal == SIGINT) {
      EXPECT_EQ(code, isWhole ? 130 : 0) << removal->errors;
      EXPECT_NE(removal->errors.find("interrupt"), std::string::npos) << removal->errors;
    }
    // What is back is looked at anew, folder by folder.
    if (isWhole) {
      EXPECT_TRUE(comesTrue([&] { return id("/tree/7") == before; }));
    }
    EXPECT_EQ(drive.run({"doctor"}).code, 0);
  }
}

TEST_F(Files, WhatAnInterruptedCommandDidAndDidNotIsTold) {
  Arguments trash{"trash", "--json"};
  for (int i = 0; i < 300; ++i) {
    drive.write("/" + std::to_string(i), "x");
    trash.push_back("/" + std::to_string(i));
  }
  ASSERT_TRUE(comesTrue([&] { return drive.run({"id", "/299"}).code == 0; }));
  const auto command = drive.start(trash);
  std::vector<Json> told{Json::parse(command->readLine(30s).value_or("{}"))};
  sendSignal(command->pid(), SIGINT);
  const int code = command->finish(60s);
  for (const std::string& line : Result{code, command->output, {}, {}}.lines()) {
    told.push_back(Json::parse(line));
  }
  ASSERT_EQ(told.size(), 300U) << command->errors;
  std::size_t done = 0;
  for (const Json& item : told) {
    const bool isDone = item["done"];
    done += isDone ? 1 : 0;
    EXPECT_EQ(fs::exists(drive.store() + item["given"].get<std::string>()), !isDone) << item;
    if (!isDone) {
      EXPECT_EQ(item["exitCode"], 130);
    }
  }
  EXPECT_EQ(code, done == 300 ? 0 : 130);
  EXPECT_NE(command->errors.find("interrupt"), std::string::npos);
  EXPECT_EQ(skein({"trash", "list"}).size(), done);
}

TEST_F(Files, EvictGivesUpWhatTheCloudHasAndGetBringsItBack) {
  drive.write("/letter.txt", "dear");
  const std::string identifier = id("/letter.txt");
  ASSERT_TRUE(isUploaded("/letter.txt"));
  skein({"evict", "/letter.txt"});
  EXPECT_FALSE(fs::exists(drive.store() + "/letter.txt"));
  const Json evicted = stat("/letter.txt");
  EXPECT_EQ(evicted["id"], identifier);
  EXPECT_EQ(evicted["size"], 4);
  EXPECT_EQ(evicted["downloaded"], false);
  EXPECT_NE(drive.run({"ls", "-l", "/"}).output.find("cloud"), std::string::npos);

  EXPECT_EQ(skein({"get", "--pin", "/letter.txt"}), (Lines{drive.store() + "/letter.txt"}));
  EXPECT_EQ(contents(drive.store() + "/letter.txt"), "dear");
  EXPECT_EQ(id("/letter.txt"), identifier);
  EXPECT_EQ(fails({"evict", "/letter.txt"}, "pinned"), 8);
  skein({"evict", "--unpin", "/letter.txt"});
  EXPECT_EQ(skein({"cat", "/letter.txt"}), (Lines{"dear"}));

  const Result partly = drive.run({"get", "/nothing", "/letter.txt"});
  EXPECT_EQ(partly.code, 3);
  EXPECT_EQ(partly.lines(), (Lines{drive.store() + "/letter.txt"}));
}

TEST_F(Files, AMovedDriveIsTheSameAndItsProcessesAreFoundFromEverySession) {
  drive.write("/draft.txt", "dear");
  const std::string identifier = id("/draft.txt");
  ASSERT_TRUE(isUploaded("/draft.txt"));
  skein({"mv", "/draft.txt", "/letter.txt"});
  skein({"evict", "/letter.txt"});
  const pid_t vald = drive.daemon();
  const pid_t host = drive.host();
  const Result session = drive.shell("XDG_RUNTIME_DIR=$HOME/another skein id /letter.txt");
  EXPECT_EQ(session.lines(), Lines{identifier}) << session.errors;
  EXPECT_EQ(drive.daemon(), vald);
  EXPECT_EQ(drive.host(), host);

  // Without being told anything: what served the old place ends.
  const std::string moved = fs::path(drive.store()).parent_path() / "moved";
  fs::rename(drive.store(), moved);
  const Result cat = drive.run({"--store", moved, "cat", "/letter.txt"});
  EXPECT_EQ(cat.lines(), Lines{"dear"}) << cat.errors;
  EXPECT_TRUE(waitUntilGone(host, 5s));
  EXPECT_TRUE(waitUntilGone(vald, 5s));
  EXPECT_EQ(drive.run({"--store", moved, "id", "/letter.txt"}).lines(), Lines{identifier});
  EXPECT_NE(drive.run({"--store", moved, "why", "/draft.txt"}).output.find("letter.txt"),
            std::string::npos);
  EXPECT_EQ(drive.run({"--store", moved, "doctor"}).code, 0);

  // A process that nobody finds any more ends, and leaves another's socket alone.
  const pid_t lost = drive.host();
  const std::string socket = drive.socketOf("skein-host");
  fs::rename(socket, socket + ".away");
  std::ofstream(socket) << "another's";
  EXPECT_TRUE(waitUntilGone(lost, 5s));
  EXPECT_EQ(contents(socket), "another's");
}

TEST_F(Files, ANewDriveIsToldOfAndCopiesNothingUntilSomebodyAgrees) {
  drive.write("/letter.txt", "dear");
  const auto unset = [&](const std::string& command) {
    return drive.shell("unset SKEIN_UPLOADS; " + command);
  };
  EXPECT_NE(unset("skein stop").errors.find("never opened"), std::string::npos);
  EXPECT_EQ(unset("skein drives").output, "") << "asking about a folder opens nothing";
  const Result first = unset("skein ls /");
  EXPECT_EQ(first.lines(), Lines{"letter.txt"});
  EXPECT_NE(first.errors.find(drive.store() + " is a drive from now on"), std::string::npos);
  EXPECT_NE(first.errors.find("/cloud"), std::string::npos) << first.errors;
  EXPECT_EQ(unset("skein ls /").errors, "") << "once";
  EXPECT_EQ(Json::parse(unset("skein cloud --json").output)["uploads"], "unasked");
  EXPECT_NE(unset("skein evict /letter.txt").errors.find("skein cloud uploads on"),
            std::string::npos);
  EXPECT_EQ(unset("skein cloud uploads on").code, 0);
  EXPECT_TRUE(isUploaded("/letter.txt"));

  // What is known is listed, and forgotten when nothing is lost by it.
  skein({"evict", "/letter.txt"});
  Json listed = Json::parse(skein({"drives", "--json"}).at(0));
  EXPECT_EQ(listed["path"], drive.store());
  EXPECT_EQ(listed["processID"], drive.daemon());
  EXPECT_GT(listed["bytes"], 0);
  EXPECT_EQ(fails({"forget"}, "the only copy of 1 evicted"), 8);
  EXPECT_EQ(skein({"cat", "/letter.txt"}), Lines{"dear"});
  skein({"get", "/letter.txt"});
  const Result forgotten = drive.run({"--store", listed["drive"], "forget"});
  EXPECT_EQ(forgotten.code, 0) << forgotten.errors;
  EXPECT_EQ(drive.run({"drives"}).output, "");
  EXPECT_EQ(contents(drive.store() + "/letter.txt"), "dear");
  EXPECT_EQ(drive.daemon(), 0);
  EXPECT_NE(unset("skein ls /").errors.find("is a drive from now on"), std::string::npos);
}

TEST_F(Files, ADriveThatHoldsItsOwnStateLeavesItOut) {
  // As a drive over the home folder.
  const fs::path top = fs::path(drive.store()).parent_path();
  std::ofstream(top / "state/other.txt") << "a document";
  const auto skeinAtTop = [&](Arguments arguments) {
    arguments.insert(arguments.begin(), {"--store", top});
    return drive.run(arguments);
  };
  EXPECT_EQ(skeinAtTop({"ls", "/state"}).lines(), Lines{"other.txt"});
  EXPECT_EQ(skeinAtTop({"ls", "/data"}).lines(), Lines());
  EXPECT_EQ(skeinAtTop({"doctor"}).code, 0);
  const Json status = Json::parse(skeinAtTop({"status", "--json"}).output);
  EXPECT_NE(status["notes"].dump().find(drive.state() + "/skein"), std::string::npos) << status;
  const Result import = skeinAtTop({"import", top / "state", "/home"});
  EXPECT_NE(import.code, 0);
  EXPECT_NE(import.errors.find("/state/skein"), std::string::npos) << import.errors;
  EXPECT_EQ(drive.run({"--store", drive.state() + "/skein", "ls", "/"}).code, 1);
}

TEST_F(Files, ADamagedDatabaseIsSetAsideAndTheDriveOpens) {
  drive.write("/letter.txt", "dear");
  ASSERT_TRUE(isUploaded("/letter.txt"));
  skein({"evict", "/letter.txt"});
  skein({"stop"});
  const fs::path state = [&] {
    for (const auto& entry : fs::directory_iterator(drive.state() + "/skein")) {
      if (entry.is_directory()) return entry.path();
    }
    return fs::path();
  }();
  const fs::path cloud =
      fs::path(drive.state()).parent_path() / "data/skein" / state.filename() / "cloud";
  const std::vector<fs::path> databases{state / "operations.db", state / "shares.sqlite",
                                        cloud / "records.db"};
  for (const fs::path& database : databases) {
    struct stat status {};
    ASSERT_EQ(::stat(database.c_str(), &status), 0) << database;
    EXPECT_EQ(status.st_mode & 0777, 0600U) << database;
    std::fstream file(database, std::ios::in | std::ios::out | std::ios::binary);
    file << "not a database any more";
  }
  EXPECT_EQ(skein({"cat", "/letter.txt"}), Lines{"dear"}) << "the marker names its contents";
  const std::string told = drive.run({"status"}).output + drive.run({"doctor"}).output;
  for (const fs::path& database : databases) {
    const std::size_t first = told.find(database.string() + " was damaged");
    ASSERT_NE(first, std::string::npos) << told;
    EXPECT_NE(told.find(database.string() + " was damaged", first + 1), std::string::npos);
  }
}

TEST_F(Files, WhatIsEvictedHasAThumbnailThatFileManagersFind) {
  const auto files = [](const fs::path& folder, const std::string& part) {
    std::error_code none;
    std::size_t count = 0;
    for (const auto& entry : fs::recursive_directory_iterator(folder, none)) {
      const bool counts = entry.is_regular_file(none);
      if (counts && entry.path().string().find(part) != std::string::npos) ++count;
    }
    return count;
  };
  const fs::path own = fs::path(drive.home()).parent_path() / "data";
  const std::string cache = drive.home() + "/.cache/thumbnails";
  drive.write("/letter.txt", "dear");
  // The machine's own types: without them this is no text.
  EXPECT_EQ(drive.shell("XDG_DATA_DIRS=/usr/share skein ls /").code, 0);
  ASSERT_TRUE(isUploaded("/letter.txt"));
  ASSERT_TRUE(comesTrue([&] { return files(own, "/pictures/") == 1; }));
  EXPECT_EQ(files(cache, ".png"), 0u);
  skein({"evict", "/letter.txt"});
  EXPECT_TRUE(comesTrue([&] { return files(cache, "/xx-large/") == 1; }));
  EXPECT_EQ(files(cache, "/normal/"), 1u);
  skein({"get", "/letter.txt"});
  EXPECT_TRUE(comesTrue([&] { return files(cache, ".png") == 0; }));
}

TEST_F(Files, FoldersMovesAndAliasesGoWherePeopleExpect) {
  drive.write("/a.txt", "a");
  drive.write("/b.txt", "b");
  EXPECT_EQ(fails({"mkdir", "/x/y"}), 3);
  skein({"mkdir", "-p", "/x/y/z", "/x/y"});
  EXPECT_EQ(fails({"mkdir", "/x"}), 6);
  EXPECT_EQ(fails({"mkdir", "x"}), 2);
  EXPECT_EQ(fails({"mkdir", "-p", "/a.txt/below"}), 3);
  const std::string identifier = id("/a.txt");

  skein({"mv", "/a.txt", "/c.txt"});
  skein({"mv", "/c.txt", "/x/d.txt"});
  skein({"mv", "/x/d.txt", "/x/y"});
  EXPECT_EQ(id("/x/y/d.txt"), identifier);
  skein({"mv", identifier, "/b.txt", "/x"});
  EXPECT_EQ(drive.list("/x"), (Lines{"b.txt", "d.txt", "y"}));
  writeAndSee("/b.txt", "another");
  EXPECT_EQ(fails({"mv", "/b.txt", "/x"}), 6);
  EXPECT_EQ(fails({"mv", "/b.txt", "/x/d.txt"}), 6);
  EXPECT_EQ(fails({"mv", "/x/d.txt", "/b.txt", "/new"}), 3);
  EXPECT_EQ(fails({"mv", "/gone", "/new"}), 3);
  EXPECT_EQ(contents(drive.store() + "/x/d.txt"), "a");
  EXPECT_NE(fails({"mv", "/x", "/x/y"}), 0);
  EXPECT_EQ(fails({"mv", "/b.txt", "/" + std::string(256, 'n')}), 2);

  skein({"alias", "/x/d.txt", "/link"});
  skein({"alias", "--outside", "/etc", "/x"});
  EXPECT_EQ(skein({"cat", "/link"}), (Lines{"a"}));
  EXPECT_EQ(fs::read_symlink(drive.store() + "/x/etc"), "/etc");
  skein({"mv", "/link", "/renamed"});
  EXPECT_EQ(drive.list("/"), (Lines{"b.txt", "renamed", "x"}));
  EXPECT_EQ(drive.list("/x"), (Lines{"b.txt", "d.txt", "etc", "y"}));
  skein({"rm", "/renamed"});
  EXPECT_EQ(contents(drive.store() + "/x/d.txt"), "a");
  EXPECT_EQ(skein({"default-location"}), skein({"default-location"}));
  EXPECT_EQ(drive.run({"doctor"}).code, 0);
}

TEST_F(Files, TheTrashGivesBackWhatIsNamedClearly) {
  fs::create_directories(drive.store() + "/one");
  fs::create_directories(drive.store() + "/two");
  drive.write("/one/note.txt", "1");
  drive.write("/two/note.txt", "2");
  const std::string identifier = id("/one/note.txt");
  skein({"trash", "/one/note.txt", "/two/note.txt"});
  EXPECT_EQ(drive.list("/one"), Lines());
  EXPECT_EQ(skein({"trash", "list"}).size(), 2U);
  const Json listed = Json::parse(skein({"trash", "list", "--json"}).back());
  EXPECT_EQ(listed["putBackPath"], "/one/note.txt");

  EXPECT_EQ(fails({"restore", "note.txt"}, "/two/note.txt"), 1);
  EXPECT_EQ(skein({"restore", "/one/note.txt"}), (Lines{"/one/note.txt"}));
  EXPECT_EQ(id("/one/note.txt"), identifier);
  EXPECT_EQ(fails({"restore", "/one/note.txt"}), 3);
  EXPECT_EQ(fails({"restore", "note.txt", "--to", "/gone"}), 3);
  // Where the name is taken by now, it comes back under another.
  const std::string bounced = skein({"restore", "note.txt", "--to", "/one"}).at(0);
  EXPECT_NE(bounced, "/one/note.txt");
  EXPECT_EQ(skein({"cat", bounced}), (Lines{"2"}));

  EXPECT_EQ(fails({"rm", "/one"}, "rm -r"), 1);
  skein({"rm", "-r", "/one"});
  EXPECT_EQ(drive.list("/"), (Lines{"two"}));
  EXPECT_EQ(fails({"rm", "/one"}), 3);
  EXPECT_EQ(fails({"trash", "/one", "/two"}), 3);
  EXPECT_EQ(drive.list("/"), Lines());
  EXPECT_EQ(drive.run({"trash"}).code, 2);
}

TEST_F(Files, MarksStayWithTheirItem) {
  drive.write("/a.txt", "a");
  drive.write("/b.txt", "b");
  skein({"tag", "/a.txt", "--add", "work", "--add", "bridge"});
  skein({"tag", "/a.txt", "/b.txt", "--add", "work", "--remove", "bridge"});
  skein({"mv", "/a.txt", "/c.txt"});
  EXPECT_EQ(skein({"tag", "/c.txt"}), (Lines{"work"}));
  EXPECT_EQ(skein({"tag", "--list"}), (Lines{"     2  work"}));
  skein({"tag", "/b.txt", "--set", "two words"});
  EXPECT_EQ(skein({"tag", "/b.txt", "/c.txt"}), (Lines{"/b.txt: two words", "/c.txt: work"}));
  skein({"favorite", "/c.txt", "--rank", "7"});
  skein({"touch-used", "/c.txt", "--date", "2001-09-09T01:46:40Z"});
  const Json marked = stat("/c.txt");
  EXPECT_EQ(marked["tags"], Json::parse("[\"work\"]"));
  EXPECT_EQ(marked["favoriteRank"], 7);
  EXPECT_EQ(marked["lastUsed"], "2001-09-09T01:46:40.000000000Z");
  EXPECT_NE(drive.run({"ls", "-l", "/"}).output.find("c.txt  *  [work]"), std::string::npos);

  skein({"tag", "/b.txt", "--clear"});
  skein({"favorite", "/c.txt", "--remove"});
  EXPECT_FALSE(stat("/c.txt").contains("favoriteRank"));
  EXPECT_EQ(skein({"tag", "/b.txt"}), Lines());
  EXPECT_EQ(fails({"tag", "/gone", "--add", "x"}), 3);
  EXPECT_EQ(fails({"touch-used", "/c.txt", "--date", "soon"}), 2);
  EXPECT_EQ(drive.run({"tag"}).code, 2);
}

TEST_F(Files, WhyTellsWhoseRequestItWas) {
  drive.write("/a.txt", "a");
  skein({"mv", "/a.txt", "/b.txt"});
  const auto trash = drive.start({"trash", "/b.txt"});
  const std::string process = "skein trash (process " + std::to_string(trash->pid()) + ')';
  ASSERT_EQ(trash->finish(20s), 0);
  const Lines why = skein({"why", "/b.txt"});
  ASSERT_GE(why.size(), 2U);
  EXPECT_NE(why[0].find("trash"), std::string::npos) << why[0];
  EXPECT_NE(why[0].find(process), std::string::npos) << why[0];
  EXPECT_NE(why[1].find("/a.txt -> /b.txt"), std::string::npos) << why[1];
  EXPECT_EQ(Json::parse(skein({"why", "--json", "/b.txt"}).at(0))["origin"], process);

  writeAndSee("/c.txt", "c");
  EXPECT_EQ(skein({"why", "/c.txt"}), (Lines{"no request of the drive changed it"}));
  EXPECT_EQ(fails({"why", "/never"}), 3);
}

TEST_F(Files, EveryVerbHasAnExample) {
  for (const char* verb :
       {"get", "cat", "cloud", "evict", "import", "mkdir", "mv", "alias", "trash", "restore", "rm",
        "tag", "favorite", "touch-used", "default-location", "why"}) {
    const Result help = drive.run({verb, "--help"});
    EXPECT_EQ(help.code, 0) << verb;
    EXPECT_NE(help.output.find("Example: skein "), std::string::npos) << verb;
  }
}

}  // namespace
}  // namespace skein
