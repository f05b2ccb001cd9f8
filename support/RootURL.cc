#include "support/RootURL.h"

namespace skein {

NSURLPtr RootURL::get(VLContainers& containers) {
  std::call_once(_once, [&] {
    const VLContainersByID table = containers.allContainersByContainerID();
    const auto found = table.find(VLUbiquitousDefaultContainerID);
    if (found == table.end() || !found->second) return;
    if (const NSURLPtr& url = found->second->documentsURL()) _url = url->copy();
  });
  return _url;
}

}  // namespace skein
