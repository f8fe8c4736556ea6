// Random sequences of steps, tried against a model, and the shortest of them that fails.
//
// A step must mean something whatever stands before it, so that any part of a sequence is a sequence. Each is tried in a process of its
// own, and one that ends its process has failed like one that disagrees with its model.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <iostream>
#include <random>
#include <string>
#include <vector>

#include "tests/support/InAProcess.h"
#include "tests/support/Sanitizers.h"
#include "tests/support/Seed.h"

namespace docuvend::tests {

template <class Step>
using Sequence = std::vector<Step>;

// Says what is wrong with a sequence; nothing when nothing is.
template <class Step>
using SequenceTrial = std::function<std::string(const Sequence<Step>& sequence)>;

// A part of the sequence that still fails, and of which no step can be left out.
template <class Step>
[[nodiscard]] Sequence<Step> shortestFailing(Sequence<Step> sequence, const SequenceTrial<Step>& trial) {
  for (std::size_t length = std::max<std::size_t>(sequence.size() / 2, 1);;) {
    bool isShorter = false;
    for (std::size_t at = 0; at < sequence.size();) {
      Sequence<Step> rest = sequence;
      const auto from = rest.begin() + static_cast<std::ptrdiff_t>(at);
      rest.erase(from, from + static_cast<std::ptrdiff_t>(std::min(length, rest.size() - at)));
      if (trial(rest).empty()) {
        at += length;
      } else {
        sequence = std::move(rest);
        isShorter = true;
      }
    }
    if (length == 1 && !isShorter) return sequence;
    length = std::max<std::size_t>(length / 2, 1);
  }
}

// How many: with seeds that are the same in every run, and with one that each run chooses and prints.
struct SequenceCounts {
  std::uint32_t fixed = kSanitized ? 200 : 1500;
  std::uint32_t random = kSanitized ? 50 : 500;
};

// Fails with the shortest sequence, one step a line, at the first that fails. Prints how many were tried.
template <class Step>
void trySequences(const SequenceCounts& counts, const std::function<Sequence<Step>(std::mt19937& random)>& make,
                  const SequenceTrial<Step>& trial, const std::function<std::string(const Step& step)>& describe) {
  const SequenceTrial<Step> isolated = [&trial](const Sequence<Step>& sequence) {
    return inAProcess([&trial, &sequence] { return trial(sequence); });
  };
  const std::uint32_t seed = seedOfThisRun();
  std::uint32_t tried = 0;
  while (tried < counts.fixed + counts.random) {
    std::mt19937 random(tried < counts.fixed ? tried : seed + tried);
    const Sequence<Step> sequence = make(random);
    ++tried;
    if (isolated(sequence).empty()) continue;
    const Sequence<Step> shortest = shortestFailing(sequence, isolated);
    std::string lines;
    for (const Step& step : shortest) lines.append("  ").append(describe(step)).append("\n");
    ADD_FAILURE() << "sequence " << tried << " of seed " << seed << " fails, and so do these " << shortest.size() << " of its steps:\n"
                  << lines << isolated(shortest);
    break;
  }
  std::cout << "sequences tried " << tried << "\n";
}

}  // namespace docuvend::tests
