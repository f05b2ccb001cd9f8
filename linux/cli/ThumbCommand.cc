// skein thumb
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <set>
#include <utility>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/Items.h"
#include "linux/cli/Pictures.h"
#include "linux/cli/Progress.h"
#include "vellum/VLErrors.h"

namespace skein::cli {
namespace {

struct ThumbOptions : ItemOptions {
  int size = 120;
  std::string folder;
};

constexpr std::string_view wordOf(HostThumbnail::Kind kind) {
  switch (kind) {
    case HostThumbnail::Kind::Thumbnail: return "thumbnail";
    case HostThumbnail::Kind::Icon: return "icon";
    case HostThumbnail::Kind::None: return "none";
    case HostThumbnail::Kind::Missing: return "missing";
    case HostThumbnail::Kind::Error: break;
  }
  return "error";
}

// Writes pictures into a folder: each under its item's name, and no two under one.
class PictureFolder {
 public:
  explicit PictureFolder(std::string folder) : _folder(std::move(folder)) {}

  // The file's path, or an error.
  std::pair<std::string, NSErrorPtr> write(const std::string& item, std::string_view picture) {
    if (mkdir(_folder.c_str(), 0777) != 0 && errno != EEXIST) return {"", error(_folder)};
    const std::string path = pathFor(item, suffixOf(formatOf(picture)));
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file << picture << std::flush;
    return {path, file ? nullptr : error(path)};
  }

 private:
  std::string pathFor(const std::string& item, std::string_view suffix) {
    std::string name = item.substr(item.find_last_of('/') + 1);
    if (name.empty() || name == "." || name == "..") name = "root";
    std::string numbered = name;
    for (int number = 2; !_names.insert(numbered + std::string(suffix)).second; ++number) {
      numbered = name + " (" + std::to_string(number) + ")";
    }
    return _folder + "/" + numbered + std::string(suffix);
  }
  static NSErrorPtr error(const std::string& path) {
    return vl_errorWithPOSIXCode(errno, path + " cannot be written: " + std::strerror(errno));
  }

  const std::string _folder;
  std::set<std::string> _names;
};

// Deals with one batch's thumbnails as they come.
class Gallery {
 public:
  explicit Gallery(const ThumbOptions& options) : _options(options), _folder(options.folder) {}

  void take(const std::string& item, const HostThumbnail& thumbnail) {
    ++_taken;
    std::string path;
    NSErrorPtr error = thumbnail.error;
    if (thumbnail.data && !_options.folder.empty()) {
      std::tie(path, error) = _folder.write(item, thumbnail.data->view());
    }
    if (error && _code == kSuccess) _code = exitCodeFor(error);
    if (_options.json) {
      writeJson(item, thumbnail, path, error);
    } else if (error) {
      _output.flush();
      complain(item + ": " + textFor(error));
    } else {
      writeText(item, thumbnail, path);
    }
    _output.flush();
  }
  int code() const { return _code; }
  std::size_t taken() const { return _taken; }

 private:
  void writeJson(const std::string& item, const HostThumbnail& thumbnail, const std::string& path,
                 const NSErrorPtr& error) {
    std::string line = "{\"given\":" + jsonString(item) + jsonBytes("given", item) +
                       ",\"result\":\"" + std::string(error ? "error" : wordOf(thumbnail.kind)) +
                       "\"";
    if (thumbnail.data && !error) {
      const std::string_view picture = thumbnail.data->view();
      line += ",\"bytes\":" + std::to_string(picture.size()) +
              ",\"type\":" + jsonString(mimeTypeOf(formatOf(picture)));
    }
    if (thumbnail.type) line += ",\"contentType\":" + jsonString(*thumbnail.type);
    if (!path.empty() && !error) line += ",\"file\":" + jsonString(path) + jsonBytes("file", path);
    if (error) {
      line += ",\"error\":" + jsonString(textFor(error)) +
              ",\"exitCode\":" + std::to_string(exitCodeFor(error));
    }
    _output.write(line + "}\n");
  }

