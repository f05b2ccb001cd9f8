// skein: the drive's command line. Reads the arguments and runs one command.
#include <csignal>
#include <cstdlib>
#include <cstring>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/Interruption.h"
#include "linux/protocol/StandardDescriptors.h"

namespace {

constexpr char kFooter[] =
    R"(Paths begin at the drive's root: / is the drive's folder. Each command has its own --help.

Example: skein --store ~/Documents ls -l /

Exit codes: 0 success, 1 failure, 2 usage, 3 no such item, 4 not authenticated,
5 unreachable, 6 collision, 7 quota or full disk, 8 refused, 130 interrupted. Of several
items that failed, the first one's.)";

}  // namespace

int main(int argc, char** argv) {
  using namespace skein::cli;
  skein::openStandardDescriptors();
  installInterruption();
  std::signal(SIGPIPE, SIG_IGN);

  CLI::App app("The command line of a Skein drive.", "skein");
  Invocation invocation;
  if (const char* store = std::getenv("SKEIN_STORE")) invocation.drive.store = store;
  app.set_version_flag("--version", std::string("skein ") + SKEIN_VERSION);
  app.add_option("--store", invocation.drive.store,
                 "The drive's folder (SKEIN_STORE, or ~/Skein if not given)");
  app.require_subcommand(1);
  app.fallthrough();
  app.footer(kFooter);
  addListCommand(app, invocation);
  addItemCommands(app, invocation);
  addContentCommands(app, invocation);
  addImportCommand(app, invocation);
  addPlaceCommands(app, invocation);
  addTrashCommands(app, invocation);
  addTagCommand(app, invocation);
  addMarkCommands(app, invocation);
  addWhyCommand(app, invocation);
  addThumbCommand(app, invocation);
  addChangeCommands(app, invocation);
  addAccountCommand(app, invocation);
  addStatusCommands(app, invocation);
  addCloudCommand(app, invocation);
  addShareCommand(app, invocation);
  addCollabCommand(app, invocation);
  addLogCommand(app, invocation);
  addProcessCommands(app, invocation);
  addDriveCommands(app, invocation);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error);  // help, or the version
    complain(std::string(error.what()) + "; see: skein --help");
    return kUsage;
  }
  const int code = invocation.run();
  // Everything is written. What the connection's threads still tidy up ends with the process.
  std::_Exit(code);
}
