// Many commands at once, with the real programs.
#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include "tests/integration/Drive.h"

namespace skein {
namespace {

constexpr int kFolders = 16;
constexpr int kUnreachable = 5;
// Many times what they need: the machine that runs the tests may be busy with others.
constexpr std::chrono::seconds kAllWithin{60};

// Four commands for each folder: all lookups that nobody has made before.
std::vector<Arguments> commandsOn(int folders) {
  std::vector<Arguments> commands;
  for (int number = 0; number < folders; ++number) {
    const std::string folder = "/folder" + std::to_string(100 + number);
    commands.push_back({"ls", folder});
    commands.push_back({"id", folder + "/a"});
    commands.push_back({"stat", "--json", folder + "/b"});
    commands.push_back({"id", folder});
  }
  return commands;
}

std::vector<std::unique_ptr<Process>> startAll(const Drive& drive,
                                               const std::vector<Arguments>& commands) {
  std::vector<std::unique_ptr<Process>> running;
  for (const Arguments& arguments : commands) running.push_back(drive.start(arguments));
  return running;
}

// All of them at once: each has the right answer.
void expectEveryAnswer(const Drive& drive, int folders) {
  const std::vector<Arguments> commands = commandsOn(folders);
  const auto running = startAll(drive, commands);
  std::set<std::string> identifiers;
  for (std::size_t at = 0; at < running.size(); ++at) {
    Process& process = *running[at];
    const std::string& target = commands[at].back();
    EXPECT_EQ(process.finish(kAllWithin), 0)
        << commands[at].front() << ' ' << target << ": " << process.errors;
    switch (at % 4) {
      case 0: EXPECT_EQ(process.output, "a\nb\n") << target; break;
      case 2:
        EXPECT_NE(process.output.find("\"" + target + "\""), std::string::npos) << process.output;
        break;
      default: identifiers.insert(process.output); break;
    }
  }
  EXPECT_EQ(identifiers.size(), static_cast<std::size_t>(folders) * 2) << "each has its own";
}

TEST(Crowd, IsAnsweredOnAFreshDriveAndWhileValdIsStoppedAndAfterwards) {
  const Drive drive;
  for (int number = 0; number < kFolders; ++number) {
    const std::string folder = "/folder" + std::to_string(100 + number);
    std::filesystem::create_directory(drive.store() + folder);
    drive.write(folder + "/a", "a");
    drive.write(folder + "/b", "bb");
  }
  expectEveryAnswer(drive, kFolders);

  const pid_t vald = drive.daemon();
  sendSignal(vald, SIGSTOP);
  for (const auto& process : startAll(drive, commandsOn(kFolders))) {
    EXPECT_EQ(process->finish(kAllWithin), kUnreachable) << process->output;
    EXPECT_NE(process->errors.find("vald"), std::string::npos) << process->errors;
  }
  sendSignal(vald, SIGCONT);
  expectEveryAnswer(drive, kFolders / 4);
}

}  // namespace
}  // namespace skein
