// skein mkdir, skein mv, skein alias, skein default-location
#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"
#include "linux/cli/Items.h"
#include "linux/cli/Progress.h"

namespace skein::cli {
namespace {

struct FolderOptions : ItemOptions {
  bool parents = false;
};

struct AliasOptions {
  std::string target;
  std::string path;
  bool outside = false;
  bool json = false;
};

struct AppOptions {
  std::string app;
  bool json = false;
};

ItemAnswer makeFolder(HostService& host, const PlaceInFolder& place) {
  const auto start = [&](auto reply) {
    host.files().createDirectory(place.name, HostTarget::path(place.folder), originOf("mkdir"),
                                 std::move(reply));
  };
  return awaitOnce<HostItem>(start);
}

// The folder, made with all above it that is missing.
ItemAnswer makeFolders(HostService& host, const std::string& path) {
  auto [found, error] = folderAt(host, path);
  const auto place = placeOf(path);
  if (exitCodeFor(error) != kNoSuchItem || found.item || !place) {
    return {std::move(found), std::move(error)};
  }
  if (auto [parent, problem] = makeFolders(host, place->folder); problem) {
    return {std::move(parent), std::move(problem)};
  }
  auto [made, refusal] = makeFolder(host, *place);
  // Somebody else was faster: that is as good.
  if (exitCodeFor(refusal) == kCollision) return folderAt(host, path);
  return {std::move(made), std::move(refusal)};
}

int runMakeFolders(HostService& host, const FolderOptions& options) {
  Report report(options.json);
  return report.each(options.items, [&](const std::string& path) {
    const auto place = placeOf(path);
    const auto [made, error] = !place            ? ItemAnswer(HostItem(), noPathError(path))
                               : options.parents ? makeFolders(host, path)
                                                 : makeFolder(host, *place);
    if (error) {
      report.failed(path, error);
    } else {
      report.done(path, made);
    }
  });
}

// Where mv(1) would put things: into a folder that is there, or else at a path.
class Mover {
 public:
  Mover(HostService& host, const ItemOptions& options)
      : _host(host), _options(options), _destination(options.items.back()) {}

  int run() {
    const std::size_t sources = _options.items.size() - 1;
    auto [found, error] = folderAt(_host, _destination);
    const bool isFolder = !error;
    if (!isFolder &&
        (exitCodeFor(error) != kNoSuchItem || sources > 1 || _destination.ends_with('/'))) {
      Report report(_options.json);
      report.failed(_destination, error);
      return report.code();
    }
    const std::vector<std::string> moved(_options.items.begin(), _options.items.end() - 1);
    Report report(_options.json);
    return report.each(moved, [&](const std::string& source) {
      const auto [item, problem] =
          isFolder ? moveTo(source, _destination, std::nullopt) : moveToPath(source);
      if (problem) {
        report.failed(source, problem);
      } else {
        report.done(source, item);
      }
    });
  }

 private:
  ItemAnswer moveTo(const std::string& source, const std::string& folder,
                    std::optional<std::string> name) {
    const auto start = [&](auto reply) {
      _host.files().reparent(targetOf(source), targetOf(folder), name, originOf("mv"),
                             std::move(reply));
    };
    auto [transfer, error] = awaitOnce<std::shared_ptr<HostTransfer>>(start);
    if (error) return {HostItem(), std::move(error)};
    auto [end, problem] = followTransfer(transfer, source);
    return {std::move(end.item), std::move(problem)};
  }

  ItemAnswer moveToPath(const std::string& source) {
    const auto place = placeOf(_destination);
    if (!place) return {HostItem(), noPathError(_destination)};
    const auto [item, error] = namedItem(_host, source);
    if (error) return {HostItem(), error};
    const auto from = placeOf(item.found.path.empty() ? source : item.found.path);
    // To rename an alias is to rename what it leads to, so an alias is moved to its new name.
    if (from && from->folder == place->folder && !item.isAlias) {
      const auto start = [&](auto reply) {
        _host.files().rename(targetOf(source), place->name, originOf("mv"), std::move(reply));
      };
      return awaitOnce<HostItem>(start);
    }
    const bool keepsName = from && from->name == place->name;
    return moveTo(source, place->folder, keepsName ? std::nullopt : std::optional(place->name));
  }

