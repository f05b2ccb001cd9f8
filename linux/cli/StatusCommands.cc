// skein status, skein doctor
#include <utility>

#include "linux/cli/CloudText.h"
#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/Progress.h"

namespace skein::cli {
namespace {

struct DoctorOptions {
  bool json = false;
  bool quick = false;
};

std::string_view wordOf(LocalDaemonStatus::Scan scan) {
  switch (scan) {
    case LocalDaemonStatus::Scan::Idle: return "idle";
    case LocalDaemonStatus::Scan::First: return "first scan";
    case LocalDaemonStatus::Scan::Verifying: return "verifying";
    case LocalDaemonStatus::Scan::Rescanning: return "rescanning";
  }
  return "idle";
}

std::string_view wordOf(HostDifference::Kind kind) {
  switch (kind) {
    case HostDifference::Kind::MissingInIndex: return "missing in the index";
    case HostDifference::Kind::MissingInStore: return "missing on disk";
    case HostDifference::Kind::Attributes: return "attributes differ";
    case HostDifference::Kind::Identity: return "identity differs";
    case HostDifference::Kind::MissingInListing: return "not listed";
    case HostDifference::Kind::OnlyInListing: return "listed only";
    case HostDifference::Kind::Listing: return "listed wrongly";
    case HostDifference::Kind::Contents: return "cannot come back";
  }
  return "differs";
}

std::string scanText(const LocalDaemonStatus& daemon) {
  std::string text(wordOf(daemon.scan));
  if (daemon.scan != LocalDaemonStatus::Scan::Idle) {
    text += ", " + std::to_string(daemon.scannedFolders) + " folders done, " +
            std::to_string(daemon.pendingFolders) + " waiting";
  }
  if (daemon.unreadableFolders > 0) {
    text += ", " + std::to_string(daemon.unreadableFolders) + " folders cannot be read";
  }
  return text;
}

std::string watchText(const LocalDaemonStatus& daemon) {
  std::string text = daemon.watch == LocalDaemonStatus::Watch::Complete ? "complete" : "degraded";
  text += ", " + std::to_string(daemon.watches) + " of " + std::to_string(daemon.watchBudget) +
          " watches";
  if (daemon.overflows > 0) text += ", " + std::to_string(daemon.overflows) + " overflows";
  if (!daemon.watchReason.empty()) text += " (" + daemon.watchReason + ')';
  return text;
}

void writeStatus(Output& output, const HostStatus& status, const LocalCloudStatus& cloud) {
  const LocalDaemonStatus& daemon = status.daemon;
  const auto field = [&](std::string label, const std::string& value) {
    label.resize(12, ' ');
    output.write(label);
    output.writeName(value);
    output.write("\n");
  };
  field("store", daemon.store);
  field("documents", std::to_string(daemon.documents));
  field("folders", std::to_string(daemon.folders));
  field("aliases", std::to_string(daemon.aliases));
  field("scan", scanText(daemon));
  field("watch", watchText(daemon));
  field("changes", "up to " + std::to_string(daemon.rank) + ", kept from " +
                       std::to_string(daemon.oldestTokenRank));
  field("cloud", summaryOf(cloud));
  for (const std::string& note : daemon.notes) field("note", note);
  field("account", !daemon.account ? "nobody is logged in"
                   : daemon.account->perAppAccountIdentifier
                       ? daemon.account->name
                       : daemon.account->name + " (no identifier for this app)");
  field("vald", "process " + std::to_string(daemon.processID) + ", " +
                    std::to_string(daemon.senders) + " update senders");
  field("skein-host", "process " + std::to_string(status.processID) + ", " +
                          std::to_string(status.watchedContainers) + " watched containers" +
                          (status.debugLog ? ", debug lines are logged" : ""));
}

void writeJson(Output& output, const HostStatus& status, const LocalCloudStatus& cloud) {
  const LocalDaemonStatus& daemon = status.daemon;
  std::string json = "{\"store\":" + jsonString(daemon.store) + jsonBytes("store", daemon.store);
  const auto number = [&](const char* key, auto value) {
    json += std::string(",\"") + key + "\":" + std::to_string(value);
  };
  number("documents", daemon.documents);
  number("folders", daemon.folders);
  number("aliases", daemon.aliases);
  json += ",\"scan\":" + jsonString(wordOf(daemon.scan));
  number("scannedFolders", daemon.scannedFolders);
  number("pendingFolders", daemon.pendingFolders);
  number("unreadableFolders", daemon.unreadableFolders);
  json += std::string(",\"watch\":\"") +
          (daemon.watch == LocalDaemonStatus::Watch::Complete ? "complete" : "degraded") + '"';
  json += ",\"watchReason\":" + jsonString(daemon.watchReason);
  number("watches", daemon.watches);
  number("watchBudget", daemon.watchBudget);
  number("overflows", daemon.overflows);
  number("rank", daemon.rank);
  number("oldestTokenRank", daemon.oldestTokenRank);
  number("senders", daemon.senders);
  json += ",\"account\":" + (daemon.account ? jsonString(daemon.account->name) : "null");
  json += ",\"notes\":[";
  for (std::size_t i = 0; i < daemon.notes.size(); ++i) {
    json += (i == 0 ? "" : ",") + jsonString(daemon.notes[i]);
  }
  json += ']';
  number("processID", daemon.processID);
  number("hostProcessID", status.processID);
  number("watchedContainers", status.watchedContainers);
  json += std::string(",\"debugLog\":") + (status.debugLog ? "true" : "false");
  output.write(json + ",\"cloud\":" + jsonOf(cloud) + "}\n");
}

int runStatus(HostService& host, bool json) {
  const auto [status, error] =
      await<HostStatus>([&](auto reply) { host.status(std::move(reply)); });
  if (error) return complainAbout(error);
  const auto [cloud, problem] =
      await<LocalCloudStatus>([&](auto reply) { host.cloudStatus(std::move(reply)); });
  if (problem) return complainAbout(problem);
  Output output;
  if (json) {
    writeJson(output, status, cloud);
  } else {
    writeStatus(output, status, cloud);
  }
  return kSuccess;
}

// What the disk and the index do not differ in, and a person should know all the same.
void tellNotes(HostService& host, Output& output, bool json) {
  const auto [status, error] =
      await<HostStatus>([&](auto reply) { host.status(std::move(reply)); });
  for (const std::string& note : status.daemon.notes) {
    if (json) {
      output.write("{\"note\":" + jsonString(note) + "}\n");
    } else {
      output.write("note  ");
      output.writeName(note);
      output.write("\n");
    }
  }
}

// What was verified so far; empty when nothing is evicted.
std::string verifiedText(const HostCheckStep& step) {
  if (step.verified == 0) return {};
  return ", " + std::to_string(step.verified) + " evicted looked at in the cloud (" +
         sizeText(step.verifiedBytes) + " read)";
}

int runDoctor(HostService& host, const DoctorOptions& options) {
  const bool json = options.json;
  const auto [check, error] = await<std::shared_ptr<HostCheck>>(
      [&](auto reply) { host.check(options.quick, std::move(reply)); });
  if (error) return complainAbout(error);
  Output output;
  Progress progress;
  std::uint64_t found = 0;
  for (;;) {
    Awaited<HostCheckStep> next;
    check->next(next.reply());
    const auto [step, problem] = next.wait();
    if (problem) {
      progress.clear();
      return complainAbout(problem);
    }
    if (!step.differences.empty()) progress.clear();
    for (const HostDifference& difference : step.differences) {
      ++found;
      if (json) {
        output.write("{\"difference\":" + jsonString(wordOf(difference.kind)) + ",\"path\":" +
                     jsonString(difference.path) + jsonBytes("path", difference.path) +
                     ",\"detail\":" + jsonString(difference.detail) + "}\n");
        continue;
      }
      output.write(wordOf(difference.kind));
      output.write("  ");
      output.writeName(difference.path);
      if (!difference.detail.empty()) {
        output.write(": ");
        output.writeName(difference.detail);
      }
      output.write("\n");
    }
    output.flush();
    progress.show(std::to_string(step.folders) + " folders, " + std::to_string(step.items) +
                  " items compared" + verifiedText(step) + " ...");
    if (!step.finished) continue;
    progress.clear();
    tellNotes(host, output, json);
    if (json) {
      output.write("{\"folders\":" + std::to_string(step.folders) + ",\"items\":" +
                   std::to_string(step.items) + ",\"verified\":" + std::to_string(step.verified) +
                   ",\"verifiedBytes\":" + std::to_string(step.verifiedBytes) +
                   ",\"differences\":" + std::to_string(found) + "}\n");
    } else {
      output.write(std::to_string(step.folders) + " folders, " + std::to_string(step.items) +
                   " items" + verifiedText(step) + ": " +
                   (found == 0 ? "no" : std::to_string(found)) +
                   (found == 1 ? " difference\n" : " differences\n"));
    }
    return found == 0 ? kSuccess : kFailure;
  }
}

}  // namespace

void addStatusCommands(CLI::App& app, Invocation& invocation) {
  auto json = std::make_shared<bool>(false);
  auto* status = app.add_subcommand("status", "Show the store, counts, scan, watches, processes");
  status->add_flag("--json", *json, "As one JSON object");
  status->footer("Example: skein status");
  status->callback([&invocation, json] {
    invocation.run = [&invocation, json] {
      return withSession(invocation, [&](HostService& host) { return runStatus(host, *json); });
    };
  });

  auto* doctor = app.add_subcommand(
      "doctor",
      "Compare the disk with the index and with what the extension lists, and verify that what "
      "is evicted can come back");
  auto options = std::make_shared<DoctorOptions>();
  doctor->add_flag("--json", options->json, "One JSON object per line");
  doctor->add_flag("--quick", options->quick,
                   "Look for the contents of what is evicted, and do not read them");
  runs(doctor, invocation, "Exit code 1 when there is a difference. Example: skein doctor", options,
       runDoctor);
}

}  // namespace skein::cli
