#include "tests/system/house/TurnTest.h"

#include <algorithm>
#include <csignal>
#include <cstdint>
#include <filesystem>
#include <sstream>
#include <utility>

#include "platform/linux/wire/FileCoordinationProtocol.h"

namespace docuvend::tests {

using linux_platform::kFileCoordinationServiceName;
using linux_platform::QXFileCoordination;

std::vector<std::string> linesOf(Process& process) {
  const Ending& ended = process.wait();
  EXPECT_EQ(ended.status, 0) << ended.errors;
  std::vector<std::string> lines;
  std::istringstream output(ended.output);
  for (std::string line; std::getline(output, line);) lines.push_back(line);
  return lines;
}

void TurnTest::SetUp() {
  SystemTest::SetUp();
  for (const auto& bundle : {kCellar, kPicker}) house_.install(bundle);
  house_.installTrickster();
  house_.install(kTurner, "docuvend-asker", stringEntry("QXBundleIdentifier", kTurner), /*entitlements=*/{});
  letter_ = url(house_.putInCloud("letter.txt", kLetterText));
  house_.startDaemon();
}

std::unique_ptr<Process> TurnTest::ask(const std::vector<std::string>& words) const {
  Command command{{std::string(DOCUVEND_BIN) + "/docuvend-asker"}, house_.environment(), {}};
  command.words.insert(command.words.end(), words.begin(), words.end());
  return std::make_unique<Process>(command);
}

std::unique_ptr<Process> TurnTest::askConfined(const std::vector<std::string>& words) const {
  Command command{{std::string(DOCUVEND_BIN) + "/docuvend-run", kTurner}, house_.environment(), {}};
  command.words.insert(command.words.end(), words.begin(), words.end());
  return std::make_unique<Process>(command);
}

std::unique_ptr<Process> TurnTest::holder(const std::string& verb, const QXURL& file, const std::string& name) const {
  auto process = ask({verb, file.absoluteString(), "hold", place(name), "end"});
  awaitHolding(place(name));
  return process;
}

std::unique_ptr<Process> TurnTest::waiter(const std::string& verb, const QXURL& file) const {
  auto expected = holders(file);
  expected.push_back(verb + " waiting");
  auto process = ask({verb, file.absoluteString(), "end"});
  awaitHolders(file, expected);
  return process;
}

void TurnTest::awaitHolding(const std::string& place) const {
  eventually("somebody holds " + place, [&place] { return std::filesystem::exists(place + ".holding"); });
}

void TurnTest::letGo(const std::string& place) { writeFile(place + ".go", ""); }

void TurnTest::killNow(Process& process) {
  EXPECT_TRUE(process.isRunning());
  process.signal(SIGKILL);
  (void)process.wait();
}

std::vector<std::pair<std::string, pid_t>> TurnTest::describedHolders(const QXURL& file) const {
  const auto answer =
      house_.client(std::nullopt, kFileCoordinationServiceName)->ask<&QXFileCoordination::holdersOfItemAtURL>(file, std::nullopt);
  std::vector<std::pair<std::string, pid_t>> result;
  const auto* values = std::get_if<0>(&answer);
  if (values == nullptr || !std::get<1>(*values)) {
    ADD_FAILURE() << "who has a file is not told";
    return result;
  }
  for (const QXValue& value : *std::get<1>(*values)) {
    const auto& holder = *value.as<QXDictionary>();
    result.emplace_back(*qxFind<std::string>(holder, "kind") + " " + *qxFind<std::string>(holder, "state"),
                        static_cast<pid_t>(*qxFind<std::int64_t>(holder, "processIdentifier")));
  }
  return result;
}

std::vector<std::string> TurnTest::holders(const QXURL& file) const {
  std::vector<std::string> result;
  for (auto& [text, process] : describedHolders(file)) result.push_back(std::move(text));
  return result;
}

std::vector<pid_t> TurnTest::holdingProcesses(const QXURL& file) const {
  std::vector<pid_t> result;
  for (const auto& [text, process] : describedHolders(file)) {
    if (text.ends_with(" holding")) result.push_back(process);
  }
  return result;
}

void TurnTest::awaitHolders(const QXURL& file, const std::vector<std::string>& expected) const {
  if (eventually("the file has the holders that it should", [&] { return holders(file) == expected; })) return;
  for (const std::string& holder : holders(file)) ADD_FAILURE() << "has: " << holder;
}

int TurnTest::timesAsked(const QXURL& file) const {
  return house_.loggedBeginning("[INFO] QXFileCoordinator requested us to provide item at URL " + file.absoluteString() + " for consumer ");
}

int TurnTest::timesTold(const QXURL& file) const {
  return house_.loggedBeginning("[INFO] QXFileCoordinator is telling us the item at URL " + file.absoluteString() +
                                " was changed by writer ID ");
}

}  // namespace docuvend::tests
