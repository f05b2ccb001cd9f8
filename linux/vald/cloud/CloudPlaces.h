// What evicting, downloading and recovering share: where documents are, how they are
// changed, and what is known of them.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "linux/vald/cloud/CloudContents.h"
#include "linux/vald/cloud/CloudRecords.h"
#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/files/FileLayer.h"
#include "linux/vald/files/StoreRoots.h"

namespace skein::vald {

// Takes the coordination lock of a document's path for a change, and waits for it; the lock
// lives as long as the answer. An error: it could not be had, and nothing may be changed.
using CoordinateWriting = std::function<Outcome<std::shared_ptr<void>>(const std::string& path)>;

// All that it refers to outlives whoever is given this.
struct CloudPlaces {
  StoreRoots& roots;
  FileLayer& files;
  CloudContents& contents;
  CloudRecords& records;
  CoordinateWriting coordinate;
  // Where else markers of the drive may lie, and come back from.
  std::vector<std::string> trashes = {};

  // Notes that something is done at a document's place, for recovery; and that it is done.
  // What cannot be noted must not be begun; an end that is not noted costs a look at the
  // next start.
  Outcome<CloudRecords::Work> beginWork(const StorePlace& place, const ContentHash& contents) const;
  NSErrorPtr endWork(const CloudRecords::Work& work) const;

  // Null when the marker was made here, or by another drive of this user: its seal is right, or its
  // document has a record of these contents.
  NSErrorPtr refusalOf(const EvictionMarker& marker, const std::string& path) const;
};

}  // namespace skein::vald
