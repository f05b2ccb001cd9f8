#include "linux/thumbnailer/RequestLoop.h"

#include <cerrno>
#include <cstdlib>

#include "linux/rendering/PacketSocket.h"
#include "linux/thumbnailer/Decoders.h"
#include "linux/thumbnailer/PictureWriter.h"

namespace skein::thumbnailer {

std::optional<RenderAnswer> answerRequest(std::string_view packet,
                                          const std::vector<FileDescriptor>& descriptors) {
  const auto request = parseRenderRequest(packet);
  if (!request || descriptors.size() != kRequestDescriptors) return std::nullopt;
  const Decoded decoded = decode(request->kind, descriptors[0].get(), request->side);
  if (decoded.status != RenderStatus::Drawn) return RenderAnswer{decoded.status};
  return writePicture(decoded.pixels.get(), request->format, descriptors[1].get());
}

int serveRequests(int socket, const Greeting& greeting) {
  if (sendPacket(socket, packetOf(greeting)) != 0) return EXIT_FAILURE;
  Packet packet;
  for (;;) {
    if (const int code = receivePacket(socket, packet)) {
      return code == EPIPE || code == ECONNRESET ? EXIT_SUCCESS : EXIT_FAILURE;
    }
    const auto answer = answerRequest(packet.bytes(), packet.descriptors);
    packet.descriptors.clear();
    if (!answer || sendPacket(socket, packetOf(*answer)) != 0) return EXIT_FAILURE;
  }
}

}  // namespace skein::thumbnailer
