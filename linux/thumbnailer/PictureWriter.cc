#include "linux/thumbnailer/PictureWriter.h"

#include <unistd.h>

#include <cerrno>

namespace skein::thumbnailer {
namespace {

struct Output {
  int file = -1;
  std::uint64_t length = 0;
};

gboolean writePiece(const gchar* bytes, gsize count, GError** error, gpointer data) {
  auto& output = *static_cast<Output*>(data);
  while (count > 0) {
    const ssize_t written = write(output.file, bytes, count);
    if (written < 0 && errno == EINTR) continue;
    if (written <= 0) {
      g_set_error_literal(error, GDK_PIXBUF_ERROR, GDK_PIXBUF_ERROR_FAILED, "no room");
      return FALSE;
    }
    bytes += written;
    count -= static_cast<gsize>(written);
    output.length += static_cast<std::uint64_t>(written);
  }
  return TRUE;
}

bool isOpaque(const GdkPixbuf* pixels) {
  if (gdk_pixbuf_get_has_alpha(pixels) == FALSE) return true;
  const guint8* row = gdk_pixbuf_read_pixels(pixels);
  const int width = gdk_pixbuf_get_width(pixels);
  for (int y = 0; y < gdk_pixbuf_get_height(pixels); ++y) {
    for (int x = 0; x < width; ++x) {
      if (row[x * 4 + 3] != 0xff) return false;
    }
    row += gdk_pixbuf_get_rowstride(pixels);
  }
  return true;
}

}  // namespace

RenderAnswer writePicture(GdkPixbuf* pixels, PictureFormat format, int output) {
  Output to{output};
  const bool asJpeg = format == PictureFormat::Any && isOpaque(pixels);
  const bool written = asJpeg
                           ? gdk_pixbuf_save_to_callback(pixels, writePiece, &to, "jpeg", nullptr,
                                                         "quality", "85", nullptr) != FALSE
                           : gdk_pixbuf_save_to_callback(pixels, writePiece, &to, "png", nullptr,
                                                         "compression", "6", nullptr) != FALSE;
  if (!written) return {RenderStatus::Failed};
  return {RenderStatus::Drawn, asJpeg ? PictureFormat::Jpeg : PictureFormat::Png,
          static_cast<std::uint32_t>(gdk_pixbuf_get_width(pixels)),
          static_cast<std::uint32_t>(gdk_pixbuf_get_height(pixels)), to.length};
}

}  // namespace skein::thumbnailer
