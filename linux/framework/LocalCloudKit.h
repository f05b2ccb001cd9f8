#pragma once

#include <memory>
#include <string>

#include "linux/framework/SyncCall.h"
#include "platform/cloudkit/CloudKit.h"

namespace skein {

// The cloud's records, asked of vald: one container, whatever it is called, with a private
// database of one's own zones and a shared one of others'. An operation is one request to the
// cloud, so its records are of one zone; others end with VLVellumErrorInvalidParameter.
//
// Records are handed out on the executor, several at once and in no order: one that blocks
// keeps no other waiting for long. A cancelled operation ends as soon as those that are being
// handed out are done, with CKErrorOperationCancelled unless all have been; the others are
// not. Any thread.
class LocalCloudKit final : public CKContainers {
 public:
  explicit LocalCloudKit(const DaemonAccess& access);
  std::shared_ptr<CKContainer> containerWithIdentifier(const std::string& identifier) override;

 private:
  const std::shared_ptr<CKContainer> _container;
};

}  // namespace skein
