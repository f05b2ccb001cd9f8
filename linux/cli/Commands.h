// The commands. Each function adds one or a few to the program's parser; the chosen one
// leaves what to do in the invocation, which main runs once everything was parsed.
#pragma once

#include <CLI/CLI.hpp>

#include <functional>
#include <memory>
#include <string>
#include <utility>

#include "linux/cli/Output.h"
#include "linux/cli/Session.h"

namespace skein::cli {

struct Invocation {
  DriveChoice drive;
  std::function<int()> run;  // answers the exit code
};

void addListCommand(CLI::App& app, Invocation& invocation);      // ls
void addItemCommands(CLI::App& app, Invocation& invocation);     // stat, id, path
void addContentCommands(CLI::App& app, Invocation& invocation);  // get, cat, evict
void addImportCommand(CLI::App& app, Invocation& invocation);    // import
void addPlaceCommands(CLI::App& app, Invocation& invocation);    // mkdir, mv, alias, ...
void addTrashCommands(CLI::App& app, Invocation& invocation);    // trash, restore, rm
void addTagCommand(CLI::App& app, Invocation& invocation);       // tag
void addMarkCommands(CLI::App& app, Invocation& invocation);     // favorite, touch-used
void addWhyCommand(CLI::App& app, Invocation& invocation);       // why
void addThumbCommand(CLI::App& app, Invocation& invocation);     // thumb
void addChangeCommands(CLI::App& app, Invocation& invocation);   // watch, changes
void addAccountCommand(CLI::App& app, Invocation& invocation);   // account
void addCloudCommand(CLI::App& app, Invocation& invocation);     // cloud
void addStatusCommands(CLI::App& app, Invocation& invocation);   // status, doctor
void addProcessCommands(CLI::App& app, Invocation& invocation);  // stop
void addDriveCommands(CLI::App& app, Invocation& invocation);    // drives, forget
void addLogCommand(CLI::App& app, Invocation& invocation);       // log
void addShareCommand(CLI::App& app, Invocation& invocation);     // share
void addCollabCommand(CLI::App& app, Invocation& invocation);    // collab

// Opens the drive's session and runs `command(host)`; complains when there is no drive.
template <class Command>
int withSession(const Invocation& invocation, Command command) {
  NSErrorPtr error;
  const auto session = Session::open(invocation.drive, &error);
  if (!session) return complainAbout(error);
  return command(session->host());
}

// Ends the drive's processes and waits until they are gone; tells of each, and in `any`
// whether there was one. The exit code.
int stopProcesses(const DrivePaths& paths, Output& output, bool& any);

// Has the command run `run(host, options)`. The footer is shown below its options.
template <class Options>
void runs(CLI::App* command, Invocation& invocation, const std::string& footer,
          std::shared_ptr<Options> options, int (*run)(HostService&, const Options&)) {
  command->footer(footer);
  command->callback([&invocation, options = std::move(options), run] {
    invocation.run = [&invocation, options, run] {
      return withSession(invocation, [&](HostService& host) { return run(host, *options); });
    };
  });
}

}  // namespace skein::cli
