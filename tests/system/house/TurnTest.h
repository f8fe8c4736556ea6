// Turns at files, taken by processes that a test starts and keeps in step.
#pragma once

#include <sys/types.h>

#include <memory>
#include <string>
#include <vector>

#include "platform/QXURL.h"
#include "tests/system/house/DaemonHouse.h"
#include "tests/system/house/Process.h"

namespace docuvend::tests {

// An application without any entitlement, made of the asker.
inline constexpr const char* kTurner = "com.example.turner";

// The lines that a program has written by its end, which this waits for.
[[nodiscard]] std::vector<std::string> linesOf(Process& process);

// With the cellar, the trickster, the picker and the turner, and a letter of the cellar.
class TurnTest : public SystemTest {
 protected:
  void SetUp() override;

  [[nodiscard]] static QXURL url(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }
  [[nodiscard]] QXURL trick(const std::string& name) const { return url(house_.storage(kTrickster) + "/" + name); }
  // Where an asker of that name holds.
  [[nodiscard]] std::string place(const std::string& name) const { return house_.home() + "/" + name; }

  // An asker, unconfined or launched as the turner, that does these words.
  [[nodiscard]] std::unique_ptr<Process> ask(const std::vector<std::string>& words) const;
  [[nodiscard]] std::unique_ptr<Process> askConfined(const std::vector<std::string>& words) const;
  // The lines of one.
  [[nodiscard]] std::vector<std::string> answers(const std::vector<std::string>& words) const { return linesOf(*ask(words)); }
  [[nodiscard]] std::vector<std::string> confinedAnswers(const std::vector<std::string>& words) const {
    return linesOf(*askConfined(words));
  }
  // An unconfined asker that has a turn, verb "reading" or "writing", until it is told to go; then it ends it.
  [[nodiscard]] std::unique_ptr<Process> holder(const std::string& verb, const QXURL& file, const std::string& name) const;
  // One that asks for a turn and ends it, and by now waits for it as the last of all who have or await the file.
  [[nodiscard]] std::unique_ptr<Process> waiter(const std::string& verb, const QXURL& file) const;

  void awaitHolding(const std::string& place) const;
  static void letGo(const std::string& place);
  // Kills an asker that still runs.
  static void killNow(Process& process);

  // Who has the file and then who waits for it, each as "reading holding"; and their processes.
  [[nodiscard]] std::vector<std::string> holders(const QXURL& file) const;
  [[nodiscard]] std::vector<pid_t> holdingProcesses(const QXURL& file) const;
  void awaitHolders(const QXURL& file, const std::vector<std::string>& expected) const;

  // How often the file's provider was asked to bring it, and told that it was written.
  [[nodiscard]] int timesAsked(const QXURL& file) const;
  [[nodiscard]] int timesTold(const QXURL& file) const;

  QXURL letter_ = QXURL::fileURL("/", QXURLKind::directory);

 private:
  [[nodiscard]] std::vector<std::pair<std::string, pid_t>> describedHolders(const QXURL& file) const;
};

inline constexpr const char* kLetterText = "Dear all,\nthis was in the cloud.\n";

}  // namespace docuvend::tests
