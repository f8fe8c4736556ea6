// A daemon that is to start where something lies already.
#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {

class RuntimeTest : public AttackTest {
 protected:
  [[nodiscard]] std::string directory() const { return house_.runtime() + "/docuvend"; }
  [[nodiscard]] std::string socket() const { return house_.publicSocket(kDVServiceName); }

  void expectRefused(const std::string& because) const {
    const Ending ending = house_.runDaemon(house_.environment());
    EXPECT_EQ(ending.status, 1);
    EXPECT_THAT(ending.errors, ::testing::HasSubstr(because));
    EXPECT_THAT(ending.errors, ::testing::Not(::testing::HasSubstr("Server starting"))) << "it served somebody";
  }
  void expectStarts() {
    house_.startDaemon();
    EXPECT_TRUE(house_.answers());
  }
};

}  // namespace docuvend::tests
