// What stands in a folder for a document whose contents are in the cloud alone.
//
// The marker of "NAME" is the file ".NAME.skein" beside the place where NAME was, which
// itself is then not there. It has the file's times, mode and extended attributes (so tags
// stay where every tool looks for them), and as its contents this text:
//
//   skein-marker 1
//   document d00000000075bcd15          the document's identifier
//   hash 9f86d0…                        SHA-256 of its contents, 64 digits
//   size 4096                           in bytes
//   modified 1795555555000000000        nanoseconds since 1970, as are the others
//   created 1795555555000000000         absent when nobody knows
//   mode 644                            octal
//   type text/plain                     absent when nobody knows
//   name a%20long%20name                only where the marker's own name is too short for it
//   seal 5f16aa…                        keyed hash of all before this line, with the cloud's key
//   end
//
// Fields come in this order; a reader skips lines that it does not know, and refuses another
// number in the first line. A text without its last line is no marker.
//
// Who may write to a folder could put a text of this kind there, and name contents that he
// may not read. So a file counts as a marker only when it is this user's own, and it is
// served only when its seal is right, or, where it has none, when the record of the
// document that it names has these contents. Its mode gives permissions alone.
//
// A name of more than 240 bytes makes a marker's name that no file system takes: then it is
// ".BEGINNING~HASH.skein", with at most 200 bytes of the name and 16 digits of the name's
// own SHA-256, and the whole name stands in the text. Beside the marker there may be, while
// an eviction or a download runs or after a crash, ".NAME.skein-part" (contents on their way
// in), ".NAME.skein-new" (a marker being written) and ".NAME.skein-old" (the file, set aside
// until the eviction is sure).
#pragma once

#include <sys/types.h>

#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "linux/vald/cloud/ContentStream.h"
#include "linux/vald/cloud/Outcome.h"
#include "linux/vald/files/DirectoryHandle.h"
#include "platform/foundation/NSDate.h"
#include "vellum/VLFileObjectID.h"

namespace skein::vald {

struct EvictionMarker {
  VLFileObjectID document = VLFileObjectID::documentWithRawID(0);
  HashedContents contents;
  NSDate modified;
  std::optional<NSDate> created;
  mode_t mode = 0600;  // 0777 at most
  std::optional<std::string> type;
  std::optional<std::string> name;  // a name that a file may have
  std::optional<ContentHash> seal;
  std::string sealed;  // the text that the seal is of, as it was read

  // `makeSeal` makes the seal of a text; without it there is none.
  std::string asText(const std::function<ContentHash(std::string_view)>& makeSeal = nullptr) const;
  // Nil for anything that is no marker.
  static std::optional<EvictionMarker> parse(const std::string& text);
};

// The names around a document called `name`, each of one component.
struct MarkerNames {
  explicit MarkerNames(const std::string& name);

  bool shortened = false;  // the whole name must stand in the marker
  std::string marker;
  std::string part;
  std::string fresh;
  std::string aside;
};

// Whether a file of this name may be a marker: only its text says whether it is.
bool mayBeMarkerName(const std::string& name);
// The document's name, from the marker and the name the marker has now: who renames a
// marker renames the document.
std::string nameOfDocument(const EvictionMarker& marker, const std::string& markerName);

// The document's name by its marker's name alone: what renaming a marker changes.
std::string documentNameOfMarker(const std::string& markerName);
// A document's name longer than this may be shortened in its marker's.
inline constexpr std::size_t kLongestMarkerBeginning = 200;
// What an open file says, if it is a plain file of this user's and a marker. Its position
// stays. `unread` is set to the errno when the file could not be read.
std::optional<EvictionMarker> readMarkerText(int file, int* unread = nullptr);

// Whether a file that is no marker begins as one: it was one. Only of this user's plain files.
bool isDamagedMarker(int file);

// A marker and the open file it was read from. NSCocoaErrorDomain 4 when there is no such
// file, 259 when it is no marker. `path` is for errors.
struct OpenMarker {
  EvictionMarker marker;
  FileDescriptor file;
};
Outcome<OpenMarker> openMarker(const DirectoryHandle& folder, const std::string& markerName,
                               const std::string& path);

}  // namespace skein::vald
