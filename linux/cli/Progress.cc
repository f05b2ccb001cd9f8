#include "linux/cli/Progress.h"

#include <array>
#include <cstdio>

#include "linux/cli/Interruption.h"
#include "linux/cli/Output.h"

namespace skein::cli {
namespace {

using Clock = std::chrono::steady_clock;

void write(const std::string& text) {
  [[maybe_unused]] const ssize_t written = ::write(STDERR_FILENO, text.data(), text.size());
}

std::string transferText(const HostTransferStep& step, const std::string& name,
                         Clock::time_point begin) {
  std::string text = escaped(name) + "  " + sizeText(step.completedBytes);
  if (step.totalBytes > 0) {
    text += " of " + sizeText(step.totalBytes) + ", " +
            std::to_string(100 * step.completedBytes / step.totalBytes) + " %";
  }
  const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
  return text + ", " +
         sizeText(static_cast<std::uint64_t>(static_cast<double>(step.completedBytes) / seconds)) +
         "/s";
}

}  // namespace

void Progress::show(const std::string& text) {
  using namespace std::chrono_literals;
  if (!_terminal || Clock::now() - _begin < 1s) return;
  write("\r\x1b[K" + text);
  _shown = true;
  setLineIsOpen(true);
}

void Progress::clear() {
  if (!std::exchange(_shown, false)) return;
  write("\r\x1b[K");
  setLineIsOpen(false);
}

std::string sizeText(std::uint64_t bytes) {
  constexpr std::array<const char*, 5> kUnits{"kB", "MB", "GB", "TB", "PB"};
  if (bytes < 1000) return std::to_string(bytes) + " bytes";
  double size = static_cast<double>(bytes) / 1000;
  std::size_t unit = 0;
  while (size >= 999.95 && unit + 1 < kUnits.size()) {
    size /= 1000;
    ++unit;
  }
  std::array<char, 32> text{};
  std::snprintf(text.data(), text.size(), "%.1f %s", size, kUnits.at(unit));
  return text.data();
}

std::pair<HostTransferStep, NSErrorPtr> followTransfer(
    const std::shared_ptr<HostTransfer>& transfer, const std::string& name) {
  const OnInterruption cancels([transfer] { transfer->cancel(); });
  Progress progress;
  const auto begin = Clock::now();
  for (;;) {
    Awaited<HostTransferStep> next;
    transfer->next(next.reply());
    auto [step, error] = next.wait();
    if (error || step.finished) return {std::move(step), std::move(error)};
    if (step.totalBytes > 0) progress.show(transferText(step, name, begin));
  }
}

}  // namespace skein::cli
