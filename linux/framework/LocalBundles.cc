#include "linux/framework/LocalBundles.h"

#include "linux/desktop/DesktopEntries.h"

namespace skein {
namespace {

class LocalBundle final : public LSBundleProxy {
 public:
  explicit LocalBundle(EntitlementValues entitlements) : _entitlements(std::move(entitlements)) {}

  EntitlementValues entitlementValuesForKeys(const std::set<std::string>& keys) const override {
    EntitlementValues values;
    for (const auto& entitlement : _entitlements) {
      if (keys.contains(entitlement.first)) values.insert(entitlement);
    }
    return values;
  }

 private:
  const EntitlementValues _entitlements;
};

}  // namespace

std::shared_ptr<const LSBundleProxy> LocalBundles::bundleProxyForIdentifier(
    const std::string& identifier) {
  auto app = appInFolders(_folders, identifier);
  if (!app) return nullptr;
  return std::make_shared<const LocalBundle>(std::move(app->entitlements));
}

}  // namespace skein
