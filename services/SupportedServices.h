#pragma once

#include <memory>

#include "platform/fileprovider/NSFileProviderServiceSource.h"
#include "platform/foundation/NSOperation.h"
#include "support/Environment.h"
#include "support/VLItemLookup.h"

namespace skein {

// The principal class's supportedServiceSourcesForItemIdentifier:error:, which stores no
// error whatever happens.
//
// A document offers collaboration, then sharing, unless it is an alias; a folder or alias,
// sharing when the daemon says that it may be shared; anything else nothing. On the
// caller's thread, which waits for the daemon.
NSFileProviderServiceSources supportedServiceSourcesForItemIdentifier(
    const NSFileProviderItemIdentifier& identifier,
    const std::shared_ptr<VLItemLookup>& fileProviderExtension,
    const std::shared_ptr<NSOperationQueue>& operationQueue, Environment& environment);

}  // namespace skein
