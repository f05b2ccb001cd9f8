#pragma once

#include "linux/framework/SyncCall.h"
#include "vellum/VLDocuments.h"

namespace skein {

// Items by URL, asked from vald. Any thread but the loop's.
class LocalQueryItemLookup final : public VLQueryItemLookup {
 public:
  explicit LocalQueryItemLookup(DaemonAccess access) : _access(std::move(access)) {}

  VLQueryItemPtr askDaemonQueryItemForURL(const NSURLPtr& url, bool andFakeFSEvent,
                                          NSErrorOut error) override;
  VLQueryItemPtr containerItemForContainer(const std::shared_ptr<const VLContainer>& container,
                                           bool forceScan) override;

 private:
  const DaemonAccess _access;
};

}  // namespace skein
