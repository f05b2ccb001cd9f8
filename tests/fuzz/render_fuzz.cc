// Feeds the worker's request decoding and its decoders, as they are before the lock-down:
// what they do wrong is to be seen. The first bytes of an input choose what is fuzzed.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <string_view>
#include <vector>

#include "linux/protocol/FileDescriptor.h"
#include "linux/rendering/PacketSocket.h"
#include "linux/rendering/RenderMessages.h"
#include "linux/thumbnailer/Fonts.h"
#include "linux/thumbnailer/RequestLoop.h"

namespace skein {
namespace {

FileDescriptor fileWith(std::string_view bytes) {
  FileDescriptor file(memfd_create("fuzz", MFD_CLOEXEC));
  if (write(file.get(), bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size())) abort();
  return file;
}

// An answer is one that vald accepts, and tells the truth about the picture.
void check(const RenderAnswer& answer, const RenderRequest& request, int picture) {
  const auto understood = parseRenderAnswer(packetOf(answer));
  if (!understood) abort();
  if (answer.status != RenderStatus::Drawn) return;
  if (answer.width > request.side || answer.height > request.side) abort();
  if (static_cast<std::uint64_t>(lseek(picture, 0, SEEK_END)) != answer.length) abort();
}

// Any bytes at all, as a packet with any number of descriptors.
void fuzzPacket(std::string_view bytes, std::size_t descriptors) {
  std::vector<FileDescriptor> files;
  for (std::size_t at = 0; at < descriptors; ++at) files.push_back(fileWith("words"));
  thumbnailer::answerRequest(bytes, files);
  parseRenderAnswer(bytes);
  parseGreeting(bytes);
}

void fuzzDocument(std::string_view bytes, std::uint8_t choice) {
  RenderRequest request;
  request.kind = static_cast<PictureKind>(choice % kPictureKinds);
  request.format = choice / 64 % 2 == 0 ? PictureFormat::Any : PictureFormat::Png;
  request.side = choice / 16 % 2 == 0 ? 64 : 200;
  std::vector<FileDescriptor> files;
  files.push_back(fileWith(bytes));
  files.push_back(fileWith({}));
  const auto answer = thumbnailer::answerRequest(packetOf(request), files);
  if (!answer) abort();
  check(*answer, request, files[1].get());
}

}  // namespace
}  // namespace skein

// fontconfig keeps what it has read until the process ends.
extern "C" const char* __asan_default_options() { return "detect_leaks=0"; }  // NOLINT

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const bool ready = !skein::thumbnailer::prepareFonts().empty();
  if (!ready || size == 0) return 0;
  const std::string_view bytes(reinterpret_cast<const char*>(data + 1), size - 1);
  if (data[0] == 0xff) {
    skein::fuzzPacket(bytes, size % 4);
  } else {
    skein::fuzzDocument(bytes, data[0]);
  }
  return 0;
}
