#pragma once

#include <optional>

#include "extension/operations/ItemRequest.h"

namespace skein {

// untrashItemWithIdentifier:toParentItemIdentifier:completionHandler:
// Moves an item out of the trash; of an alias, the alias itself. Into the folder that was
// asked for, else to where it was, else into its container's documents folder. A name that
// is taken there is no obstacle: the framework finds another. Errors are translated as
// file-system errors and then into the host's domain.
void untrashItemWithIdentifier(const ItemRequest& request,
                               const NSFileProviderItemIdentifier& identifier,
                               std::optional<NSFileProviderItemIdentifier> toParentItemIdentifier,
                               ItemCompletion completionHandler);

}  // namespace skein
