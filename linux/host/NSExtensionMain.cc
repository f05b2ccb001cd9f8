#include "linux/host/NSExtensionMain.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string_view>
#include <utility>
#include <vector>

#include "linux/host/FileProviderHost.h"

namespace skein {
namespace {

constexpr char kPointKey[] = "NSExtensionPointIdentifier";
constexpr char kPrincipalClassKey[] = "NSExtensionPrincipalClass";
constexpr char kDocumentGroupKey[] = "NSExtensionFileProviderDocumentGroup";
constexpr char kEnumerationKey[] = "NSExtensionFileProviderSupportsEnumeration";

// What each key may say; empty: anything.
const std::map<std::string_view, std::vector<std::string_view>> kKeys{
    {kPointKey, {"com.tessel.fileprovider"}},
    {kPrincipalClassKey, {}},
    {kDocumentGroupKey, {"drive"}},
    {kEnumerationKey, {"YES", "NO"}}};

constexpr std::uintmax_t kLargestFile = 64 << 10;

NSErrorPtr failure(std::string text) {
  return NSError::errorWithDomain(NSCocoaErrorDomain, NSFeatureUnsupportedError,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

// Empty for a line that says something; else what is wrong with it.
std::string problemOf(std::string_view key, std::string_view value) {
  const auto known = kKeys.find(key);
  if (known == kKeys.end()) {
    std::string keys;
    for (const auto& entry : kKeys) keys += (keys.empty() ? "" : ", ") + std::string(entry.first);
    return "there is no such key; the keys are " + keys + ".";
  }
  const auto& values = known->second;
  if (values.empty() || std::find(values.begin(), values.end(), value) != values.end()) return {};
  std::string allowed;
  for (const auto one : values) allowed += (allowed.empty() ? "" : " or ") + std::string(one);
  return std::string(key) + " is " + allowed + ".";
}

std::string_view trimmed(std::string_view text) {
  const auto first = text.find_first_not_of(" \t\r");
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(" \t\r") - first + 1);
}

}  // namespace

std::shared_ptr<const NSExtensionAttributes> readExtensionAttributes(const std::string& path,
                                                                     NSErrorOut error) {
  const auto unreadable = [&](const std::string& why) {
    error.store(failure("The extension's attributes " + path + " cannot be read: " + why +
                        ". Name a file of lines KEY=VALUE with --attributes."));
    return nullptr;
  };
  std::error_code code;
  const auto status = std::filesystem::status(path, code);
  if (!std::filesystem::exists(status)) {
    return unreadable(code ? code.message() : std::strerror(ENOENT));
  }
  if (!std::filesystem::is_regular_file(status)) return unreadable("it is no file");
  if (std::filesystem::file_size(path, code) > kLargestFile) return unreadable("it is too large");
  std::ifstream file(path);
  if (!file) return unreadable(std::strerror(errno));
  auto attributes = std::make_shared<NSExtensionAttributes>();
  std::string line;
  for (int number = 1; std::getline(file, line); ++number) {
    const std::string_view text = trimmed(line);
    if (text.empty() || text.front() == '#') continue;
    const auto equals = text.find('=');
    const std::string_view key = trimmed(text.substr(0, equals));
    const std::string_view value =
        equals != std::string_view::npos ? trimmed(text.substr(equals + 1)) : std::string_view();
    const std::string problem = value.empty() ? "a line is KEY=VALUE." : problemOf(key, value);
    if (!problem.empty()) {
      error.store(failure(path + ':' + std::to_string(number) + ": " + problem));
      return nullptr;
    }
    attributes->values[std::string(key)] = value;
  }
  if (file.bad()) return unreadable(std::strerror(errno));
  for (const auto& [key, values] : kKeys) {
    if (attributes->values.contains(std::string(key))) continue;
    error.store(failure("The extension's attributes " + path +
                        " are incomplete: " + std::string(key) + " is missing."));
    return nullptr;
  }
  attributes->principalClass = attributes->values[kPrincipalClassKey];
  return attributes;
}

bool supportsEnumeration(const NSExtensionAttributes& attributes) {
  const auto value = attributes.values.find(kEnumerationKey);
  return value == attributes.values.end() || value->second == "YES";
}

bool NSExtensionMain(const std::string& attributesPath, const NSExtensionPrincipalClasses& classes,
                     FileProviderHost& host, NSErrorOut error) {
  const auto attributes = readExtensionAttributes(attributesPath, error);
  if (!attributes) return false;
  auto object = NSExtensionInstantiatePrincipalClass(attributes, classes, error);
  if (!object) return false;
  host.setExtension(std::move(object), supportsEnumeration(*attributes));
  return true;
}

std::shared_ptr<NSFileProviderExtension> NSExtensionInstantiatePrincipalClass(
    const std::shared_ptr<const NSExtensionAttributes>& attributes,
    const NSExtensionPrincipalClasses& classes, NSErrorOut error) {
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
