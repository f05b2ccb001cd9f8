#pragma once

#include <string>

#include "extension/operations/ItemRequest.h"

namespace skein {

// renameItemWithIdentifier:toName:completionHandler:
// Renames an item in its place; of an alias, the item it points to. Errors are translated
// as file-system errors and then into the host's domain.
void renameItemWithIdentifier(const ItemRequest& request,
                              const NSFileProviderItemIdentifier& identifier,
                              const std::string& toName, ItemCompletion completionHandler);

}  // namespace skein
