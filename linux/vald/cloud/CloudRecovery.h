// What a crash, or a step that failed, left of an eviction or a download.
#pragma once

#include <cstdint>

#include "linux/vald/cloud/CloudPlaces.h"

namespace skein::vald {

// Brings one document's place into order: contents on their way in and markers being
// written are removed; a file set aside is put back and its marker removed; a file and a
// marker that stand for the same contents become the file alone. A file that is none of
// this system's doing is never touched: a marker beside a file with other contents stays,
// and a file set aside whose name was taken meanwhile gets another name, unless it is what
// the marker stands for. Nothing may be under way there. Null when all is in order.
NSErrorPtr recoverPlace(const CloudPlaces& places, const StorePlace& place);

// The same for everything that was under way when the process ended. At start, before the
// first eviction or download. Goes on after a place that cannot be mended, which stays noted
// for the next start, and answers the first error. A folder that is gone is in order.
NSErrorPtr recoverUnfinishedWork(const CloudPlaces& places);

}  // namespace skein::vald
