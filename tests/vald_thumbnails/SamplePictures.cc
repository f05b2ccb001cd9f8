#include "tests/vald_thumbnails/SamplePictures.h"

#include <gdk-pixbuf/gdk-pixbuf.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdlib>
#include <string_view>

#include "linux/thumbnailer/GlibPointers.h"

namespace skein::samples {
namespace {

using namespace std::string_view_literals;
using thumbnailer::PixbufPtr;

constexpr std::string_view kGif =
    "GIF89a\x02\0\x01\0\x80\0\0\xff\0\0\0\0\xff,\0\0\0\0\x02\0\x01\0\0\x02\x02\x44\x0a\0;"sv;

std::string encoded(PictureKind kind, int width, int height) {
  const PixbufPtr pixels(gdk_pixbuf_new(GDK_COLORSPACE_RGB, FALSE, 8, width, height));
  guchar* row = gdk_pixbuf_get_pixels(pixels.get());
  for (int y = 0; y < height; ++y, row += gdk_pixbuf_get_rowstride(pixels.get())) {
    for (int x = 0; x < width * 3; ++x) row[x] = static_cast<guchar>(x * 7 + y * 3);
  }
  gchar* bytes = nullptr;
  gsize length = 0;
  if (gdk_pixbuf_save_to_buffer(pixels.get(), &bytes, &length,
                                std::string(pictureKindName(kind)).c_str(), nullptr,
                                nullptr) == FALSE) {
    std::abort();
  }
  std::string result(bytes, length);
  g_free(bytes);
  return result;
}

std::string bigEndian(std::uint32_t number) {
  std::string bytes;
  for (int shift = 24; shift >= 0; shift -= 8) bytes += static_cast<char>(number >> shift);
  return bytes;
}

std::string pngChunk(const std::string& name, const std::string& data) {
  const std::string named = name + data;
  std::uint32_t crc = 0xffffffff;
  for (const char byte : named) {
    crc ^= static_cast<unsigned char>(byte);
    for (int bit = 0; bit < 8; ++bit) crc = crc >> 1 ^ ((crc & 1) != 0 ? 0xedb88320 : 0);
  }
  return bigEndian(static_cast<std::uint32_t>(data.size())) + named + bigEndian(~crc);
}

// Zeros, deflated: one of them, and "258 more of the same" over and over.
class DeflatedZeros {
 public:
  explicit DeflatedZeros(std::uint64_t count) {
    add(0b011, 3);       // the last block; fixed codes
    add(0b00001100, 8);  // the literal 0
    const std::uint64_t runs = (count - 1) / 258;
    for (std::uint64_t run = 0; run < runs; ++run) {
      add(0b10100011, 8);  // a length of 258
      add(0, 5);           // from one byte before
    }
    for (std::uint64_t rest = runs * 258 + 1; rest < count; ++rest) add(0b00001100, 8);
    add(0, 7);  // the end
    add(0, 7);
    _bytes += bigEndian(static_cast<std::uint32_t>(count % 65521 << 16 | 1));
  }
  const std::string& bytes() const { return _bytes; }

 private:
  // The lowest bit goes first; codes are given backwards.
  void add(unsigned bits, int count) {
    _pending |= bits << _count;
    for (_count += count; _count >= 8; _count -= 8, _pending >>= 8) {
      _bytes += static_cast<char>(_pending);
    }
  }

