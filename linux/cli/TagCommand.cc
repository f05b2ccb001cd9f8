// skein tag
#include <string_view>
#include <unordered_set>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"
#include "linux/cli/Items.h"

namespace skein::cli {
namespace {

struct TagOptions : ItemOptions {
  std::vector<std::string> set;
  std::vector<std::string> add;
  std::vector<std::string> remove;
  bool clear = false;
  bool list = false;

  bool changes() const { return clear || !set.empty() || !add.empty() || !remove.empty(); }
};

void writeUse(Output& output, const TagUse& tag, bool json) {
  if (json) {
    output.write("{\"tag\":" + jsonString(tag.name) + jsonBytes("tag", tag.name) +
                 ",\"items\":" + std::to_string(tag.items) + "}\n");
  } else {
    std::string count = std::to_string(tag.items);
    count.insert(0, count.size() < 6 ? 6 - count.size() : 0, ' ');
    output.write(count + "  ");
    output.writeName(tag.name);
    output.write("\n");
  }
}

int runList(HostService& host, bool json) {
  Output output;
  std::string after;
  for (;;) {
    const auto [tags, error] = await<std::vector<TagUse>>(
        [&](auto reply) { host.files().tagsInUse(after, std::move(reply)); });
    if (error) return complainAbout(error);
    if (tags.empty()) return kSuccess;
    for (const TagUse& tag : tags) writeUse(output, tag, json);
    after = tags.back().name;
  }
}

// The item's tags after what the options ask for; each once, the old ones first.
std::vector<std::string> tagsAfter(std::vector<std::string> tags, const TagOptions& options) {
  if (options.clear || !options.set.empty()) tags = options.set;
  tags.insert(tags.end(), options.add.begin(), options.add.end());
  std::vector<std::string> result;
  std::unordered_set<std::string_view> told(options.remove.begin(), options.remove.end());
  for (const std::string& tag : tags) {
    if (told.insert(tag).second) result.push_back(tag);
  }
  return result;
}

std::string lineOf(const std::string& item, const HostItem& found, const TagOptions& options) {
  const std::string tags = tagText(*found.item);
  if (options.items.size() == 1) return tags.empty() ? "" : tags + '\n';
  return item + ": " + tags + '\n';
}

int runTag(HostService& host, const TagOptions& options) {
  if (options.list) return runList(host, options.json);
  Report report(options.json);
  return report.each(options.items, [&](const std::string& item) {
    auto [found, error] =
        await<HostItem>([&](auto reply) { host.item(targetOf(item), std::move(reply)); });
    if (!error && options.changes()) {
      const auto start = [&, names = tagsAfter(tagsOf(*found.item), options)](auto reply) {
        host.files().setTags(targetOf(item), names, std::move(reply));
      };
      std::tie(found, error) = awaitOnce<HostItem>(start);
    }
    if (error) return report.failed(item, error);
    const std::string line = options.changes() ? "" : lineOf(item, found, options);
    report.done(item, found, line);
  });
}

}  // namespace

void addTagCommand(CLI::App& app, Invocation& invocation) {
  auto options = std::make_shared<TagOptions>();
  auto* tag = app.add_subcommand("tag", "Show and change the tags of items");
  tag->add_option("PATH", options->items, "Paths from the drive's root, or item identifiers");
  const auto names = [&](const char* option, std::vector<std::string>& into, const char* text) {
    return tag->add_option(option, into, text)->type_name("TAG")->allow_extra_args(false);
  };
  auto* set = names("--set", options->set, "Give the items this tag and no other");
  names("--add", options->add, "Add a tag");
  names("--remove", options->remove, "Take a tag off");
  auto* clear = tag->add_flag("--clear", options->clear, "Take all tags off");
  auto* list = tag->add_flag("--list", options->list, "List every tag, and how many items have it");
  tag->add_flag("--json", options->json, "One JSON object per line");
  set->excludes(clear);
  runs(tag, invocation,
       "Without an option it shows the tags. Each option may be given several times.\n"
       "Example: skein tag /Documents/letter.odt --add work --add urgent\n"
       "         skein tag --list",
       options, runTag);
  tag->parse_complete_callback([options, list] {
    if (options->items.empty() && list->count() == 0) throw CLI::RequiredError("PATH");
  });
}

}  // namespace skein::cli
