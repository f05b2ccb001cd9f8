// What a drive's processes share on disk, and how one starts another.
#include <sys/stat.h>
#include <sys/xattr.h>

#include <array>
#include <cstdlib>
#include <fstream>
#include <iomanip>
#include <regex>
#include <set>
#include <sstream>
#include <thread>

#include "base/Fault.h"
#include "linux/protocol/DrivePaths.h"
#include "linux/protocol/LogFile.h"
#include "linux/protocol/ProcessLauncher.h"
#include "linux/protocol/RunLock.h"
#include "linux/protocol/UnixSocket.h"
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

std::vector<std::string> linesOf(const std::string& path) {
  std::ifstream file(path);
  std::vector<std::string> lines;
  for (std::string line; std::getline(file, line);) lines.push_back(line);
  return lines;
}

class Processes : public testing::Test {
 protected:
  Processes() {
    char name[] = "/tmp/skein-process-XXXXXX";
    folder = mkdtemp(name);
    for (const auto& [variable, below] :
         std::map<const char*, const char*>{{"XDG_RUNTIME_DIR", "/run"},
                                            {"XDG_STATE_HOME", "/state"},
                                            {"XDG_DATA_HOME", "/data"}}) {
      setenv(variable, (folder + below).c_str(), 1);
    }
    mkdir((folder + "/store").c_str(), 0755);
  }
  ~Processes() override { std::filesystem::remove_all(folder); }

  static mode_t modeOf(const std::string& path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 ? status.st_mode & 0777 : 0;
  }
  // The error's text; empty when there is none.
  static std::string problemWith(const std::string& store) {
    NSErrorPtr error;
    const DrivePaths paths = DrivePaths::forStore(store, &error);
    EXPECT_EQ(paths.store.empty(), error != nullptr);
    return error ? error->localizedDescription() : "";
  }
  DrivePaths pathsOf(const std::string& below) const {
    NSErrorPtr error;
    DrivePaths paths = DrivePaths::forStore(folder + below, &error);
    EXPECT_EQ(error, nullptr) << error->localizedDescription();
    return paths;
  }
  // As copying a folder with its attributes does.
  void identify(const std::string& below, const std::string& identity) const {
    EXPECT_EQ(
        setxattr((folder + below).c_str(), "user.skein.drive", identity.data(), identity.size(), 0),
        0);
  }
  void script(const std::string& text) const {
    std::ofstream(folder + "/vald") << "#!/bin/sh\n" << text << "\n";
    chmod((folder + "/vald").c_str(), 0755);
  }
  ProgramToStart program(std::chrono::milliseconds deadline = std::chrono::seconds(20)) const {
    ProgramToStart it;
    it.program = "vald";
    it.arguments = {"--store", folder + "/store"};
    it.socketPath = folder + "/socket";
    it.logPath = folder + "/vald.log";
    it.folder = folder;
    it.deadline = deadline;
    return it;
  }

  std::string folder;
};

TEST_F(Processes, OneDriveHasOnePlaceHoweverItIsSpelled) {
  const DrivePaths paths = pathsOf("/store");
  symlink("store", (folder + "/link").c_str());
  EXPECT_EQ(pathsOf("/link/../link/").daemonSocket, paths.daemonSocket);
  EXPECT_EQ(paths.stateDirectory, folder + "/state/skein/" + paths.driveID);
  mkdir((folder + "/other").c_str(), 0755);
  EXPECT_NE(pathsOf("/other").driveID, paths.driveID);
  setenv("XDG_RUNTIME_DIR", (folder + "/another").c_str(), 1);
  EXPECT_EQ(pathsOf("/store").daemonLock, paths.daemonLock) << "another session";
  const auto folders = {paths.stateDirectory, paths.containersDirectory, paths.cloudDirectory};
  for (const std::string& path : folders) EXPECT_EQ(modeOf(path), 0700U) << path;
  chmod(paths.stateDirectory.c_str(), 0755);
  pathsOf("/store");
  EXPECT_EQ(modeOf(paths.stateDirectory), 0700U) << "closed again";
}

