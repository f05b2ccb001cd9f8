#pragma once

#include <sys/stat.h>

#include <cstdint>

#include "platform/foundation/NSDate.h"

namespace skein::vald {

// What a file looked like at a moment: if it looks the same later, it holds the same. A
// value. (Its device is left out: some volumes get another number at each mount.)
struct UploadStamp {
  std::uint64_t size = 0;
  NSDate modified;
  NSDate changed;  // of the contents or of anything about the file, its name included
  std::uint64_t inode = 0;

  // A time that no date can tell (after 2262) is the last one.
  static NSDate dateOf(const timespec& time) {
    constexpr auto kLast =
        std::chrono::floor<std::chrono::seconds>(NSDate::max().time_since_epoch());
    constexpr auto kFirst =
        std::chrono::ceil<std::chrono::seconds>(NSDate::min().time_since_epoch());
    if (time.tv_sec >= kLast.count()) return NSDate::max();
    if (time.tv_sec <= kFirst.count()) return NSDate::min();
    return NSDate(std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec));
  }
  static timespec timeOf(NSDate date) {
    const auto seconds = std::chrono::floor<std::chrono::seconds>(date.time_since_epoch());
    return {seconds.count(), (date.time_since_epoch() - seconds).count()};
  }
  static UploadStamp of(const struct stat& status) {
    return {static_cast<std::uint64_t>(status.st_size), dateOf(status.st_mtim),
            dateOf(status.st_ctim), status.st_ino};
  }

  // Whether only things about the file can differ, since a rename changes `changed`.
  bool sameButForChanged(const UploadStamp& other) const {
    return size == other.size && modified == other.modified && inode == other.inode;
  }
  friend bool operator==(const UploadStamp&, const UploadStamp&) = default;
};

}  // namespace skein::vald
