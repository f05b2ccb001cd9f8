#pragma once

#include <memory>

#include "platform/fileprovider/NSFileProviderEnumerating.h"
#include "support/Environment.h"
#include "support/VLItemLookup.h"

namespace skein {

// The principal class's enumeratorForContainerItemIdentifier:error: a fresh enumerator
// for a container, which the host owns; null with an error when nobody is logged in, the
// working set included, or when the identifier has no URL. A document's identifier gets a
// folder's enumerator like any other. Synchronous; any thread.
std::shared_ptr<NSFileProviderEnumerator> enumeratorForContainerItemIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut error, VLItemLookup& lookup,
    Environment& environment);

}  // namespace skein
