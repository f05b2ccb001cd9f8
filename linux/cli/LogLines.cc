#include "linux/cli/LogLines.h"

#include <array>
#include <charconv>
#include <cstdio>
#include <utility>

namespace skein::cli {
namespace {

constexpr std::array<std::string_view, 4> kMarkers{"┏", "┣", "┳", "┗"};
enum Marker : std::uint8_t { Opens, GoesOn, Arrives, Closes, OfAnother, None };

// MOMENT LEVEL PROCESS/THREAD TEXT: the third field.
std::string threadOf(std::string_view line) {
  for (int field = 0; field < 2; ++field) {
    const auto space = line.find(' ');
    if (space == std::string_view::npos) return {};
    line.remove_prefix(space + 1);
  }
  return std::string(line.substr(0, line.find(' ')));
}

Marker markerOf(std::string_view line, std::string_view number) {
  for (std::size_t i = 0; i < kMarkers.size(); ++i) {
    const auto at = line.find(kMarkers[i]);
    if (at == std::string_view::npos) continue;
    const std::string_view rest = line.substr(at + kMarkers[i].size());
    const bool same =
        rest.starts_with(number) && (rest.size() == number.size() || rest[number.size()] == ' ');
    return same ? static_cast<Marker>(i) : OfAnother;
  }
  return None;
}

}  // namespace

SectionFilter::SectionFilter(std::uint64_t section)
    : _number([section] {
        std::array<char, 20> text{};
        std::snprintf(text.data(), text.size(), "%llx", static_cast<unsigned long long>(section));
        return std::string(text.data());
      }()) {}

bool SectionFilter::wants(std::string_view line) {
  const std::string thread = threadOf(line);
  switch (markerOf(line, _number)) {
    case Opens:
    case Arrives:
      _hasBegun = true;
      _inside.insert(thread);
      return true;
    case GoesOn:
      // Some sections begin so. Such a one has no others within, and may never close.
      if (!std::exchange(_hasBegun, true)) _begunByGoingOn = thread;
      return true;
    case Closes:
      _inside.clear();
      _begunByGoingOn.clear();
      return true;
    case OfAnother:
      if (thread == _begunByGoingOn) _begunByGoingOn.clear();
      break;
    case None: break;
  }
  return _inside.contains(thread) || (!thread.empty() && thread == _begunByGoingOn);
}

std::optional<std::uint64_t> parseSection(const std::string& text) {
  std::string_view digits = text;
  if (digits.starts_with("0x")) digits.remove_prefix(2);
  std::uint64_t section = 0;
  const auto [end, problem] =
      std::from_chars(digits.data(), digits.data() + digits.size(), section, 16);
  if (problem != std::errc() || end != digits.data() + digits.size() || section == 0) {
    return std::nullopt;
  }
  return section;
}

}  // namespace skein::cli
