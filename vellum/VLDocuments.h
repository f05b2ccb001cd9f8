// What the framework adds to URLs and items: the documents store as a client sees it.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/foundation/NSError.h"
#include "platform/foundation/NSURL.h"
#include "vellum/VLContainer.h"
#include "vellum/VLFileObjectID.h"
#include "vellum/VLQueryItem.h"

namespace skein {

// URL categories. Synchronous, on the calling thread, and any of them may ask the
// daemon: none may be called on a connection's reader thread. A null URL is nil.
class VLDocuments {
 public:
  virtual ~VLDocuments() = default;

  // vl_documentURLFromFileObjectID:error: null with an error when there is none.
  virtual NSURLPtr vl_documentURLFromFileObjectID(const VLFileObjectID& fileObjectID,
                                                  NSErrorOut error) = 0;

  // Whether the URL lies in the documents store; NO for nil.
  virtual bool vl_isInSyncedLocation(const NSURLPtr& url) = 0;

  // Whether the item is a reference to a document elsewhere; NO for nil.
  virtual bool vl_isExternalDocumentReference(const NSURLPtr& url) = 0;

  // vl_URLByResolvingExternalDocumentReferenceWithError: the reference's target.
  virtual NSURLPtr vl_URLByResolvingExternalDocumentReferenceWithError(const NSURLPtr& url,
                                                                       NSErrorOut error) = 0;

  // Marks the URL as naming the physical file. A null URL is left alone.
  virtual void vl_addPhysicalProperty(const NSURLPtr& url) = 0;

  // The container whose documents folder the URL is; nil for any other URL and for the
  // default container's.
  virtual std::optional<std::string> vl_containerIDIfIsDocumentsContainerURL(
      const NSURLPtr& url) = 0;
};

// The item class's own methods, under the same rules.
class VLQueryItemLookup {
 public:
  virtual ~VLQueryItemLookup() = default;

  // askDaemonQueryItemForURL:andFakeFSEvent:error: with the flag, the daemon looks at
  // the file before it answers. Null, with or without an error, when there is no item.
  virtual VLQueryItemPtr askDaemonQueryItemForURL(const NSURLPtr& url, bool andFakeFSEvent,
                                                  NSErrorOut error) = 0;

  // containerItemForContainer:forceScan: null for a null container.
  virtual VLQueryItemPtr containerItemForContainer(
      const std::shared_ptr<const VLContainer>& container, bool forceScan) = 0;
};

}  // namespace skein
