#pragma once

#include "extension/operations/ItemRequest.h"

namespace skein {

// trashItemWithIdentifier:completionHandler:
// Moves an item to the trash under file coordination; of an alias, the alias itself.
// Synchronous: it answers before it returns. No error is translated here, so that the host
// sees what the file system said.
void trashItemWithIdentifier(const ItemRequest& request,
                             const NSFileProviderItemIdentifier& identifier,
                             ItemCompletion completionHandler);

}  // namespace skein
