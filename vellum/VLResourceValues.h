#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/foundation/NSError.h"
#include "platform/foundation/NSURL.h"

namespace skein {

// Resource values that are flags.
inline constexpr char NSURLIsAliasFileKey[] = "NSURLIsAliasFileKey";
inline constexpr char NSURLUbiquitousItemIsSharedKey[] = "NSURLUbiquitousItemIsSharedKey";

// What can be read of the item at a URL. Synchronous, on the calling thread, and any of
// them may ask the daemon. A null URL is nil: the read fails, without an error.
class VLResourceValues {
 public:
  virtual ~VLResourceValues() = default;

  // getResourceValue:forKey:error: nil when it could not be read, or for another key.
  virtual std::optional<bool> getResourceValue(const NSURLPtr& url, std::string_view forKey,
                                               NSErrorOut error) = 0;

  // getPromisedItemResourceValue:forKey:error: the same of an item that need not be present.
  virtual std::optional<bool> getPromisedItemResourceValue(const NSURLPtr& url,
                                                           std::string_view forKey,
                                                           NSErrorOut error) = 0;

  // vl_typeIdentifierWithError: nil when it could not be found out.
  virtual std::optional<std::string> vl_typeIdentifierWithError(const NSURLPtr& url,
                                                                NSErrorOut error) = 0;
};

}  // namespace skein
