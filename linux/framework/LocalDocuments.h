#pragma once

#include <memory>

#include "linux/framework/DriveState.h"
#include "linux/framework/SyncCall.h"
#include "vellum/VLDocuments.h"

namespace skein {

// The documents store as a client of this host sees it: folders of containers, known by
// path. Any thread but the loop's.
class LocalDocuments final : public VLDocuments {
 public:
  LocalDocuments(DaemonAccess access, std::shared_ptr<DriveState> state);

  NSURLPtr vl_documentURLFromFileObjectID(const VLFileObjectID& fileObjectID,
                                          NSErrorOut error) override;

  // A container's folder, or anything below one by its path; what is in the trash is in it
  // too. A path with "." or ".." in it lies nowhere.
  bool vl_isInSyncedLocation(const NSURLPtr& url) override;

  // Symbolic links are the references.
  bool vl_isExternalDocumentReference(const NSURLPtr& url) override;

  // The file at the end of all links. NSCocoaErrorDomain 4 when there is none.
  NSURLPtr vl_URLByResolvingExternalDocumentReferenceWithError(const NSURLPtr& url,
                                                               NSErrorOut error) override;
  void vl_addPhysicalProperty(const NSURLPtr& url) override;
  std::optional<std::string> vl_containerIDIfIsDocumentsContainerURL(const NSURLPtr& url) override;

 private:
  const DaemonAccess _access;
  const std::shared_ptr<DriveState> _state;
};

}  // namespace skein
