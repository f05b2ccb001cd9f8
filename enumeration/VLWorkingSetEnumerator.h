#pragma once

#include "platform/fileprovider/NSFileProviderEnumerating.h"
#include "platform/foundation/uuid.h"
#include "support/Environment.h"

namespace skein {

// The enumerator of the working set. It lists nothing: a listing ends at once and signals
// the host, which then gets everything as changes, from the daemon's own journal. The
// daemon's change tokens are the sync anchors, handed through unchanged.
//
// Stateless; any thread. Replies go to the observer on the connection's reply thread.
class VLWorkingSetEnumerator final : public NSFileProviderEnumerator,
                                     public NSFileProviderChangeEnumerating {
 public:
  // `environment` outlives the enumerator.
  explicit VLWorkingSetEnumerator(Environment& environment) : _environment(environment) {}

  // The start of the history: 17 bytes of text, which no token of the daemon's equals.
  static const NSFileProviderSyncAnchor& initialSyncAnchor();

  // The page is ignored.
  void enumerateItemsForObserver(std::shared_ptr<NSFileProviderEnumerationObserver> observer,
                                 std::optional<NSFileProviderPage> startingAtPage) override;
  // A nil anchor is the start of the history too.
  void enumerateChangesForObserver(std::shared_ptr<NSFileProviderChangeObserver> observer,
                                   std::optional<NSFileProviderSyncAnchor> fromSyncAnchor) override;
  // Always the initial anchor.
  void currentSyncAnchorWithCompletionHandler(
      UniqueFunction<void(std::optional<NSFileProviderSyncAnchor>)> completionHandler) override;
  void invalidate() override {}

 private:
  Environment& _environment;
  // Unused: the daemon's tokens carry their own identity.
  [[maybe_unused]] uuid_t _uuid{};
};

}  // namespace skein