TEST_F(Processes, ADriveThatMovedIsTheSameAndACopyIsAnother) {
  const DrivePaths paths = pathsOf("/store");
  if (paths.driveID.size() != 32) GTEST_SKIP() << "no attributes in " << folder;
  // Renamed: what served it is told to end, once.
  const FileDescriptor daemon = listenOnUnixSocket(paths.daemonSocket, nullptr);
  const FileDescriptor host = listenOnUnixSocket(paths.hostSocket, nullptr);
  rename((folder + "/store").c_str(), (folder + "/a\nb").c_str());
  const DrivePaths moved = pathsOf("/a\nb");
  EXPECT_EQ(moved.driveID, paths.driveID);
  EXPECT_EQ(moved.store, folder + "/a\nb");
  EXPECT_FALSE(std::filesystem::exists(paths.daemonSocket));
  EXPECT_FALSE(std::filesystem::exists(paths.hostSocket));
  listenOnUnixSocket(paths.daemonSocket, nullptr).reset();
  EXPECT_EQ(pathsOf("/a\nb").driveID, paths.driveID);
  EXPECT_TRUE(std::filesystem::exists(paths.daemonSocket));

  // A new folder at the old place is a new drive, a copy too; the drive stays what it was.
  mkdir((folder + "/store").c_str(), 0755);
  EXPECT_NE(pathsOf("/store").driveID, paths.driveID);
  mkdir((folder + "/copy").c_str(), 0755);
  identify("/copy", paths.driveID);
  const DrivePaths copy = pathsOf("/copy");
  EXPECT_NE(copy.driveID, paths.driveID);
  EXPECT_EQ(copy.driveID.size(), 32U);
  EXPECT_EQ(pathsOf("/copy").driveID, copy.driveID);
  EXPECT_EQ(pathsOf("/a\nb").driveID, paths.driveID);

  // Moved to another volume: copied, then removed.
  mkdir((folder + "/far").c_str(), 0755);
  identify("/far", paths.driveID);
  rmdir((folder + "/a\nb").c_str());
  EXPECT_EQ(pathsOf("/far").driveID, paths.driveID);

  // No name of a folder, so no identity.
  identify("/far", "../../../../../../../../etc/skein");
  EXPECT_EQ(pathsOf("/far").driveID.find('/'), std::string::npos);
}

