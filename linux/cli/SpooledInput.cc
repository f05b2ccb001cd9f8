#include "linux/cli/SpooledInput.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "linux/cli/Interruption.h"
#include "linux/protocol/FileDescriptor.h"
#include "vellum/VLErrors.h"

namespace skein::cli {
namespace {

bool writeAll(int to, const char* bytes, std::size_t length) {
  while (length > 0) {
    const ssize_t written = write(to, bytes, length);
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return false;
    bytes += written;
    length -= static_cast<std::size_t>(written);
  }
  return true;
}

NSErrorPtr spoolFailure(const std::string& what) {
  const int code = errno;
  return vl_errorWithPOSIXCode(code, what + ": " + std::strerror(code));
}

NSErrorPtr copyInput(int to, const std::string& path) {
  std::string buffer(std::size_t{256} * 1024, '\0');
  for (;;) {
    if (!waitForInput()) return interruptedError();
    const ssize_t got = read(STDIN_FILENO, buffer.data(), buffer.size());
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return spoolFailure("standard input cannot be read");
    if (got == 0) return nullptr;
    if (!writeAll(to, buffer.data(), static_cast<std::size_t>(got))) {
      return spoolFailure(path + " cannot be written; name a folder with more room in TMPDIR");
    }
  }
}

}  // namespace

SpooledInput::SpooledInput(std::string folder, std::string path)
    : _folder(std::move(folder)), _path(std::move(path)) {
  rememberTemporaryFile(_folder, _path);
}

SpooledInput::~SpooledInput() {
  unlink(_path.c_str());
  rmdir(_folder.c_str());
  forgetTemporaryFile();
}

std::unique_ptr<SpooledInput> SpooledInput::read(const std::string& name, NSErrorOut error) {
  // Not the system's usual one, which may be in memory.
  const char* parent = std::getenv("TMPDIR");
  std::string folder = std::string(parent != nullptr && *parent == '/' ? parent : "/var/tmp") +
                       "/skein-input-XXXXXX";
  if (mkdtemp(folder.data()) == nullptr) {
    error.store(spoolFailure(folder + " cannot be made; name another folder in TMPDIR"));
    return nullptr;
  }
  const std::string path = folder + '/' + name;
  std::unique_ptr<SpooledInput> spooled(new SpooledInput(folder, path));
  const FileDescriptor file(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
  NSErrorPtr problem = file ? copyInput(file.get(), path) : spoolFailure(path + " cannot be made");
  if (!problem) return spooled;
  error.store(std::move(problem));
  return nullptr;
}

}  // namespace skein::cli
