#pragma once

#include <cstdint>
#include <optional>

#include "extension/operations/ItemRequest.h"

namespace skein {

// setFavoriteRank:forItemIdentifier:completionHandler:
// Writes or clears (nil) an item's place among the favourites; of an alias, the alias
// itself. Synchronous: it answers before it returns. Only the lookup of the item at the end
// can fail, also for an identifier that names nothing.
void setFavoriteRank(const ItemRequest& request, std::optional<std::int64_t> rank,
                     const NSFileProviderItemIdentifier& forItemIdentifier,
                     ItemCompletion completionHandler);

}  // namespace skein
