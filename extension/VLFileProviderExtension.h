#pragma once

#include <map>
#include <memory>
#include <string>

#include "base/Mutex.h"
#include "base/SerialQueue.h"
#include "extension/ItemIdentity.h"
#include "platform/fileprovider/NSFileProviderExtension.h"
#include "platform/foundation/NSOperation.h"
#include "support/Environment.h"

namespace skein {

class VLFileProvidingOperation;

// The extension's principal class: what a host instantiates by name and calls from its
// own threads, several operations at once. Every operation is one line that hands it to
// the room that does it; operations that are not named here behave as the platform's.
class VLFileProviderExtension final : public NSFileProviderExtension {
 public:
  // init
  // Null, with nothing created or registered, when the superclass refuses `attributes`.
  // Observes account changes from the end of this call until the object's destruction.
  // `environment` outlives the object.
  static std::shared_ptr<VLFileProviderExtension> init(
      std::shared_ptr<const NSExtensionAttributes> attributes, Environment& environment);
  ~VLFileProviderExtension() override;

  NSURLPtr URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier) override;
  std::optional<NSFileProviderItemIdentifier> persistentIdentifierForItemAtURL(
      const NSURLPtr& url) override;
  NSFileProviderItemPtr itemForIdentifier(const NSFileProviderItemIdentifier& identifier,
                                          NSErrorOut error) override;
  std::shared_ptr<NSFileProviderEnumerator> enumeratorForContainerItemIdentifier(
      const NSFileProviderItemIdentifier& identifier, NSErrorOut error) override;
  NSErrorPtr fileProviderErrorFromFSError(const NSErrorPtr& error) override;

 private:
  explicit VLFileProviderExtension(Environment& environment);

  // Somebody logged in or out: the root is looked at anew. On the poster's thread; touches
  // neither caches nor queues.
  void _accountDidChange();

  Environment& _environment;
  ItemIdentity _identity;

  // Destroyed from the last to the first: no queue may outlive what its work refers to.
  Monitor _lock;
  // The download under way for a file's path, at most one.
  std::map<std::string, std::shared_ptr<VLFileProvidingOperation>> _downloadOperationByPath
      SKEIN_GUARDED_BY(_lock);
  std::shared_ptr<NSOperationQueue> _operationQueue;
  std::shared_ptr<SerialQueue> _queue;
};

}  // namespace skein