TEST_F(Processes, ManyAtOnceAgreeOnTheIdentityOfANewDrive) {
  std::array<std::string, 8> identities;
  std::vector<std::thread> threads;
  for (std::string& identity : identities) {
    threads.emplace_back(
        [&] { identity = DrivePaths::forStore(folder + "/store", nullptr).driveID; });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(std::set<std::string>(identities.begin(), identities.end()).size(), 1U);
}

TEST_F(Processes, ADriveKnownByItsPathIsTakenOver) {
  // The state of a drive as it was found by its path alone.
  std::uint64_t hash = 0xcbf29ce484222325U;
  for (const char c : folder + "/store") {
    hash = (hash ^ static_cast<unsigned char>(c)) * 0x100000001b3U;
  }
  std::ostringstream name;
  name << std::hex << std::setw(16) << std::setfill('0') << hash;
  const std::string state = folder + "/state/skein/" + name.str();
  const std::string data = folder + "/data/skein/" + name.str();
  const auto make = [&] {
    std::filesystem::create_directories(state);
    std::filesystem::create_directories(data + "/cloud");
    std::ofstream(state + "/operations.db") << "journal";
    std::ofstream(data + "/cloud/records.db") << "records";
  };
  make();
  // As long as processes of before hold its locks, which they keep elsewhere, nobody starts.
  const std::string run = folder + "/run/skein/" + name.str();
  std::filesystem::create_directories(run);
  {
    RunLock older;
    ASSERT_EQ(older.take(run + "/vald.lock", run + "/none", std::chrono::milliseconds(0), nullptr),
              RunLock::Outcome::Taken);
    const std::string told = problemWith(folder + "/store");
    EXPECT_NE(told.find("kill " + std::to_string(getpid())), std::string::npos) << told;
  }
  const auto isTakenOver = [&] {
    const DrivePaths paths = pathsOf("/store");
    EXPECT_EQ(std::filesystem::exists(state), paths.stateDirectory == state);
    return linesOf(paths.stateDirectory + "/operations.db") ==
               std::vector<std::string>{"journal"} &&
           linesOf(paths.cloudDirectory + "/records.db") == std::vector<std::string>{"records"};
  };
  EXPECT_TRUE(isTakenOver());
  // Cut off between the two folders, and before both.
  const std::string identity = pathsOf("/store").driveID;
  for (const bool withData : {false, true}) {
    std::filesystem::rename(folder + "/state/skein/" + identity, state);
    if (withData) std::filesystem::rename(folder + "/data/skein/" + identity, data);
    EXPECT_TRUE(isTakenOver());
    EXPECT_EQ(pathsOf("/store").driveID, identity);
  }
}

TEST_F(Processes, PathProblemsNameTheirCause) {
  EXPECT_NE(problemWith("").find("--store"), std::string::npos);
  EXPECT_NE(problemWith(folder + "/none").find("No such file"), std::string::npos);
  std::ofstream(folder + "/file") << "x";
  EXPECT_NE(problemWith(folder + "/file").find("has to be a folder"), std::string::npos);
  // A link in the place of the state folder could lead to somebody else's.
  mkdir((folder + "/state").c_str(), 0700);
  symlink(folder.c_str(), (folder + "/state/skein").c_str());
  EXPECT_NE(problemWith(folder + "/store").find("has to be a folder"), std::string::npos);
  if (geteuid() == 0) {
    unlink((folder + "/state/skein").c_str());
    mkdir((folder + "/state/skein").c_str(), 0777);
    ASSERT_EQ(chown((folder + "/state/skein").c_str(), 65534, 65534), 0);
    EXPECT_NE(problemWith(folder + "/store").find("another user"), std::string::npos);
  }
}

TEST_F(Processes, SocketsMayHaveLongPaths) {
  std::string deep = folder;
  while (deep.size() < 300) {
    deep += '/';
    deep.append(60, 'd');
    mkdir(deep.c_str(), 0700);
  }
  const std::string path = deep + "/vald.socket";
  const FileDescriptor listener = listenOnUnixSocket(path, nullptr);
  ASSERT_TRUE(listener);
  EXPECT_EQ(modeOf(path), 0600U);
  int code = 0;
  EXPECT_TRUE(connectToUnixSocket(path, code)) << code;
  EXPECT_FALSE(connectToUnixSocket(deep + "/none/vald.socket", code));
  EXPECT_EQ(code, ENOENT);
}

TEST_F(Processes, LogLinesAreWholeAndHarmless) {
  const auto log = LogFile::open({folder + "/log"}, nullptr);
  ASSERT_TRUE(log);
  EXPECT_EQ(modeOf(folder + "/log"), 0600U);
  log->write(LogType::Error, "[ERROR] a\nb \x1b[31m \xff\t┗5 ");
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 100; ++i) log->write(LogType::Debug, std::string(500, 'x'));
    });
  }
  for (std::thread& thread : threads) thread.join();
  const auto lines = linesOf(folder + "/log");
  ASSERT_EQ(lines.size(), 401U);
  EXPECT_TRUE(std::regex_match(
      lines[0], std::regex(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{6}Z ERROR \d+/\d+ .*)")));
  EXPECT_TRUE(lines[0].ends_with("[ERROR] a\\nb \\x1b[31m \xff\t┗5 "));
  for (std::size_t at = 1; at < lines.size(); ++at) {
    ASSERT_TRUE(lines[at].ends_with(' ' + std::string(500, 'x'))) << at;
  }

  LogFile::takeFaults(log);
  reportFault("a broken promise");
  setFaultHandler(nullptr);
  EXPECT_TRUE(linesOf(folder + "/log").back().ends_with("[CRIT] a broken promise"));
  NSErrorPtr error;
  EXPECT_EQ(LogFile::open({folder + "/none/log"}, &error), nullptr);
  EXPECT_NE(error->localizedDescription().find("/none/log"), std::string::npos);
}

TEST_F(Processes, LogIsRotatedOnce) {
  LogFile::Options options{folder + "/log"};
  options.rotateAt = 1000;
  {
    const auto log = LogFile::open(options, nullptr);
    for (int i = 0; i < 10; ++i) log->write(LogType::Info, std::string(200, 'x'));
  }
  const auto log = LogFile::open(options, nullptr);  // knows how long the file is
  for (int i = 0; i < 4; ++i) log->write(LogType::Info, "last" + std::string(200, 'x'));
  EXPECT_LE(std::filesystem::file_size(folder + "/log"), 1000U);
  EXPECT_LE(std::filesystem::file_size(folder + "/log.1"), 1000U);
  EXPECT_FALSE(linesOf(folder + "/log.1").empty());
}

TEST_F(Processes, ProgramIsReadyWhenItsSocketAccepts) {
  ASSERT_EQ(mkfifo((folder + "/fifo").c_str(), 0600), 0);
  // Started apart from this program: another session, no terminal, nothing inherited.
  script("cd '" + folder + "' && echo \"$1 $2 $(ps -o sid= -p $$) $$ $(ls /proc/$$/fd | wc -l)\"" +
         " > fifo\nread line < fifo");
  // A socket that nobody listens on any more is no sign of life.
  listenOnUnixSocket(folder + "/socket", nullptr).reset();
  std::string told;
  FileDescriptor listener;
  std::thread other([&] {
    std::getline(std::ifstream(folder + "/fifo"), told);
    listener = listenOnUnixSocket(folder + "/socket", nullptr);
  });
  EXPECT_EQ(startProgram(program()), nullptr);
  other.join();
  const std::regex expected("--store " + folder + R"(/store +(\d+) (\d+) (\d+))");
  std::smatch parts;
  ASSERT_TRUE(std::regex_match(told, parts, expected)) << told;
  EXPECT_EQ(parts[1], parts[2]) << "it leads its own session";
  EXPECT_LE(std::stoi(parts[3]), 5);
  // Now that it accepts, nothing is started.
  script("exit 1");
  EXPECT_EQ(startProgram(program()), nullptr);
  std::ofstream(folder + "/fifo") << "end\n";
}

TEST_F(Processes, StartProblemsNameTheirCause) {
  const auto problem = [&](std::chrono::milliseconds deadline) {
    const NSErrorPtr error = startProgram(program(deadline));
    return error ? error->localizedDescription() : "";
  };
  using std::chrono::seconds;
  EXPECT_NE(problem(seconds(20)).find(folder + "/vald cannot be run"), std::string::npos);
  script("echo 'the disk is on fire' >&2; exit 7");
  const std::string failed = problem(seconds(20));
  EXPECT_NE(failed.find("status 7"), std::string::npos) << failed;
  EXPECT_NE(failed.find("the disk is on fire"), std::string::npos) << failed;
  EXPECT_NE(failed.find(folder + "/vald.log"), std::string::npos) << failed;
  script("kill -9 $$");
  EXPECT_NE(problem(seconds(20)).find("signal 9"), std::string::npos);
  // The loser of a race ends with 0; whoever it lost to is waited for.
  script("exit 0");
  EXPECT_NE(problem(std::chrono::milliseconds(30)).find("not ready within 30 ms"),
            std::string::npos);
}

}  // namespace
}  // namespace skein
