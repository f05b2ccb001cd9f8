// Unix sockets as plain descriptors: what needs no event loop. A path may be longer than the
// 107 bytes that a socket's address holds.
#pragma once

#include <sys/socket.h>
#include <sys/types.h>

#include <optional>
#include <string>

#include "linux/protocol/FileDescriptor.h"
#include "platform/foundation/NSError.h"

namespace skein {

// A listening socket at `path`, mode 0600, close-on-exec, non-blocking. What stands at
// the path is replaced: a process that calls this holds its program's lock file, so a
// socket found there is stale. None, with an error that names the path and the cause.
FileDescriptor listenOnUnixSocket(const std::string& path, NSErrorOut error);

// Connects without waiting. None with an errno in `code`: ENOENT or ECONNREFUSED when
// nobody listens, EAGAIN when the listener does not accept, EACCES when the listener is
// a process of another user.
FileDescriptor connectToUnixSocket(const std::string& path, int& code);

// The process that listens on the socket at `path`, held so that its number cannot become
// another's: the kernel tells, whether or not that process is able to answer. Nothing when
// nobody listens.
struct SocketListener {
  pid_t pid = 0;
  FileDescriptor handle;
};
std::optional<SocketListener> listenerOnUnixSocket(const std::string& path);

// Who is at the other end, as the kernel noted when it connected; nothing when that cannot be
// told.
std::optional<ucred> peerOfSocket(int descriptor);

}  // namespace skein
