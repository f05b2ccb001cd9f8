#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/framework/DriveState.h"
#include "linux/framework/SyncCall.h"
#include "vellum/VLFileOperations.h"

namespace skein {

// File operations, asked of vald. An item goes to vald by its logical URL whether or not it
// is present, so that the physical property changes nothing there; it does where the disk is
// asked. Any thread but the loop's; completions run on the executor, with the origin that
// the calling thread had (RequestOriginScope).
class LocalFileOperations final : public VLFileOperations {
 public:
  LocalFileOperations(DaemonAccess access, std::shared_ptr<DriveState> state);

  // Reports to the calling thread's RequestProgress.
  void fp_importUnderFolder(const NSURLPtr& url, const NSURLPtr& folder,
                            VLURLHandler completionHandler) override;
  void fp_createSubFolder(const NSURLPtr& url, const std::string& name,
                          VLURLHandler completionHandler) override;
  void fp_renameWithNewName(const NSURLPtr& url, const std::string& newName,
                            VLURLHandler completionHandler) override;
  void fp_reparentUnderFolder_withNewName(const NSURLPtr& url, const NSURLPtr& folder,
                                          std::optional<std::string> newName,
                                          VLURLHandler completionHandler) override;
  void fp_reparentUnderFolder_allowBouncing(const NSURLPtr& url, const NSURLPtr& folder,
                                            bool allowBouncing,
                                            VLURLHandler completionHandler) override;
  void fp_deleteWithCompletionHandler(const NSURLPtr& url,
                                      UniqueFunction<void(NSErrorPtr)> completionHandler) override;
  // The coordinated URL is physical where `url` is.
  void fp_coordinatedDeleteWithHandler(const NSURLPtr& url, VLURLHandler handler) override;
  std::uint64_t vl_capabilityToMoveToURL(const NSURLPtr& url, const NSURLPtr& toURL,
                                         NSErrorOut error) override;
  bool vl_setTagNames(const NSURLPtr& url, const std::vector<std::string>& names,
                      NSErrorOut error) override;
  // Null also when vald does not know.
  NSURLPtr vl_physicalURL(const NSURLPtr& url) override;
  bool vl_isPromiseURL(const NSURLPtr& url) override;
  // The innermost one: an item of the drive's Documents folder is in that folder's container.
  std::shared_ptr<const VLContainer> vl_vellumContainer(const NSURLPtr& url) override;
  // Asks the disk; for a physical URL, whether the physical file is there.
  bool checkResourceIsReachable(const NSURLPtr& url, NSErrorOut error) override;

 private:
  struct Physical {
    NSURLPtr url;
    bool isMarker = false;  // the URL that was asked about is one
  };
  Physical physical(const NSURLPtr& url) const;

  const DaemonAccess _access;
  const std::shared_ptr<DriveState> _state;
};

}  // namespace skein
