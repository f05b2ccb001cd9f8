#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "platform/fileprovider/NSFileProviderExtension.h"
#include "platform/foundation/NSError.h"

namespace skein {

// Reads an extension's attributes: a file of lines KEY=VALUE, with "#" comments and blank
// lines. The principal class is the value of NSExtensionPrincipalClass. Null with an error
// that names the file and, for a line that cannot be read, its number.
std::shared_ptr<const NSExtensionAttributes> readExtensionAttributes(const std::string& path,
                                                                     NSErrorOut error);

// How the host makes an object of each class that an attributes file may name. Null means
// that the class's own construction refused.
using NSExtensionPrincipalClasses =
    std::map<std::string, std::function<std::shared_ptr<NSFileProviderExtension>(
                              std::shared_ptr<const NSExtensionAttributes>)>>;

// Makes the principal object. Null with an error: the attributes name no class, or one that
// is not in `classes`, or the class refused.
std::shared_ptr<NSFileProviderExtension> NSExtensionInstantiatePrincipalClass(
    const std::shared_ptr<const NSExtensionAttributes>& attributes,
    const NSExtensionPrincipalClasses& classes, NSErrorOut error);

}  // namespace skein
