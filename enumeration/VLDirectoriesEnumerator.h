#pragma once

#include "platform/fileprovider/NSFileProviderEnumerating.h"
#include "support/Environment.h"

namespace skein {

// Lists every folder of the store, page by page, with a folder listing's page tokens.
// Reports no changes, so it is no NSFileProviderChangeEnumerating.
//
// Stateless; any thread. Replies go to the observer on the connection's reply thread.
class VLDirectoriesEnumerator final : public NSFileProviderEnumerator {
 public:
  // `environment` outlives the enumerator.
  explicit VLDirectoriesEnumerator(Environment& environment) : _environment(environment) {}

  void enumerateItemsForObserver(std::shared_ptr<NSFileProviderEnumerationObserver> observer,
                                 std::optional<NSFileProviderPage> startingAtPage) override;
  void invalidate() override {}

 private:
  Environment& _environment;
};

}  // namespace skein
