#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <vector>

#include "base/Mutex.h"
#include "vellum/VLFileObjectID.h"

namespace skein::vald {

// The listings of the trash that are under way. Each is of the moment when it began: so the
// trash is read and put in order once for a listing, and what comes or goes meanwhile moves
// nothing from one page to another. A few are kept; whoever stays away for longer begins
// again where it was. Any thread.
class TrashListings {
 public:
  using Items = std::shared_ptr<const std::vector<VLFileObjectID>>;

  // Where a page begins. It crosses to the client and back as one number, 0 for the start.
  struct Place {
    std::uint32_t listing = 0;
    std::uint32_t position = 0;

    static Place of(std::uint64_t offset) {
      return {static_cast<std::uint32_t>(offset >> 32), static_cast<std::uint32_t>(offset)};
    }
    std::uint64_t offset() const { return std::uint64_t{listing} << 32 | position; }
  };

  // Null for a listing that has ended or is kept no more.
  Items find(const Place& place) SKEIN_EXCLUDES(_mutex);
  // Keeps the items of a new listing; sets its number.
  void begin(Items items, Place& place) SKEIN_EXCLUDES(_mutex);
  void end(const Place& place) SKEIN_EXCLUDES(_mutex);

 private:
  Mutex _mutex;
  std::uint32_t _last SKEIN_GUARDED_BY(_mutex) = 0;
  std::map<std::uint32_t, Items> _listings SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
