#pragma once

#include <optional>

#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSURL.h"

namespace skein {

// The principal class's lookups, as the rooms see them that it calls itself. Synchronous;
// may ask the daemon, so never on a connection's reader thread.
class VLItemLookup {
 public:
  virtual ~VLItemLookup() = default;

  // The item's URL, references resolved; null when it has none in the synced location.
  virtual NSURLPtr URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier) = 0;

  // _URLForItemWithPersistentIdentifier:resolvingVLAliases: without the physical property.
  NSURLPtr _URLForItemWithPersistentIdentifier(const NSFileProviderItemIdentifier& identifier,
                                               bool resolvingVLAliases) {
    return _URLForItemWithPersistentIdentifier(identifier, resolvingVLAliases, false);
  }

  // _URLForItemWithPersistentIdentifier:resolvingVLAliases:attachPhysical:
  virtual NSURLPtr _URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier, bool resolvingVLAliases,
      bool attachPhysical) = 0;

  virtual std::optional<NSFileProviderItemIdentifier> persistentIdentifierForItemAtURL(
      const NSURLPtr& url) = 0;

  // _isLoggedInOrError: stores the translated error when nobody is logged in.
  virtual bool _isLoggedInOrError(NSErrorOut error) = 0;

  // itemForIdentifier:error: null with an error when there is no such item.
  virtual NSFileProviderItemPtr itemForIdentifier(const NSFileProviderItemIdentifier& identifier,
                                                  NSErrorOut error) = 0;

  // _propertiesForItemAtURL:error: of an item that the daemon knows already.
  virtual NSFileProviderItemPtr _propertiesForItemAtURL(const NSURLPtr& url, NSErrorOut error) = 0;

  // _propertiesForNewItemAtURL:error: the daemon looks at the file first.
  virtual NSFileProviderItemPtr _propertiesForNewItemAtURL(const NSURLPtr& url,
                                                           NSErrorOut error) = 0;
};

}  // namespace skein
