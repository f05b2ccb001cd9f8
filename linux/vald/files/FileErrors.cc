#include "linux/vald/files/FileErrors.h"

#include <cerrno>
#include <system_error>
#include <utility>

namespace skein::vald {
namespace {

struct Reading {
  std::int64_t code;
  const char* words;
};

Reading readingOf(int number) {
  switch (number) {
    case ENOENT: return {NSFileNoSuchFileError, "there is no such file or folder"};
    case EEXIST:
    case ENOTEMPTY: return {NSFileWriteFileExistsError, "the name is taken"};
    case EACCES:
    case EPERM:
      return {NSFileWriteNoPermissionError,
              "permission denied; look at the owner and the mode of it and of its folder"};
    case ENOSPC:
      return {NSFileWriteOutOfSpaceError, "the disk is full; free some space and try again"};
    case EDQUOT:
      return {NSFileWriteOutOfSpaceError,
              "the disk quota is used up; free some space and try again"};
    case EROFS: return {NSFileWriteVolumeReadOnlyError, "the volume is mounted read-only"};
    case ENAMETOOLONG: return {NSFileWriteInvalidFileNameError, "the name is too long"};
    case ECANCELED: return {NSUserCancelledError, "it was cancelled"};
    case EXDEV: return {NSFileWriteUnknownError, "it would leave its volume; copy it instead"};
    case EBUSY: return {NSFileWriteUnknownError, "it is in use, or a volume is mounted there"};
    case ETXTBSY:
      return {
          NSFileWriteUnknownError,
          "another program has it open for writing; try again when that is over, or leave it out"};
    case ELOOP: return {NSFileWriteUnknownError, "a symbolic link is in the way"};
    case ENOTDIR: return {NSFileNoSuchFileError, "what should be a folder is none"};
    case ESTALE:
      return {NSFileNoSuchFileError,
              "another program moved or replaced it a moment ago; look at what is there now and "
              "name it again"};
    default: return {NSFileWriteUnknownError, nullptr};
  }
}

}  // namespace

std::string printable(const std::string& path) {
  std::string text;
  for (std::size_t at = 0; at < path.size();) {
    const auto first = static_cast<unsigned char>(path[at]);
    std::size_t length = first < 0x80 ? 1 : first >> 5 == 6 ? 2 : first >> 4 == 14 ? 3 : 4;
    bool valid = first >= 0x20 && first != 0x7f && (first < 0x80 || (first > 0xc1 && first < 0xf5));
    for (std::size_t next = 1; valid && next < length; ++next) {
      valid = at + next < path.size() && (static_cast<unsigned char>(path[at + next]) >> 6) == 2;
    }
    if (!valid) length = 1;
    text += valid ? path.substr(at, length) : "?";
    at += length;
  }
  return text;
}

NSErrorPtr fileErrorWithWords(std::int64_t cocoaCode, int posix, std::string words,
                              const std::string& path) {
  NSErrorUserInfo info{{NSLocalizedDescriptionKey, std::move(words)}};
  if (!path.empty()) info.emplace(NSURLErrorKey, NSURL::fileURLWithPath(path));
  if (posix != 0) {
    info.emplace(NSUnderlyingErrorKey,
                 NSError::errorWithDomain(
                     NSPOSIXErrorDomain, posix,
                     {{NSLocalizedDescriptionKey, std::generic_category().message(posix)}}));
  }
  return NSError::errorWithDomain(NSCocoaErrorDomain, cocoaCode, std::move(info));
}

NSErrorPtr fileError(int number, const std::string& doing, const std::string& path) {
  const Reading reading = readingOf(number);
  const std::string why =
      reading.words != nullptr ? reading.words : std::generic_category().message(number);
  return fileErrorWithWords(reading.code, number, doing + " \"" + printable(path) + "\": " + why,
                            path);
}

}  // namespace skein::vald
