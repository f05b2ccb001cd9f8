#include "linux/vald/scan/StoreNames.h"

#include <fcntl.h>
#include <unistd.h>

#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

constexpr std::string_view kTrashBeginning = ".Trash-";
constexpr std::string_view kTrashEnding = "/files";

std::int64_t nanoseconds(NSDate date) { return date.time_since_epoch().count(); }

}  // namespace

bool isHiddenFromStore(std::string_view name) {
  return name == "." || name == ".." || useOfReservedName(name) != nullptr;
}

std::string ownTrashFolderName() {
  return trashFolderName(::geteuid()) + std::string(kTrashEnding);
}

bool isTrashFolderName(std::string_view name) {
  return name.starts_with(kTrashBeginning) && name.ends_with(kTrashEnding);
}

bool addConcernedNames(const std::string& name, std::set<std::string>& documents) {
  if (isHiddenFromStore(name)) return true;
  documents.insert(name);
  if (!mayBeMarkerName(name)) return true;
  std::string document = documentNameOfMarker(name);
  const bool isShort = MarkerNames(document).marker == name;
  // A name that was too long for a marker's stands in the marker alone.
  const bool mayBeShortened = document.size() > kLongestMarkerBeginning;
  if (isShort) documents.insert(std::move(document));
  return !mayBeShortened;
}

std::string readMarker(int folder, const std::string& name, FileState& state) {
  if (!mayBeMarkerName(name) || state.kind != ItemKind::Document) return {};
  FileDescriptor file(
      ::openat(folder, name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  if (!file) return {};
  const auto marker = readMarkerText(file.get());
  if (!marker) return {};
  std::string document = nameOfDocument(*marker, name);
  // Nobody finds it by its document's name: it is a file like any other.
  if (MarkerNames(document).marker != name || isHiddenFromStore(document)) return {};
  state.isEvicted = true;
  state.size = marker->contents.size;
  state.modified = nanoseconds(marker->modified);
  state.markedDocument = marker->document.rawID();
  state.markedBirth = marker->created ? nanoseconds(*marker->created) : 0;
  return document;
}

}  // namespace skein::vald
