// A terminal of an application's own, in place of the user's, and the relay between the two. What is typed goes to the application only
// while docuvend-run is in front at the user's terminal; what the application sets is set at its own. The user's modes are put back before
// docuvend-run stops or ends.
//
// For a process of one thread, which it makes the parent of the application's.
#pragma once

#include <signal.h>
#include <sys/types.h>

#include <optional>
#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/launch/ConfinedLaunch.h"
#include "tools/docuvend-run/UserTerminal.h"

namespace docuvend {

class OwnTerminal {
 public:
  explicit OwnTerminal(UserTerminal& user) : user_(user) {}

  // Executes the plan in a child, and returns its exit status when it has ended and all that it wrote is at the user's terminal. A signal
  // that ended the child ends this process. Fails when there is no terminal, or no child, to be had.
  [[nodiscard]] std::variant<int, QXError> run(linux_platform::LaunchPlan plan);

 private:
  std::optional<QXError> open();
  std::optional<QXError> watchSignals();
  [[noreturn]] void becomeApplication(linux_platform::LaunchPlan plan, pid_t parent) const;
  void relay();
  void await();
  void takeSignals();
  void takeSignal(int number);
  void pass(int number);
  void stop();
  void giveSize();
  void takeInput();
  void giveInput();
  void takeOutput();
  void giveOutput();
  void hangUp();
  [[nodiscard]] bool isFinished() const { return ended_ && !own_ && output_.empty(); }

  UserTerminal& user_;
  linux_platform::UniqueDescriptor own_;     // the side that is not the application's; none once nothing more can come from there
  linux_platform::UniqueDescriptor theirs_;  // until the child has it
  linux_platform::UniqueDescriptor signals_;
  sigset_t maskBefore_{};
  pid_t child_ = -1;
  bool wasInFront_ = false;   // at the last look, and in raw mode since
  bool isEnding_ = false;     // a signal that ends it was passed on
  std::optional<int> ended_;  // as waitpid says it
  std::string input_;         // typed, and not yet passed on
  std::string output_;        // written, and not yet shown
};

}  // namespace docuvend
