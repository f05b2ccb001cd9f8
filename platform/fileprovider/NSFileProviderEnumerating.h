// Enumerators and the observers that they answer.
#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "base/UniqueFunction.h"
#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSError.h"

namespace skein {

// Receives one page. Any number of didEnumerateItems, then exactly one finish; on any
// thread, possibly with the enumerator's lock held: queue the answer and return.
class NSFileProviderEnumerationObserver {
 public:
  virtual ~NSFileProviderEnumerationObserver() = default;
  virtual void didEnumerateItems(const NSFileProviderItems& items) = 0;
  // nil: the listing is complete.
  virtual void finishEnumeratingUpToPage(std::optional<NSFileProviderPage> nextPage) = 0;
  virtual void finishEnumeratingWithError(NSErrorPtr error) = 0;
};

// Receives one batch of changes, under the same rules.
class NSFileProviderChangeObserver {
 public:
  virtual ~NSFileProviderChangeObserver() = default;
  virtual void didUpdateItems(const NSFileProviderItems& items) = 0;
  virtual void didDeleteItemsWithIdentifiers(
      const std::vector<NSFileProviderItemIdentifier>& identifiers) = 0;
  // finishEnumeratingChangesUpToSyncAnchor:moreComing:
  virtual void finishEnumeratingChangesUpToSyncAnchor(NSFileProviderSyncAnchor anchor,
                                                      bool moreComing) = 0;
  virtual void finishEnumeratingWithError(NSErrorPtr error) = 0;
};

// One container's enumerator. Owned by the host that asked for it; the host sends
// invalidate when it is done. Any thread.
class NSFileProviderEnumerator {
 public:
  virtual ~NSFileProviderEnumerator() = default;

  // enumerateItemsForObserver:startingAtPage:
  // Asynchronous; the observer is held until it was told the end. A nil page starts at
  // the beginning, by name.
  virtual void enumerateItemsForObserver(
      std::shared_ptr<NSFileProviderEnumerationObserver> observer,
      std::optional<NSFileProviderPage> startingAtPage) = 0;
  virtual void invalidate() = 0;
};

// The optional half: what an enumerator implements besides when it can report changes.
// A host asks with a dynamic cast.
class NSFileProviderChangeEnumerating {
 public:
  virtual ~NSFileProviderChangeEnumerating() = default;

  // enumerateChangesForObserver:fromSyncAnchor:
  virtual void enumerateChangesForObserver(
      std::shared_ptr<NSFileProviderChangeObserver> observer,
      std::optional<NSFileProviderSyncAnchor> fromSyncAnchor) = 0;

  // currentSyncAnchorWithCompletionHandler:
  virtual void currentSyncAnchorWithCompletionHandler(
      UniqueFunction<void(std::optional<NSFileProviderSyncAnchor>)> completionHandler) = 0;
};

}  // namespace skein
