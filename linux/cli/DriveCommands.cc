// skein drives, skein forget
#include <sys/stat.h>

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/Progress.h"
#include "linux/protocol/DriveIdentity.h"
#include "linux/protocol/RunLock.h"
#include "linux/protocol/UnixSocket.h"
#include "vellum/VLErrors.h"

namespace skein::cli {
namespace {

namespace fs = std::filesystem;

struct ForgetOptions {
  bool force = false;
};

// What is below a folder, as far as it can be read.
struct Contents {
  std::uint64_t files = 0;
  std::uint64_t markers = 0;  // files that stand for evicted documents
  std::uint64_t bytes = 0;    // on the disk
  bool isWhole = true;        // false: a part could not be read
};

bool isMarkerName(const std::string& name) {
  constexpr std::string_view kEnding = ".skein";
  return name.size() > kEnding.size() + 1 && name.front() == '.' && name.ends_with(kEnding);
}

Contents contentsOf(const std::string& path) {
  Contents contents;
  std::error_code failure;
  fs::recursive_directory_iterator entry(path, failure);
  for (; !failure && entry != fs::recursive_directory_iterator(); entry.increment(failure)) {
    struct stat status {};
    if (lstat(entry->path().c_str(), &status) != 0) continue;
    contents.bytes += static_cast<std::uint64_t>(status.st_blocks) * 512;
    if (!S_ISREG(status.st_mode)) continue;
    ++contents.files;
    if (isMarkerName(entry->path().filename())) ++contents.markers;
  }
  contents.isWhole = !failure;
  return contents;
}

// ---- drives

int runDrives(bool json) {
  NSErrorPtr error;
  const DriveTops tops = DrivePaths::tops(&error);
  if (error) return complainAbout(error);
  Output output;
  for (const NotedDrive& drive : notedDrives(tops.state)) {
    const std::string state = tops.state + '/' + drive.name;
    const auto vald = listenerOnUnixSocket(state + kDaemonSocketName);
    const std::uint64_t bytes =
        contentsOf(state).bytes + contentsOf(tops.data + '/' + drive.name).bytes;
    if (json) {
      output.write("{\"drive\":" + jsonString(drive.name) +
                   ",\"path\":" + (drive.path.empty() ? "null" : jsonString(drive.path)) +
                   jsonBytes("path", drive.path) +
                   ",\"isThere\":" + (drive.isThere ? "true" : "false") +
                   ",\"processID\":" + (vald ? std::to_string(vald->pid) : "null") +
                   ",\"bytes\":" + std::to_string(bytes) + "}\n");
      continue;
    }
    output.write(drive.name + "  " + sizeText(bytes) + "  " +
                 (vald            ? "open (vald is process " + std::to_string(vald->pid) + ")"
                  : drive.isThere ? "closed"
                                  : "not there") +
                 "  ");
    output.writeName(drive.path.empty() ? "(where it is is not noted)" : drive.path);
    output.write("\n");
  }
  return kSuccess;
}

// ---- forget

// Whose state goes, and where its folder is: by its name as "skein drives" shows it, since the
// folder may be gone, or else by its folder.
struct Forgotten {
  std::string name;
  std::string path;
  bool isThere = false;
};

NSErrorPtr find(const Invocation& invocation, Forgotten& drive) {
  if (const auto noted = invocation.drive.noted()) {
    drive = {noted->name, noted->path, noted->isThere};
    return nullptr;
  }
  NSErrorPtr error;
  const DrivePaths paths = invocation.drive.known(&error);
  drive = {paths.driveID, paths.store, true};
  return error;
}

// What would be lost with the drive's cloud and containers; empty: nothing.
std::string lossOf(const Forgotten& drive, const std::string& data) {
  const Contents apps = contentsOf(data + "/containers");
  if (apps.files > 0 || !apps.isWhole) {
    return std::to_string(apps.files) + " documents of apps in " + data +
           "/containers; move them away first";
  }
  std::error_code ignored;
  if (contentsOf(data + "/cloud/objects").files == 0) return {};
  if (!drive.isThere) {
    return "copies of documents in " + data + "/cloud, perhaps the only ones: the folder " +
           (drive.path.empty() ? "of the drive" : drive.path) + " is not there, so nobody can tell";
  }
  const Contents documents = contentsOf(drive.path);
  if (!documents.isWhole) return "perhaps evicted documents: not all of it can be read";
  if (documents.markers == 0) return {};
  return "the only copy of " + std::to_string(documents.markers) +
         " evicted documents; fetch them first (skein get)";
}

int runForget(const Invocation& invocation, const ForgetOptions& options) {
  NSErrorPtr error;
  const DriveTops tops = DrivePaths::tops(&error);
  Forgotten drive;
  if (!error) error = find(invocation, drive);
  if (error) return complainAbout(error);
  DrivePaths paths;
  paths.stateDirectory = tops.state + '/' + drive.name;
  paths.hostSocket = paths.stateDirectory + kHostSocketName;
  paths.daemonSocket = paths.stateDirectory + kDaemonSocketName;
  const std::string data = tops.data + '/' + drive.name;

  Output output;
  bool any = false;
  if (const int code = stopProcesses(paths, output, any); code != kSuccess) return code;
  // Nobody starts meanwhile, and what starts after has nothing to find.
  RunLock host;
  RunLock daemon;
  for (const auto& [lock, name] :
       {std::pair(&host, kHostLockName), std::pair(&daemon, kDaemonLockName)}) {
    const auto outcome =
        lock->take(paths.stateDirectory + name, {}, std::chrono::seconds(1), &error);
    if (outcome == RunLock::Outcome::Taken) continue;
    if (error) return complainAbout(error);
    complain("the drive was opened again meanwhile; try once more");
    return kFailure;
  }
  if (const std::string loss = lossOf(drive, data); !loss.empty() && !options.force) {
    complain("nothing was forgotten: " + loss + ". With --force they are lost");
    return kRefused;
  }
  const std::uint64_t bytes = contentsOf(paths.stateDirectory).bytes + contentsOf(data).bytes;
  if (!drive.path.empty()) removeIdentity(drive.path, drive.name);
  for (const std::string& folder : {data, paths.stateDirectory}) {
    std::error_code failure;
    fs::remove_all(folder, failure);
    if (!failure) continue;
    return complainAbout(vl_errorWithPOSIXCode(
        failure.value(), folder + " cannot be removed: " + failure.message() + "."));
  }
  output.write("forgot ");
  output.writeName(drive.path.empty() ? drive.name : drive.path);
  output.write(", " + sizeText(bytes) + " freed\n");
  return kSuccess;
}

}  // namespace

void addDriveCommands(CLI::App& app, Invocation& invocation) {
  auto json = std::make_shared<bool>(false);
  auto* drives = app.add_subcommand("drives", "List the drives that are open or known");
  drives->add_flag("--json", *json, "One JSON object per line");
  drives->footer(
      "The room is that of their state, cloud and app containers.\n"
      "Example: skein drives");
  drives->callback([&invocation, json] { invocation.run = [json] { return runDrives(*json); }; });

  auto options = std::make_shared<ForgetOptions>();
  auto* forget = app.add_subcommand(
      "forget", "Remove all that is kept about a drive; its folder stays as it is");
  forget->add_flag("--force", options->force,
                   "Also when evicted documents, or documents of apps, are lost with it");
  forget->footer(
      "--store names the drive's folder, or the drive as \"skein drives\" shows it.\n"
      "Example: skein --store /tmp/mistyped forget");
  forget->callback([&invocation, options] {
    invocation.run = [&invocation, options] { return runForget(invocation, *options); };
  });
}

}  // namespace skein::cli
