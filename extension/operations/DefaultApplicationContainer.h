#pragma once

#include <optional>
#include <string>

#include "extension/operations/ItemRequest.h"

namespace skein {

// _defaultApplicationContainerForBundleIdentifier:completionHandler:
// The folder where an app's documents go by default: for the files app, and without an
// identifier, the drive's Documents folder, made when there is none (and answered with the
// collision error that carries it when there is); for another app, the first container that
// it is entitled to. A refusal is answered before this returns, the rest on a reply thread.
// Errors are translated into the host's domain; the lookup's stay as they are.
void _defaultApplicationContainerForBundleIdentifier(
    const ItemRequest& request, const std::optional<std::string>& bundleIdentifier,
    ItemCompletion completionHandler);

}  // namespace skein
