#include "tools/docuvendctl/CommandTable.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>
#include <set>

#include "tools/docuvendctl/CommandLine.h"
#include "tools/docuvendctl/Help.h"
#include "tools/docuvendctl/Outcome.h"

namespace docuvend::ctl {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

std::vector<const Command*> commands() {
  std::vector<const Command*> result;
  for (const CommandGroup& group : CommandTable::all().groups()) {
    for (const Command& command : group.commands) result.push_back(&command);
  }
  return result;
}

TEST(CommandTable, HasEveryOperationOfTheDaemonAndOfItsAdministration) {
  for (const char* name : {"wake",
                           "grant",
                           "placeholder",
                           "start",
                           "stop",
                           "providers",
                           "extend-bookmark",
                           "bookmark",
                           "resolve",
                           "cat",
                           "put",
                           "read",
                           "write",
                           "holders",
                           "grants",
                           "revoke",
                           "status",
                           "install",
                           "uninstall",
                           "platform lock-state",
                           "platform first-unlock",
                           "doctor",
                           "version",
                           "help"}) {
    EXPECT_NE(CommandTable::all().find(name), nullptr) << name;
  }
}

TEST(CommandTable, NamesAreDistinctAndNoneIsTheBeginningOfAnother) {
  std::set<std::string_view> names;
  for (const Command* command : commands()) {
    EXPECT_TRUE(names.insert(command->name).second) << command->name;
    EXPECT_FALSE(CommandTable::all().isFirstWord(command->name)) << command->name;
  }
}

TEST(CommandTable, NoCommandTakesAnOptionThatEveryCommandTakes) {
  for (const Command* command : commands()) {
    for (const Option& option : command->options) {
      EXPECT_THAT(std::string(option.name), StartsWith("--"));
      for (const Option& common : commonOptions()) EXPECT_NE(option.name, common.name) << command->name;
    }
  }
}

TEST(CommandTable, OperandsAreCountedByHowTheyAreWritten) {
  const std::vector<std::tuple<std::string_view, std::size_t, std::size_t>> table = {
      {"", 0, 0},
      {"URL", 1, 1},
      {"URL PROVIDER CONSUMER", 3, 3},
      {"[STATE [locked|unlocked]]", 0, 2},
      {"A [B]", 1, 2},
      {"[COMMAND...]", 0, std::numeric_limits<std::size_t>::max()},
  };
  for (const auto& [operands, least, most] : table) {
    Command command{};
    command.operands = operands;
    EXPECT_EQ(operandCount(command).least, least) << operands;
    EXPECT_EQ(operandCount(command).most, most) << operands;
  }
}

std::string help(const std::string& name) {
  const auto text = helpText(CommandTable::all(), name);
  return std::holds_alternative<std::string>(text) ? std::get<std::string>(text) : std::get<QXError>(text).description();
}

TEST(Help, TheOverviewNamesEveryCommandEveryCommonOptionAndEveryStatus) {
  const std::string text = help("");
  EXPECT_THAT(text, StartsWith("docuvendctl [--as BUNDLE] [--json] [--timeout SECONDS] COMMAND [OPERAND...]\n"));
  for (const Command* command : commands()) {
    const std::string operands = command->operands.empty() ? "" : " " + std::string(command->operands);
    EXPECT_THAT(text, HasSubstr("\n  " + std::string(command->name) + operands + " ")) << command->name;
    EXPECT_THAT(text, HasSubstr("  " + std::string(command->summary) + "\n")) << command->name;
  }
  for (const char* option : {"--as BUNDLE ", "--json ", "--timeout SECONDS ", "--help "}) EXPECT_THAT(text, HasSubstr(option));
  for (const char* status : {"0 done", "2 usage", "3 not permitted", "4 not found", "5 the provider", "6 invalid", "7 the daemon",
                             "8 no answer", "9 a file", "10 anything"}) {
    EXPECT_THAT(text, HasSubstr(status));
  }
  EXPECT_THAT(text, EndsWith("\n"));
}

TEST(Help, ACommandsOwnTellsItsUsageItsOptionsAndWhatItPrints) {
  for (const Command* command : commands()) {
    const std::string text = help(std::string(command->name));
    EXPECT_THAT(text, StartsWith(usageOf(*command) + "\n\n"));
    EXPECT_THAT(text, HasSubstr(std::string(command->details)));
    EXPECT_THAT(text, EndsWith("\n"));
    EXPECT_THAT(text, Not(EndsWith("\n\n")));
    for (const Option& option : command->options) EXPECT_THAT(text, HasSubstr("\n  " + std::string(option.name)));
  }
  EXPECT_EQ(help("uninstall").substr(0, 54), "docuvendctl uninstall [--remove-grants] BUNDLE\n\nRemove");
  EXPECT_THAT(help("grants"), HasSubstr("\n  --provider PROVIDER  only those of its items\n  --consumer CONSUMER  "));
}

TEST(Help, TheFirstWordOfSeveralCommandsExplainsAllOfThem) {
  EXPECT_EQ(help("platform"), help("platform lock-state") + "\n" + help("platform first-unlock"));
}

TEST(Help, OfNoCommandIsAUsageError) {
  for (const char* name : {"dance", "plat", "platform dance", "wake up"}) {
    const auto text = helpText(CommandTable::all(), name);
    ASSERT_TRUE(std::holds_alternative<QXError>(text)) << name;
    EXPECT_EQ(statusOf(std::get<QXError>(text)), ExitStatus::usage);
    EXPECT_EQ(messageOf(std::get<QXError>(text)), "unknown command " + std::string(name) + "; --help lists them");
  }
}

TEST(Help, NoLineIsTooWideForAWideTerminal) {
  std::string all = help("");
  for (const Command* command : commands()) all += help(std::string(command->name));
  std::size_t start = 0;
  for (std::size_t end = all.find('\n'); end != std::string::npos; start = end + 1, end = all.find('\n', start)) {
    EXPECT_LE(end - start, 140U) << all.substr(start, end - start);
  }
}

}  // namespace
}  // namespace docuvend::ctl
