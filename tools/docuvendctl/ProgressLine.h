// How far an item is, as one line of a terminal that is rewritten in place.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "sdk/Consumer.h"

namespace docuvend::ctl {

// "12.3 MB": three digits at the most before the point, steps of a thousand.
[[nodiscard]] std::string bytesText(std::uint64_t bytes);

// " 43 %  12.3 MB of 28.6 MB  3.1 MB/s"; without a share when the size is zero, without a rate when there is none yet.
[[nodiscard]] std::string progressText(const Progress& progress, std::optional<std::uint64_t> bytesPerSecond);

class ProgressLine {
 public:
  // The terminal outlives this object.
  explicit ProgressLine(int terminal) : terminal_(terminal) {}
  ~ProgressLine() { clear(); }
  ProgressLine(const ProgressLine&) = delete;
  ProgressLine& operator=(const ProgressLine&) = delete;

  void show(const Progress& progress);
  // Leaves the terminal as it was, and nothing is shown any more.
  void clear();

 private:
  using Clock = std::chrono::steady_clock;

  [[nodiscard]] std::optional<std::uint64_t> rate(std::uint64_t present);
  void write(const std::string& text) const;

  const int terminal_;
  std::optional<Clock::time_point> firstAt_;
  std::uint64_t firstPresent_ = 0;
  std::size_t shownWidth_ = 0;
  bool isOver_ = false;
};

}  // namespace docuvend::ctl