  std::string _bytes = "\x78\x01";
  unsigned _pending = 0;
  int _count = 0;
};

}  // namespace

std::string picture(PictureKind kind, int width, int height) {
  switch (kind) {
    case PictureKind::Jpeg:
    case PictureKind::Png:
    case PictureKind::WebP: return encoded(kind, width, height);
    case PictureKind::Gif: return std::string(kGif);
    case PictureKind::Svg:
      return "<svg xmlns='http://www.w3.org/2000/svg' width='30' height='20'>"
             "<filter id='f'><feGaussianBlur stdDeviation='1'/></filter>"
             "<rect width='9' height='9' filter='url(#f)'/><text y='15'>Words</text></svg>";
    case PictureKind::Pdf: return slowPdf(0);
    case PictureKind::Text: return "Words, and more words.\n";
  }
  return {};
}

std::string pngOfZeros(std::uint32_t width, std::uint32_t height, std::uint32_t rows) {
  const std::string head = bigEndian(width) + bigEndian(height) + std::string("\x08\x06\0\0\0", 5);
  const std::uint64_t row = 1 + std::uint64_t{4} * width;
  return "\x89PNG\r\n\x1a\n" + pngChunk("IHDR", head) +
         pngChunk("IDAT", DeflatedZeros(row * rows).bytes()) + pngChunk("IEND", {});
}

std::string jpegThatClaims(std::uint16_t width, std::uint16_t height) {
  std::string bytes = encoded(PictureKind::Jpeg, 16, 16);
  const std::size_t frame = bytes.find("\xff\xc0");
  const std::string size = bigEndian(std::uint32_t{height} << 16 | width);
  return bytes.replace(frame + 5, 4, size);
}

std::string gifThatClaims(std::uint16_t width, std::uint16_t height) {
  std::string bytes(kGif);
  for (const std::size_t at : {std::size_t{6}, bytes.find(',') + 5}) {
    bytes[at] = static_cast<char>(width);
    bytes[at + 1] = static_cast<char>(width >> 8);
    bytes[at + 2] = static_cast<char>(height);
    bytes[at + 3] = static_cast<char>(height >> 8);
  }
  return bytes;
}

std::string deepSvg(int depth) {
  std::string text = "<svg xmlns='http://www.w3.org/2000/svg' width='9' height='9'>";
  for (int at = 0; at < depth; ++at) text += "<g>";
  for (int at = 0; at < depth; ++at) text += "</g>";
  return text + "</svg>";
}

std::string swellingSvg() {
  std::string text = "<!DOCTYPE svg [<!ENTITY e0 'words'>";
  for (int at = 1; at < 12; ++at) {
    const std::string before = "&e" + std::to_string(at - 1) + ";";
    text += "<!ENTITY e" + std::to_string(at) + " '";
    for (int times = 0; times < 10; ++times) text += before;
    text += "'>";
  }
  return text +
         "]><svg xmlns='http://www.w3.org/2000/svg' width='9' height='9'><text>&e11;</text></svg>";
}

std::string slowPdf(int levels) {
  std::string text =
      "%PDF-1.4\n1 0 obj<</Type/Catalog/Pages 2 0 R>>endobj\n"
      "2 0 obj<</Type/Pages/Kids[3 0 R]/Count 1>>endobj\n"
      "3 0 obj<</Type/Page/Parent 2 0 R/MediaBox[0 0 300 200]/Contents 4 0 R/Resources<<"
      "/Font<</F1<</Type/Font/Subtype/Type1/BaseFont/Helvetica>>>>/XObject<</X 5 0 R>>>>>>endobj\n";
  const auto stream = [&](int number, const std::string& entries, const std::string& contents) {
    text += std::to_string(number) + " 0 obj<<" + entries + "/Length " +
            std::to_string(contents.size()) + ">>stream\n" + contents + "\nendstream endobj\n";
  };
  stream(4, "", "BT /F1 30 Tf 20 100 Td (Words) Tj ET /X Do");
  for (int level = 0; level < levels; ++level) {
    std::string contents;
    for (int times = 0; times < 10; ++times) contents += "/X Do ";
    stream(5 + level,
           "/Type/XObject/Subtype/Form/BBox[0 0 300 200]/Resources<</XObject<</X " +
               std::to_string(6 + level) + " 0 R>>>>",
           contents);
  }
  stream(5 + levels, "/Type/XObject/Subtype/Form/BBox[0 0 300 200]", "1 0 0 rg 9 9 50 50 re f");
  return text + "trailer<</Root 1 0 R>>\n";
}

FileDescriptor fileWith(const std::string& bytes) {
  FileDescriptor file(memfd_create("sample", MFD_CLOEXEC));
  if (write(file.get(), bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size())) {
    std::abort();
  }
  return file;
}

}  // namespace skein::samples
