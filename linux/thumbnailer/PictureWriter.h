#pragma once

#include "linux/rendering/RenderMessages.h"
#include "linux/thumbnailer/GlibPointers.h"

namespace skein::thumbnailer {

// Writes the pixels to `output`, from its position on: in the format that is asked for, and
// for Any as JPEG when no pixel is transparent, else as PNG. Drawn, or Failed.
RenderAnswer writePicture(GdkPixbuf* pixels, PictureFormat format, int output);

}  // namespace skein::thumbnailer
