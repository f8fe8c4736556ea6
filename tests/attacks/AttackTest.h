// A house with a confined attacker in it, and an honest application beside it.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {

// The bundle of attacker/main.cpp.
inline const std::string kAttacker = "com.orvane.attacker";

class AttackTest : public SystemTest {
 protected:
  // Installs the attacker with these entitlements, as what stands between "<dict>" and "</dict>".
  void installAttacker(const std::string& entitlements = "") {
    house_.install(kAttacker, "docuvend-attacker", stringEntry("QXBundleIdentifier", kAttacker), entitlements);
  }
  // What the attacker, confined, prints for its acts, a line each.
  [[nodiscard]] std::vector<std::string> attack(const std::vector<std::string>& words) const;
  // The same, started by the running daemon as an extension, a new one each time. It serves nobody.
  [[nodiscard]] std::vector<std::string> attackAsExtension(const std::vector<std::string>& words);
  // The attacker, confined, that does these acts and keeps what it took until it is let go.
  [[nodiscard]] std::unique_ptr<Process> holdingAttacker(std::vector<std::string> acts, const std::string& name) const;
  // What it had to say.
  [[nodiscard]] std::vector<std::string> letGo(Process& attacker, const std::string& name) const;
  // The same as at first, unconfined.
  [[nodiscard]] std::vector<std::string> unconfined(const std::vector<std::string>& words) const;

 private:
  int extensions_ = 0;
};

[[nodiscard]] std::vector<std::string> linesOf(const std::string& text);

}  // namespace docuvend::tests
