#include "linux/cli/Pictures.h"

#include <algorithm>
#include <cstdlib>

#include "linux/cli/Output.h"

namespace skein::cli {
namespace {

// What kitty takes in one escape sequence.
constexpr std::size_t kKittyChunk = 4096;

std::string_view variable(const char* name) {
  const char* value = std::getenv(name);
  return value != nullptr ? value : "";
}

bool isSvg(std::string_view picture) {
  const std::string_view head = picture.substr(0, 1024);
  return head.find("<svg") != std::string_view::npos;
}

std::string shownByKitty(std::string_view picture) {
  const std::string text = base64(picture);
  std::string escapes;
  for (std::size_t at = 0; at < text.size(); at += kKittyChunk) {
    const bool isLast = at + kKittyChunk >= text.size();
    escapes += at == 0 ? "\x1b_Ga=T,f=100,m=" : "\x1b_Gm=";
    escapes += isLast ? "0;" : "1;";
    escapes.append(text, at, kKittyChunk);
    escapes += "\x1b\\";
  }
  return escapes + "\n";
}

std::string shownByITerm(std::string_view picture, int side) {
  return "\x1b]1337;File=inline=1;preserveAspectRatio=1;height=" + std::to_string(side) +
         "px;size=" + std::to_string(picture.size()) + ":" + base64(picture) + "\a\n";
}

}  // namespace

PictureFormat formatOf(std::string_view picture) {
  if (picture.starts_with("\x89PNG\r\n")) return PictureFormat::Png;
  if (picture.starts_with("\xff\xd8\xff")) return PictureFormat::Jpeg;
  if (picture.starts_with("GIF8")) return PictureFormat::Gif;
  if (picture.starts_with("RIFF") && picture.substr(0, 12).ends_with("WEBP")) {
    return PictureFormat::WebP;
  }
  return isSvg(picture) ? PictureFormat::Svg : PictureFormat::Unknown;
}

std::string_view suffixOf(PictureFormat format) {
  switch (format) {
    case PictureFormat::Png: return ".png";
    case PictureFormat::Jpeg: return ".jpg";
    case PictureFormat::Gif: return ".gif";
    case PictureFormat::WebP: return ".webp";
    case PictureFormat::Svg: return ".svg";
    case PictureFormat::Unknown: break;
  }
  return ".bin";
}

std::string_view mimeTypeOf(PictureFormat format) {
  switch (format) {
    case PictureFormat::Png: return "image/png";
    case PictureFormat::Jpeg: return "image/jpeg";
    case PictureFormat::Gif: return "image/gif";
    case PictureFormat::WebP: return "image/webp";
    case PictureFormat::Svg: return "image/svg+xml";
    case PictureFormat::Unknown: break;
  }
  return "application/octet-stream";
}

PictureProtocol pictureProtocol() {
  const std::string_view program = variable("TERM_PROGRAM");
  for (const std::string_view name : {"iTerm.app", "WezTerm", "mintty", "vscode"}) {
    if (program == name) return PictureProtocol::ITerm;
  }
  if (variable("LC_TERMINAL") == "iTerm2") return PictureProtocol::ITerm;
  const bool isKitty = !variable("KITTY_WINDOW_ID").empty() || program == "ghostty" ||
                       variable("TERM") == "xterm-kitty";
  return isKitty ? PictureProtocol::Kitty : PictureProtocol::None;
}

bool canShow(PictureProtocol protocol, PictureFormat format) {
  switch (protocol) {
    case PictureProtocol::None: return false;
    case PictureProtocol::Kitty: return format == PictureFormat::Png;
    case PictureProtocol::ITerm:
      return format != PictureFormat::Svg && format != PictureFormat::Unknown;
  }
  return false;
}

std::string shown(PictureProtocol protocol, std::string_view picture, int side) {
  return protocol == PictureProtocol::Kitty ? shownByKitty(picture) : shownByITerm(picture, side);
}

}  // namespace skein::cli
