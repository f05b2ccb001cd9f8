#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "platform/fileprovider/NSFileProviderExtension.h"
#include "platform/foundation/NSError.h"

namespace skein {

class FileProviderHost;

// Reads an extension's attributes: a file of lines KEY=VALUE, with "#" comments and blank
// lines, each of these keys once:
//   NSExtensionPointIdentifier                  the kind of extension: com.tessel.fileprovider
//   NSExtensionPrincipalClass                   the class that the host makes an object of
//   NSExtensionFileProviderDocumentGroup        where its documents are: in the drive's folder
//   NSExtensionFileProviderSupportsEnumeration  YES or NO: whether its folders are listed
// Null with an error that names the file and, for a line that says nothing, its number.
std::shared_ptr<const NSExtensionAttributes> readExtensionAttributes(const std::string& path,
                                                                     NSErrorOut error);

// How the host makes an object of each class that an attributes file may name. Null means
// that the class's own construction refused.
using NSExtensionPrincipalClasses =
    std::map<std::string, std::function<std::shared_ptr<NSFileProviderExtension>(
                              std::shared_ptr<const NSExtensionAttributes>)>>;

// Makes the principal object. Null with an error: the attributes name a class that is not in
// `classes`, or the class refused.
std::shared_ptr<NSFileProviderExtension> NSExtensionInstantiatePrincipalClass(
    const std::shared_ptr<const NSExtensionAttributes>& attributes,
    const NSExtensionPrincipalClasses& classes, NSErrorOut error);

// Where the platform enters the extension: reads the attributes, instantiates the principal
// class and hands the object over to the host, which alone calls it from then on. False, with
// nothing handed over, and an error as of the two above.
bool NSExtensionMain(const std::string& attributesPath, const NSExtensionPrincipalClasses& classes,
                     FileProviderHost& host, NSErrorOut error);

}  // namespace skein
