#include "linux/protocol/UnixSocket.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr int kBacklog = 128;

// An address holds 107 bytes. A longer path is reached by way of its folder, which stays
// open in `folder` for as long as the address is used. An errno, or zero.
int addressFor(const std::string& path, sockaddr_un& address, FileDescriptor& folder) {
  std::string shorter = path;
  if (path.size() >= sizeof address.sun_path) {
    const std::size_t slash = path.rfind('/');
    if (slash == std::string::npos) return ENAMETOOLONG;
    folder =
        FileDescriptor(open(path.substr(0, slash + 1).c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!folder) return errno;
    shorter = "/proc/self/fd/" + std::to_string(folder.get()) + path.substr(slash);
    if (shorter.size() >= sizeof address.sun_path) return ENAMETOOLONG;
  }
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, shorter.c_str(), shorter.size() + 1);
  return 0;
}

FileDescriptor newSocket() {
  return FileDescriptor(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

}  // namespace

FileDescriptor listenOnUnixSocket(const std::string& path, NSErrorOut error) {
  const auto fail = [&](int code) {
    error.store(vl_errorWithPOSIXCode(
        code, "The socket " + path + " cannot be listened on: " + std::strerror(code) + "."));
    return FileDescriptor();
  };
  sockaddr_un address{};
  FileDescriptor folder;
  if (const int code = addressFor(path, address, folder)) return fail(code);
  FileDescriptor listener = newSocket();
  if (!listener) return fail(errno);
  if (unlink(path.c_str()) != 0 && errno != ENOENT) return fail(errno);
  if (bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    return fail(errno);
  }
  // Nobody can connect before listen(), so the mode is right from the first moment on.
  if (chmod(path.c_str(), 0600) != 0) return fail(errno);
  if (listen(listener.get(), kBacklog) != 0) return fail(errno);
  return listener;
}

FileDescriptor connectToUnixSocket(const std::string& path, int& code) {
  sockaddr_un address{};
  FileDescriptor folder;
  code = addressFor(path, address, folder);
  if (code != 0) return {};
  FileDescriptor connection = newSocket();
  if (!connection ||
      connect(connection.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    code = errno;
    return {};
  }
  const auto peer = peerOfSocket(connection.get());
  if (!peer || peer->uid != geteuid()) {
    code = EACCES;
    return {};
  }
  return connection;
}

std::optional<SocketListener> listenerOnUnixSocket(const std::string& path) {
  int code = 0;
  const FileDescriptor connection = connectToUnixSocket(path, code);
  const auto peer = connection ? peerOfSocket(connection.get()) : std::nullopt;
  if (!peer) return std::nullopt;
  SocketListener listener{peer->pid,
                          FileDescriptor(static_cast<int>(syscall(SYS_pidfd_open, peer->pid, 0)))};
  if (!listener.handle) return std::nullopt;
  return listener;
}

std::optional<ucred> peerOfSocket(int descriptor) {
  ucred peer{};
  socklen_t length = sizeof peer;
  if (getsockopt(descriptor, SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) return std::nullopt;
  return peer;
}

}  // namespace skein
