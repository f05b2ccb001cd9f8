#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_set>

namespace skein::cli {

// Picks the lines of one request out of a log: those that carry the section's number, and
// those that a thread writes in between, from the section's opening (or a reply's arrival)
// to its end. Feed it line by line, in order.
class SectionFilter {
 public:
  explicit SectionFilter(std::uint64_t section);
  bool wants(std::string_view line);

 private:
  const std::string _number;
  bool _hasBegun = false;
  std::string _begunByGoingOn;  // the thread that goes on with such a section; else empty
  std::unordered_set<std::string> _inside;  // threads, as "process/thread"
};

// "1f" or "0x1f" as the log prints sections; nothing for what is no number.
std::optional<std::uint64_t> parseSection(const std::string& text);

}  // namespace skein::cli
