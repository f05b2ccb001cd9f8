#include "linux/thumbnailer/WarmUp.h"

#include <sys/mman.h>
#include <unistd.h>

#include <string>
#include <string_view>

#include "linux/protocol/FileDescriptor.h"
#include "linux/thumbnailer/Decoders.h"
#include "linux/thumbnailer/PictureWriter.h"

namespace skein::thumbnailer {
namespace {

using namespace std::string_view_literals;

// One pixel.
constexpr std::string_view kWebP =
    "RIFF\x1a\0\0\0WEBPVP8L\x0d\0\0\0\x2f\0\0\0\x10\x07\x10\x11\x11\x88\x88\xfe\x07\0"sv;
constexpr std::string_view kGif =
    "GIF89a\x01\0\x01\0\x80\0\0\xff\xff\xff\0\0\0,\0\0\0\0\x01\0\x01\0\0\x02\x02\x44\x01\0;"sv;
// With text and a picture in it, but without a filter: for those librsvg starts threads.
constexpr std::string_view kSvg = R"svg(<?xml version="1.0"?>
<svg xmlns="http://www.w3.org/2000/svg" xmlns:xlink="http://www.w3.org/1999/xlink"
  width="8" height="8">
<text y="8" font-size="4">A</text>
<image width="1" height="1" xlink:href="data:image/gif;base64,R0lGODlhAQABAIAAAP///wAAACwAAAAAAQABAAACAkQBADs="/>
</svg>)svg";
constexpr std::string_view kPdf = R"pdf(%PDF-1.4
1 0 obj<</Type/Catalog/Pages 2 0 R>>endobj
2 0 obj<</Type/Pages/Kids[3 0 R]/Count 1>>endobj
3 0 obj<</Type/Page/Parent 2 0 R/MediaBox[0 0 9 9]/Contents 4 0 R/Resources<</Font<<
/F1<</Type/Font/Subtype/Type1/BaseFont/Helvetica>>/F2<</Type/Font/Subtype/Type1/BaseFont/Courier>>
/F3<</Type/Font/Subtype/Type1/BaseFont/Times-Roman>>>>>>>>endobj
4 0 obj<</Length 75>>stream
BT /F1 9 Tf (A) Tj /F2 9 Tf (A) Tj /F3 9 Tf (A) Tj ET                      
endstream endobj
trailer<</Root 1 0 R>>
)pdf";

FileDescriptor fileWith(std::string_view bytes) {
  FileDescriptor file(memfd_create("warm-up", MFD_CLOEXEC));
  if (file && write(file.get(), bytes.data(), bytes.size()) < 0) file.reset();
  return file;
}

std::string encodedPixel(const char* format) {
  const PixbufPtr pixel(gdk_pixbuf_new(GDK_COLORSPACE_RGB, FALSE, 8, 1, 1));
  gdk_pixbuf_fill(pixel.get(), 0xffffffff);
  gchar* bytes = nullptr;
  gsize length = 0;
  if (gdk_pixbuf_save_to_buffer(pixel.get(), &bytes, &length, format, nullptr, nullptr) == FALSE) {
    return {};
  }
  std::string encoded(bytes, length);
  g_free(bytes);
  return encoded;
}

std::string tinyDocument(PictureKind kind) {
  switch (kind) {
    case PictureKind::Jpeg: return encodedPixel("jpeg");
    case PictureKind::Png: return encodedPixel("png");
    case PictureKind::WebP: return std::string(kWebP);
    case PictureKind::Gif: return std::string(kGif);
    case PictureKind::Svg: return std::string(kSvg);
    case PictureKind::Pdf: return std::string(kPdf);
    case PictureKind::Text: return "A \xd9\x85 \xe6\x97\xa5";
  }
  return {};
}

bool works(PictureKind kind) {
  const FileDescriptor document = fileWith(tinyDocument(kind));
  const FileDescriptor output = fileWith({});
  if (!document || !output) return false;
  const Decoded decoded = decode(kind, document.get(), 64);
  if (decoded.status != RenderStatus::Drawn) return false;
  return writePicture(decoded.pixels.get(), PictureFormat::Any, output.get()).status ==
         RenderStatus::Drawn;
}

}  // namespace

std::uint32_t warmUp() {
  std::uint32_t kinds = 0;
  for (std::uint32_t number = 0; number < kPictureKinds; ++number) {
    const auto kind = static_cast<PictureKind>(number);
    if (works(kind)) kinds |= 1U << number;
  }
  return kinds;
}

}  // namespace skein::thumbnailer
