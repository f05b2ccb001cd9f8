#pragma once

#include <optional>
#include <string>

#include "platform/foundation/NSURL.h"
#include "vellum/VLFileObjectID.h"

namespace skein {

// A reference to a URL that remembers the item whose place it is. A path may name something
// else by the time it is used. A watch that is asked for with such a reference is of the item,
// wherever that has gone; what is done to a document is done to that item or not at all. Copies
// of the URL forget it.
NSURLPtr documentURL(std::string path, VLFileObjectID fileObjectID);

// Nil for a reference that was not made so, and for null.
std::optional<VLFileObjectID> fileObjectIDOfDocumentURL(const NSURLPtr& url);

}  // namespace skein
