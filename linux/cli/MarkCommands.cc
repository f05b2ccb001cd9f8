// skein favorite, skein touch-used
#include <array>
#include <chrono>
#include <ctime>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/Items.h"

namespace skein::cli {
namespace {

struct FavoriteOptions : ItemOptions {
  std::optional<std::int64_t> rank;
  bool remove = false;
};

struct UsedOptions : ItemOptions {
  std::string date = "now";
};

int runFavorite(HostService& host, const FavoriteOptions& options) {
  using namespace std::chrono;
  std::optional<std::int64_t> rank = options.rank;
  // After every favorite there is, as each was made before.
  if (!rank && !options.remove) {
    rank = duration_cast<milliseconds>(system_clock::now().time_since_epoch()).count();
  }
  return changeEach(options, [&](const std::string& item, HostFiles::ItemReply reply) {
    host.files().setFavoriteRank(targetOf(item), rank, std::move(reply));
  });
}

// "now", or a date with or without a time, local unless it ends in Z. Nothing for others.
std::optional<NSDate> parseDate(const std::string& text) {
  if (text == "now")
    return std::chrono::time_point_cast<NSDate::duration>(std::chrono::system_clock::now());
  for (const char* format : {"%Y-%m-%dT%H:%M:%SZ", "%Y-%m-%dT%H:%MZ", "%Y-%m-%dT%H:%M:%S",
                             "%Y-%m-%d %H:%M:%S", "%Y-%m-%dT%H:%M", "%Y-%m-%d %H:%M", "%Y-%m-%d"}) {
    std::tm parts{};
    parts.tm_isdst = -1;
    const char* end = strptime(text.c_str(), format, &parts);
    if (end == nullptr || *end != '\0') continue;
    const std::time_t seconds = text.ends_with('Z') ? timegm(&parts) : mktime(&parts);
    return NSDate(std::chrono::seconds(seconds));
  }
  return std::nullopt;
}

int runTouchUsed(HostService& host, const UsedOptions& options) {
  std::optional<NSDate> date;
  if (options.date != "never") {
    date = parseDate(options.date);
    if (!date) {
      complain("\"" + options.date +
               "\" is no date; give one as 2026-11-24 or \"2026-11-24 22:05\", or: now, never");
      return kUsage;
    }
  }
  return changeEach(options, [&](const std::string& item, HostFiles::ItemReply reply) {
    host.files().setLastUsedDate(targetOf(item), date, std::move(reply));
  });
}

}  // namespace

void addMarkCommands(CLI::App& app, Invocation& invocation) {
  auto favorites = std::make_shared<FavoriteOptions>();
  auto* favorite = app.add_subcommand("favorite", "Make items favorites, in an order");
  favorite->add_option("PATH", favorites->items, "Paths from the drive's root, or item identifiers")
      ->required();
  auto* rank = favorite->add_option("--rank", favorites->rank,
                                    "The place among favorites, lowest first (if not given: last)");
  favorite->add_flag("--remove", favorites->remove, "They are favorites no more")->excludes(rank);
  favorite->add_flag("--json", favorites->json, "One JSON object per line");
  runs(favorite, invocation, "Example: skein favorite /Projects/Bridge", favorites, runFavorite);

  auto used = std::make_shared<UsedOptions>();
  auto* touch = app.add_subcommand("touch-used", "Say when items were last used");
  touch->add_option("PATH", used->items, "Paths from the drive's root, or item identifiers")
      ->required();
  touch->add_option("--date", used->date,
                    "2026-11-24, \"2026-11-24 22:05\", now (if not given) or never");
  touch->add_flag("--json", used->json, "One JSON object per line");
  runs(touch, invocation, "Example: skein touch-used --date 2026-11-24 /Documents/letter.odt", used,
       runTouchUsed);
}

}  // namespace skein::cli
