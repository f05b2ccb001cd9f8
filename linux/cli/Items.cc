#include "linux/cli/Items.h"

#include <unistd.h>

#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"
#include "vellum/VLErrors.h"

namespace skein::cli {
namespace {

std::string failureLine(const std::string& given, const std::string& text, int code) {
  return "{\"given\":" + jsonString(given) + jsonBytes("given", given) +
         ",\"done\":false,\"error\":" + jsonString(text) + ",\"exitCode\":" + std::to_string(code) +
         "}\n";
}

}  // namespace

HostTarget targetOf(const std::string& text) {
  return text.starts_with('/') ? HostTarget::path(text) : HostTarget::identifier(text);
}

RequestOrigin originOf(std::string_view verb) {
  return "skein " + std::string(verb) + " (process " + std::to_string(getpid()) + ')';
}

std::optional<PlaceInFolder> placeOf(const std::string& path) {
  const std::size_t end = path.find_last_not_of('/');
  if (!path.starts_with('/') || end == std::string::npos) return std::nullopt;
  const std::size_t separator = path.rfind('/', end);
  PlaceInFolder place{path.substr(0, separator), path.substr(separator + 1, end - separator)};
  if (place.folder.find_first_not_of('/') == std::string::npos) place.folder = "/";
  return place;
}

NSErrorPtr noPathError(const std::string& text) { return vlc_errorInvalidParameter("path", text); }

ItemAnswer folderAt(HostService& host, const std::string& text) {
  auto [found, error] =
      await<HostItem>([&](auto reply) { host.item(targetOf(text), std::move(reply)); });
  if (!error && !found.item->isFolder()) {
    error = NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError,
                                     {{NSLocalizedDescriptionKey, text + " is no folder"}});
  }
  return {std::move(found), std::move(error)};
}

std::pair<NamedItem, NSErrorPtr> namedItem(HostService& host, const std::string& text) {
  const HostTarget target = targetOf(text);
  NamedItem named;
  named.identifier = target.text;
  if (target.kind == HostTarget::Kind::Path) {
    auto [identifier, error] = await<std::string>(
        [&](auto reply) { host.identifierForPath(target.text, std::move(reply)); });
    if (error) return {named, error};
    named.identifier = std::move(identifier);
  }
  auto [found, error] = await<HostItem>([&](auto reply) { host.item(target, std::move(reply)); });
  named.isAlias = !found.item || found.item->itemIdentifier() != named.identifier;
  named.found = std::move(found);
  // An alias may lead nowhere; only a path tells that there is one.
  const bool isThere = target.kind == HostTarget::Kind::Path && exitCodeFor(error) == kNoSuchItem;
  return {std::move(named), isThere ? nullptr : error};
}

void Report::done(const std::string& given, std::string_view text) {
  tell("{\"given\":" + jsonString(given) + jsonBytes("given", given) + ",\"done\":true}\n", text);
}

void Report::done(const std::string& given, const HostItem& item, std::string_view text) {
  tell("{\"given\":" + jsonString(given) + jsonBytes("given", given) + ",\"done\":true," +
           jsonMembers(*item.item, item.path) + ",\"url\":" + jsonString(item.url) + "}\n",
       text);
}

void Report::failed(const std::string& given, const NSErrorPtr& error) {
  const std::string text = textFor(error);
  if (_code == kSuccess) _code = exitCodeFor(error);
  ++_failures;
  _hasCancelled = _hasCancelled || exitCodeFor(error) == kInterrupted;
  tell(failureLine(given, text, exitCodeFor(error)), {});
  complain(given + ": " + text);
}

void Report::interrupted(const std::vector<std::string>& items, std::size_t notBegun) {
  const std::size_t left = items.size() - notBegun;
  const std::size_t done = notBegun - _failures;
  if (left == 0 && !_hasCancelled) {
    complain(done == items.size() ? "the interruption came too late: everything is done"
                                  : "the interruption came too late to change anything");
    return;
  }
  _code = 128 + interruption();
  std::string text =
      "interrupted: " + std::to_string(done) + " of " + std::to_string(items.size()) + " done";
  if (_failures > 0) text += ", " + std::to_string(_failures) + " failed or cancelled";
  if (left > 0) text += ", " + std::to_string(left) + " not begun, from " + items[notBegun] + " on";
  for (std::size_t at = notBegun; at < items.size(); ++at) {
    tell(failureLine(items[at], "the command was interrupted before this was begun", _code), {});
  }
  complain(text);
}

// Told at once: who interrupts the command knows how far it came.
void Report::tell(const std::string& json, std::string_view text) {
  _output.write(_json ? json : text);
  _output.flush();
}

}  // namespace skein::cli
