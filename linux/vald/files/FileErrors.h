// What went wrong with a file, as the framework's errors: the domain and code that
// callers test, and words that name the cause and the next step.
#pragma once

#include <string>

#include "platform/foundation/NSError.h"

namespace skein::vald {

// Codes of NSCocoaErrorDomain that file operations answer with, besides 4 and 516.
inline constexpr std::int64_t NSFileLockingError = 255;
inline constexpr std::int64_t NSFileReadNoPermissionError = 257;
inline constexpr std::int64_t NSFileWriteNoPermissionError = 513;
inline constexpr std::int64_t NSFileWriteInvalidFileNameError = 514;
inline constexpr std::int64_t NSFileWriteOutOfSpaceError = 640;
inline constexpr std::int64_t NSFileWriteVolumeReadOnlyError = 642;

// `number`: an errno, not 0. `doing`: what was tried, such as "can't rename". The POSIX
// error lies underneath; the path is named as NSURLErrorKey. ENOENT is "no such file",
// ESTALE too, EEXIST "file exists" (then `path` must be the colliding one), EACCES and EPERM "no
// permission", ENOSPC and EDQUOT "out of space", EROFS "read only", ENAMETOOLONG
// "invalid name", ECANCELED "cancelled"; the rest is the general write error.
NSErrorPtr fileError(int number, const std::string& doing, const std::string& path);

// The same shape with words of its own; `posix` 0: nothing underneath.
NSErrorPtr fileErrorWithWords(std::int64_t cocoaCode, int posix, std::string words,
                              const std::string& path);

// A path for people: bytes that are no text, and control characters, as "?".
std::string printable(const std::string& path);

}  // namespace skein::vald
