// What the commands about several items share: how an item is named, whose request it is,
// and what is told of each.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>
#include <vector>

#include "linux/cli/Interruption.h"
#include "linux/cli/Output.h"
#include "linux/cli/Session.h"

namespace skein::cli {

struct ItemOptions {
  std::vector<std::string> items;  // as they were typed
  bool json = false;
};

// What is no path is an identifier.
HostTarget targetOf(const std::string& text);

// "skein VERB (process 4711)"
RequestOrigin originOf(std::string_view verb);

// A path's folder and the name in it. Nothing for what is no path from the drive's root, or
// is the root.
struct PlaceInFolder {
  std::string folder;
  std::string name;
};
std::optional<PlaceInFolder> placeOf(const std::string& path);
NSErrorPtr noPathError(const std::string& text);

// The folder at `text`, or an error: nothing is there, or something else.
using ItemAnswer = std::tuple<HostItem, NSErrorPtr>;
ItemAnswer folderAt(HostService& host, const std::string& text);

// An item as it is named: an alias counts as itself, although the host answers with what it
// leads to; `found` is empty when that is nowhere.
struct NamedItem {
  std::string identifier;
  HostItem found;
  bool isAlias = false;
};
std::pair<NamedItem, NSErrorPtr> namedItem(HostService& host, const std::string& text);

// Tells of items one by one, as they are dealt with: failures on standard error, and with
// --json each item as one object on standard output, failed ones too.
class Report {
 public:
  explicit Report(bool json) : _json(json) {}

  // `text` is for people.
  void done(const std::string& given, std::string_view text = {});
  void done(const std::string& given, const HostItem& item, std::string_view text = {});
  void failed(const std::string& given, const NSErrorPtr& error);
  // Done, or failed with an error.
  void ended(const std::string& given, const NSErrorPtr& error) {
    error ? failed(given, error) : done(given);
  }

  // Calls deal(item) for each of the items until the command is interrupted, and tells then what
  // was not begun. Answers code().
  template <class Deal>
  int each(const std::vector<std::string>& items, Deal deal) {
    const NotedInterruption noted;
    std::size_t at = 0;
    while (at < items.size() && interruption() == 0) deal(items[at++]);
    if (interruption() != 0) interrupted(items, at);
    return _code;
  }

  Output& output() { return _output; }
  // That of the first failure; 128 + signal when an interruption kept something from being done.
  int code() const { return _code; }
  std::size_t failures() const { return _failures; }

 private:
  void tell(const std::string& json, std::string_view text);
  // What is before `notBegun` was dealt with.
  void interrupted(const std::vector<std::string>& items, std::size_t notBegun);

  const bool _json;
  Output _output;
  int _code = 0;
  std::size_t _failures = 0;
  bool _hasCancelled = false;
};

// Calls change(item, reply) for each of the items, one after the other, and reports. A change
// is never asked twice: it may have been made although its answer was lost.
template <class Change>
int changeEach(const ItemOptions& options, Change change) {
  Report report(options.json);
  return report.each(options.items, [&](const std::string& item) {
    const auto start = [&](auto reply) { change(item, std::move(reply)); };
    const auto [changed, error] = awaitOnce<HostItem>(start);
    if (error) {
      report.failed(item, error);
    } else {
      report.done(item, changed);
    }
  });
}

}  // namespace skein::cli
