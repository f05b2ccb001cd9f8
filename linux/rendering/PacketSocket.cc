#include "linux/rendering/PacketSocket.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstring>

#include "linux/rendering/RenderMessages.h"

namespace skein {
namespace {

constexpr std::size_t kControlSize = CMSG_SPACE(kRequestDescriptors * sizeof(int));

struct alignas(cmsghdr) Control {
  char bytes[kControlSize];
};

}  // namespace

int sendPacket(int socket, std::string_view packet, const std::vector<int>& descriptors) {
  if (descriptors.size() > kRequestDescriptors) return EINVAL;
  Control control{};
  iovec part{const_cast<char*>(packet.data()), packet.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  if (!descriptors.empty()) {
    message.msg_control = control.bytes;
    message.msg_controllen = CMSG_SPACE(descriptors.size() * sizeof(int));
    cmsghdr* header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
    std::memcpy(CMSG_DATA(header), descriptors.data(), descriptors.size() * sizeof(int));
  }
  ssize_t sent = 0;
  do {
    sent = sendmsg(socket, &message, MSG_NOSIGNAL);
  } while (sent < 0 && errno == EINTR);
  return sent < 0 ? errno : 0;
}

int receivePacket(int socket, Packet& packet) {
  packet.descriptors.clear();
  packet._size = 0;
  Control control{};
  iovec part{packet._bytes, sizeof packet._bytes};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.bytes;
  message.msg_controllen = sizeof control.bytes;
  ssize_t received = 0;
  do {
    received = recvmsg(socket, &message, MSG_CMSG_CLOEXEC);
  } while (received < 0 && errno == EINTR);
  if (received < 0) return errno;
  for (cmsghdr* header = CMSG_FIRSTHDR(&message); header != nullptr;
       header = CMSG_NXTHDR(&message, header)) {
    if (header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t count = (header->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t at = 0; at < count; ++at) {
      int descriptor = -1;
      std::memcpy(&descriptor, CMSG_DATA(header) + at * sizeof(int), sizeof descriptor);
      packet.descriptors.emplace_back(descriptor);
    }
  }
  if (received == 0) return EPIPE;
  if ((message.msg_flags & (MSG_TRUNC | MSG_CTRUNC)) != 0) {
    packet.descriptors.clear();
    return 0;
  }
  packet._size = static_cast<std::size_t>(received);
  return 0;
}

}  // namespace skein
