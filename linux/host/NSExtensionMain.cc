#include "linux/host/NSExtensionMain.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <string_view>
#include <utility>

namespace skein {
namespace {

constexpr char kPrincipalClassKey[] = "NSExtensionPrincipalClass";

NSErrorPtr failure(std::string text) {
  return NSError::errorWithDomain(NSCocoaErrorDomain, NSFeatureUnsupportedError,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

std::string_view trimmed(std::string_view text) {
  const auto first = text.find_first_not_of(" \t\r");
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(" \t\r") - first + 1);
}

}  // namespace

std::shared_ptr<const NSExtensionAttributes> readExtensionAttributes(const std::string& path,
                                                                     NSErrorOut error) {
  std::ifstream file(path);
  if (!file) {
    error.store(failure("The extension's attributes file " + path +
                        " cannot be read: " + std::strerror(errno) + "."));
    return nullptr;
  }
  auto attributes = std::make_shared<NSExtensionAttributes>();
  std::string line;
  for (int number = 1; std::getline(file, line); ++number) {
    const std::string_view text = trimmed(line);
    if (text.empty() || text.front() == '#') continue;
    const auto equals = text.find('=');
    const std::string_view key = trimmed(text.substr(0, equals));
    if (equals == std::string_view::npos || key.empty()) {
      error.store(failure(path + ":" + std::to_string(number) + ": a line is KEY=VALUE."));
      return nullptr;
    }
    attributes->values[std::string(key)] = trimmed(text.substr(equals + 1));
  }
  if (const auto named = attributes->values.find(kPrincipalClassKey);
      named != attributes->values.end()) {
    attributes->principalClass = named->second;
  }
  return attributes;
}

std::shared_ptr<NSFileProviderExtension> NSExtensionInstantiatePrincipalClass(
    const std::shared_ptr<const NSExtensionAttributes>& attributes,
    const NSExtensionPrincipalClasses& classes, NSErrorOut error) {
  if (attributes->principalClass.empty()) {
    error.store(failure(std::string("The extension's attributes name no principal class: ") +
                        kPrincipalClassKey + " is missing."));
    return nullptr;
  }
  const auto known = classes.find(attributes->principalClass);
  if (known == classes.end()) {
    error.store(failure("The extension's attributes name the principal class \"" +
                        attributes->principalClass + "\", which is not part of this program."));
    return nullptr;
  }
  auto object = known->second(attributes);
  if (!object) {
    error.store(failure("The principal class \"" + attributes->principalClass +
                        "\" refused to be instantiated."));
  }
  return object;
}

}  // namespace skein
