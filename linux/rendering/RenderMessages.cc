#include "linux/rendering/RenderMessages.h"

#include <array>
#include <cstring>
#include <type_traits>
#include <utility>

namespace skein {
namespace {

template <class Message>
std::optional<Message> copyOf(std::string_view packet) {
  static_assert(std::is_trivially_copyable_v<Message>);
  if (packet.size() != sizeof(Message)) return std::nullopt;
  Message message;
  std::memcpy(static_cast<void*>(&message), packet.data(), sizeof message);
  return message;
}

template <class Enum>
bool isUpTo(Enum value, Enum last) {
  return static_cast<std::uint32_t>(value) <= static_cast<std::uint32_t>(last);
}

constexpr std::array<std::pair<std::string_view, PictureKind>, 14> kContentTypes{{
    {"image/jpeg", PictureKind::Jpeg},
    {"image/png", PictureKind::Png},
    {"image/webp", PictureKind::WebP},
    {"image/gif", PictureKind::Gif},
    {"image/svg+xml", PictureKind::Svg},
    {"application/pdf", PictureKind::Pdf},
    {"application/json", PictureKind::Text},
    {"application/xml", PictureKind::Text},
    {"application/yaml", PictureKind::Text},
    {"application/x-yaml", PictureKind::Text},
    {"application/toml", PictureKind::Text},
    {"application/javascript", PictureKind::Text},
    {"application/x-shellscript", PictureKind::Text},
    {"application/x-perl", PictureKind::Text},
}};

}  // namespace

std::string_view pictureKindName(PictureKind kind) {
  switch (kind) {
    case PictureKind::Jpeg: return "jpeg";
    case PictureKind::Png: return "png";
    case PictureKind::WebP: return "webp";
    case PictureKind::Gif: return "gif";
    case PictureKind::Svg: return "svg";
    case PictureKind::Pdf: return "pdf";
    case PictureKind::Text: return "text";
  }
  return "unknown";
}

std::optional<PictureKind> pictureKindForContentType(std::string_view contentType) {
  for (const auto& [type, kind] : kContentTypes) {
    if (type == contentType) return kind;
  }
  if (contentType.starts_with("text/")) return PictureKind::Text;
  return std::nullopt;
}

std::optional<RenderRequest> parseRenderRequest(std::string_view packet) {
  const auto request = copyOf<RenderRequest>(packet);
  if (!request || request->version != kRenderVersion) return std::nullopt;
  if (!isUpTo(request->kind, PictureKind::Text)) return std::nullopt;
  if (!isUpTo(request->format, PictureFormat::Png)) return std::nullopt;
  if (request->format == PictureFormat::Jpeg) return std::nullopt;
  if (request->side == 0 || request->side > kLargestSide) return std::nullopt;
  return request;
}

std::optional<RenderAnswer> parseRenderAnswer(std::string_view packet) {
  const auto answer = copyOf<RenderAnswer>(packet);
  if (!answer || !isUpTo(answer->status, RenderStatus::Failed)) return std::nullopt;
  if (answer->status != RenderStatus::Drawn) return RenderAnswer{answer->status};
  if (!isUpTo(answer->format, PictureFormat::Png)) return std::nullopt;
  if (answer->format == PictureFormat::Any) return std::nullopt;
  if (answer->width == 0 || answer->width > kLargestSide) return std::nullopt;
  if (answer->height == 0 || answer->height > kLargestSide) return std::nullopt;
  if (answer->length == 0 || answer->length > kMostPictureBytes) return std::nullopt;
  return answer;
}

std::optional<Greeting> parseGreeting(std::string_view packet) {
  const auto greeting = copyOf<Greeting>(packet);
  if (!greeting || greeting->version != kRenderVersion) return std::nullopt;
  return greeting;
}

}  // namespace skein
