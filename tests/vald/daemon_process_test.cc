// What vald's process is made of.
#include <atomic>
#include <cstdlib>
#include <optional>

#include "linux/protocol/RunLock.h"
#include "linux/protocol/UnixSocket.h"
#include "linux/vald/ClosableExecutor.h"
#include "linux/vald/CommandLine.h"
#include "linux/vald/FolderLock.h"
#include "tests/vald/TestDaemon.h"

namespace skein::vald {
namespace {

constexpr std::chrono::milliseconds kNoPatience{0};

TEST(RunLock, IsHeldByOneUntilItGoes) {
  const TemporaryFolder folder;
  const std::string file = folder.path + "/lock";
  const std::string socket = folder.path + "/socket";
  NSErrorPtr error;
  std::optional<RunLock> first(std::in_place);
  ASSERT_EQ(first->take(file, socket, kNoPatience, &error), RunLock::Outcome::Taken);
  EXPECT_EQ(RunLock().take(file, socket, kNoPatience, &error), RunLock::Outcome::AlreadyRunning);
  {
    // While somebody accepts, nobody waits.
    const FileDescriptor listening = listenOnUnixSocket(socket, nullptr);
    ASSERT_TRUE(listening);
    EXPECT_EQ(RunLock().take(file, socket, std::chrono::hours(1), &error),
              RunLock::Outcome::AlreadyRunning);
  }
  first.reset();
  RunLock again;
  EXPECT_EQ(again.take(file, socket, kNoPatience, &error), RunLock::Outcome::Taken);
  EXPECT_FALSE(error);

  std::filesystem::create_symlink(file, folder.path + "/link");
  EXPECT_EQ(RunLock().take(folder.path + "/link", socket, kNoPatience, &error),
            RunLock::Outcome::Failed);
  ASSERT_TRUE(error);
  EXPECT_NE(error->localizedDescription().find("/link"), std::string::npos);
}

TEST(FolderLock, IsHeldByOneWhateverTheFolderIsCalled) {
  const TemporaryFolder folder;
  const std::string name = folder.path + "/a";
  std::filesystem::create_directory(name);
  std::optional<FolderLock> first(std::in_place);
  ASSERT_FALSE(first->take(name, kNoPatience));
  std::filesystem::rename(name, folder.path + "/b");
  const NSErrorPtr refusal = FolderLock().take(folder.path + "/b", kNoPatience);
  ASSERT_TRUE(refusal);
  EXPECT_NE(refusal->localizedDescription().find("kill " + std::to_string(getpid())),
            std::string::npos)
      << refusal->localizedDescription();
  first.reset();
  EXPECT_FALSE(FolderLock().take(folder.path + "/b", kNoPatience));
}

TEST(CommandLine, SaysWhatMakesNoSense) {
  unsetenv("SKEIN_STORE");
  setenv("SKEIN_LOG", "debug", 1);
  std::string problem;
  auto line = parseCommandLine({"--store", "a", "--foreground"}, problem);
  ASSERT_TRUE(line);
  EXPECT_EQ(line->store, "a");
  EXPECT_TRUE(line->foreground);
  EXPECT_EQ(line->logLevel, LogLevel::Debug);
  line = parseCommandLine({"--log-level=notice", "--store=b=c"}, problem);
  ASSERT_TRUE(line);
  EXPECT_EQ(line->store, "b=c");
  EXPECT_EQ(line->logLevel, LogLevel::Notice);
  EXPECT_TRUE(parseCommandLine({"--help"}, problem));
  EXPECT_TRUE(problem.empty());

  using Arguments = std::vector<std::string>;
  for (const Arguments& wrong : {Arguments{}, Arguments{"--store"}, Arguments{"--store="},
                                 Arguments{"x"}, Arguments{"--store", "a", "--foreground=1"},
                                 Arguments{"--store", "a", "--log-level", "loud"}}) {
    problem.clear();
    EXPECT_FALSE(parseCommandLine(wrong, problem));
    EXPECT_FALSE(problem.empty());
  }
  unsetenv("SKEIN_LOG");
}

TEST(ClosableExecutor, RunsWhatCameBeforeItClosedAndDropsTheRest) {
  ClosableExecutor executor(2, "test");
  std::atomic<int> ran{0};
  for (int i = 0; i < 100; ++i) {
    executor.post([&] {
      ++ran;
      executor.post([] {});  // may come before or after the end
    });
  }
  executor.close();
  EXPECT_EQ(ran, 100);
  const auto token = std::make_shared<int>(0);
  executor.post([&ran, token] { ++ran; });
  executor.close();
  EXPECT_EQ(ran, 100);
  EXPECT_EQ(token.use_count(), 1);
}

}  // namespace
}  // namespace skein::vald
