// How long coordinated reads of one provider's item take while another provider does nothing in particular, and while it hangs.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/QXURL.h"
#include "sdk/Consumer.h"

namespace docuvend::turntaker {

struct HangPlan {
  QXURL healthy;
  // An item whose provider hangs in bringing it until the file `free` is there.
  QXURL hanging;
  std::string free;
  std::size_t rounds = 0;  // each of them one read without and one with
};

struct HangFigures {
  std::vector<double> without;  // microseconds, sorted
  std::vector<double> with;
};

[[nodiscard]] Result<HangFigures> measureHang(Consumer& consumer, const HangPlan& plan);

}  // namespace docuvend::turntaker
