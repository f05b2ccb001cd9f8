#include "linux/vald/cloud/MarkerCheck.h"

#include <cerrno>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

bool isMissing(const NSErrorPtr& error) { return error->code() == NSFileNoSuchFileError; }

}  // namespace

std::optional<LostDocument> checkMarker(const CloudPlaces& places, const std::string& markerPath,
                                        bool quick, StreamObserver& observer) {
  StorePlace place;
  if (NSErrorPtr error = places.roots.locate(markerPath, place)) {
    if (isMissing(error)) return std::nullopt;
    return LostDocument{markerPath, error->localizedDescription()};
  }
  FileDescriptor file;
  int unread = place.folder.openFile(place.name, file);
  const auto marker = file ? readMarkerText(file.get(), &unread) : std::nullopt;
  if (unread == ENOENT) return std::nullopt;
  if (unread != 0) {
    return LostDocument{
        markerPath, fileError(unread, "can't read the marker", markerPath)->localizedDescription()};
  }
  if (!marker) {
    if (!isDamagedMarker(file.get())) return std::nullopt;
    return LostDocument{markerPath, "it is an evicted document's marker, and damaged"};
  }
  const std::string path = joinPath(place.folderPath(), nameOfDocument(*marker, place.name));
  if (NSErrorPtr error = places.refusalOf(*marker, path)) {
    return LostDocument{path, error->localizedDescription()};
  }
  const auto hold = places.contents.hold(marker->contents);
  if (!hold) {
    return LostDocument{path, "the cloud has no contents of its " +
                                  std::to_string(marker->contents.size) + " bytes any more"};
  }
  if (quick) return std::nullopt;
  NSErrorPtr error = places.contents.verify(marker->contents.hash, observer);
  if (error == nullptr || error->code() == NSUserCancelledError) return std::nullopt;
  return LostDocument{path, error->code() == NSFileReadCorruptFileError
                                ? "its contents in the cloud are damaged"
                                : error->localizedDescription()};
}

}  // namespace skein::vald
