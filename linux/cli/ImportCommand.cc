// skein import
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/Items.h"
#include "linux/cli/Progress.h"
#include "linux/cli/SpooledInput.h"

namespace skein::cli {
namespace {

struct ImportOptions : ItemOptions {  // the last item is the folder
  std::string name;
};

NSErrorPtr noSuchSource(const std::string& source, int code) {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFileNoSuchFileError,
      {{NSLocalizedDescriptionKey, source + " cannot be found: " + std::strerror(code) +
                                       "; name a file or folder of this machine"}});
}

std::string realPath(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> real(realpath(path.c_str(), nullptr),
                                                         &std::free);
  return real ? real.get() : "";
}

// The absolute path of what is imported: a symbolic link itself, not where it leads; empty
// with an error when nothing is there.
std::string absolutePathOf(std::string source, NSErrorOut error) {
  while (source.size() > 1 && source.back() == '/') source.pop_back();
  const std::size_t separator = source.rfind('/');
  const std::string name = separator == std::string::npos ? source : source.substr(separator + 1);
  struct stat status {};
  if (lstat(source.c_str(), &status) != 0) {
    error.store(noSuchSource(source, errno));
    return {};
  }
  if (name.empty() || name == "." || name == "..") return realPath(source);
  const std::string folder =
      realPath(separator == std::string::npos ? "." : source.substr(0, separator + 1));
  if (folder.empty()) error.store(noSuchSource(source, errno));
  return folder.empty() ? "" : (folder == "/" ? "" : folder) + '/' + name;
}

// Imports one by one, each whole or not at all.
class Importer {
 public:
  Importer(HostService& host, const ImportOptions& options)
      : _host(host), _options(options), _report(options.json) {}

  int run() {
    const std::string& folder = _options.items.back();
    if (const auto [found, error] = folderAt(_host, folder); error) {
      _report.failed(folder, error);
      return _report.code();
    }
    const std::vector<std::string> sources(_options.items.begin(), _options.items.end() - 1);
    _report.each(sources, [&](const std::string& source) { importOne(source); });
    if (!_options.json && _report.output().isTerminal()) writeSummary();
    return _report.code();
  }

 private:
  void importOne(const std::string& source) {
    NSErrorPtr error;
    std::unique_ptr<SpooledInput> input;
    std::string path;
    if (source == "-") {
      input = SpooledInput::read(_options.name, &error);
      if (input) path = input->path();
    } else {
      path = absolutePathOf(source, &error);
    }
    if (!error) error = transfer(source, path);
    if (error) _report.failed(source, error);
  }

  NSErrorPtr transfer(const std::string& source, const std::string& path) {
    const auto start = [&](auto reply) {
      _host.files().importDocument(path, targetOf(_options.items.back()), originOf("import"),
                                   std::move(reply));
    };
    auto [transfer, error] = awaitOnce<std::shared_ptr<HostTransfer>>(start);
    if (error) return std::move(error);
    auto [end, problem] = followTransfer(transfer, source);
    if (problem) return std::move(problem);
    ++_imported;
    _bytes += end.completedBytes;
    _report.done(source, end.item);
    return nullptr;
  }

  void writeSummary() {
    const double seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - _begin).count();
    std::array<char, 32> time{};
    std::snprintf(time.data(), time.size(), " in %.1f s", seconds);
    std::string text = "imported " + std::to_string(_imported) +
                       (_imported == 1 ? " item, " : " items, ") + sizeText(_bytes) + time.data();
    if (_report.failures() > 0) text += "; " + std::to_string(_report.failures()) + " failed";
    _report.output().write(text + '\n');
  }

  HostService& _host;
  const ImportOptions& _options;
  Report _report;
  std::size_t _imported = 0;
  std::uint64_t _bytes = 0;
  const std::chrono::steady_clock::time_point _begin = std::chrono::steady_clock::now();
};

int runImport(HostService& host, const ImportOptions& options) {
  const auto inputs = std::count(options.items.begin(), options.items.end() - 1, "-");
  if (inputs > 1 || (inputs == 1) == options.name.empty()) {
    complain("--name NAME says what standard input, the one source \"-\", is called in the drive");
    return kUsage;
  }
  const std::string& name = options.name;
  if (name.find('/') != std::string::npos || name == "." || name == "..") {
    complain("--name takes a name, not a path; name the folder last");
    return kUsage;
  }
  return Importer(host, options).run();
}

}  // namespace

void addImportCommand(CLI::App& app, Invocation& invocation) {
  auto options = std::make_shared<ImportOptions>();
  auto* import =
      app.add_subcommand("import", "Copy files and folders of this machine into the drive");
  import
      ->add_option("SOURCE... FOLDER", options->items,
                   "Files or whole folders (\"-\": standard input), then a folder of the drive")
      ->required()
      ->expected(2, -1);
  import->add_option("--name", options->name, "The name for standard input");
  import->add_flag("--json", options->json, "One JSON object per line");
  runs(import, invocation,
       "Each source arrives whole or not at all; Ctrl-C cancels the one under way.\n"
       "Example: skein import ~/Pictures/2026 letter.odt /Documents\n"
       "         tar -c src | skein import - --name src.tar /Archive",
       options, runImport);
}

}  // namespace skein::cli
