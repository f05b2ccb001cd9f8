#pragma once

#include <optional>

#include "extension/operations/ItemRequest.h"
#include "platform/foundation/NSData.h"

namespace skein {

// setTagData:forItemIdentifier:completionHandler:
// Replaces an item's tags; of an alias, its target's. Synchronous: it answers before it
// returns. Data that holds no tags, nil included, clears them. A write that fails, as that
// of an identifier that names nothing does, is logged and answered in the host's domain.
void setTagData(const ItemRequest& request, const std::optional<NSData>& tagData,
                const NSFileProviderItemIdentifier& forItemIdentifier,
                ItemCompletion completionHandler);

}  // namespace skein
