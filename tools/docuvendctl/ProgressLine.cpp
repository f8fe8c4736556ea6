// Only a carriage return and spaces are used, so that it works on every terminal.
#include "tools/docuvendctl/ProgressLine.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdio>

#include "tools/docuvendctl/Terminal.h"
#include "tools/docuvendctl/TextWidth.h"

namespace docuvend::ctl {

std::string bytesText(std::uint64_t bytes) {
  static constexpr std::array kUnits = {"B", "kB", "MB", "GB", "TB", "PB", "EB"};
  // What rounds up to a thousand belongs to the next unit.
  constexpr double kOneUnit = 999.95;
  if (bytes < 1000) return std::to_string(bytes) + " B";
  auto value = static_cast<double>(bytes);
  std::size_t unit = 0;
  while (value >= kOneUnit && unit + 1 < kUnits.size()) {
    value /= 1000;
    ++unit;
  }
  std::array<char, 32> text{};
  std::snprintf(text.data(), text.size(), "%.1f %s", value, kUnits[unit]);
  return text.data();
}

std::string progressText(const Progress& progress, std::optional<std::uint64_t> bytesPerSecond) {
  std::string text;
  if (progress.size > 0) {
    const double share = 100.0 * static_cast<double>(std::min(progress.bytesPresent, progress.size)) / static_cast<double>(progress.size);
    std::array<char, 16> percent{};
    std::snprintf(percent.data(), percent.size(), "%3d %%  ", static_cast<int>(share));
    text = percent.data();
  }
  text.append(bytesText(progress.bytesPresent));
  if (progress.size > 0) text.append(" of ").append(bytesText(progress.size));
  if (bytesPerSecond) text.append("  ").append(bytesText(*bytesPerSecond)).append("/s");
  return text;
}

void ProgressLine::show(const Progress& progress) {
  if (isOver_) return;
  // One column stays free: a full line would go on to the next.
  const std::string text = cutToWidth(progressText(progress, rate(progress.bytesPresent)), terminalWidth(terminal_) - 1);
  const std::size_t width = textWidth(text);
  write("\r" + filledToWidth(text, shownWidth_));
  shownWidth_ = width;
}

void ProgressLine::clear() {
  isOver_ = true;
  if (shownWidth_ > 0) write("\r" + std::string(shownWidth_, ' ') + "\r");
  shownWidth_ = 0;
}

std::optional<std::uint64_t> ProgressLine::rate(std::uint64_t present) {
  const auto now = Clock::now();
  if (!firstAt_) {
    firstAt_ = now;
    firstPresent_ = present;
  }
  const double seconds = std::chrono::duration<double>(now - *firstAt_).count();
  if (seconds <= 0 || present <= firstPresent_) return std::nullopt;
  return static_cast<std::uint64_t>(static_cast<double>(present - firstPresent_) / seconds);
}

// A terminal that takes nothing is nobody's loss.
void ProgressLine::write(const std::string& text) const { (void)!::write(terminal_, text.data(), text.size()); }

}  // namespace docuvend::ctl
