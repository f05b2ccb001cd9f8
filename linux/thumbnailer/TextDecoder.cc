#include <pango/pangocairo.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <string>

#include "linux/thumbnailer/Decoders.h"
#include "linux/thumbnailer/Surfaces.h"

namespace skein::thumbnailer {
namespace {

// More does not fit on the page.
constexpr std::size_t kMostBytes = 16 << 10;
constexpr std::size_t kMostLines = 70;
constexpr std::size_t kMostLineBytes = 2000;
// The page has the proportions of A4 paper, and lines of this many letters.
constexpr double kPaperWidth = 210;
constexpr double kPaperHeight = 297;
constexpr double kMargin = 0.06;  // of the width
constexpr double kLetters = 66;
constexpr double kLetterWidth = 0.6;  // of a font's size, as fixed-width fonts have it
// What is no text has many bytes that no text has.
constexpr std::size_t kOddBytesAllowed = 20;  // one of so many

bool isOdd(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return (byte < 0x20 && c != '\n' && c != '\r' && c != '\t' && c != '\f') || byte == 0x7f;
}

// The document's beginning, cut where the page ends at the latest.
RenderStatus readBeginning(int document, std::string& text) {
  std::array<char, kMostBytes> buffer;
  ssize_t length = 0;
  do {
    length = pread(document, buffer.data(), buffer.size(), 0);
  } while (length < 0 && errno == EINTR);
  if (length < 0) return RenderStatus::Failed;
  std::size_t lines = 1;
  std::size_t lineBytes = 0;
  std::size_t odd = 0;
  for (const char c : std::string_view(buffer.data(), static_cast<std::size_t>(length))) {
    if (isOdd(c)) ++odd;
    if (c == '\n' && ++lines > kMostLines) break;
    lineBytes = c == '\n' ? 0 : lineBytes + 1;
    if (lineBytes <= kMostLineBytes) text += isOdd(c) || c == '\r' || c == '\f' ? ' ' : c;
  }
  if (odd * kOddBytesAllowed > static_cast<std::size_t>(length)) return RenderStatus::Malformed;
  const bool blank = text.find_first_not_of(" \n\t") == std::string::npos;
  return blank ? RenderStatus::Empty : RenderStatus::Drawn;
}

}  // namespace

Decoded decodeText(int document, std::uint32_t side) {
  std::string text;
  if (const auto status = readBeginning(document, text); status != RenderStatus::Drawn) {
    return {status};
  }
  const std::unique_ptr<char, decltype(&g_free)> valid(
      g_utf8_make_valid(text.data(), static_cast<gssize>(text.size())), &g_free);

  const FittedSize size = fittedSize(kPaperWidth, kPaperHeight, side);
  const Paper paper(size);
  const double margin = size.width * kMargin;
  const double fontSize = (size.width - 2 * margin) / (kLetters * kLetterWidth);
  const ObjectPtr<PangoLayout> layout(pango_cairo_create_layout(paper.context.get()));
  PangoFontDescription* font = pango_font_description_from_string("monospace");
  pango_font_description_set_absolute_size(font, fontSize * PANGO_SCALE);
  pango_layout_set_font_description(layout.get(), font);
  pango_font_description_free(font);
  pango_layout_set_width(layout.get(), static_cast<int>((size.width - 2 * margin) * PANGO_SCALE));
  pango_layout_set_wrap(layout.get(), PANGO_WRAP_WORD_CHAR);
  pango_layout_set_text(layout.get(), valid.get(), -1);

  cairo_t* context = paper.context.get();
  cairo_rectangle(context, 0, 0, size.width, size.height - margin);
  cairo_clip(context);
  cairo_set_source_rgb(context, 0.1, 0.1, 0.1);
  cairo_move_to(context, margin, margin);
  pango_cairo_show_layout(context, layout.get());
  return pixelsOf(paper);
}

}  // namespace skein::thumbnailer
