// What crosses between vald and its rendering workers (skein-thumbnailer): packets on a
// socket pair (SOCK_SEQPACKET), in the machine's own byte order.
//
//   worker   Greeting, once, when it is locked down; or, when it cannot be, the step that
//            failed in words, and it ends
//   vald     RenderRequest with two descriptors: the document, open for reading, and a
//            memory file that takes the picture
//   worker   RenderAnswer, one per request, in order
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace skein {

// As what a document is decoded. Its contents have no say in it.
enum class PictureKind : std::uint32_t { Jpeg, Png, WebP, Gif, Svg, Pdf, Text };
inline constexpr std::size_t kPictureKinds = 7;

// "jpeg", "png": part of file names, so never changed.
std::string_view pictureKindName(PictureKind kind);
// Nil for a type that is not rendered here.
std::optional<PictureKind> pictureKindForContentType(std::string_view contentType);

enum class PictureFormat : std::uint32_t {
  Any,   // in a request: JPEG for a picture without transparency, else PNG
  Jpeg,  // in an answer only
  Png,
};

enum class RenderStatus : std::uint32_t {
  Drawn,
  Malformed,    // not what its type says, cut off, or protected by a password
  Empty,        // a document without anything to show
  TooLarge,     // more pixels or bytes than a worker takes on
  Unsupported,  // this machine has no loader for the type
  Failed,       // reading the document or writing the picture
};

inline constexpr std::uint32_t kRenderVersion = 2;
inline constexpr std::uint32_t kLargestSide = 1024;
inline constexpr std::uint64_t kMostPictureBytes = 16 << 20;
inline constexpr std::size_t kRequestDescriptors = 2;
// Of processor time, in a worker's whole life.
inline constexpr std::uint64_t kWorkerSeconds = 600;

struct Greeting {
  std::uint32_t version = kRenderVersion;
  std::uint32_t hasFonts = 0;  // 1: it can draw letters in pages
  std::uint32_t kinds = 0;     // bit 1 << kind: there is a loader for it
};

struct RenderRequest {
  std::uint32_t version = kRenderVersion;
  PictureKind kind = PictureKind::Jpeg;
  PictureFormat format = PictureFormat::Any;  // or Png
  std::uint32_t side = kLargestSide;          // neither width nor height is more
};

struct RenderAnswer {
  RenderStatus status = RenderStatus::Failed;
  PictureFormat format = PictureFormat::Any;
  std::uint32_t width = 0;
  std::uint32_t height = 0;
  std::uint64_t length = 0;  // of the picture, from the memory file's start
};

// Each takes a whole packet; nil for one that breaks the rules above.
std::optional<RenderRequest> parseRenderRequest(std::string_view packet);
std::optional<RenderAnswer> parseRenderAnswer(std::string_view packet);
std::optional<Greeting> parseGreeting(std::string_view packet);

}  // namespace skein
