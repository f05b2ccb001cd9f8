#include "linux/framework/LocalQueryItemLookup.h"

#include <utility>

namespace skein {

VLQueryItemPtr LocalQueryItemLookup::askDaemonQueryItemForURL(const NSURLPtr& url,
                                                              bool andFakeFSEvent,
                                                              NSErrorOut error) {
  auto [item, problem] = askDaemon<VLQueryItemPtr>(_access, [&](LocalDaemon& daemon, auto reply) {
    daemon.queryItemForURL(url, andFakeFSEvent, std::move(reply));
  });
  if (!item && problem) error.store(std::move(problem));
  return item;
}

VLQueryItemPtr LocalQueryItemLookup::containerItemForContainer(
    const std::shared_ptr<const VLContainer>& container, bool forceScan) {
  if (!container || !container->documentsURL()) return nullptr;
  return askDaemonQueryItemForURL(container->documentsURL(), forceScan, nullptr);
}

}  // namespace skein
