#include "linux/vald/DocumentPlaces.h"

#include "linux/vald/files/FileNames.h"

namespace skein::vald {

DocumentPlace findDocument(const StoreRoots& roots, const std::string& path) {
  DocumentPlace document{path, path, std::nullopt, false};
  StorePlace place;
  if (roots.locate(path, place) || place.isRoot()) return document;
  const std::string folder = place.folderPath();
  const bool isThere = place.folder.exists(place.name);
  std::string markerName = MarkerNames(place.name).marker;
  if (isThere) {
    if (!mayBeMarkerName(place.name)) return document;
    markerName = place.name;
  }
  auto marker = openMarker(place.folder, markerName, path);
  if (!marker) return document;
  const std::string name = nameOfDocument(marker->marker, markerName);
  // A marker beside its document's file stands for nothing.
  if (MarkerNames(name).marker != markerName || place.folder.exists(name)) return document;
  document.path = joinPath(folder, name);
  document.physical = joinPath(folder, markerName);
  document.marker = std::move(marker->marker);
  document.namedByMarker = isThere;
  return document;
}

std::string documentPath(const StoreRoots* roots, const std::string& physical) {
  const std::string name = nameOfPath(physical);
  if (!mayBeMarkerName(name)) return physical;
  if (roots != nullptr) return findDocument(*roots, physical).path;
  return joinPath(parentOfPath(physical), documentNameOfMarker(name));
}

std::vector<std::string> otherNamesOfItem(const std::string& name) {
  if (mayBeMarkerName(name)) return {documentNameOfMarker(name)};
  return {MarkerNames(name).marker};
}

}  // namespace skein::vald
