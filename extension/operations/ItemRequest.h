// What the item operations share: each opens a log section that closes when the method
// returns, resolves identifiers, asks the framework to do the work, and answers with the
// item of the result. They differ on purpose in how identifiers are resolved and in which
// errors are translated; each says so itself.
//
// All run on the host's calling thread. An asynchronous one returns once the framework's
// operation is started; what it gave the framework runs on the framework's thread, and its
// lines fall outside the section. None asks who is logged in: that is the daemon's to say.
#pragma once

#include <memory>
#include <optional>

#include "platform/fileprovider/NSFileProviderError.h"
#include "platform/fileprovider/NSFileProviderExtension.h"
#include "support/Environment.h"
#include "support/VLItemLookup.h"

namespace skein {

using ItemCompletion = NSFileProviderExtension::ItemCompletion;
using ErrorCompletion = NSFileProviderExtension::ErrorCompletion;

// What one operation works with.
struct ItemRequest {
  // The principal class's lookups; to hold them is to hold the principal object.
  std::shared_ptr<VLItemLookup> lookup;
  Environment& environment;

  Log& log() const { return environment.log; }
};

// Answers that `identifier` names no item.
inline void completeAsNonExistent(ItemCompletion& completionHandler,
                                  const std::optional<NSFileProviderItemIdentifier>& identifier) {
  completionHandler(nullptr, fileProviderErrorForNonExistentItemWithIdentifier(identifier));
}

// Answers with the item that was just made or changed at `url`, or the lookup's error, both
// as they are. `error` is what the lookup's slot holds at first, which it may leave there.
inline void completeWithNewItemAtURL(VLItemLookup& lookup, const NSURLPtr& url,
                                     ItemCompletion& completionHandler,
                                     NSErrorPtr error = nullptr) {
  NSFileProviderItemPtr item = lookup._propertiesForNewItemAtURL(url, &error);
  completionHandler(std::move(item), std::move(error));
}

}  // namespace skein
