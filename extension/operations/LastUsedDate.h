#pragma once

#include <optional>

#include "extension/operations/ItemRequest.h"
#include "platform/foundation/NSDate.h"

namespace skein {

// setLastUsedDate:forItemIdentifier:completionHandler:
// Writes or clears (nil) when an item was last used; of an alias, the alias itself.
// Synchronous: it answers before it returns. Only the lookup of the item at the end can
// fail, also for an identifier that names nothing: the write of a nil URL is no write.
void setLastUsedDate(const ItemRequest& request, std::optional<NSDate> date,
                     const NSFileProviderItemIdentifier& forItemIdentifier,
                     ItemCompletion completionHandler);

}  // namespace skein
