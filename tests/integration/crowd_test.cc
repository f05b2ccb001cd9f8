// Many commands at once, with the real programs.
#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <string>
#include <vector>

#include "tests/integration/Drive.h"

namespace skein {
namespace {

constexpr int kCommands = 64;
constexpr int kUnreachable = 5;
// Several times what they need: the machine that runs the tests may be busy with others.
constexpr std::chrono::seconds kAllWithin{60};

struct Command {
  Arguments arguments;
  std::string output;  // the right one
};

// Every kind of lookup, of folders that nobody has looked into yet.
std::vector<Command> commandsOn(const Drive& drive) {
  std::vector<Command> commands;
  for (int number = 0; number < kCommands / 4; ++number) {
    const std::string folder = "/folder" + std::to_string(100 + number);
    std::filesystem::create_directory(drive.store() + folder);
    drive.write(folder + "/a", "a");
    drive.write(folder + "/b", "bb");
    commands.push_back({{"ls", folder}, "a\nb\n"});
    commands.push_back({{"ls", "-R", folder}, ""});
    commands.push_back({{"id", folder + "/a"}, ""});
    commands.push_back({{"stat", "--json", folder + "/b"}, ""});
  }
  return commands;
}

std::vector<std::unique_ptr<Process>> startAll(const Drive& drive,
                                               const std::vector<Command>& commands) {
  std::vector<std::unique_ptr<Process>> running;
  for (const Command& command : commands) running.push_back(drive.start(command.arguments));
  return running;
}

// All of them at once; each ends well, with the answer that it has alone.
void expectEveryAnswer(const Drive& drive, const std::vector<Command>& commands) {
  const auto running = startAll(drive, commands);
  for (std::size_t at = 0; at < running.size(); ++at) {
    const Command& command = commands[at];
    EXPECT_EQ(running[at]->finish(kAllWithin), 0)
        << command.arguments[0] << ' ' << command.arguments.back() << ": " << running[at]->errors;
    if (command.output.empty()) {
      EXPECT_FALSE(running[at]->output.empty()) << command.arguments.back();
    } else {
      EXPECT_EQ(running[at]->output, command.output) << command.arguments.back();
    }
  }
}

TEST(Crowd, IsAnsweredOnAFreshDriveAndWhileValdIsStoppedAndAfterwards) {
  const Drive drive;
  std::vector<Command> commands = commandsOn(drive);
  expectEveryAnswer(drive, commands);
  // What each says alone is what all must say from now on.
  for (Command& command : commands) {
    const Result alone = drive.run(command.arguments);
    ASSERT_EQ(alone.code, 0) << alone.errors;
    if (!command.output.empty()) {
      EXPECT_EQ(alone.output, command.output);
    }
    command.output = alone.output;
  }
  expectEveryAnswer(drive, commands);

  const pid_t vald = drive.daemon();
  sendSignal(vald, SIGSTOP);
  const auto running = startAll(drive, commands);
  for (const auto& process : running) {
    EXPECT_EQ(process->finish(kAllWithin), kUnreachable) << process->output;
    EXPECT_NE(process->errors.find("vald"), std::string::npos) << process->errors;
  }
  sendSignal(vald, SIGCONT);
  expectEveryAnswer(drive, commands);
}

}  // namespace
}  // namespace skein
