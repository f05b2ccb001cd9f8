#include "linux/protocol/UploadConsent.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "linux/protocol/FileDescriptor.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr char kName[] = "/uploads-wait";
constexpr char kRefused = 'r';

}  // namespace

UploadConsent uploadConsentOf(const std::string& stateDirectory) {
  const FileDescriptor file(
      open((stateDirectory + kName).c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  // What cannot be read is no agreement.
  if (!file) return errno == ENOENT ? UploadConsent::Given : UploadConsent::Unasked;
  char word = 0;
  return pread(file.get(), &word, 1, 0) == 1 && word == kRefused ? UploadConsent::Refused
                                                                 : UploadConsent::Unasked;
}

NSErrorPtr setUploadConsent(const std::string& stateDirectory, UploadConsent consent) {
  const std::string path = stateDirectory + kName;
  const auto failed = [&] {
    return vl_errorWithPOSIXCode(
        errno, "The setting " + path + " cannot be written: " + std::strerror(errno) + ".");
  };
  if (consent == UploadConsent::Given) {
    return unlink(path.c_str()) == 0 || errno == ENOENT ? nullptr : failed();
  }
  const FileDescriptor file(
      open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!file) return failed();
  if (consent == UploadConsent::Refused && pwrite(file.get(), &kRefused, 1, 0) != 1) {
    return failed();
  }
  return nullptr;
}

}  // namespace skein
