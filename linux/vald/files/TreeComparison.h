#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "linux/vald/files/DirectoryHandle.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// Whether a copy may take its source's place: the same contents, read from the disk, names, links,
// sizes, dates of change, owner, group, permissions, access lists and user attributes, but for the
// hint of which document a file is. And whether the source is still what was compared. Memory does
// not grow with the tree. Changes nothing. One use; one thread.
class TreeComparison {
 public:
  // `goesOn` is asked every megabyte and every entry; false cancels.
  explicit TreeComparison(const std::function<bool()>& goesOn) : _goesOn(goesOn) {}

  // `path`: what the source is called in errors. Null, or what is not the same, or cannot be read.
  NSErrorPtr compare(const DirectoryHandle& from, const std::string& name, const std::string& path,
                     const DirectoryHandle& to, const std::string& newName);
  // After compare(): whether the source, which may have another name by now, was left alone since,
  // and nobody has a file of it open for writing (this user's own files, where the file system
  // tells). 0; ETXTBSY when it was not, or another errno.
  int refusalOfSource(const DirectoryHandle& folder, const std::string& name) const;

 private:
  class Pairs;
  class Source;

  const std::function<bool()>& _goesOn;
  std::uint64_t _print = 0;  // of the source as it was compared
};

}  // namespace skein::vald
