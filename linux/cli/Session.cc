#include "linux/cli/Session.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdlib>

#include "linux/cli/ExitCodes.h"

namespace skein::cli {

DrivePaths DriveChoice::paths(NSErrorOut error) const {
  std::string folder = store;
  if (folder.empty()) {
    const char* home = std::getenv("HOME");
    folder = std::string(home != nullptr ? home : "") + "/Skein";
    struct stat status {};
    if (stat(folder.c_str(), &status) != 0) {
      error.store(NSError::errorWithDomain(
          NSPOSIXErrorDomain, ENOENT,
          {{NSLocalizedDescriptionKey,
            "there is no drive: name its folder with --store DIR or SKEIN_STORE, or make the "
            "folder " +
                folder}}));
      return {};
    }
  }
  return DrivePaths::forStore(folder, error);
}

std::unique_ptr<Session> Session::open(const DriveChoice& drive, NSErrorOut error) {
  const DrivePaths paths = drive.paths(error);
  if (paths.store.empty()) return nullptr;
  return std::unique_ptr<Session>(new Session(paths));
}

Session::Session(const DrivePaths& paths)
    : _loop(RpcLoop::start("skein-io")),
      _executor(std::make_shared<ThreadPool>(2, "skein")),
      _host(makeHostClient(_loop, _executor, hostClientOptions(paths))) {}

bool isWorthAnotherTry(const NSErrorPtr& error, std::chrono::steady_clock::time_point begin) {
  using namespace std::chrono_literals;
  return error && exitCodeFor(error) == kUnreachable &&
         std::chrono::steady_clock::now() - begin < 1s;
}

}  // namespace skein::cli
