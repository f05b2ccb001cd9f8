#pragma once

#include <optional>

#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSError.h"

namespace skein {

inline constexpr char NSFileProviderErrorDomain[] = "NSFileProviderErrorDomain";

// Codes of NSFileProviderErrorDomain.
inline constexpr std::int64_t NSFileProviderErrorNotAuthenticated = -1000;
inline constexpr std::int64_t NSFileProviderErrorFilenameCollision = -1001;
inline constexpr std::int64_t NSFileProviderErrorSyncAnchorExpired = -1002;
inline constexpr std::int64_t NSFileProviderErrorInsufficientQuota = -1003;
inline constexpr std::int64_t NSFileProviderErrorServerUnreachable = -1004;
inline constexpr std::int64_t NSFileProviderErrorNoSuchItem = -1005;

// User-information keys of the two errors below.
inline constexpr char NSFileProviderErrorNonExistentItemIdentifierKey[] =
    "NSFileProviderErrorNonExistentItemIdentifier";
inline constexpr char NSFileProviderErrorCollidingItemKey[] = "NSFileProviderErrorCollidingItem";

// No-such-item for `identifier`, which it carries; without that entry for nil.
NSErrorPtr fileProviderErrorForNonExistentItemWithIdentifier(
    const std::optional<NSFileProviderItemIdentifier>& identifier);

// The collision error that carries the existing item. `item` is not null.
NSErrorPtr fileProviderErrorForCollisionWithItem(NSFileProviderItemPtr item);

// The URL that a file-exists error names (NSURLErrorKey); null when there is none, and
// for a null error.
NSURLPtr fp_collidingURL(const NSErrorPtr& error);

}  // namespace skein
