// skein ls
#include <deque>
#include <utility>
#include <vector>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"

namespace skein::cli {
namespace {

// Pages that are asked for before the first is printed, so that none is waited for.
constexpr std::size_t kPagesUnderWay = 3;

struct ListOptions {
  std::string path = "/";
  std::string sort = "name";
  bool longLines = false;
  bool recursive = false;
  bool allFolders = false;
  bool json = false;
};

struct Folder {
  HostTarget target;
  std::string path;
};

class Lister {
 public:
  Lister(HostService& host, const ListOptions& options) : _host(host), _options(options) {}

  int run() {
    if (_options.allFolders) {
      return list(
          {HostTarget::identifier(NSFileProviderAllDirectoriesContainerItemIdentifier), ""});
    }
    std::vector<Folder> folders{{HostTarget::path(_options.path), trimmed(_options.path)}};
    int code = kSuccess;
    for (bool first = true; !folders.empty(); first = false) {
      const Folder folder = std::move(folders.back());
      folders.pop_back();
      if (_options.recursive && !_options.json) {
        if (!first) _output.write("\n");
        _output.writeName(folder.path);
        _output.write(":\n");
      }
      _subfolders.clear();
      if (const int failure = list(folder); failure != kSuccess) {
        // A folder that went away while its parent was listed is no reason to stop.
        if (first || failure != kNoSuchItem) return failure;
        code = failure;
      }
      if (!_options.recursive) break;
      folders.insert(folders.end(), std::make_move_iterator(_subfolders.rbegin()),
                     std::make_move_iterator(_subfolders.rend()));
    }
    return code;
  }

 private:
  static std::string trimmed(std::string path) {
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    return path;
  }

  int list(const Folder& folder) {
    const auto begin = std::chrono::steady_clock::now();
    bool any = false;
    NSErrorPtr error = listOnce(folder, any);
    // What was shown cannot be taken back, so only a listing that has not begun is tried again.
    if (!any && isWorthAnotherTry(error, begin)) error = listOnce(folder, any);
    return error ? fail(error) : kSuccess;
  }

  // Null, or why it ended; `any` is set with the first page.
  NSErrorPtr listOnce(const Folder& folder, bool& any) {
    auto [listing, error] = await<std::shared_ptr<HostListing>>([&](auto reply) {
      _host.list(folder.target, _options.sort == "date" ? HostOrder::Date : HostOrder::Name,
                 std::move(reply));
    });
    if (error) return error;
    std::deque<Awaited<NSFileProviderItems, bool>> underWay;
    for (;;) {
      while (underWay.size() < kPagesUnderWay) listing->next(underWay.emplace_back().reply());
      const auto [items, last, problem] = underWay.front().wait();
      underWay.pop_front();
      if (problem) return problem;
      any = true;
      for (const NSFileProviderItemPtr& item : items) print(*item, folder.path);
      // What is there is shown while the rest comes.
      _output.flush();
      if (last) return nullptr;
    }
  }

  int fail(const NSErrorPtr& error) {
    _output.flush();
    return complainAbout(error);
  }

  void print(const NSFileProviderItem& item, const std::string& folder) {
    const std::string path = folder.empty() ? "" : pathBelow(folder, item.filename());
    if (_options.json) {
      _output.write('{' + jsonMembers(item, path) + "}\n");
    } else if (_options.longLines) {
      writeLongLine(_output, item);
    } else {
      _output.writeName(item.filename(), item.isFolder());
      _output.write("\n");
    }
    if (_options.recursive && item.isFolder()) {
      _subfolders.push_back({HostTarget::identifier(item.itemIdentifier()), path});
    }
  }

  HostService& _host;
  const ListOptions& _options;
  Output _output;
  std::vector<Folder> _subfolders;
};

}  // namespace

void addListCommand(CLI::App& app, Invocation& invocation) {
  auto* command = app.add_subcommand("ls", "List a folder, or every folder of the drive");
  auto options = std::make_shared<ListOptions>();
  command->add_option("PATH", options->path, "The folder, from the drive's root (/ if not given)");
  command->add_option("--sort", options->sort, "By name, or by date with the newest first")
      ->check(CLI::IsMember({"name", "date"}));
  command->add_flag("-l,--long", options->longLines, "With kind, size and date");
  command->add_flag("-R,--recursive", options->recursive, "With all folders below");
  command->add_flag("--all-folders", options->allFolders, "Every folder of the drive");
  command->add_flag("--json", options->json, "One JSON object per line");
  command->footer("Example: skein ls -l --sort date /Documents");
  command->callback([&invocation, options] {
    invocation.run = [&invocation, options] {
      return withSession(invocation,
                         [&](HostService& host) { return Lister(host, *options).run(); });
    };
  });
}

}  // namespace skein::cli
