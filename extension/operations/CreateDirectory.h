#pragma once

#include <string>

#include "extension/operations/ItemRequest.h"

namespace skein {

// createDirectoryWithName:inParentItemIdentifier:completionHandler:
// Makes an empty folder. Errors are translated as file-system errors alone, so that a name
// that is taken is answered with the item that has it. A folder that was made and cannot be
// looked up is answered with the lookup's error.
void createDirectoryWithName(const ItemRequest& request, const std::string& name,
                             const NSFileProviderItemIdentifier& inParentItemIdentifier,
                             ItemCompletion completionHandler);

}  // namespace skein
