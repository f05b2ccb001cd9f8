#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/foundation/NSData.h"
#include "platform/foundation/NSDate.h"

namespace skein {

// A persistent string that names an item. Bytes, compared by value.
using NSFileProviderItemIdentifier = std::string;

// Where the next page of a listing starts, and the point that changes are asked from:
// opaque to the host, which hands them back unchanged.
using NSFileProviderPage = NSData;
using NSFileProviderSyncAnchor = NSData;

// The reserved identifiers. None begins with "d" or "i", so that none is ever taken
// for the string form of a file object identifier.
inline constexpr char NSFileProviderRootContainerItemIdentifier[] =
    "NSFileProviderRootContainerItemIdentifier";
inline constexpr char NSFileProviderWorkingSetContainerItemIdentifier[] =
    "NSFileProviderWorkingSetContainerItemIdentifier";
inline constexpr char NSFileProviderAllDirectoriesContainerItemIdentifier[] =
    "NSFileProviderAllDirectoriesContainerItemIdentifier";

// The first page of a listing by name or by date. Told apart by value; their length
// differs from that of every page token.
const NSFileProviderPage& NSFileProviderInitialPageSortedByName();
const NSFileProviderPage& NSFileProviderInitialPageSortedByDate();

// What may be done with an item, as bits.
enum NSFileProviderItemCapabilities : std::uint64_t {
  NSFileProviderItemCapabilitiesAllowsReading = 1 << 0,
  NSFileProviderItemCapabilitiesAllowsWriting = 1 << 1,
  NSFileProviderItemCapabilitiesAllowsReparenting = 1 << 2,
  NSFileProviderItemCapabilitiesAllowsRenaming = 1 << 3,
  NSFileProviderItemCapabilitiesAllowsTrashing = 1 << 4,
  NSFileProviderItemCapabilitiesAllowsDeleting = 1 << 5,
};

// What a file browser shows of an item. Immutable once handed out. Any thread.
class NSFileProviderItem {
 public:
  virtual ~NSFileProviderItem() = default;

  virtual NSFileProviderItemIdentifier itemIdentifier() const = 0;
  virtual NSFileProviderItemIdentifier parentItemIdentifier() const = 0;
  // The name as bytes; not necessarily UTF-8.
  virtual std::string filename() const = 0;
  // The content type; nil when unknown.
  virtual std::optional<std::string> typeIdentifier() const = 0;
  virtual std::uint64_t capabilities() const = 0;
  // In bytes; nil for folders.
  virtual std::optional<std::uint64_t> documentSize() const = 0;
  virtual std::optional<NSDate> creationDate() const = 0;
  virtual std::optional<NSDate> contentModificationDate() const = 0;
  virtual std::optional<NSDate> lastUsedDate() const = 0;
  virtual std::optional<NSData> tagData() const = 0;
  virtual std::optional<std::int64_t> favoriteRank() const = 0;
  // The number of items directly inside; nil for what is no folder, or not counted yet.
  virtual std::optional<std::uint64_t> childItemCount() const = 0;
  virtual bool isFolder() const = 0;
  virtual bool isTrashed() const = 0;
  virtual bool isUploaded() const = 0;
  virtual bool isDownloaded() const = 0;
  virtual bool isShared() const = 0;
};

using NSFileProviderItemPtr = std::shared_ptr<const NSFileProviderItem>;
using NSFileProviderItems = std::vector<NSFileProviderItemPtr>;

}  // namespace skein
