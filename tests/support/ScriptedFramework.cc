#include "tests/support/ScriptedFramework.h"

#include "platform/log/Description.h"

namespace skein {
namespace {

template <class Map>
typename Map::mapped_type valueOf(const Map& map, const typename Map::key_type& key) {
  const auto found = map.find(key);
  return found != map.end() ? found->second : typename Map::mapped_type();
}

}  // namespace

NSURLPtr ScriptedDocuments::vl_documentURLFromFileObjectID(const VLFileObjectID& id,
                                                           NSErrorOut out) {
  _transcript.add("documents: url of " + id.asString());
  NSURLPtr url = valueOf(urls, id);
  if (!url) out.store(error);
  return url;
}

bool ScriptedDocuments::vl_isInSyncedLocation(const NSURLPtr& url) {
  return url && (url->path() + "/").starts_with("/store/");
}

bool ScriptedDocuments::vl_isExternalDocumentReference(const NSURLPtr& url) {
  return url && references.contains(url->path());
}

NSURLPtr ScriptedDocuments::vl_URLByResolvingExternalDocumentReferenceWithError(const NSURLPtr& url,
                                                                                NSErrorOut out) {
  _transcript.add("documents: resolve " + description(url));
  NSURLPtr target = valueOf(references, url->path());
  if (!target) out.store(error);
  return target;
}

void ScriptedDocuments::vl_addPhysicalProperty(const NSURLPtr& url) {
  _transcript.add("documents: physical " + description(url));
  if (url) url->attachPhysicalProperty();
}

std::optional<std::string> ScriptedDocuments::vl_containerIDIfIsDocumentsContainerURL(
    const NSURLPtr& url) {
  if (!url || !containerIDs.contains(url->path())) return std::nullopt;
  return containerIDs[url->path()];
}

VLQueryItemPtr ScriptedQueryItems::askDaemonQueryItemForURL(const NSURLPtr& url,
                                                            bool andFakeFSEvent, NSErrorOut out) {
  _transcript.add("items: ask " + description(url) + (andFakeFSEvent ? " after a scan" : ""));
  if (error) out.store(error);
  return valueOf(items, url->path());
}

VLQueryItemPtr ScriptedQueryItems::containerItemForContainer(
    const std::shared_ptr<const VLContainer>& container, bool forceScan) {
  _transcript.add("items: container " + (container ? container->containerID() : "nil") +
                  (forceScan ? " after a scan" : ""));
  return container ? valueOf(containerItems, container->containerID()) : nullptr;
}

}  // namespace skein
