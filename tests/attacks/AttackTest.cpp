#include "tests/attacks/AttackTest.h"

#include <filesystem>
#include <sstream>

namespace docuvend::tests {

std::vector<std::string> linesOf(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream stream(text);
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

std::vector<std::string> AttackTest::attack(const std::vector<std::string>& words) const {
  const Ending ending = house_.confined(kAttacker, words);
  EXPECT_EQ(ending.status, 0) << ending.errors;
  return linesOf(ending.output);
}

std::vector<std::string> AttackTest::attackAsExtension(const std::vector<std::string>& words) {
  const std::string identifier = kAttacker + ".extension" + std::to_string(++extensions_);
  std::filesystem::create_directories(house_.container(identifier));
  std::filesystem::permissions(house_.container(identifier), std::filesystem::perms::owner_all);
  std::string acts;
  for (const std::string& word : words) acts += word + "\n";
  writeFile(house_.container(identifier) + "/acts", acts);
  const std::string group = identifier + ".documents";
  house_.install(identifier, "docuvend-attacker",
                 stringEntry("QXBundleIdentifier", identifier) + "<key>QXGroups</key><array><string>" + group +
                     "</string></array><key>QXExtension</key><dict>" + stringEntry("QXExtensionPointName", "com.orvane.docuvend-nonui") +
                     stringEntry("QXExtensionDocuvendDocumentGroup", group) + "</dict>",
                 {});
  // What it prints is in the daemon's log, and again whenever it is tried again.
  const std::string prefix = "[INFO] " + identifier + ": ";
  std::vector<std::string> lines;
  if (!house_.awaitLog(prefix + "done")) return lines;
  for (const std::string& line : house_.log()) {
    if (line == prefix + "done") break;
    if (line.starts_with(prefix)) lines.push_back(line.substr(prefix.size()));
  }
  return lines;
}

std::unique_ptr<Process> AttackTest::holdingAttacker(std::vector<std::string> acts, const std::string& name) const {
  acts.insert(acts.begin(), {std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker});
  acts.insert(acts.end(), {"hold", name});
  auto process = std::make_unique<Process>(Command{acts, house_.environment(), {}});
  eventually("the attacker has what it wants", [this, &name, &process] {
    return std::filesystem::exists(house_.container(kAttacker) + "/" + name + ".holding") || !process->isRunning();
  });
  return process;
}

std::vector<std::string> AttackTest::letGo(Process& attacker, const std::string& name) const {
  EXPECT_TRUE(attacker.isRunning());
  writeFile(house_.container(kAttacker) + "/" + name + ".go", "");
  const Ending& ending = attacker.wait();
  EXPECT_EQ(ending.status, 0) << ending.errors;
  auto lines = linesOf(ending.output);
  if (!lines.empty() && lines.back() == "ok") lines.pop_back();
  return lines;
}

std::vector<std::string> AttackTest::unconfined(const std::vector<std::string>& words) const {
  Command command{{std::string(DOCUVEND_BIN) + "/docuvend-attacker"}, house_.environment(), {}};
  command.words.insert(command.words.end(), words.begin(), words.end());
  Process process(command);
  const Ending& ending = process.wait();
  EXPECT_EQ(ending.status, 0) << ending.errors;
  return linesOf(ending.output);
}

}  // namespace docuvend::tests
