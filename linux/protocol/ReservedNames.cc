#include "linux/protocol/ReservedNames.h"

namespace skein {
namespace {

constexpr std::string_view kTrash = ".Trash";

}  // namespace

bool isStagingName(std::string_view name) {
  return name.starts_with(kImportPrefix) || name.starts_with(kRemovalPrefix);
}

const char* useOfReservedName(std::string_view name) {
  if (!name.starts_with('.')) return nullptr;
  if (isStagingName(name)) return "is used while files are brought in and removed";
  for (const std::string_view suffix : {kPartSuffix, kFreshSuffix, kAsideSuffix}) {
    if (name.size() > 1 + suffix.size() && name.ends_with(suffix)) {
      return "is used while documents come from the cloud and go there";
    }
  }
  return name != kTrash && isTrashName(name) ? "belongs to the trash" : nullptr;
}

bool isTrashName(std::string_view name) {
  if (name == kTrash) return true;
  const std::size_t number = kTrash.size() + 1;
  return name.starts_with(kTrash) && name.size() > number && name[number - 1] == '-' &&
         name.find_first_not_of("0123456789", number) == std::string_view::npos;
}

}  // namespace skein
