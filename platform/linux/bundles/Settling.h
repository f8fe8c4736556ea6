// Decides when the registry looks at its directories, and which bundles it does not judge yet. A value without clock: it is told the time.
//
// An installation is many changes: a look waits until nothing has changed for a moment, but never for long. While looks keep finding
// something new, both grow, so that a hundred changes in a row are seen in few looks and a single one at once. (Whatever a look finds has a
// price: a provider that was there for a moment only is tried to be set up for seconds.)
//
// A bundle that is written in place (copied into the directory, or edited there) is looked at when nothing has been written there for
// longer, and meanwhile counts as what it was. One that is renamed into place is whole; but one that comes and goes again and again is
// treated as if it were written: it counts as what it was, or as nothing once it was seen to be gone, until it stays.
#pragma once

#include <algorithm>
#include <chrono>
#include <map>
#include <optional>
#include <set>
#include <string>

namespace docuvend::linux_platform {

class Settling {
 public:
  using Time = std::chrono::steady_clock::time_point;
  using Duration = std::chrono::milliseconds;
  enum class Found { nothingNew, changes };

  static constexpr Duration kShortestQuiet{20};
  static constexpr Duration kLongestQuiet{160};
  static constexpr Duration kFirstWait{1'000};  // at most, after the first change, also when there is no quiet
  static constexpr Duration kLongestWait{4'000};
  static constexpr Duration kBusy{5'000};             // after a look that found changes; then both are short again
  static constexpr Duration kQuietInPlace{200};       // of one bundle
  static constexpr Duration kComesAndGoes{1'000};     // between two renames of one bundle
  static constexpr Duration kLongestInPlace{10'000};  // a bundle that is written to for ever is looked at so often

  // Something changed that may have to do with bundles.
  void changed(Time now);
  // The bundle is being written to in its place. It came or went as a whole.
  void wasWritten(const std::string& bundle, Time now);
  void wasRenamed(const std::string& bundle, Time now);

  // When to look next; none: there is nothing to look for.
  [[nodiscard]] std::optional<Time> nextLook() const;
  // The bundles that are not to be judged by a look at this time.
  [[nodiscard]] std::set<std::string> unsettled(Time now) const;
  // A look that began at `began` is over. It saw all changes that were told before this, but those of the bundles that were unsettled then.
  void looked(Time began, Found found);

 private:
  struct Span {
    Time first;
    Time last;
  };

  [[nodiscard]] Time lookAfter(const Span& changes) const { return std::min<Time>(changes.last + quiet_, changes.first + wait_); }
  [[nodiscard]] static Time endOf(const Span& written) {
    return std::min<Time>(written.last + kQuietInPlace, written.first + kLongestInPlace);
  }

  std::optional<Span> pending_;          // the changes that no look has seen
  std::map<std::string, Span> written_;  // bundles that were written in place, until they are judged
  std::map<std::string, Time> renamed_;  // bundles that came or went a short while ago
  std::optional<Time> lastFind_;         // when a look last found changes
  Duration quiet_ = kShortestQuiet;
  Duration wait_ = kFirstWait;
};

}  // namespace docuvend::linux_platform