  void writeText(const std::string& item, const HostThumbnail& thumbnail, const std::string& path) {
    _output.writeName(path.empty() ? item : path);
    if (!thumbnail.data) {
      _output.write(thumbnail.kind == HostThumbnail::Kind::Missing ? "  is not in the cloud yet\n"
                                                                   : "  has no thumbnail\n");
      return;
    }
    _output.write("\n");
    if (!path.empty()) return;
    const std::string_view picture = thumbnail.data->view();
    if (canShow(_protocol, formatOf(picture))) {
      _output.write(shown(_protocol, picture, _options.size));
    } else {
      _output.write("  this terminal cannot show it; write it to a folder with -o DIR\n");
    }
  }

  const ThumbOptions& _options;
  const PictureProtocol _protocol = pictureProtocol();
  PictureFolder _folder;
  Output _output;
  int _code = kSuccess;
  std::size_t _taken = 0;
};

// Follows one batch to its end; its error when it never began or broke off.
NSErrorPtr runBatch(HostService& host, const std::vector<std::string>& items,
                    const ThumbOptions& options, Gallery& gallery) {
  std::vector<HostTarget> targets;
  targets.reserve(items.size());
  for (const std::string& item : items) targets.push_back(targetOf(item));
  const auto side = static_cast<double>(options.size);
  const auto [batch, refused] = await<std::shared_ptr<HostThumbnailBatch>>([&](auto reply) {
    host.thumbnails().fetchThumbnails(targets, {side, side}, std::move(reply));
  });
  if (refused) return refused;
  Progress progress;
  for (;;) {
    const auto start = [&, &batch = batch](auto reply) { batch->next(std::move(reply)); };
    const auto [step, error] = awaitUnlessInterrupted<HostThumbnailStep>(start);
    progress.clear();
    for (const HostThumbnail& thumbnail : step.thumbnails) {
      if (thumbnail.index < items.size()) gallery.take(items[thumbnail.index], thumbnail);
    }
    // An error of the whole batch was told of with each item that it concerns.
    if (step.finished) return nullptr;
    if (error) return error;
    progress.show(std::to_string(step.done) + " of " + std::to_string(step.total) + " thumbnails");
  }
}

// As many as one batch, and one message, may name.
std::vector<std::string> takeBatch(std::vector<std::string>::const_iterator& next,
                                   std::vector<std::string>::const_iterator end) {
  constexpr std::size_t kMostBytes = 200'000;
  std::vector<std::string> items;
  std::size_t bytes = 0;
  while (next != end && items.size() < HostThumbnails::kMostTargets &&
         (items.empty() || bytes + next->size() <= kMostBytes)) {
    bytes += next->size();
    items.push_back(*next++);
  }
  return items;
}

int runThumb(HostService& host, const ThumbOptions& options) {
  if (options.folder.empty() && !options.json && pictureProtocol() == PictureProtocol::None) {
    complain("this terminal shows no pictures; write them to a folder with -o DIR");
    return kUsage;
  }
  Gallery gallery(options);
  const NotedInterruption noted;
  for (auto next = options.items.begin(); next != options.items.end();) {
    const std::vector<std::string> items = takeBatch(next, options.items.end());
    const NSErrorPtr error = runBatch(host, items, options, gallery);
    if (interruption() != 0 && gallery.taken() < options.items.size()) {
      complain("interrupted: " + std::to_string(gallery.taken()) + " of " +
               std::to_string(options.items.size()) + " thumbnails came; the rest is cancelled");
      return 128 + interruption();
    }
    if (error) return complainAbout(error);
  }
  return gallery.code();
}

}  // namespace

void addThumbCommand(CLI::App& app, Invocation& invocation) {
  auto options = std::make_shared<ThumbOptions>();
  auto* thumb = app.add_subcommand("thumb", "Show thumbnails, or write them to a folder");
  thumb->add_option("PATH", options->items, "Paths from the drive's root, or item identifiers")
      ->required();
  thumb->add_option("--size", options->size, "The side in points: of icons, and on a terminal")
      ->check(CLI::Range(1, 4096));
  thumb->add_option("-o", options->folder, "Write the pictures into this folder");
  thumb->add_flag("--json", options->json, "One JSON object per line");
  runs(thumb, invocation,
       "Documents have the thumbnail that the cloud stored when they were uploaded. Ctrl-C cancels "
       "what is left.\n"
       "Example: skein thumb -o /tmp/pictures /Photos/a.jpg /Photos/b.jpg",
       options, runThumb);
}

}  // namespace skein::cli
