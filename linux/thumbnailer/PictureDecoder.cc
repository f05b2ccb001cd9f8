#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <string>

#include "linux/thumbnailer/Decoders.h"
#include "linux/thumbnailer/Surfaces.h"

namespace skein::thumbnailer {
namespace {

constexpr std::size_t kPiece = 64 << 10;

// What the loader told about the picture while it read.
struct Progress {
  const PictureKind kind;
  const std::uint32_t side;
  bool tooLarge = false;
  int rows = 0;  // decoded so far
};

// JPEG pictures are decoded smaller by 2, 4 or 8 where that still leaves enough. Other
// sizes than these would make gdk-pixbuf scale by itself and keep quiet about the rows.
int reduction(int width, int height, std::uint32_t side) {
  const auto longer = static_cast<std::uint32_t>(std::max(width, height));
  int factor = 1;
  while (factor < 8 && longer / (factor * 2) >= side) factor *= 2;
  return factor;
}

void sizeIsKnown(GdkPixbufLoader* loader, int width, int height, gpointer data) {
  auto& progress = *static_cast<Progress*>(data);
  if (width <= 0 || height <= 0) return;
  if (progress.kind == PictureKind::Svg) {
    const FittedSize size = fittedSize(width, height, progress.side);
    gdk_pixbuf_loader_set_size(loader, size.width, size.height);
    return;
  }
  if (static_cast<std::uint64_t>(width) * static_cast<std::uint64_t>(height) > kMostPixels) {
    progress.tooLarge = true;
    gdk_pixbuf_loader_set_size(loader, 0, 0);  // the loader stops here
    return;
  }
  if (progress.kind == PictureKind::Jpeg) {
    const int factor = reduction(width, height, progress.side);
    gdk_pixbuf_loader_set_size(loader, (width + factor - 1) / factor,
                               (height + factor - 1) / factor);
  }
}

void areaIsDecoded(GdkPixbufLoader* /*loader*/, int /*x*/, int y, int /*width*/, int height,
                   gpointer data) {
  auto& progress = *static_cast<Progress*>(data);
  progress.rows = std::max(progress.rows, y + height);
}

// What the loader is called by gdk-pixbuf.
std::string loaderName(PictureKind kind) { return std::string(pictureKindName(kind)); }

// Feeds the loader. Drawn: all of it was taken.
RenderStatus feed(GdkPixbufLoader* loader, int document, const Progress& progress) {
  std::array<unsigned char, kPiece> piece;
  std::uint64_t offset = 0;
  for (;;) {
    const ssize_t length = pread(document, piece.data(), piece.size(), static_cast<off_t>(offset));
    if (length < 0 && errno == EINTR) continue;
    if (length < 0) return RenderStatus::Failed;
    if (length == 0) return offset == 0 ? RenderStatus::Empty : RenderStatus::Drawn;
    offset += static_cast<std::uint64_t>(length);
    if (offset > kMostDocumentBytes) return RenderStatus::TooLarge;
    const bool taken =
        gdk_pixbuf_loader_write(loader, piece.data(), static_cast<gsize>(length), nullptr) != FALSE;
    if (progress.tooLarge) return RenderStatus::TooLarge;
    if (!taken) return RenderStatus::Malformed;
  }
}

// Whether the picture was cut off, which not every loader says. At its end a loader draws
// what it can of a JPEG picture: `rows` are those of before.
bool isComplete(PictureKind kind, int document, int rows, const GdkPixbuf* pixels) {
  const bool tellsRows = kind == PictureKind::Jpeg || kind == PictureKind::Png;
  if (tellsRows) return rows >= gdk_pixbuf_get_height(pixels);
  if (kind != PictureKind::WebP) return true;
  // "RIFF" and the length of what follows, the lowest byte first.
  std::array<unsigned char, 8> head{};
  if (pread(document, head.data(), head.size(), 0) != ssize_t{8}) return false;
  const std::uint64_t length =
      8 + (head[4] | head[5] << 8U | head[6] << 16U | static_cast<std::uint64_t>(head[7]) << 24U);
  return static_cast<std::uint64_t>(lseek(document, 0, SEEK_END)) >= length;
}

PixbufPtr scaledToFit(PixbufPtr pixels, std::uint32_t side) {
  const int width = gdk_pixbuf_get_width(pixels.get());
  const int height = gdk_pixbuf_get_height(pixels.get());
  if (std::max(width, height) <= static_cast<int>(side)) return pixels;
  const FittedSize size = fittedSize(width, height, side);
  return PixbufPtr(
      gdk_pixbuf_scale_simple(pixels.get(), size.width, size.height, GDK_INTERP_BILINEAR));
}

}  // namespace

Decoded decodePicture(PictureKind kind, int document, std::uint32_t side) {
  const ObjectPtr<GdkPixbufLoader> loader(
      gdk_pixbuf_loader_new_with_type(loaderName(kind).c_str(), nullptr));
  if (!loader) return {RenderStatus::Unsupported};
  Progress progress{kind, side};
  g_signal_connect(loader.get(), "size-prepared", G_CALLBACK(sizeIsKnown), &progress);
  g_signal_connect(loader.get(), "area-updated", G_CALLBACK(areaIsDecoded), &progress);

  const RenderStatus fed = feed(loader.get(), document, progress);
  const int rows = progress.rows;
  const bool closed = gdk_pixbuf_loader_close(loader.get(), nullptr) != FALSE;
  if (fed != RenderStatus::Drawn) return {fed};
  if (progress.tooLarge) return {RenderStatus::TooLarge};
  GdkPixbuf* pixels = gdk_pixbuf_loader_get_pixbuf(loader.get());
  if (!closed || pixels == nullptr || !isComplete(kind, document, rows, pixels)) {
    return {RenderStatus::Malformed};
  }
  PixbufPtr upright(gdk_pixbuf_apply_embedded_orientation(pixels));
  PixbufPtr fitted = upright ? scaledToFit(std::move(upright), side) : nullptr;
  if (!fitted) return {RenderStatus::TooLarge};
  return {RenderStatus::Drawn, std::move(fitted)};
}

Decoded decode(PictureKind kind, int document, std::uint32_t side) {
  switch (kind) {
    case PictureKind::Pdf: return decodePdf(document, side);
    case PictureKind::Text: return decodeText(document, side);
    default: return decodePicture(kind, document, side);
  }
}

}  // namespace skein::thumbnailer
