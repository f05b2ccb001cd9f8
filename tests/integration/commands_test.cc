// The three programs together, as a person uses them.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <set>

#include "tests/integration/Drive.h"

namespace skein {
namespace {

using namespace std::chrono_literals;
using Lines = std::vector<std::string>;

// Within 5 s, and twice that for a busy machine.
constexpr auto kAnswersWithin = 10s;

std::string firstWord(const std::string& line) { return line.substr(0, line.find(' ')); }

TEST(Commands, ListsByNameAndDateAndBelow) {
  Drive drive;
  drive.write("/beta.txt", "12345");
  drive.write("/alpha.txt", "");
  std::filesystem::create_directories(drive.store() + "/folder/inner");
  drive.write("/folder/deep.txt", "x");
  const timespec old[2] = {{1000000000, 0}, {1000000000, 0}};
  utimensat(AT_FDCWD, (drive.store() + "/alpha.txt").c_str(), old, 0);

  const Result byName = drive.run({"ls", "/"});
  ASSERT_EQ(byName.code, 0) << byName.errors;
  EXPECT_EQ(byName.lines(), (Lines{"alpha.txt", "beta.txt", "folder"}));
  const Result byDate = drive.run({"ls", "--sort", "date"});
  ASSERT_EQ(byDate.lines().size(), 3U) << byDate.code << byDate.errors;
  EXPECT_EQ(byDate.lines().back(), "alpha.txt");

  const Lines details = drive.run({"ls", "-l", "/"}).lines();
  ASSERT_EQ(details.size(), 3U);
  EXPECT_NE(details[0].find("2001-09-09"), std::string::npos) << details[0];
  EXPECT_NE(details[1].find(" 5  "), std::string::npos) << details[1];
  EXPECT_EQ(details[2][0], 'd');

  EXPECT_EQ(drive.run({"ls", "-R", "/"}).output,
            "/:\nalpha.txt\nbeta.txt\nfolder\n\n/folder:\ndeep.txt\ninner\n\n/folder/inner:\n");
  const Lines folders = drive.run({"ls", "--all-folders"}).lines();
  EXPECT_TRUE(std::count(folders.begin(), folders.end(), "folder"));
  EXPECT_TRUE(std::count(folders.begin(), folders.end(), "inner"));
  EXPECT_FALSE(std::count(folders.begin(), folders.end(), "deep.txt"));

  const auto json = nlohmann::json::parse(drive.run({"ls", "--json", "/"}).lines().at(1));
  EXPECT_EQ(json["name"], "beta.txt");
  EXPECT_EQ(json["path"], "/beta.txt");
  EXPECT_EQ(json["size"], 5);
  EXPECT_EQ(json["kind"], "document");
}

TEST(Commands, NamesOfAnyBytesRoundTrip) {
  Drive drive;
  const Lines names{"line\nend", "bad\xff\xfe",        "A", "a", "e\xcc\x81",
                    "\xc3\xa9",  std::string(255, 'n')};
  for (const std::string& name : names) drive.write('/' + name, name);

  std::set<std::string> listed;
  for (const std::string& line : drive.run({"ls", "--json", "/"}).lines()) {
    const auto json = nlohmann::json::parse(line);
    const std::string identifier = json["id"];
    const Result path = drive.run({"path", identifier});
    ASSERT_EQ(path.code, 0) << path.errors;
    const std::string name = path.output.substr(1, path.output.size() - 2);
    EXPECT_TRUE(listed.insert(name).second) << name;
    EXPECT_EQ(drive.run({"id", '/' + name}).output, identifier + '\n');
    EXPECT_EQ(json.contains("nameBytes"), name == names[1]);
  }
  EXPECT_EQ(listed, std::set<std::string>(names.begin(), names.end()));
}

TEST(Commands, StatTellsAnItemByPathAndIdentifier) {
  Drive drive;
  drive.write("/letter.txt", "dear");
  const Result byPath = drive.run({"stat", "--json", "/letter.txt"});
  ASSERT_EQ(byPath.code, 0) << byPath.errors;
  const auto json = nlohmann::json::parse(byPath.output);
  EXPECT_EQ(json["size"], 4);
  EXPECT_EQ(json["url"], "file://" + drive.store() + "/letter.txt");
  EXPECT_EQ(drive.run({"stat", "--json", json["id"]}).output, byPath.output);
  EXPECT_NE(drive.run({"stat", "/letter.txt"}).output.find("identifier"), std::string::npos);
}

TEST(Commands, ExitCodesTellWhatWentWrong) {
  Drive drive;
  EXPECT_EQ(drive.run({"ls", "/nothing"}).code, 3);
  EXPECT_EQ(drive.run({"stat", "/nothing"}).code, 3);
  EXPECT_EQ(drive.run({"path", "d00000000000000ff"}).code, 3);
  const Result usage = drive.run({"ls", "/a/../b"});
  EXPECT_EQ(usage.code, 2);
  EXPECT_EQ(usage.errors.rfind("skein: ", 0), 0U) << usage.errors;
  EXPECT_EQ(drive.run({"no-such-command"}).code, 2);
  EXPECT_EQ(drive.run({"changes", "--since", "nonsense"}).code, 2);
  EXPECT_EQ(drive.run({"ls", "--store", "/no/such/folder"}).code, 1);
  for (const char* command : {"ls", "stat", "id", "path", "watch", "changes", "account", "status",
                              "log", "doctor", "stop"}) {
    const Result help = drive.run({command, "--help"});
    EXPECT_EQ(help.code, 0);
    EXPECT_NE(help.output.find("Example: "), std::string::npos) << command;
  }
}

TEST(Commands, LoggedOutIsToldAndLoggingInMendsIt) {
  Drive drive;
  drive.write("/letter.txt", "");
  ASSERT_EQ(drive.run({"account", "login", "kim"}).code, 0);
  EXPECT_EQ(drive.run({"account", "status"}).code, 0);
  ASSERT_EQ(drive.run({"account", "logout"}).code, 0);
  EXPECT_EQ(drive.run({"account", "status"}).code, 4);
  EXPECT_EQ(drive.run({"ls", "/"}).code, 4);
  EXPECT_EQ(drive.run({"stat", "/letter.txt"}).code, 4);
  ASSERT_EQ(drive.run({"account", "login", "--no-app-id"}).code, 0);
  EXPECT_EQ(drive.run({"ls", "/"}).code, 4);
  ASSERT_EQ(drive.run({"account", "login", "kim"}).code, 0);
  EXPECT_EQ(drive.list("/"), (Lines{"letter.txt"}));
}

TEST(Commands, WatchSeesWhatHappensAndSurvivesVald) {
  Drive drive;
  drive.write("/old.txt", "");
  const auto watch = drive.start({"watch", "/", "--ready-fd", "1"});
  ASSERT_EQ(watch->readLine(20s), "ready") << watch->errors;

  drive.write("/new.txt", "1");
  const auto created = watch->readLine(5s);
  EXPECT_EQ(created, "created  new.txt");
  std::filesystem::rename(drive.store() + "/old.txt", drive.store() + "/older.txt");
  auto next = watch->readLine(5s);
  while (next == "changed  new.txt") next = watch->readLine(5s);
  EXPECT_EQ(next, "renamed  old.txt -> older.txt");

  // What happens while vald is away is told once it is back.
  const pid_t vald = drive.daemon();
  ASSERT_GT(vald, 0);
  sendSignal(vald, SIGKILL);
  std::filesystem::remove(drive.store() + "/older.txt");
  next = watch->readLine(15s);
  while (next && firstWord(*next) == "changed") next = watch->readLine(15s);
  EXPECT_EQ(next, "deleted  older.txt");
  EXPECT_NE(drive.daemon(), vald);
  sendSignal(watch->pid(), SIGINT);
  EXPECT_EQ(watch->finish(5s), 130);
}

TEST(Commands, ChangesGoOnFromTheTokenPrintedLast) {
  Drive drive;
  drive.write("/one.txt", "");
  const Lines first = drive.run({"changes", "--since", "initial"}).lines();
  ASSERT_FALSE(first.empty());
  EXPECT_TRUE(std::count(first.begin(), first.end(), "changed  one.txt"));
  const std::string token = first.back().substr(first.back().rfind(' ') + 1);

  const auto watch = drive.start({"watch", "--working-set", "--count", "1", "--ready-fd", "1"});
  ASSERT_EQ(watch->readLine(20s), "ready") << watch->errors;
  drive.write("/two.txt", "");
  EXPECT_EQ(watch->readLine(10s), "created  two.txt");
  EXPECT_EQ(watch->finish(5s), 0);
  const Lines second = drive.run({"changes", "--since", token}).lines();
  EXPECT_TRUE(std::count(second.begin(), second.end(), "changed  two.txt"));
  EXPECT_FALSE(std::count(second.begin(), second.end(), "changed  one.txt"));
}

// The link of a watch breaks while the folder's name is already another folder's.
TEST(Commands, AWatchOfARenamedFolderHearsOnAfterItsLinkBroke) {
  Drive drive;
  const std::string store = drive.store();
  std::filesystem::create_directory(store + "/a");
  drive.write("/a/old.txt", "");
  ASSERT_EQ(symlink("a", (store + "/alias").c_str()), 0);
  EXPECT_EQ(drive.list("/alias"), (Lines{"old.txt"}));
  const auto watch = drive.start({"watch", "/a", "--ready-fd", "1"});
  ASSERT_EQ(watch->readLine(20s), "ready") << watch->errors;
  const auto ofAlias = drive.start({"watch", "/alias", "--json", "--ready-fd", "1"});
  ASSERT_EQ(ofAlias->readLine(20s), "ready") << ofAlias->errors;
  drive.write("/a/first.txt", "");
  EXPECT_EQ(watch->readLine(10s), "created  first.txt");
  EXPECT_NE(ofAlias->readLine(10s).value_or("").find("\"path\":\"/a/first.txt\""),
            std::string::npos);

  std::filesystem::rename(store + "/a", store + "/b");
  std::filesystem::create_directory(store + "/a");
  ASSERT_EQ(drive.run({"account", "login", "other"}).code, 0);
  drive.write("/b/new.txt", "");
  auto next = watch->readLine(10s);
  while (next && firstWord(*next) == "changed") next = watch->readLine(10s);
  EXPECT_EQ(next, "created  new.txt");
  std::filesystem::remove_all(store + "/b");
  EXPECT_NE(watch->finish(10s), 0);
}

TEST(Commands, DoctorFindsNothingInAHealthyDrive) {
  Drive drive;
  std::filesystem::create_directories(drive.store() + "/a/b");
  drive.write("/a/b/file", "text");
  drive.write("/.hidden", "");
  const Result doctor = drive.run({"doctor", "--json"});
  EXPECT_EQ(doctor.code, 0) << doctor.output << doctor.errors;
  const auto last = nlohmann::json::parse(doctor.lines().back());
  EXPECT_EQ(last["differences"], 0);
  EXPECT_EQ(last["folders"], 3);
  EXPECT_EQ(last["items"], 4);
}

TEST(Commands, AStoppedOrKilledVald) {
  Drive drive;
  drive.write("/letter.txt", "");
  ASSERT_EQ(drive.list("/"), (Lines{"letter.txt"}));
  sendSignal(drive.daemon(), SIGKILL);
  EXPECT_EQ(drive.list("/"), (Lines{"letter.txt"}));

  const pid_t vald = drive.daemon();
  sendSignal(vald, SIGSTOP);
  // All at once: each waits for its own deadline.
  const std::vector<Arguments> commands{
      {"ls", "/"},      {"stat", "/letter.txt"},           {"id", "/letter.txt"}, {"status"},
      {"watch", "/"},   {"changes", "--since", "initial"}, {"account", "status"}, {"doctor"},
      {"ls", "-R", "/"}};
  std::vector<std::unique_ptr<Process>> running;
  for (const Arguments& arguments : commands) running.push_back(drive.start(arguments));
  for (std::size_t i = 0; i < commands.size(); ++i) {
    EXPECT_EQ(running[i]->finish(kAnswersWithin), 5) << commands[i][0] << running[i]->output;
    EXPECT_NE(running[i]->errors.find("vald"), std::string::npos) << running[i]->errors;
  }
  sendSignal(vald, SIGCONT);
  EXPECT_EQ(drive.list("/"), (Lines{"letter.txt"}));

  const pid_t host = drive.host();
  sendSignal(host, SIGSTOP);
  const auto stopped = drive.start({"ls", "/"});
  EXPECT_EQ(stopped->finish(kAnswersWithin), 5);
  EXPECT_NE(stopped->errors.find("skein-host"), std::string::npos) << stopped->errors;
  sendSignal(host, SIGCONT);
}

TEST(Commands, StopLeavesNothingRunning) {
  Drive drive;
  ASSERT_EQ(drive.run({"ls", "/"}).code, 0);
  const pid_t host = drive.host();
  const pid_t vald = drive.daemon();
  ASSERT_GT(host, 0);
  ASSERT_GT(vald, 0);
  const Result stop = drive.run({"stop"});
  EXPECT_EQ(stop.code, 0) << stop.errors;
  EXPECT_NE(stop.output.find(std::to_string(vald)), std::string::npos);
  EXPECT_TRUE(waitUntilGone(host, 0ms));
  EXPECT_TRUE(waitUntilGone(vald, 0ms));
  EXPECT_EQ(drive.run({"stop"}).output, "nothing was running\n");
}

TEST(Commands, LogShowsOneRequestsSection) {
  Drive drive;
  drive.write("/letter.txt", "");
  ASSERT_EQ(drive.run({"log", "--level", "debug"}).code, 0);
  ASSERT_EQ(drive.run({"stat", "/letter.txt"}).code, 0);
  std::string section;
  for (const std::string& line : drive.run({"log", "-n", "1000"}).lines()) {
    const auto at = line.find("┏");
    if (at == std::string::npos || line.find("asked properties for d") == std::string::npos)
      continue;
    section = firstWord(line.substr(at + std::string("┏").size()));
  }
  ASSERT_FALSE(section.empty());
  const Lines lines = drive.run({"log", "--section", section}).lines();
  ASSERT_GE(lines.size(), 3U);
  EXPECT_NE(lines.front().find("┏" + section + " asked properties"), std::string::npos);
  EXPECT_NE(lines.back().find("┗" + section), std::string::npos);

  // One that begins as if it went on, and never closes.
  ASSERT_EQ(drive.run({"get", "/letter.txt"}).code, 0);
  for (const std::string& line : drive.run({"log", "-n", "1000"}).lines()) {
    const auto at = line.find("┣");
    if (at != std::string::npos && line.find("start providing") != std::string::npos) {
      section = firstWord(line.substr(at + std::string("┣").size()));
    }
  }
  const Lines open = drive.run({"log", "--section", section}).lines();
  ASSERT_EQ(open.size(), 2U);
  EXPECT_NE(open.back().find("url exists, granting the read"), std::string::npos);
}

}  // namespace
}  // namespace skein