  HostService& _host;
  const ItemOptions& _options;
  const std::string& _destination;
};

int runMove(HostService& host, const ItemOptions& options) { return Mover(host, options).run(); }

int runAlias(HostService& host, const AliasOptions& options) {
  auto place = placeOf(options.path);
  // As ln(1): into a folder that is there, under the target's name.
  if (const auto [folder, error] = folderAt(host, options.path); !error) {
    const auto target = placeOf(options.target);
    place = PlaceInFolder{options.path, target ? target->name : ""};
  }
  Report report(options.json);
  if (!place || place->name.empty()) {
    report.failed(options.path, noPathError(options.path));
    return report.code();
  }
  if (options.outside && !options.target.starts_with('/')) {
    report.failed(options.target, noPathError(options.target));
    return report.code();
  }
  const auto start = [&](auto reply) {
    host.files().makeAlias(
        options.outside ? HostTarget::path(options.target) : targetOf(options.target),
        options.outside, place->name, HostTarget::path(place->folder), originOf("alias"),
        std::move(reply));
  };
  const auto [made, error] = awaitOnce<HostItem>(start);
  if (error) {
    report.failed(options.path, error);
  } else {
    report.done(options.path, made);
  }
  return report.code();
}

int runDefaultLocation(HostService& host, const AppOptions& options) {
  // To ask for the drive's own is to have it made, which printing is not.
  constexpr char kDocuments[] = "/Documents";
  if (options.app.empty() &&
      exitCodeFor(std::get<NSErrorPtr>(folderAt(host, kDocuments))) == kNoSuchItem) {
    Report report(options.json);
    report.done(kDocuments, std::string(kDocuments) + '\n');
    return report.code();
  }
  std::optional<std::string> app;
  if (!options.app.empty()) app = options.app;
  const auto [folder, error] =
      await<HostItem>([&](auto reply) { host.files().defaultContainer(app, std::move(reply)); });
  Report report(options.json);
  if (exitCodeFor(error) == kUsage) {
    report.failed(options.app,
                  NSError::errorWithDomain(
                      NSCocoaErrorDomain, NSFileNoSuchFileError,
                      {{NSLocalizedDescriptionKey,
                        std::string("no such app is installed; an app is named as its desktop "
                                    "entry is, without \".desktop\"")}}));
  } else if (error) {
    report.failed(options.app.empty() ? "/" : options.app, error);
  } else {
    report.done(options.app, folder, folder.path + '\n');
  }
  return report.code();
}

}  // namespace

void addPlaceCommands(CLI::App& app, Invocation& invocation) {
  auto folders = std::make_shared<FolderOptions>();
  auto* mkdir = app.add_subcommand("mkdir", "Make folders");
  mkdir->add_option("PATH", folders->items, "Paths from the drive's root")->required();
  mkdir->add_flag("-p,--parents", folders->parents, "With all folders above; one may be there");
  mkdir->add_flag("--json", folders->json, "One JSON object per line");
  runs(mkdir, invocation, "Example: skein mkdir -p /Projects/2026/Bridge", folders, runMakeFolders);

  auto moves = std::make_shared<ItemOptions>();
  auto* mv = app.add_subcommand("mv", "Rename or move items, within the drive");
  mv->add_option("SOURCE... DEST", moves->items,
                 "Items, then where to: a folder that is there, or a new path for the one item")
      ->required()
      ->expected(2, -1);
  mv->add_flag("--json", moves->json, "One JSON object per line");
  runs(
      mv, invocation,
      "Nothing is ever overwritten (exit code 6). An alias is moved itself. To an app's folder on\n"
      "another volume an item is copied, compared and then removed; Ctrl-C leaves it where it "
      "was.\n"
      "Example: skein mv /draft.odt /Documents/letter.odt\n"
      "         skein mv /a.jpg /b.jpg /Pictures",
      moves, runMove);

  auto alias = std::make_shared<AliasOptions>();
  auto* aliasCommand = app.add_subcommand("alias", "Make a reference to an item");
  aliasCommand->add_option("TARGET", alias->target, "What it leads to: an item of the drive")
      ->required();
  aliasCommand->add_option("PATH", alias->path, "Its own path, or the folder to make it in")
      ->required();
  aliasCommand->add_flag("--outside", alias->outside, "TARGET is an absolute path of this machine");
  aliasCommand->add_flag("--json", alias->json, "As one JSON object");
  runs(aliasCommand, invocation,
       "Example: skein alias /Projects/2026 /Current\n"
       "         skein alias --outside /srv/music /Music",
       alias, runAlias);

  auto location = std::make_shared<AppOptions>();
  auto* locationCommand =
      app.add_subcommand("default-location", "Print the folder where an app's documents go");
  locationCommand->add_option("APP", location->app,
                              "The app's identifier (if not given: the drive's Documents)");
  locationCommand->add_flag("--json", location->json, "As one JSON object");
  runs(locationCommand, invocation, "Example: skein default-location org.example.Writer", location,
       runDefaultLocation);
}

}  // namespace skein::cli
