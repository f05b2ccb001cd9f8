#include "linux/cli/Items.h"

#include <unistd.h>

#include "linux/cli/ExitCodes.h"
#include "linux/cli/ItemText.h"
#include "vellum/VLErrors.h"

namespace skein::cli {

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
  tell("{\"given\":" + jsonString(given) + jsonBytes("given", given) +
           ",\"done\":false,\"error\":" + jsonString(text) +
           ",\"exitCode\":" + std::to_string(exitCodeFor(error)) + "}\n",
       {});
  complain(given + ": " + text);
}

// Told at once: who interrupts the command knows how far it came.
void Report::tell(const std::string& json, std::string_view text) {
  _output.write(_json ? json : text);
  _output.flush();
}

}  // namespace skein::cli
