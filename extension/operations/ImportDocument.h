#pragma once

#include "extension/operations/ItemRequest.h"

namespace skein {

// importDocumentAtURL:toParentItemIdentifier:completionHandler:
// Brings a document from outside the drive into a folder of it. Errors are translated as
// file-system errors alone. A document that was brought in and cannot be looked up is
// answered with neither item nor error: it is there, and an error would have the host bring
// it in again.
void importDocumentAtURL(const ItemRequest& request, const NSURLPtr& url,
                         const NSFileProviderItemIdentifier& toParentItemIdentifier,
                         ItemCompletion completionHandler);

}  // namespace skein
