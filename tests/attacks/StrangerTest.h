// Another user on the same machine: an agent of its, started beside the tests by who may make users, does what the attacker's program can.
// Where there is none these tests say so; they fail where one is demanded.
#pragma once

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {

// Where both users may come to: as long as this object lives, a test's house is made there.
class MeetingPlace {
 public:
  MeetingPlace();
  ~MeetingPlace();
  MeetingPlace(const MeetingPlace&) = delete;
  MeetingPlace& operator=(const MeetingPlace&) = delete;

  // Why there is no stranger; a test that does not go on then is not to have passed.
  [[nodiscard]] static std::optional<std::string> whyNoStranger();
  [[nodiscard]] static bool isDemanded();

 private:
  std::optional<std::string> before_;
};

// The stranger does these acts of the attacker's, with that run-time directory; what it prints, a line each.
[[nodiscard]] std::vector<std::string> askStranger(const std::string& runtime, const std::vector<std::string>& words);

// Lets every user read and enter a directory or read a file; write too.
void openToAll(const std::string& path);
void openWide(const std::string& path);

// A test with a house that the stranger can come to.
template <class Base>
class WithStranger : private MeetingPlace, public Base {
 protected:
  void SetUp() override {
    if (const auto reason = whyNoStranger()) {
      if (isDemanded()) FAIL() << *reason;
      GTEST_SKIP() << "NOT TESTED, another user's attacks: " << *reason;
    }
    Base::SetUp();
  }
  [[nodiscard]] std::vector<std::string> stranger(const std::vector<std::string>& words) const {
    return askStranger(this->house_.runtime(), words);
  }
};

}  // namespace docuvend::tests
