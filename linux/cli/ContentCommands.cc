// skein get, skein cat, skein evict
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"
#include "linux/cli/Items.h"
#include "linux/cli/Progress.h"
#include "linux/protocol/FileDescriptor.h"
#include "vellum/VLErrors.h"

namespace skein::cli {
namespace {

struct GetOptions : ItemOptions {
  bool pin = false;
  bool newest = false;
};

struct EvictOptions : ItemOptions {
  bool unpin = false;
};

// Makes the document present; nothing of it is left when this program ends before that.
std::pair<HostItem, NSErrorPtr> fetch(HostService& host, const std::string& item,
                                      bool currentVersion) {
  auto [transfer, error] = await<std::shared_ptr<HostTransfer>>(
      [&](auto reply) { host.files().contents(targetOf(item), currentVersion, std::move(reply)); });
  if (error) return {HostItem(), std::move(error)};
  auto [end, problem] = followTransfer(transfer, item);
  return {std::move(end.item), std::move(problem)};
}

NSErrorPtr setPinned(HostService& host, const std::string& item, bool pinned) {
  const auto start = [&](auto reply) {
    host.files().setPinned(targetOf(item), pinned, std::move(reply));
  };
  return std::get<0>(awaitOnce<>(start));
}

int runGet(HostService& host, const GetOptions& options) {
  Report report(options.json);
  return report.each(options.items, [&](const std::string& item) {
    auto [found, error] = fetch(host, item, options.newest);
    if (!error && options.pin) error = setPinned(host, item, true);
    if (error) return report.failed(item, error);
    std::string line = pathOfURL(found.url);
    if (report.output().isTerminal()) line = escaped(line);
    report.done(item, found, line + '\n');
  });
}

NSErrorPtr fileError(const std::string& path) {
  return vl_errorWithPOSIXCode(errno, path + " cannot be read: " + std::strerror(errno));
}

// Null when all of it was written.
NSErrorPtr copyToOutput(const std::string& path, Output& output) {
  // Another program may put anything in the document's place meanwhile: a link to a file outside
  // the drive is not followed, and a pipe not waited for.
  open_how how{};
  how.flags = O_RDONLY | O_CLOEXEC | O_NONBLOCK;
  how.resolve = RESOLVE_NO_SYMLINKS;
  const FileDescriptor file(
      static_cast<int>(syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof(how))));
  struct stat status {};
  if (!file || fstat(file.get(), &status) != 0) return fileError(path);
  if (!S_ISREG(status.st_mode)) {
    errno = ESTALE;
    return fileError(path);
  }
  std::string buffer(std::size_t{256} * 1024, '\0');
  for (;;) {
    const ssize_t got = read(file.get(), buffer.data(), buffer.size());
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return fileError(path);
    if (got == 0) return nullptr;
    output.write(std::string_view(buffer).substr(0, static_cast<std::size_t>(got)));
    output.flush();
  }
}

int runCat(HostService& host, const ItemOptions& options) {
  Report report(false);
  for (const std::string& item : options.items) {
    auto [found, error] = fetch(host, item, false);
    if (!error) error = copyToOutput(pathOfURL(found.url), report.output());
    if (error) report.failed(item, error);
  }
  return report.code();
}

int runEvict(HostService& host, const EvictOptions& options) {
  Report report(options.json);
  return report.each(options.items, [&](const std::string& item) {
    NSErrorPtr error;
    if (options.unpin) error = setPinned(host, item, false);
    if (!error) {
      const auto start = [&](auto reply) { host.files().evict(targetOf(item), std::move(reply)); };
      error = std::get<0>(awaitOnce<>(start));
    }
    report.ended(item, error);
  });
}

}  // namespace

void addContentCommands(CLI::App& app, Invocation& invocation) {
  auto getOptions = std::make_shared<GetOptions>();
  auto* get = app.add_subcommand("get", "Download documents, and print where they are");
  get->add_option("PATH", getOptions->items, "Paths from the drive's root, or item identifiers")
      ->required();
  get->add_flag("--pin", getOptions->pin, "Keep them: a pinned document is not evicted");
  get->add_flag("--newest", getOptions->newest, "Fetch the newest version, though one is there");
  get->add_flag("--json", getOptions->json, "One JSON object per line");
  runs(get, invocation,
       "Ctrl-C cancels, and leaves nothing of the download.\n"
       "Example: skein get --pin /Documents/letter.odt",
       getOptions, runGet);

  auto catOptions = std::make_shared<ItemOptions>();
  auto* cat =
      app.add_subcommand("cat", "Write documents to standard output, downloaded if need be");
  cat->add_option("PATH", catOptions->items, "Paths from the drive's root, or item identifiers")
      ->required();
  runs(cat, invocation, "Example: skein cat /Documents/notes.txt | wc -l", catOptions, runCat);

  auto evictOptions = std::make_shared<EvictOptions>();
  auto* evict = app.add_subcommand(
      "evict", "Give up the local copies of documents that are safely in the cloud");
  evict->add_option("PATH", evictOptions->items, "Paths from the drive's root, or item identifiers")
      ->required();
  evict->add_flag("--unpin", evictOptions->unpin, "Also what \"skein get --pin\" keeps");
  evict->add_flag("--json", evictOptions->json, "One JSON object per line");
  runs(evict, invocation,
       "What is not uploaded, or changed since, is refused with the reason (exit code 8).\n"
       "Example: skein evict /Videos/holiday.mkv",
       evictOptions, runEvict);
}

}  // namespace skein::cli
