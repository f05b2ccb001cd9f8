// skein cloud
#include <optional>
#include <utility>

#include "linux/cli/CloudText.h"
#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/Progress.h"
#include "linux/protocol/UploadConsent.h"

namespace skein::cli {
namespace {

struct StatusOptions {
  bool json = false;
};

struct KeepOptions {
  std::optional<std::uint32_t> days;
  std::optional<std::uint32_t> percent;
};

struct TryOptions {
  LocalCloudConditions conditions;
  bool reset = false;
};

int runCloudStatus(HostService& host, const StatusOptions& options) {
  const auto [cloud, error] =
      await<LocalCloudStatus>([&](auto reply) { host.cloudStatus(std::move(reply)); });
  if (error) return complainAbout(error);
  Output output;
  if (options.json) {
    output.write(jsonOf(cloud) + '\n');
    return kSuccess;
  }
  const auto field = [&output](std::string label, const std::string& value) {
    label.resize(14, ' ');
    output.write(label);
    output.writeName(value);
    output.write("\n");
  };
  field("in the cloud", sizeText(cloud.usedBytes));
  field("uploads", uploadsText(cloud));
  field("kept", keptText(cloud));
  field("kept for", keepingText(cloud));
  field("waiting", std::to_string(cloud.waiting));
  field("failed", std::to_string(cloud.failed));
  field("left out", std::to_string(cloud.leftOut));
  field("last failure", cloud.lastFailure.empty() ? "none" : cloud.lastFailure);
  field("conditions", conditionsText(cloud.conditions));
  return kSuccess;
}

int runKeep(HostService& host, const KeepOptions& options) {
  const auto [cloud, unknown] =
      await<LocalCloudStatus>([&](auto reply) { host.cloudStatus(std::move(reply)); });
  if (unknown) return complainAbout(unknown);
  const LocalCloudKeeping keeping{options.days.value_or(cloud.keeping.days),
                                  options.percent.value_or(cloud.keeping.percent)};
  const auto [error] =
      await<>([&](auto reply) { host.setCloudKeeping(keeping, std::move(reply)); });
  return error ? complainAbout(error) : kSuccess;
}

int runCollect(HostService& host, const StatusOptions& options) {
  const auto [collection, error] =
      await<LocalCloudCollection>([&](auto reply) { host.collectCloud(std::move(reply)); });
  if (error) return complainAbout(error);
  Output output;
  if (options.json) {
    output.write(jsonOf(collection) + '\n');
  } else {
    output.write("freed " + std::to_string(collection.freedFiles) + ", " +
                 sizeText(collection.freedBytes) + "; kept " +
                 std::to_string(collection.keptFiles) + ", " + sizeText(collection.keptBytes) +
                 '\n');
  }
  return kSuccess;
}

int runTry(HostService& host, const TryOptions& options) {
  if (!options.reset && options.conditions == LocalCloudConditions()) {
    complain("nothing to try; name conditions, or end the trial with: skein cloud try --reset");
    return kUsage;
  }
  const auto [error] =
      await<>([&](auto reply) { host.setCloudConditions(options.conditions, std::move(reply)); });
  return error ? complainAbout(error) : kSuccess;
}

// Kept in the drive's state folder, where vald looks; what is uploaded already stays.
int runUploads(const Invocation& invocation, const std::string& word) {
  NSErrorPtr error;
  const DrivePaths paths = invocation.drive.paths(&error);
  if (paths.store.empty()) return complainAbout(error);
  error = setUploadConsent(paths.stateDirectory,
                           word == "on" ? UploadConsent::Given : UploadConsent::Refused);
  return error ? complainAbout(error) : kSuccess;
}

}  // namespace

void addCloudCommand(CLI::App& app, Invocation& invocation) {
  auto* cloud = app.add_subcommand("cloud", "Show the local cloud, or try it out");
  auto status = std::make_shared<StatusOptions>();
  cloud->require_subcommand(0, 1);
  cloud->add_flag("--json", status->json, "As one JSON object");
  cloud->footer("Example: skein cloud");

  auto keep = std::make_shared<KeepOptions>();
  auto* keeping = cloud->add_subcommand(
      "keep", "Set how long old revisions and removed documents stay, whichever ends first");
  keeping->fallthrough();
  auto* ways = keeping->add_option_group("how long");
  ways->add_option("--days", keep->days, "DAYS since the revision was replaced or removed")
      ->check(CLI::Range(0U, LocalCloudKeeping::kMostDays));
  ways->add_option("--percent", keep->percent, "PERCENT of the disk that they take in all")
      ->check(CLI::Range(0U, 100U));
  ways->require_option(1, 2);
  runs(keeping, invocation,
       "What may be the only copy of an evicted document stays for all of the days.\n"
       "Example: skein cloud keep --days 7",
       keep, runKeep);

  auto collecting = std::make_shared<StatusOptions>();
  auto* collect = cloud->add_subcommand("gc", "Remove now what is not kept any longer");
  collect->fallthrough();
  collect->add_flag("--json", collecting->json, "As one JSON object");
  runs(collect, invocation, "Example: skein cloud gc", collecting, runCollect);

  auto options = std::make_shared<TryOptions>();
  LocalCloudConditions& conditions = options->conditions;
  auto* trial = cloud->add_subcommand("try", "Set how the cloud behaves, in place of before");
  trial->fallthrough();
  auto* reset = trial->add_flag("--reset", options->reset, "Behave as usual again");
  const CLI::AsSizeValue size(true);  // as sizes are shown: a kB is 1000 bytes
  for (CLI::Option* option :
       {trial->add_flag("--offline", conditions.offline, "It cannot be reached"),
        trial->add_flag("--corrupt", conditions.corrupt, "Contents arrive with other bytes"),
        trial
            ->add_option("--quota", conditions.quota,
                         "BYTES of room in all, such as 500K, 20M or 1G")
            ->transform(size),
        trial->add_option("--delay", conditions.delayMilliseconds,
                          "MS before the first byte of each transfer"),
        trial
            ->add_option("--bandwidth", conditions.bytesPerSecond,
                         "BYTES per second of each transfer, such as 500K or 20M")
            ->transform(size),
        trial->add_option("--failures", conditions.failures, "So many transfers fail at first")}) {
    option->excludes(reset);
  }
  runs(trial, invocation,
       "Only for a drive that was started with SKEIN_ALLOW_FAULTS=1.\n"
       "Example: skein cloud try --delay 200 --bandwidth 1M\n"
       "         skein cloud try --reset",
       options, runTry);

  auto word = std::make_shared<std::string>();
  auto* uploads = cloud->add_subcommand("uploads", "Agree that documents are copied into it");
  uploads->fallthrough();
  uploads->add_option("STATE", *word, "on, or off: nothing more is uploaded")
      ->required()
      ->check(CLI::IsMember({"on", "off"}));
  uploads->footer("Example: skein cloud uploads on");
  uploads->callback([&invocation, word] {
    invocation.run = [&invocation, word] { return runUploads(invocation, *word); };
  });

  // Runs after that of its subcommand.
  cloud->callback([&invocation, cloud, status] {
    if (!cloud->get_subcommands().empty()) return;
    invocation.run = [&invocation, status] {
      return withSession(invocation,
                         [&](HostService& host) { return runCloudStatus(host, *status); });
    };
  });
}

}  // namespace skein::cli
