#include "tests/support/Observers.h"

#include <algorithm>

namespace skein {
namespace {

std::string joined(Lines names) {
  std::sort(names.begin(), names.end());
  std::string text = "[";
  for (const std::string& name : names) text += (text.size() > 1 ? ", " : "") + name;
  return text + "]";
}

std::string joined(const NSFileProviderItems& items) {
  Lines names;
  for (const auto& item : items) names.push_back(item->filename());
  return joined(std::move(names));
}

}  // namespace

std::string brief(const NSErrorPtr& error) {
  if (!error) return "no error";
  std::string text = error->domain() + " " + std::to_string(error->code());
  if (const NSErrorPtr under = error->underlyingError()) text += " under " + brief(under);
  return text;
}

VLQueryItemPtr makeItem(std::uint64_t rawID, bool isDead, std::string name) {
  VLQueryItem::Properties properties;
  properties.fileObjectID = VLFileObjectID::documentWithRawID(rawID);
  properties.itemIdentifier = properties.fileObjectID.asString();
  properties.filename = std::move(name);
  properties.isDead = isDead;
  return std::make_shared<VLQueryItem>(std::move(properties));
}

void RecordingObserver::didEnumerateItems(const NSFileProviderItems& items) {
  _transcript.add("observer: items " + joined(items));
}

void RecordingObserver::finishEnumeratingUpToPage(std::optional<NSFileProviderPage> next) {
  ++finishes;
  nextPage = std::move(next);
  _transcript.add(nextPage ? "observer: next page" : "observer: end");
}

void RecordingObserver::finishEnumeratingWithError(NSErrorPtr ended) {
  ++finishes;
  error = std::move(ended);
  _transcript.add("observer: error " + brief(error));
}

void RecordingChangeObserver::didUpdateItems(const NSFileProviderItems& items) {
  updated = items;
  _transcript.add("observer: updated " + joined(items));
}

void RecordingChangeObserver::didDeleteItemsWithIdentifiers(
    const std::vector<NSFileProviderItemIdentifier>& identifiers) {
  deleted = identifiers;
  _transcript.add("observer: deleted " + joined(Lines(identifiers)));
}

void RecordingChangeObserver::finishEnumeratingChangesUpToSyncAnchor(NSFileProviderSyncAnchor upTo,
                                                                     bool more) {
  ++finishes;
  anchor = std::move(upTo);
  moreComing = more;
  _transcript.add(more ? "observer: anchor, more coming" : "observer: anchor");
}

void RecordingChangeObserver::finishEnumeratingWithError(NSErrorPtr ended) {
  ++finishes;
  error = std::move(ended);
  _transcript.add("observer: error " + brief(error));
}

}  // namespace skein
