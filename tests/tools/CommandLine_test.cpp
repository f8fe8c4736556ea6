#include "tools/docuvendctl/CommandLine.h"

#include <gtest/gtest.h>

#include <chrono>

namespace docuvend::ctl {
namespace {

using namespace std::chrono_literals;
using Words = std::vector<std::string>;

std::string shown(const Words& words) {
  std::string text;
  for (const std::string& word : words) text += "[" + word + "]";
  return text;
}

struct Good {
  Words words;
  std::string command;
  Words operands;
  std::map<std::string, std::string, std::less<>> options;
  std::optional<std::string> actAs;
  bool isJSONWanted = false;
  std::optional<std::chrono::milliseconds> deadline;
};

TEST(CommandLine, GoodOnesAreTaken) {
  const std::vector<Good> table = {
      {{"wake"}, "wake", {}, {}, {}, false, {}},
      {{"--as", "com.example.a", "wake"}, "wake", {}, {}, "com.example.a", false, {}},
      {{"--as=com.example.a", "wake"}, "wake", {}, {}, "com.example.a", false, {}},
      {{"--as=", "wake"}, "wake", {}, {}, "", false, {}},
      {{"--as", "", "wake"}, "wake", {}, {}, "", false, {}},
      {{"--as", "--json", "wake"}, "wake", {}, {}, "--json", false, {}},
      {{"--as", "a", "--as", "b", "wake"}, "wake", {}, {}, "b", false, {}},
      {{"--json", "providers"}, "providers", {}, {}, {}, true, {}},
      {{"--timeout", "1", "wake"}, "wake", {}, {}, {}, false, 1s},
      {{"--timeout=86400", "wake"}, "wake", {}, {}, {}, false, 86'400s},
      // What every command takes may stand anywhere.
      {{"wake", "--json"}, "wake", {}, {}, {}, true, {}},
      {{"cat", "--as", "a", "s", "--timeout", "3", "--json"}, "cat", {"s"}, {}, "a", true, 3s},
      {{"grant", "/x", "p", "c"}, "grant", {"/x", "p", "c"}, {}, {}, false, {}},
      {{"grant", "", "", ""}, "grant", {"", "", ""}, {}, {}, false, {}},
      {{"cat", "-"}, "cat", {"-"}, {}, {}, false, {}},
      // A command's own options.
      {{"grants"}, "grants", {}, {}, {}, false, {}},
      {{"grants", "--provider", "p", "--consumer=c"}, "grants", {}, {{"--provider", "p"}, {"--consumer", "c"}}, {}, false, {}},
      {{"grants", "--provider", "--help"}, "grants", {}, {{"--provider", "--help"}}, {}, false, {}},
      {{"uninstall", "b"}, "uninstall", {"b"}, {}, {}, false, {}},
      {{"uninstall", "--remove-grants", "b"}, "uninstall", {"b"}, {{"--remove-grants", ""}}, {}, false, {}},
      {{"uninstall", "b", "--remove-grants"}, "uninstall", {"b"}, {{"--remove-grants", ""}}, {}, false, {}},
      // Behind "--" everything is an operand.
      {{"cat", "--", "--json"}, "cat", {"--json"}, {}, {}, false, {}},
      {{"cat", "--", "--"}, "cat", {"--"}, {}, {}, false, {}},
      {{"--json", "--", "cat", "s"}, "cat", {"s"}, {}, {}, true, {}},
      // Two words, and operands that may be missing.
      {{"platform", "lock-state"}, "platform lock-state", {}, {}, {}, false, {}},
      {{"platform", "lock-state", "1"}, "platform lock-state", {"1"}, {}, {}, false, {}},
      {{"platform", "--json", "lock-state", "1", "locked"}, "platform lock-state", {"1", "locked"}, {}, {}, true, {}},
      {{"platform", "first-unlock"}, "platform first-unlock", {}, {}, {}, false, {}},
      {{"help"}, "help", {}, {}, {}, false, {}},
      {{"help", "platform", "lock-state"}, "help", {"platform", "lock-state"}, {}, {}, false, {}},
  };
  for (const Good& row : table) {
    const auto parsed = parseCommandLine(row.words, CommandTable::all());
    const auto* line = std::get_if<CommandLine>(&parsed);
    ASSERT_NE(line, nullptr) << shown(row.words) << std::get<UsageError>(parsed).text;
    EXPECT_EQ(line->command->name, row.command) << shown(row.words);
    EXPECT_EQ(line->call.operands, row.operands) << shown(row.words);
    EXPECT_EQ(line->call.options, row.options) << shown(row.words);
    EXPECT_EQ(line->actAs, row.actAs) << shown(row.words);
    EXPECT_EQ(line->isJSONWanted, row.isJSONWanted) << shown(row.words);
    EXPECT_EQ(line->call.deadline, row.deadline) << shown(row.words);
  }
}

TEST(CommandLine, BadOnesAreToldInOneLine) {
  const std::string seconds = "--timeout takes a number of seconds from 1 to 86400";
  const std::string none = "no command given; --help lists them";
  const std::string grant = "usage: docuvendctl grant URL PROVIDER CONSUMER";
  const std::vector<std::pair<Words, std::string>> table = {
      {{}, none},
      {{"--json"}, none},
      {{"--"}, none},
      {{"unknown"}, "unknown command unknown; --help lists them"},
      {{""}, "unknown command ; --help lists them"},
      {{"-"}, "unknown command -; --help lists them"},
      {{"--", "--json"}, "unknown command --json; --help lists them"},
      {{"unknown", "--what"}, "unknown command unknown; --help lists them"},
      {{"platform"}, "platform is half a command; --help lists them"},
      {{"platform", "dance"}, "unknown command platform dance; --help lists them"},
      {{"--as"}, "--as needs a value"},
      {{"wake", "--as"}, "--as needs a value"},
      {{"--timeout"}, "--timeout needs a value"},
      {{"grants", "--provider"}, "--provider needs a value"},
      {{"--timeout", "0", "wake"}, seconds},
      {{"--timeout", "-1", "wake"}, seconds},
      {{"--timeout", "86401", "wake"}, seconds},
      {{"--timeout", "99999999999999999999", "wake"}, seconds},
      {{"--timeout", "", "wake"}, seconds},
      {{"--timeout", " 1", "wake"}, seconds},
      {{"--timeout", "1s", "wake"}, seconds},
      {{"--timeout=1.5", "wake"}, seconds},
      {{"--unknown", "wake"}, "unknown option --unknown"},
      {{"--js", "wake"}, "unknown option --js"},
      {{"--json=yes", "wake"}, "unknown option --json=yes"},
      {{"-x", "wake"}, "unknown option -x"},
      {{"--provider", "p", "grants"}, "unknown option --provider"},
      {{"wake", "--provider", "p"}, "unknown option --provider of wake"},
      {{"uninstall", "b", "--remove-grants=yes"}, "unknown option --remove-grants=yes of uninstall"},
      {{"platform", "--unknown"}, "unknown option --unknown"},
      {{"platform", "lock-state", "-1"}, "unknown option -1 of platform lock-state"},
      {{"wake", "up"}, "usage: docuvendctl wake"},
      {{"grant"}, grant},
      {{"grant", "/x", "p"}, grant},
      {{"grant", "/x", "p", "c", "d"}, grant},
      {{"grants", "p"}, "usage: docuvendctl grants [--provider PROVIDER] [--consumer CONSUMER]"},
      {{"uninstall"}, "usage: docuvendctl uninstall [--remove-grants] BUNDLE"},
      {{"platform", "lock-state", "1", "locked", "now"}, "usage: docuvendctl platform lock-state [STATE [locked|unlocked]]"},
  };
  for (const auto& [words, expected] : table) {
    const auto parsed = parseCommandLine(words, CommandTable::all());
    const auto* error = std::get_if<UsageError>(&parsed);
    ASSERT_NE(error, nullptr) << shown(words);
    EXPECT_EQ(error->text, expected) << shown(words);
  }
}

TEST(CommandLine, HelpAndVersionAreCommandsWhateverElseIsAsked) {
  struct Row {
    Words words;
    std::string command;
    Words operands;
  };
  const std::vector<Row> table = {
      {{"--help"}, "help", {}},
      {{"-h"}, "help", {}},
      {{"--as", "b", "--help", "wake"}, "help", {}},
      {{"--help", "--unknown"}, "help", {}},
      {{"grant", "--help"}, "help", {"grant"}},
      {{"grant", "one", "-h", "--unknown"}, "help", {"grant"}},
      {{"platform", "--help"}, "help", {"platform"}},
      {{"platform", "lock-state", "--help"}, "help", {"platform lock-state"}},
      {{"--version"}, "version", {}},
      {{"grant", "--version"}, "version", {}},
  };
  for (const Row& row : table) {
    const auto parsed = parseCommandLine(row.words, CommandTable::all());
    const auto* line = std::get_if<CommandLine>(&parsed);
    ASSERT_NE(line, nullptr) << shown(row.words);
    EXPECT_EQ(line->command->name, row.command) << shown(row.words);
    EXPECT_EQ(line->call.operands, row.operands) << shown(row.words);
    EXPECT_TRUE(line->call.options.empty()) << shown(row.words);
    EXPECT_FALSE(line->isJSONWanted) << shown(row.words);
  }
}

TEST(CommandLine, AFailureIsToldInJSONWhereverThatWasAskedFor) {
  const std::vector<std::pair<Words, bool>> table = {
      {{"--json"}, true},
      {{"dance", "--json"}, true},
      {{"--what", "--json"}, true},
      {{"grant", "--json"}, true},
      {{"wake", "up", "--", "--json"}, false},
      {{"dance"}, false},
  };
  for (const auto& [words, isJSONWanted] : table) {
    const auto parsed = parseCommandLine(words, CommandTable::all());
    ASSERT_TRUE(std::holds_alternative<UsageError>(parsed)) << shown(words);
    EXPECT_EQ(std::get<UsageError>(parsed).isJSONWanted, isJSONWanted) << shown(words);
  }
  const auto help = parseCommandLine({"grant", "--help", "--json"}, CommandTable::all());
  EXPECT_TRUE(std::get<CommandLine>(help).isJSONWanted);
}

}  // namespace
}  // namespace docuvend::ctl
