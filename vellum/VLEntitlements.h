// What an installed app may have of the drive.
#pragma once

#include <string>
#include <vector>

#include "platform/launchservices/LSBundleProxy.h"

namespace skein {

// Keys of an app's entitlements.
inline constexpr char VLApplicationIdentifierEntitlement[] = "application-identifier";
inline constexpr char VLSkeinServicesEntitlement[] = "com.tessel.skein-services";
inline constexpr char VLSkeinContainerIdentifiersEntitlement[] =
    "com.tessel.skein-container-identifiers";
inline constexpr char VLUbiquityContainerIdentifiersEntitlement[] =
    "com.tessel.ubiquity-container-identifiers";

// The value of VLSkeinServicesEntitlement that lets an app keep documents.
inline constexpr char VLSkeinServiceDocuments[] = "SkeinDocuments";

// VLEntitledContainerIdentifiers: the containers that an app with these entitlements may
// use, its own preference first; each once.
//
// They are those that VLSkeinContainerIdentifiersEntitlement lists, in its order, then
// those of VLUbiquityContainerIdentifiersEntitlement. An app that names its services has
// none unless VLSkeinServiceDocuments is among them; one that has that service and lists
// no container has the one that its application identifier names. Pure; any thread.
std::vector<std::string> VLEntitledContainerIdentifiers(
    const LSBundleProxy::EntitlementValues& entitlements);

}  // namespace skein
