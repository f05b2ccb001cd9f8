#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/dispatch/DispatchGroup.h"
#include "platform/fileprovider/NSFileProviderExtension.h"
#include "support/Environment.h"
#include "support/VLItemLookup.h"

namespace skein {

// What the zones' operations of one batch share, until the last of them has ended.
struct ThumbnailFetch {
  ThumbnailFetch(std::shared_ptr<VLItemLookup> itemLookup, Environment& theEnvironment,
                 std::vector<NSFileProviderItemIdentifier> askedFor,
                 NSFileProviderExtension::ThumbnailWithTypeHandler handler, std::uint64_t number)
      : lookup(std::move(itemLookup)),
        environment(theEnvironment),
        identifiers(std::move(askedFor)),
        perThumbnailCompletionHandler(std::move(handler)),
        section(number) {}

  const std::shared_ptr<VLItemLookup> lookup;
  Environment& environment;
  const std::vector<NSFileProviderItemIdentifier> identifiers;  // the whole batch's
  const NSFileProviderExtension::ThumbnailWithTypeHandler perThumbnailCompletionHandler;
  // The batch's second section. Every record, every zone and the end close it: the reader of
  // a log sees by the closing lines how far the batch has come.
  const std::uint64_t section;

  // Entered once per zone.
  DispatchGroup group;
  Mutex errorMutex;
  // The last zone's that failed.
  NSErrorPtr error SKEIN_GUARDED_BY(errorMutex);
};

// The items of one zone by their records.
using ZoneItems = std::map<CKRecordID, NSFileProviderItemIdentifier>;

// Asks the zone's database for the stored thumbnails, in one operation that is under way when
// this returns. Its records and its end come on the database's threads: the end leaves the
// group. A record's callback may block there while a download starts.
std::shared_ptr<CKFetchRecordsOperation> startZoneFetch(
    const std::shared_ptr<ThumbnailFetch>& fetch, const CKRecordZoneID& zoneID, ZoneItems items,
    CKContainer& container, const std::shared_ptr<CKOperationGroup>& operationGroup);

}  // namespace skein
