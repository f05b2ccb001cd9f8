#include "vellum/VLEntitlements.h"

#include <algorithm>

namespace skein {
namespace {

using Values = std::vector<std::string>;

// The key's values; none for a key that is missing.
Values valuesOf(const LSBundleProxy::EntitlementValues& entitlements, const char* key) {
  const auto found = entitlements.find(key);
  return found != entitlements.end() ? found->second : Values();
}

bool contains(const Values& values, const std::string& value) {
  return std::find(values.begin(), values.end(), value) != values.end();
}

void addNew(Values& identifiers, const Values& values) {
  for (const std::string& value : values) {
    if (!value.empty() && !contains(identifiers, value)) identifiers.push_back(value);
  }
}

}  // namespace

std::vector<std::string> VLEntitledContainerIdentifiers(
    const LSBundleProxy::EntitlementValues& entitlements) {
  const bool namesServices = entitlements.contains(VLSkeinServicesEntitlement);
  if (namesServices &&
      !contains(valuesOf(entitlements, VLSkeinServicesEntitlement), VLSkeinServiceDocuments)) {
    return {};
  }
  Values identifiers;
  addNew(identifiers, valuesOf(entitlements, VLSkeinContainerIdentifiersEntitlement));
  addNew(identifiers, valuesOf(entitlements, VLUbiquityContainerIdentifiersEntitlement));
  if (identifiers.empty() && namesServices) {
    addNew(identifiers, valuesOf(entitlements, VLApplicationIdentifierEntitlement));
  }
  return identifiers;
}

}  // namespace skein
