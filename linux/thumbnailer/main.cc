// skein-thumbnailer: draws documents for vald in a process that can do nothing else.
//
// vald starts it with a socket as descriptor 3 (see linux/rendering/RenderMessages.h). It
// loads what the decoders need, gives up everything but the socket and its memory, and
// answers until the socket closes.
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "linux/rendering/PacketSocket.h"
#include "linux/thumbnailer/Fonts.h"
#include "linux/thumbnailer/LockDown.h"
#include "linux/thumbnailer/RequestLoop.h"
#include "linux/thumbnailer/WarmUp.h"

#ifdef SKEIN_SANITIZED
// In place of the limit of the address space. A leak checker would need system calls that
// are taken away by then.
extern "C" const char* __asan_default_options();   // NOLINT
extern "C" const char* __asan_default_options() {  // NOLINT
  return "max_allocation_size_mb=512:allocator_may_return_null=1:detect_leaks=0";
}
// Pango's threads are not this program's to judge.
extern "C" const char* __tsan_default_options();   // NOLINT
extern "C" const char* __tsan_default_options() {  // NOLINT
  return "ignore_noninstrumented_modules=1";
}
#endif

// In place of the C library's, which asks by a system call that may name a file as well and
// so is not allowed here. Font libraries ask it of each font that they open.
#if defined(SYS_fstat) && __SIZEOF_POINTER__ == 8
extern "C" int fstat(int file, struct stat* status) {  // NOLINT
  return static_cast<int>(syscall(SYS_fstat, file, status));
}
#endif

namespace skein::thumbnailer {
namespace {

constexpr int kSocket = 3;
constexpr int kNiceness = 10;  // after everything that a person waits for

bool isPacketSocket(int descriptor) {
  int type = 0;
  socklen_t length = sizeof type;
  return getsockopt(descriptor, SOL_SOCKET, SO_TYPE, &type, &length) == 0 && type == SOCK_SEQPACKET;
}

int run() {
  if (!isPacketSocket(kSocket)) {
    std::fputs("skein-thumbnailer: vald starts this program, with a socket as descriptor 3\n",
               stderr);
    return 2;
  }
  setpriority(PRIO_PROCESS, 0, kNiceness);
  Greeting greeting;
  const std::vector<std::string> fontFolders = prepareFonts();
  greeting.kinds = warmUp();
  const LockDown outcome = lockDown(fontFolders);
  if (!outcome.problem.empty()) {
    std::fprintf(stderr, "skein-thumbnailer: %s\n", outcome.problem.c_str());
    sendPacket(kSocket, std::string_view(outcome.problem).substr(0, kMostPacketBytes));
    return EXIT_FAILURE;
  }
  greeting.hasFonts = outcome.hasFonts ? 1 : 0;
  if (!outcome.hasFonts) greeting.kinds &= ~(1U << static_cast<unsigned>(PictureKind::Text));
  // Not exit(): what runs at the end of a process asks for more than is left.
  _exit(serveRequests(kSocket, greeting));
}

}  // namespace
}  // namespace skein::thumbnailer

int main() { return skein::thumbnailer::run(); }
