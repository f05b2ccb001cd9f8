// Pictures on a terminal, and as files.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace skein::cli {

enum class PictureFormat : std::uint8_t { Unknown, Png, Jpeg, Gif, WebP, Svg };

// By the bytes it begins with.
PictureFormat formatOf(std::string_view picture);
// ".png" and the like; ".bin" for what is unknown.
std::string_view suffixOf(PictureFormat format);
// "image/png" and the like.
std::string_view mimeTypeOf(PictureFormat format);

// How a terminal is told to show a picture.
enum class PictureProtocol : std::uint8_t { None, Kitty, ITerm };

// By what the terminal says of itself in the environment.
PictureProtocol pictureProtocol();

// Whether the protocol takes the format. Neither draws vectors; kitty's takes PNG alone.
bool canShow(PictureProtocol protocol, PictureFormat format);
// What to write to a terminal so that it shows the picture, at most `side` pixels high where
// the protocol can say so.
std::string shown(PictureProtocol protocol, std::string_view picture, int side);

}  // namespace skein::cli
