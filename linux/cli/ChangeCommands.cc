// skein watch, skein changes
#include <unistd.h>

#include <map>
#include <string>
#include <utility>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"

namespace skein::cli {
namespace {

struct WatchOptions {
  std::string path = "/";
  bool workingSet = false;
  bool json = false;
  std::uint64_t count = 0;
  double timeout = 0;
  int readyDescriptor = -1;
};

std::string_view wordOf(HostChange::Kind kind) {
  switch (kind) {
    case HostChange::Kind::Created: return "created";
    case HostChange::Kind::Changed: return "changed";
    case HostChange::Kind::Deleted: return "deleted";
  }
  return "changed";
}

// Paths of changed items, by those of their folders, each asked for once. For a moment: the
// folders move, too.
class ChangedPaths {
 public:
  explicit ChangedPaths(HostService& host) : _host(host) {}

  // Empty where there is none.
  std::string of(const NSFileProviderItem& item) {
    if (item.isTrashed()) return {};
    const auto [at, isNew] = _folders.try_emplace(item.parentItemIdentifier());
    if (isNew) {
      at->second = std::get<0>(await<std::string>([&](auto reply) {
        _host.pathForIdentifier(item.parentItemIdentifier(), std::move(reply));
      }));
    }
    if (at->second.empty()) return {};
    return (at->second == "/" ? "" : at->second) + '/' + item.filename();
  }

 private:
  HostService& _host;
  std::map<std::string, std::string> _folders;
};

void writeChange(Output& output, const HostChange& change, bool json, ChangedPaths& paths) {
  if (json) {
    std::string line = "{\"change\":\"" +
                       std::string(change.previousFilename ? "renamed" : wordOf(change.kind)) +
                       "\",";
    if (change.previousFilename) {
      line += "\"previousName\":" + jsonString(*change.previousFilename) +
              jsonBytes("previousName", *change.previousFilename) + ',';
    }
    if (change.item) {
      line += jsonMembers(*change.item, paths.of(*change.item));
    } else {
      line += "\"name\":" + jsonString(change.filename) + jsonBytes("name", change.filename) +
              ",\"id\":" + jsonString(change.identifier);
    }
    output.write(line + "}\n");
    return;
  }
  if (change.previousFilename) {
    output.write("renamed  ");
    output.writeName(*change.previousFilename);
    output.write(" -> ");
  } else {
    output.write(wordOf(change.kind));
    output.write("  ");
  }
  output.writeName(change.filename.empty() ? change.identifier : change.filename);
  output.write("\n");
}

int runWatch(HostService& host, const WatchOptions& options) {
  using Clock = std::chrono::steady_clock;
  const HostTarget target =
      options.workingSet ? HostTarget::identifier(NSFileProviderWorkingSetContainerItemIdentifier)
                         : HostTarget::path(options.path);
  const auto [watch, error] =
      await<std::shared_ptr<HostWatch>>([&](auto reply) { host.watch(target, std::move(reply)); });
  if (error) return complainAbout(error);
  if (options.readyDescriptor >= 0 && ::write(options.readyDescriptor, "ready\n", 6) != 6) {
    complain("descriptor " + std::to_string(options.readyDescriptor) +
             " cannot be written to; open it for this command: --ready-fd 9 9>FILE");
    return kUsage;
  }
  std::optional<Clock::time_point> end;
  if (options.timeout > 0) {
    end = Clock::now() + std::chrono::duration_cast<Clock::duration>(
                             std::chrono::duration<double>(options.timeout));
  }
  Output output;
  std::uint64_t seen = 0;
  for (;;) {
    Awaited<std::vector<HostChange>> next;
    watch->next(next.reply());
    const auto answer = next.waitUntil(end);
    if (!answer) return kSuccess;
    const auto& [changes, problem] = *answer;
    ChangedPaths paths(host);
    for (const HostChange& change : changes) {
      writeChange(output, change, options.json, paths);
      if (++seen == options.count) return kSuccess;
    }
    output.flush();
    if (problem) return complainAbout(problem);
  }
}

struct ChangesOptions {
  std::string since;
  bool json = false;
};

int runChanges(HostService& host, const ChangesOptions& options) {
  std::optional<NSData> token;
  if (options.since != "initial") {
    const auto bytes = bytesOfHexadecimal(options.since);
    if (!bytes || bytes->empty()) {
      complain("\"" + options.since +
               "\" is no token; use the one that skein changes printed last, or: initial");
      return kUsage;
    }
    token = NSData(std::string_view(*bytes));
  }
  Output output;
  for (bool more = true; more;) {
    const auto [batch, error] =
        await<HostChangeBatch>([&](auto reply) { host.changesSince(token, std::move(reply)); });
    if (error) {
      output.flush();
      return complainAbout(error);
    }
    ChangedPaths paths(host);
    for (const NSFileProviderItemPtr& item : batch.updates) {
      writeChange(
          output,
          {HostChange::Kind::Changed, item->itemIdentifier(), item->filename(), std::nullopt, item},
          options.json, paths);
    }
    for (const std::string& identifier : batch.deletions) {
      writeChange(output, {HostChange::Kind::Deleted, identifier, "", std::nullopt, nullptr},
                  options.json, paths);
    }
    output.flush();
    token = batch.token;
    more = batch.moreComing;
  }
  const std::string digits = hexadecimal(token->view());
  output.write(options.json ? "{\"token\":\"" + digits + "\"}\n" : "token    " + digits + "\n");
  return kSuccess;
}

}  // namespace

void addChangeCommands(CLI::App& app, Invocation& invocation) {
  auto watchOptions = std::make_shared<WatchOptions>();
  auto* watch = app.add_subcommand("watch", "Show changes as they come, until Ctrl-C");
  watch->add_option("PATH", watchOptions->path, "The folder (/ if not given)");
  watch->add_flag("--working-set", watchOptions->workingSet, "The whole drive instead of a folder");
  watch->add_flag("--json", watchOptions->json, "One JSON object per line");
  watch->add_option("--count", watchOptions->count, "End after so many changes");
  watch->add_option("--timeout", watchOptions->timeout, "End after so many seconds");
  watch->add_option("--ready-fd", watchOptions->readyDescriptor,
                    "Write a line to this descriptor once changes are watched for");
  watch->footer("Example: skein watch --json /Documents");
  watch->callback([&invocation, watchOptions] {
    invocation.run = [&invocation, watchOptions] {
      return withSession(invocation,
                         [&](HostService& host) { return runWatch(host, *watchOptions); });
    };
  });

  auto changesOptions = std::make_shared<ChangesOptions>();
  auto* changes = app.add_subcommand("changes", "Show what changed in the drive since a token");
  changes
      ->add_option("--since", changesOptions->since,
                   "The token printed last, or \"initial\" for everything")
      ->required();
  changes->add_flag("--json", changesOptions->json, "One JSON object per line");
  changes->footer("Example: skein changes --since initial");
  changes->callback([&invocation, changesOptions] {
    invocation.run = [&invocation, changesOptions] {
      return withSession(invocation,
                         [&](HostService& host) { return runChanges(host, *changesOptions); });
    };
  });
}

}  // namespace skein::cli
