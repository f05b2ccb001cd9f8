// Thumbnails of many items at once, as a file browser asks for them. Containers get their
// app's icon, folders and aliases nothing, every document what the cloud has stored: one
// operation for each zone of records, each thumbnail handed over as it arrives. No document
// is opened.
#pragma once

#include <memory>
#include <vector>

#include "base/SerialQueue.h"
#include "platform/fileprovider/NSFileProviderExtension.h"
#include "support/Environment.h"
#include "support/VLItemLookup.h"
#include "thumbnails/ContainerThumbnails.h"

namespace skein {

// What a batch works with.
struct ThumbnailRequest {
  // The principal class's lookups; to hold them is to hold the principal object.
  std::shared_ptr<VLItemLookup> lookup;
  const ContainerThumbnails& containers;
  Environment& environment;
  // Where the final completion runs, unless the batch ends before this call returns.
  std::shared_ptr<SerialQueue> queue;
};

// fetchThumbnailsForItemIdentifiers:requestedSize:perThumbnailCompletionHandlerWithType:completionHandler:
// Blocks while the daemon finds out the records; the rest comes later. The per-thumbnail
// handler is called once per item, several at once, on this thread or the cloud's, and may be
// empty; an item that the daemon knows no record of gets no call, and a record that was not
// asked for comes under an empty identifier. The completion handler is called once, after all
// of these: with the daemon's error, when there are no records for that
// reason (documents get no call then), or the error of the last zone that failed, translated.
// Cancelling the progress cancels every operation; they end through the same handlers.
std::shared_ptr<NSProgress> fetchThumbnailsForItemIdentifiersWithType(
    const ThumbnailRequest& request, const std::vector<NSFileProviderItemIdentifier>& identifiers,
    NSSize requestedSize,
    NSFileProviderExtension::ThumbnailWithTypeHandler perThumbnailCompletionHandlerWithType,
    NSFileProviderExtension::ErrorCompletion completionHandler);

// fetchThumbnailsForItemIdentifiers:requestedSize:perThumbnailCompletionHandler:completionHandler:
// The same for a handler of three arguments. What comes third is the content type, and never
// an item's error, which this variant drops.
std::shared_ptr<NSProgress> fetchThumbnailsForItemIdentifiers(
    const ThumbnailRequest& request, const std::vector<NSFileProviderItemIdentifier>& identifiers,
    NSSize requestedSize, NSFileProviderExtension::ThumbnailHandler perThumbnailCompletionHandler,
    NSFileProviderExtension::ErrorCompletion completionHandler);

}  // namespace skein
