#pragma once

#include "support/Environment.h"
#include "support/VLItemLookup.h"

namespace skein {

// The principal class's lookups: item identifier to URL and back, the item of either, and
// the log-in test before them.
//
// All synchronous, on the host's threads, several at once; they may ask the daemon. Lookups
// open a log section each; the log-in test opens none.
class ItemIdentity : public VLItemLookup {
 public:
  explicit ItemIdentity(Environment& environment) : _environment(environment) {}

  NSURLPtr URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier) override;

  using VLItemLookup::_URLForItemWithPersistentIdentifier;
  // _URLForItemWithPersistentIdentifier:resolvingVLAliases:attachPhysical:
  // The root's URL comes as it is: neither flag applies to it, nor the log-in test.
  NSURLPtr _URLForItemWithPersistentIdentifier(const NSFileProviderItemIdentifier& identifier,
                                               bool resolvingVLAliases,
                                               bool attachPhysical) override;

  std::optional<NSFileProviderItemIdentifier> persistentIdentifierForItemAtURL(
      const NSURLPtr& url) override;

  bool _isLoggedInOrError(NSErrorOut error) override;

  NSFileProviderItemPtr itemForIdentifier(const NSFileProviderItemIdentifier& identifier,
                                          NSErrorOut error) override;

  NSFileProviderItemPtr _propertiesForItemAtURL(const NSURLPtr& url, NSErrorOut error) override;
  NSFileProviderItemPtr _propertiesForNewItemAtURL(const NSURLPtr& url, NSErrorOut error) override;

 private:
  // _propertiesForItemAtURL:forceScan:error:
  NSFileProviderItemPtr _propertiesForItemAtURL(const NSURLPtr& url, bool forceScan,
                                                NSErrorOut error);
  bool _isInSyncedLocation(const NSURLPtr& url) const;

  Environment& _environment;
};

// The principal class's fileProviderErrorFromFSError: a file-exists error becomes the
// platform's collision error with the item that is in the way, when `lookup` finds it.
// Every other error comes back as the same object; null for null.
NSErrorPtr fileProviderErrorFromFSError(const NSErrorPtr& error, VLItemLookup& lookup);

}  // namespace skein
