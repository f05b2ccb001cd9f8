// The commands. Each function adds one or a few to the program's parser; the chosen one
// leaves what to do in the invocation, which main runs once everything was parsed.
#pragma once

#include <CLI/CLI.hpp>

#include <functional>
#include <memory>

#include "linux/cli/Output.h"
#include "linux/cli/Session.h"

namespace skein::cli {

struct Invocation {
  DriveChoice drive;
  std::function<int()> run;  // answers the exit code
};

void addListCommand(CLI::App& app, Invocation& invocation);      // ls
void addItemCommands(CLI::App& app, Invocation& invocation);     // stat, id, path
void addChangeCommands(CLI::App& app, Invocation& invocation);   // watch, changes
void addAccountCommand(CLI::App& app, Invocation& invocation);   // account
void addStatusCommands(CLI::App& app, Invocation& invocation);   // status, doctor
void addProcessCommands(CLI::App& app, Invocation& invocation);  // stop
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

}  // namespace skein::cli
