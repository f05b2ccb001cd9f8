#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace skein {

// An installed app as the system knows it. Immutable; any thread.
class LSBundleProxy {
 public:
  using EntitlementValues = std::map<std::string, std::vector<std::string>>;

  virtual ~LSBundleProxy() = default;
  // entitlementValuesForKeys: only the keys that the app has a value for.
  virtual EntitlementValues entitlementValuesForKeys(const std::set<std::string>& keys) const = 0;
};

// The installed apps. Any thread.
class LSBundles {
 public:
  virtual ~LSBundles() = default;
  // bundleProxyForIdentifier: null when no such app is installed.
  virtual std::shared_ptr<const LSBundleProxy> bundleProxyForIdentifier(
      const std::string& identifier) = 0;
};

}  // namespace skein
