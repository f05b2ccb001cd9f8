// What the commands about several items share: how an item is named, whose request it is,
// and what is told of each.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>
#include <vector>

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

  Output& output() { return _output; }
  // That of the first failure.
  int code() const { return _code; }
  std::size_t failures() const { return _failures; }

 private:
  void tell(const std::string& json, std::string_view text);

  const bool _json;
  Output _output;
  int _code = 0;
  std::size_t _failures = 0;
};

// Calls change(item, reply) for each of the items, one after the other, and reports. A change
// is never asked twice: it may have been made although its answer was lost.
template <class Change>
int changeEach(const ItemOptions& options, Change change) {
  Report report(options.json);
  for (const std::string& item : options.items) {
    const auto start = [&](auto reply) { change(item, std::move(reply)); };
    const auto [changed, error] = awaitOnce<HostItem>(start);
    if (error) {
      report.failed(item, error);
    } else {
      report.done(item, changed);
    }
  }
  return report.code();
}

}  // namespace skein::cli
