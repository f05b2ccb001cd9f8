#include "linux/vald/CommandLine.h"

#include <cstdlib>

namespace skein::vald {
namespace {

std::optional<LogLevel> logLevelNamed(const std::string& name) {
  if (name == "debug") return LogLevel::Debug;
  if (name == "info") return LogLevel::Info;
  if (name == "notice") return LogLevel::Notice;
  return std::nullopt;
}

std::string fromEnvironment(const char* name) {
  const char* value = std::getenv(name);
  return value != nullptr ? value : "";
}

}  // namespace

std::optional<CommandLine> parseCommandLine(const std::vector<std::string>& arguments,
                                            std::string& problem) {
  CommandLine line;
  line.store = fromEnvironment("SKEIN_STORE");
  line.logLevel = logLevelNamed(fromEnvironment("SKEIN_LOG")).value_or(line.logLevel);

  for (std::size_t i = 0; i < arguments.size(); ++i) {
    std::string option = arguments[i];
    std::optional<std::string> value;
    if (const std::size_t equals = option.find('='); equals != std::string::npos) {
      value = option.substr(equals + 1);
      option.resize(equals);
    }
    if (option == "--store" || option == "--log-level") {
      if (!value && i + 1 < arguments.size()) value = arguments[++i];
      if (!value || value->empty()) {
        problem = option + " needs a value";
        return std::nullopt;
      }
    } else if (value) {
      problem = option + " takes no value";
      return std::nullopt;
    }

    if (option == "--store") {
      line.store = *value;
    } else if (option == "--log-level") {
      const auto level = logLevelNamed(*value);
      if (!level) {
        problem = "unknown log level \"" + *value + "\": debug, info and notice there are";
        return std::nullopt;
      }
      line.logLevel = *level;
    } else if (option == "--foreground") {
      line.foreground = true;
    } else if (option == "--help" || option == "-h") {
      line.help = true;
    } else {
      problem = "unknown argument \"" + option + "\"";
      return std::nullopt;
    }
  }
  if (!line.help && line.store.empty()) {
    problem = "no drive was named: give --store FOLDER, or set SKEIN_STORE";
    return std::nullopt;
  }
  return line;
}

const char* helpText() {
  return "Usage: vald --store FOLDER [--foreground] [--log-level LEVEL]\n"
         "\n"
         "Serves the drive over FOLDER: keeps its index and its history of changes, and\n"
         "answers the drive's other programs, which start it when they need it. Nothing in\n"
         "FOLDER is changed by that, but FOLDER gets an attribute that names the drive. It\n"
         "stays until it is told to stop.\n"
         "\n"
         "  --store FOLDER      the drive's folder (default: $SKEIN_STORE)\n"
         "  --foreground        stay on the terminal, and write the log there too;\n"
         "                      otherwise vald goes to the background once it serves\n"
         "  --log-level LEVEL   debug, info or notice (default: $SKEIN_LOG, or info)\n"
         "  --help              this text\n"
         "\n"
         "Environment:\n"
         "  SKEIN_ALLOW_FAULTS=1   let the owner of the socket ask for faults, for tests\n"
         "  SKEIN_UPLOADS          how much is uploaded into the cloud on this machine: off,\n"
         "                         unlimited, or MiB (default: 1024 where a copy takes room,\n"
         "                         unlimited where the file system shares blocks)\n"
         "  XDG_STATE_HOME, XDG_DATA_HOME, XDG_DATA_DIRS\n"
         "                         where the socket, the index and log, the containers and\n"
         "                         the desktop entries of apps are\n"
         "\n"
         "SIGTERM, SIGINT and SIGHUP end it in order.\n"
         "\n"
         "Exit status:\n"
         "  0   it ended in order, serves in the background now, or another vald serves\n"
         "      this drive already\n"
         "  1   it could not start, or failed; the message and the log say why\n"
         "  2   the arguments make no sense\n";
}

void setLogLevel(Log& log, LogLevel level) {
  log.setEnabled(LogType::Debug, level == LogLevel::Debug);
  log.setEnabled(LogType::Info, level != LogLevel::Notice);
}

}  // namespace skein::vald
