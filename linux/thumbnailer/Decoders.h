// Documents to pixels. None of these opens a file or looks at contents to find out what
// they are; each reads the descriptor from its start, whatever its position. One thread.
#pragma once

#include <cstdint>

#include "linux/rendering/RenderMessages.h"
#include "linux/thumbnailer/GlibPointers.h"

namespace skein::thumbnailer {

// A picture with more pixels is not decoded: 100 megapixels are what large scanners make.
inline constexpr std::uint64_t kMostPixels = 100'000'000;
// A document with more bytes is not read.
inline constexpr std::uint64_t kMostDocumentBytes = 256 << 20;

struct Decoded {
  RenderStatus status = RenderStatus::Malformed;
  PixbufPtr pixels = nullptr;  // when Drawn
};

// What gdk-pixbuf's loader of this kind makes of the document: the first picture of an
// animation, turned as it says. Fits into `side` by `side`; photographs are never enlarged,
// drawings (Svg) always fill it.
Decoded decodePicture(PictureKind kind, int document, std::uint32_t side);

// The first page, on white.
Decoded decodePdf(int document, std::uint32_t side);

// The text's beginning as a page of paper.
Decoded decodeText(int document, std::uint32_t side);

// All of them.
Decoded decode(PictureKind kind, int document, std::uint32_t side);

}  // namespace skein::thumbnailer
