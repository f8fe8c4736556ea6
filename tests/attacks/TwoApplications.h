// Two confined applications, each with a document that only it may have, so that an answer tells for whom the daemon takes the caller.
// They are one program, and the attacker's bundle holds the very file that the victim's executes.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {

inline const std::string kVictim = "com.orvane.victim";

using Lines = std::vector<std::string>;

class TwoApplications : public AttackTest {
 protected:
  void SetUp() override;

  // What the attacker's program is to ask to show who it is, and what it prints then.
  [[nodiscard]] Lines whoAmI() const { return {"ask", others_, "ask", own_}; }
  static inline const Lines kIsAttacker = {"DVErrorDomain 2", "ok"};
  static inline const Lines kIsVictim = {"ok", "DVErrorDomain 2"};
  static inline const Lines kIsNobody = {"QXRpcErrorDomain 10", "QXRpcErrorDomain 10"};

  // Those words, and then what shows who says them; those lines, and then those others.
  [[nodiscard]] Lines thenWhoAmI(Lines words) const { return joined(std::move(words), whoAmI()); }
  [[nodiscard]] static Lines joined(Lines first, const Lines& second);

  // The program of both: confined as one of them; or not confined at all, where a command may stand before it.
  [[nodiscard]] Lines as(const std::string& bundle, const Lines& words) const;
  [[nodiscard]] Lines unconfined(const Lines& words, const Lines& command = {}) const;
  [[nodiscard]] Lines unconfined(const Lines& words, const Lines& command, const Lines& environment) const;

  // Who says so over a connection: as whoAmI prints it.
  [[nodiscard]] Lines whoIsAt(Client& connection) const;

  // How often the log says that somebody was refused a document as that bundle.
  [[nodiscard]] long refusalsOf(const std::string& bundle) const;

  [[nodiscard]] static QXURL url(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }
  [[nodiscard]] static std::string program();
  // The victim's executable, in its bundle and in the attacker's.
  [[nodiscard]] std::string victimsProgram() const { return house_.bundles() + "/" + kVictim + "/docuvend-attacker"; }
  [[nodiscard]] std::string sameProgram() const { return house_.bundles() + "/" + kAttacker + "/victims-program"; }

  std::string own_;      // the attacker's string
  std::string others_;   // the victim's
  std::string ownPath_;  // their documents
  std::string othersPath_;
};

// A launch of the attacker's that hands connections through a socket in its container.
class Accomplice {
 public:
  // It says those words, and then hands over what they set aside.
  Accomplice(const DaemonHouse& house, Lines words);

  // What it handed over, which the daemon may look at as long as this object lives.
  [[nodiscard]] linux_platform::UniqueDescriptor connection();
  // What it printed, when it has ended: which it does by itself once nobody is left here.
  [[nodiscard]] Ending end();

 private:
  linux_platform::UniqueDescriptor listener_;
  linux_platform::UniqueDescriptor hand_;
  std::unique_ptr<Process> process_;
};

// A socket at that path, at which nobody has been yet, and who comes to it.
[[nodiscard]] linux_platform::UniqueDescriptor listenAt(const std::string& path);
[[nodiscard]] linux_platform::UniqueDescriptor acceptAt(const linux_platform::UniqueDescriptor& listener);
// The file of that socket in the attacker's container.
[[nodiscard]] std::string hatch(const DaemonHouse& house);

}  // namespace docuvend::tests
