// Documents of every kind, made on the fly: good ones, and such as want to do harm.
#pragma once

#include <cstdint>
#include <string>

#include "linux/protocol/FileDescriptor.h"
#include "linux/rendering/RenderMessages.h"

namespace skein::samples {

// A good document; JPEG, PNG and WebP of this size, GIF of 2 by 1.
std::string picture(PictureKind kind, int width = 300, int height = 200);

// A small PNG file of transparent black that is large when it is decoded, and has so many of
// the rows that it claims.
std::string pngOfZeros(std::uint32_t width, std::uint32_t height, std::uint32_t rows);
// A good JPEG document whose head claims another size.
std::string jpegThatClaims(std::uint16_t width, std::uint16_t height);
std::string gifThatClaims(std::uint16_t width, std::uint16_t height);
// Elements within elements.
std::string deepSvg(int depth);
// Entities that stand for ever more of each other.
std::string swellingSvg();
// Forms that draw each other, in all 10 to the power of `levels` times.
std::string slowPdf(int levels);

// A file of these bytes, without a name.
FileDescriptor fileWith(const std::string& bytes);

}  // namespace skein::samples
