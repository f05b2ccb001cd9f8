#include "extension/VLFileProviderExtension.h"

#include "enumeration/EnumeratorSelection.h"

namespace skein {

VLFileProviderExtension::VLFileProviderExtension(Environment& environment)
    : _environment(environment), _identity(environment) {}

std::shared_ptr<VLFileProviderExtension> VLFileProviderExtension::init(
    std::shared_ptr<const NSExtensionAttributes> attributes, Environment& environment) {
  const std::shared_ptr<VLFileProviderExtension> self(new VLFileProviderExtension(environment));
  if (!self->NSFileProviderExtension::init(std::move(attributes))) return nullptr;

  self->_operationQueue = std::make_shared<NSOperationQueue>(environment.executor);
  self->_queue = std::make_shared<SerialQueue>("fileprovider-portfolio", environment.executor);
  // Without this the process never hears of account changes, and the next line is in vain.
  environment.accounts.startAccountTokenChangeObserverIfNeeded();
  environment.notificationCenter.addObserver(self, &VLFileProviderExtension::_accountDidChange,
                                             VLAccountTokenDidChangeNotification);
  return self;
}

VLFileProviderExtension::~VLFileProviderExtension() {
  _environment.notificationCenter.removeObserver(this, VLAccountTokenDidChangeNotification);
}

void VLFileProviderExtension::_accountDidChange() {
  Log& log = _environment.log;
  VL_DEBUG(log,
           "[DEBUG] received account did update notification, signal changes to fileproviderd");
  _environment.providerManager.signalEnumeratorForContainerItemIdentifier(
      NSFileProviderRootContainerItemIdentifier, [&log](const NSErrorPtr& error) {
        if (!error) return;
        VL_ERROR(log, "[ERROR] failed to signal enumerator for root container: %@", error);
      });
}

// Lookups.

NSURLPtr VLFileProviderExtension::URLForItemWithPersistentIdentifier(
    const NSFileProviderItemIdentifier& identifier) {
  return _identity.URLForItemWithPersistentIdentifier(identifier);
}

std::optional<NSFileProviderItemIdentifier>
VLFileProviderExtension::persistentIdentifierForItemAtURL(const NSURLPtr& url) {
  return _identity.persistentIdentifierForItemAtURL(url);
}

NSFileProviderItemPtr VLFileProviderExtension::itemForIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut error) {
  return _identity.itemForIdentifier(identifier, error);
}

NSErrorPtr VLFileProviderExtension::fileProviderErrorFromFSError(const NSErrorPtr& error) {
  return skein::fileProviderErrorFromFSError(error, _identity);
}

// Enumeration.

std::shared_ptr<NSFileProviderEnumerator>
VLFileProviderExtension::enumeratorForContainerItemIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut error) {
  return skein::enumeratorForContainerItemIdentifier(identifier, error, _identity, _environment);
}

}  // namespace skein
