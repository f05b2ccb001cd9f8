#pragma once

#include <optional>
#include <string>

#include "extension/operations/ItemRequest.h"

namespace skein {

// reparentItemWithIdentifier:toParentItemWithIdentifier:newName:completionHandler:
// Moves an item into another folder, under a new name when there is one; of an alias, the
// alias itself. A move that the framework's rules do not allow is refused before it is
// tried. Errors are translated as file-system errors and then into the host's domain.
void reparentItemWithIdentifier(const ItemRequest& request,
                                const NSFileProviderItemIdentifier& identifier,
                                const NSFileProviderItemIdentifier& toParentItemWithIdentifier,
                                std::optional<std::string> newName,
                                ItemCompletion completionHandler);

}  // namespace skein
