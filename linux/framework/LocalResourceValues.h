#pragma once

#include "linux/framework/SyncCall.h"
#include "vellum/VLResourceValues.h"

namespace skein {

// Flags and types of items, as vald knows them: a promised item's are those of the item. Any
// thread but the loop's.
class LocalResourceValues final : public VLResourceValues {
 public:
  explicit LocalResourceValues(DaemonAccess access) : _access(std::move(access)) {}

  std::optional<bool> getResourceValue(const NSURLPtr& url, std::string_view forKey,
                                       NSErrorOut error) override;
  std::optional<bool> getPromisedItemResourceValue(const NSURLPtr& url, std::string_view forKey,
                                                   NSErrorOut error) override;
  std::optional<std::string> vl_typeIdentifierWithError(const NSURLPtr& url,
                                                        NSErrorOut error) override;

 private:
  // Null for a null URL, and with an error.
  VLQueryItemPtr itemAt(const NSURLPtr& url, NSErrorOut error);

  const DaemonAccess _access;
};

}  // namespace skein
