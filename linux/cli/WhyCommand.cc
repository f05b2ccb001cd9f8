// skein why
#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/Items.h"

namespace skein::cli {
namespace {

struct WhyOptions {
  std::string item;
  std::uint64_t limit = 20;
  bool json = false;
};

void writeEntry(Output& output, const FileHistoryEntry& entry) {
  output.write(localDate(entry.when) + "  ");
  output.writeName(entry.operation);
  output.write("  ");
  output.writeName(entry.path);
  if (!entry.destination.empty() && entry.destination != entry.path) {
    output.write(" -> ");
    output.writeName(entry.destination);
  }
  output.write("  by ");
  output.writeName(entry.origin.empty() ? "a program that did not say its name" : entry.origin);
  output.write(entry.undone ? " (cut off, and taken back)\n" : "\n");
}

void writeJson(Output& output, const FileHistoryEntry& entry) {
  const auto text = [](const char* key, const std::string& value) {
    return std::string(",\"") + key + "\":" + jsonString(value) + jsonBytes(key, value);
  };
  output.write("{\"when\":\"" + isoDate(entry.when) + '"' + text("operation", entry.operation) +
               text("origin", entry.origin) + text("id", entry.identifier) +
               text("path", entry.path) + text("destination", entry.destination) +
               ",\"undone\":" + (entry.undone ? "true" : "false") + "}\n");
}

int runWhy(HostService& host, const WhyOptions& options) {
  const auto [entries, error] = await<std::vector<FileHistoryEntry>>([&](auto reply) {
    host.files().history(targetOf(options.item), options.limit, std::move(reply));
  });
  if (error) return complainAbout(error);
  Output output;
  for (const FileHistoryEntry& entry : entries) {
    if (options.json) {
      writeJson(output, entry);
    } else {
      writeEntry(output, entry);
    }
  }
  if (!entries.empty()) return kSuccess;
  const auto [found, missing] =
      await<HostItem>([&](auto reply) { host.item(targetOf(options.item), std::move(reply)); });
  if (missing) {
    complain(options.item +
             " is not there, and no request of the drive removed it; another program may have, "
             "or it never was");
    return exitCodeFor(missing);
  }
  if (!options.json) output.write("no request of the drive changed it\n");
  return kSuccess;
}

}  // namespace

void addWhyCommand(CLI::App& app, Invocation& invocation) {
  auto options = std::make_shared<WhyOptions>();
  auto* why = app.add_subcommand("why", "Show which requests made, changed or removed an item");
  why->add_option("ITEM", options->item,
                  "A path from the drive's root, also one where nothing is now; or an identifier")
      ->required();
  why->add_option("-n,--limit", options->limit, "At most so many (20), newest first");
  why->add_flag("--json", options->json, "One JSON object per line");
  runs(why, invocation, "Example: skein why /Documents/letter.odt", options, runWhy);
}

}  // namespace skein::cli
