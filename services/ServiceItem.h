#pragma once

#include <memory>
#include <utility>

#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSOperation.h"
#include "support/Environment.h"
#include "support/VLItemLookup.h"

namespace skein {

// What a source of an item's services has in common with the objects that it exports: the item,
// and the extension that offers the service.
class ServiceItem {
 public:
  // initWithFileProviderExtension:itemIdentifier:operationQueue:
  // `environment` outlives the object.
  ServiceItem(std::shared_ptr<VLItemLookup> fileProviderExtension,
              NSFileProviderItemIdentifier itemIdentifier,
              std::shared_ptr<NSOperationQueue> operationQueue, Environment& environment)
      : _fileProviderExtension(std::move(fileProviderExtension)),
        _itemIdentifier(std::move(itemIdentifier)),
        _operationQueue(std::move(operationQueue)),
        _environment(environment) {}

 protected:
  ~ServiceItem() = default;

  // The principal class's lookups; to hold them is to hold the principal object.
  const std::shared_ptr<VLItemLookup> _fileProviderExtension;
  const NSFileProviderItemIdentifier _itemIdentifier;
  const std::shared_ptr<NSOperationQueue> _operationQueue;
  Environment& _environment;
};

}  // namespace skein
