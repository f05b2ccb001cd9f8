// skein stat, skein id, skein path
#include <utility>
#include <vector>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"
#include "linux/cli/Items.h"

namespace skein::cli {
namespace {

std::string stateOf(const NSFileProviderItem& item) {
  std::string state = item.isDownloaded() ? "downloaded" : "not downloaded";
  if (item.isUploaded()) state += ", uploaded";
  if (item.isShared()) state += ", shared";
  if (item.isTrashed()) state += ", in the trash";
  return state;
}

void writeItem(Output& output, const HostItem& found) {
  const NSFileProviderItem& item = *found.item;
  output.writeField("name", item.filename());
  if (!found.path.empty()) output.writeField("path", found.path);
  output.writeField("identifier", item.itemIdentifier());
  output.writeField("parent", item.parentItemIdentifier());
  output.writeField("url", found.url);
  output.writeField("kind", kindOf(item));
  output.writeField("type", item.typeIdentifier().value_or("-"));
  if (const auto size = item.documentSize()) output.writeField("size", std::to_string(*size));
  if (const auto count = item.childItemCount()) {
    output.writeField("children", std::to_string(*count));
  }
  output.writeField("modified", localDate(item.contentModificationDate()));
  output.writeField("created", localDate(item.creationDate()));
  if (item.lastUsedDate()) output.writeField("last used", localDate(item.lastUsedDate()));
  output.writeField("state", stateOf(item));
  if (const std::string tags = tagText(item); !tags.empty()) output.writeField("tags", tags);
  if (const auto rank = item.favoriteRank()) {
    output.writeField("favorite", "rank " + std::to_string(*rank));
  }
}

int runStat(HostService& host, const ItemOptions& options) {
  Output output;
  int code = kSuccess;
  bool first = true;
  for (const std::string& target : options.items) {
    const auto [found, error] =
        await<HostItem>([&](auto reply) { host.item(targetOf(target), std::move(reply)); });
    output.flush();
    if (error) {
      code = complainAbout(error);
      continue;
    }
    if (options.json) {
      output.write('{' + jsonMembers(*found.item, found.path) +
                   ",\"url\":" + jsonString(found.url) + "}\n");
      continue;
    }
    if (!std::exchange(first, false)) output.write("\n");
    writeItem(output, found);
  }
  return code;
}

// One answer a line, in the order of the questions.
template <class Ask>
int runLookups(const ItemOptions& options, Ask ask) {
  Output output;
  int code = kSuccess;
  for (const std::string& target : options.items) {
    const auto [answer, error] =
        await<std::string>([&](auto reply) { ask(target, std::move(reply)); });
    if (error) {
      output.flush();
      code = complainAbout(error);
      continue;
    }
    output.writeName(answer);
    output.write("\n");
  }
  return code;
}

}  // namespace

void addItemCommands(CLI::App& app, Invocation& invocation) {
  auto options = std::make_shared<ItemOptions>();
  auto* stat = app.add_subcommand("stat", "Show one item: identifier, URL, type, dates, state");
  stat->add_option("ITEM", options->items, "Paths from the drive's root, or item identifiers")
      ->required();
  stat->add_flag("--json", options->json, "One JSON object per line");
  stat->footer("Example: skein stat /Documents/letter.txt");
  stat->callback([&invocation, options] {
    invocation.run = [&invocation, options] {
      return withSession(invocation, [&](HostService& host) { return runStat(host, *options); });
    };
  });

  auto* id = app.add_subcommand("id", "Print the identifiers of paths");
  id->add_option("PATH", options->items, "Paths from the drive's root")->required();
  id->footer("Example: skein id /Documents/letter.txt");
  id->callback([&invocation, options] {
    invocation.run = [&invocation, options] {
      return withSession(invocation, [&](HostService& host) {
        return runLookups(*options, [&](const std::string& path, auto reply) {
          host.identifierForPath(path, std::move(reply));
        });
      });
    };
  });

  auto* path = app.add_subcommand("path", "Print the paths of identifiers");
  path->add_option("ID", options->items, "Item identifiers, as skein id prints them")->required();
  path->footer("Example: skein path d00000000000000ff");
  path->callback([&invocation, options] {
    invocation.run = [&invocation, options] {
      return withSession(invocation, [&](HostService& host) {
        return runLookups(*options, [&](const std::string& identifier, auto reply) {
          host.pathForIdentifier(identifier, std::move(reply));
        });
      });
    };
  });
}

}  // namespace skein::cli
