// skein trash, skein restore, skein rm
#include <unistd.h>

#include <iostream>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"
#include "linux/cli/Items.h"
#include "linux/cli/Progress.h"

namespace skein::cli {
namespace {

struct RestoreOptions : ItemOptions {
  std::string folder;
};

struct RemoveOptions : ItemOptions {
  bool folders = false;
  bool force = false;
};

NSErrorPtr trashFailure(std::string text, std::int64_t code = NSFileWriteUnknownError) {
  return NSError::errorWithDomain(NSCocoaErrorDomain, code,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

// The whole trash, newest first.
std::pair<std::vector<HostTrashedItem>, NSErrorPtr> readTrash(HostService& host) {
  auto [trash, error] = await<std::shared_ptr<HostTrash>>(
      [&](auto reply) { host.files().trashedItems(std::move(reply)); });
  std::vector<HostTrashedItem> all;
  for (bool last = false; !error && !last;) {
    Awaited<std::vector<HostTrashedItem>, bool> page;
    trash->next(page.reply());
    auto [items, isLast, problem] = page.wait();
    all.insert(all.end(), std::make_move_iterator(items.begin()),
               std::make_move_iterator(items.end()));
    last = isLast;
    error = std::move(problem);
  }
  return {std::move(all), std::move(error)};
}

// What it was called, and is called in the trash when that is not known.
std::string shownName(const HostTrashedItem& trashed) {
  return trashed.putBackPath.empty() ? trashed.item.item->filename() : trashed.putBackPath;
}

std::string lineOf(const HostTrashedItem& trashed) {
  return localDate(trashed.trashed) + "  " + trashed.item.item->itemIdentifier() + "  " +
         shownName(trashed);
}

int runTrashList(HostService& host, const ItemOptions& options) {
  const auto [items, error] = readTrash(host);
  if (error) return complainAbout(error);
  Output output;
  for (const HostTrashedItem& trashed : items) {
    if (options.json) {
      output.write("{\"putBackPath\":" + jsonString(trashed.putBackPath) +
                   jsonBytes("putBackPath", trashed.putBackPath) +
                   (trashed.trashed ? ",\"trashedAt\":\"" + isoDate(*trashed.trashed) + '"' : "") +
                   ',' + jsonMembers(*trashed.item.item, trashed.item.path) + "}\n");
    } else {
      const std::string line = lineOf(trashed);
      output.write((output.isTerminal() ? escaped(line) : line) + '\n');
    }
  }
  return kSuccess;
}

int runTrash(HostService& host, const ItemOptions& options) {
  return changeEach(options, [&](const std::string& item, HostFiles::ItemReply reply) {
    host.files().trash(targetOf(item), originOf("trash"), std::move(reply));
  });
}

// The one that `text` means: by identifier, by the path it had, or by name.
std::pair<std::string, NSErrorPtr> identifierInTrash(const std::vector<HostTrashedItem>& trash,
                                                     const std::string& text) {
  const auto matching = [&](auto matches) {
    std::vector<const HostTrashedItem*> found;
    for (const HostTrashedItem& trashed : trash) {
      if (matches(trashed)) found.push_back(&trashed);
    }
    return found;
  };
  auto found = matching(
      [&](const HostTrashedItem& trashed) { return trashed.item.item->itemIdentifier() == text; });
  if (found.empty()) {
    found = matching([&](const HostTrashedItem& trashed) { return trashed.putBackPath == text; });
  }
  if (found.empty()) {
    found = matching([&](const HostTrashedItem& trashed) {
      return trashed.item.item->filename() == text || trashed.putBackPath.ends_with('/' + text);
    });
  }
  if (found.empty()) {
    return {"", trashFailure("it is not in the trash; see what is with: skein trash list",
                             NSFileNoSuchFileError)};
  }
  if (found.size() == 1) return {found.front()->item.item->itemIdentifier(), nullptr};
  std::string candidates;
  for (const HostTrashedItem* trashed : found) candidates += "\n  " + lineOf(*trashed);
  return {"", trashFailure(
                  std::to_string(found.size()) +
                  " items in the trash have that name; name one by its identifier:" + candidates)};
}

int runRestore(HostService& host, const RestoreOptions& options) {
  const auto [trash, error] = readTrash(host);
  if (error) return complainAbout(error);
  std::optional<HostTarget> folder;
  if (!options.folder.empty()) {
    if (const auto [found, problem] = folderAt(host, options.folder); problem) {
      return complainAbout(problem);
    }
    folder = targetOf(options.folder);
  }
  Report report(options.json);
  return report.each(options.items, [&, &trash = trash](const std::string& item) {
    const auto [identifier, unclear] = identifierInTrash(trash, item);
    if (unclear) return report.failed(item, unclear);
    const auto start = [&, name = identifier](auto reply) {
      host.files().untrash(HostTarget::identifier(name), folder, originOf("restore"),
                           std::move(reply));
    };
    const auto [restored, problem] = awaitOnce<HostItem>(start);
    if (problem) return report.failed(item, problem);
    // It may have got another name, or another folder.
    const std::string& path = restored.path;
    report.done(item, restored, (report.output().isTerminal() ? escaped(path) : path) + '\n');
  });
}

// Asks on a terminal; elsewhere nobody can be asked, and the command was clear.
bool isWanted(const std::string& item) {
  if (isatty(STDIN_FILENO) != 1 || isatty(STDERR_FILENO) != 1) return true;
  std::cerr << "Remove " << escaped(item) << " for good? [y/N] " << std::flush;
  std::string answer;
  if (waitForInput()) std::getline(std::cin, answer);
  return answer == "y" || answer == "Y" || answer == "yes";
}

NSErrorPtr removeOne(HostService& host, const std::string& item) {
  const auto start = [&](auto reply) {
    host.files().remove(targetOf(item), originOf("rm"), std::move(reply));
  };
  auto [removal, error] = awaitOnce<std::shared_ptr<HostTransfer>>(start);
  return error ? std::move(error) : followTransfer(removal, item).second;
}

int runRemove(HostService& host, const RemoveOptions& options) {
  Report report(options.json);
  return report.each(options.items, [&](const std::string& item) {
    auto [named, error] = namedItem(host, item);
    const bool isFolder = !named.isAlias && named.found.item && named.found.item->isFolder();
    if (!error && isFolder && !options.folders) {
      error = trashFailure("it is a folder; remove it and all that is in it with: skein rm -r");
    }
    if (!error && !options.force && !isWanted(item)) {
      error = interruption() != 0 ? interruptedError()
                                  : trashFailure("it was not removed; nobody said yes");
    }
    if (!error) error = removeOne(host, item);
    report.ended(item, error);
  });
}

}  // namespace

void addTrashCommands(CLI::App& app, Invocation& invocation) {
  auto trashed = std::make_shared<ItemOptions>();
  auto* trash = app.add_subcommand("trash", "Move items to the trash, or list what is in it");
  trash->add_option("PATH", trashed->items, "Paths from the drive's root, or item identifiers");
  trash->add_flag("--json", trashed->json, "One JSON object per line");
  auto* list = trash->add_subcommand("list", "List the trash, newest first");
  list->add_flag("--json", trashed->json, "One JSON object per line");
  list->fallthrough();
  runs(list, invocation, "Example: skein trash list", trashed, runTrashList);
  trash->footer("Example: skein trash /Documents/old.txt");
  trash->callback([&invocation, list, trashed] {
    if (list->parsed()) return;
    if (trashed->items.empty()) throw CLI::RequiredError("PATH");
    invocation.run = [&invocation, trashed] {
      return withSession(invocation, [&](HostService& host) { return runTrash(host, *trashed); });
    };
  });

  auto restored = std::make_shared<RestoreOptions>();
  auto* restore = app.add_subcommand("restore", "Put items of the trash back where they were");
  restore
      ->add_option("ITEM", restored->items,
                   "By identifier, by the path it had, or by name; see: skein trash list")
      ->required();
  restore->add_option("--to", restored->folder, "Into this folder instead");
  restore->add_flag("--json", restored->json, "One JSON object per line");
  runs(restore, invocation, "Prints where each is.\nExample: skein restore /Documents/old.txt",
       restored, runRestore);

  auto removed = std::make_shared<RemoveOptions>();
  auto* rm = app.add_subcommand("rm", "Remove items for good");
  rm->add_option("PATH", removed->items, "Paths from the drive's root, or item identifiers")
      ->required();
  rm->add_flag("-r,--recursive", removed->folders, "Folders too, with all that is in them");
  rm->add_flag("-f,--force", removed->force, "Do not ask, as it does on a terminal");
  rm->add_flag("--json", removed->json, "One JSON object per line");
  runs(rm, invocation,
       "To be able to get them back, use: skein trash. Until this command has ended, Ctrl-C puts "
       "the "
       "item\nunder way back, a whole folder too.\nExample: skein rm -r /Scratch",
       removed, runRemove);
}

}  // namespace skein::cli
