#pragma once

#include <cstddef>
#include <string_view>
#include <type_traits>
#include <vector>

#include "linux/protocol/FileDescriptor.h"

namespace skein {

inline constexpr std::size_t kMostPacketBytes = 64;

// Sends one packet, with copies of the descriptors. 0, or an errno; never a signal.
int sendPacket(int socket, std::string_view packet, const std::vector<int>& descriptors = {});

template <class Message>
std::string_view packetOf(const Message& message) {
  static_assert(std::is_trivially_copyable_v<Message>);
  return {reinterpret_cast<const char*>(&message), sizeof message};
}

// One packet as it came. One that was too long, or had more descriptors than two, is
// empty: no message is.
struct Packet {
  std::string_view bytes() const { return {_bytes, _size}; }

  std::vector<FileDescriptor> descriptors;

 private:
  friend int receivePacket(int socket, Packet& packet);
  char _bytes[kMostPacketBytes];
  std::size_t _size = 0;
};

// Waits for a packet. 0, or an errno; EPIPE when the other end is closed.
int receivePacket(int socket, Packet& packet);

}  // namespace skein
