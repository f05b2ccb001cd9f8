#pragma once

#include "extension/operations/ItemRequest.h"

namespace skein {

// deleteItemWithIdentifier:completionHandler:
// Deletes an item for good; of an alias, the alias itself. An item that is not there is
// tried once more where its physical file is. Errors are translated into the host's domain
// alone: a deletion meets no name that is taken.
void deleteItemWithIdentifier(const ItemRequest& request,
                              const NSFileProviderItemIdentifier& identifier,
                              ErrorCompletion completionHandler);

}  // namespace skein
