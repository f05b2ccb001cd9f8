#include "vellum/VLFileCoordinator.h"

#include <cstdio>

namespace skein {
namespace {

constexpr struct {
  NSFileCoordinatorReadingOptions option;
  const char* name;
} kNames[] = {
    {NSFileCoordinatorReadingWithoutChanges, "without-changes"},
    {NSFileCoordinatorReadingResolvesSymbolicLink, "resolves-symbolic-link"},
    {NSFileCoordinatorReadingImmediatelyAvailableMetadataOnly, "metadata-only"},
    {NSFileCoordinatorReadingForUploading, "for-uploading"},
    {NSFileCoordinatorReadingAlwaysFetches, "always-fetches"},
};

}  // namespace

std::string VLFileCoordinatorReadingOptionsPrettyPrint(NSFileCoordinatorReadingOptions options) {
  if (options == 0) return "none";
  std::string text;
  const auto add = [&text](const char* name) {
    if (!text.empty()) text += '|';
    text += name;
  };
  for (const auto& [option, name] : kNames) {
    if ((options & option) == 0) continue;
    add(name);
    options &= ~option;
  }
  if (options != 0) {
    char rest[2 + 16 + 1];
    std::snprintf(rest, sizeof rest, "0x%llx", static_cast<unsigned long long>(options));
    add(rest);
  }
  return text;
}

}  // namespace skein
