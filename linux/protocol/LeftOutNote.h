#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace skein {

// The note of vald's status that names a folder which is no part of the drive, by its real
// path: this system keeps its own files there.
inline constexpr std::string_view kLeftOutNote =
    "left out, as this system keeps its own files there: ";

inline std::string noteOfLeftOut(const std::string& path) {
  return std::string(kLeftOutNote) + path;
}

// The path in such a note; nil for any other.
inline std::optional<std::string> pathLeftOut(const std::string& note) {
  if (!note.starts_with(kLeftOutNote)) return std::nullopt;
  return note.substr(kLeftOutNote.size());
}

}  // namespace skein
