#include "linux/thumbnailer/Surfaces.h"

#include <algorithm>
#include <cmath>

namespace skein::thumbnailer {

FittedSize fittedSize(double width, double height, std::uint32_t side) {
  const double scale = side / std::max(width, height);
  const auto scaled = [&](double length) {
    return std::clamp(static_cast<int>(std::lround(length * scale)), 1, static_cast<int>(side));
  };
  return {scaled(width), scaled(height)};
}

Paper::Paper(FittedSize size)
    : surface(cairo_image_surface_create(CAIRO_FORMAT_RGB24, size.width, size.height)),
      context(cairo_create(surface.get())) {
  cairo_set_source_rgb(context.get(), 1, 1, 1);
  cairo_paint(context.get());
}

Decoded pixelsOf(const Paper& paper) {
  cairo_surface_flush(paper.surface.get());
  if (cairo_status(paper.context.get()) != CAIRO_STATUS_SUCCESS) return {RenderStatus::Malformed};
  const int width = cairo_image_surface_get_width(paper.surface.get());
  const int height = cairo_image_surface_get_height(paper.surface.get());
  PixbufPtr pixels(gdk_pixbuf_new(GDK_COLORSPACE_RGB, FALSE, 8, width, height));
  if (!pixels) return {RenderStatus::TooLarge};
  const unsigned char* from = cairo_image_surface_get_data(paper.surface.get());
  unsigned char* to = gdk_pixbuf_get_pixels(pixels.get());
  for (int y = 0; y < height; ++y) {
    // A pixel of the surface is a number of 32 bits, 0x00RRGGBB.
    const auto* pixel = reinterpret_cast<const std::uint32_t*>(
        from +
        static_cast<std::ptrdiff_t>(y) * cairo_image_surface_get_stride(paper.surface.get()));
    unsigned char* out =
        to + static_cast<std::ptrdiff_t>(y) * gdk_pixbuf_get_rowstride(pixels.get());
    for (int x = 0; x < width; ++x, ++pixel, out += 3) {
      out[0] = static_cast<unsigned char>(*pixel >> 16);
      out[1] = static_cast<unsigned char>(*pixel >> 8);
      out[2] = static_cast<unsigned char>(*pixel);
    }
  }
  return {RenderStatus::Drawn, std::move(pixels)};
}

}  // namespace skein::thumbnailer
