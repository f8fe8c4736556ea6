#include "tools/docuvendctl/CommandLine.h"

#include <gtest/gtest.h>

#include <chrono>

namespace docuvend::ctl {
namespace {

using Parsed = std::variant<CommandLine, HelpWanted, UsageError>;
using Words = std::vector<std::string>;

Parsed parse(Words words) {
  words.insert(words.begin(), "docuvendctl");
  std::vector<char*> pointers;
  for (std::string& word : words) pointers.push_back(word.data());
  pointers.push_back(nullptr);
  return parseCommandLine(static_cast<int>(words.size()), pointers.data());
}

std::string shown(const Words& words) {
  std::string text;
  for (const std::string& word : words) text += "[" + word + "]";
  return text;
}

struct Good {
  Words words;
  CommandLine line;
};

TEST(CommandLine, GoodOnesAreTaken) {
  using namespace std::chrono_literals;
  const std::vector<Good> table = {
      {{"wake"}, {{}, OutputForm::text, {}, "wake", {}}},
      {{"--as", "com.example.a", "wake"}, {"com.example.a", OutputForm::text, {}, "wake", {}}},
      {{"--as=com.example.a", "wake"}, {"com.example.a", OutputForm::text, {}, "wake", {}}},
      {{"--as", "", "wake"}, {"", OutputForm::text, {}, "wake", {}}},
      {{"--json", "providers"}, {{}, OutputForm::json, {}, "providers", {}}},
      {{"--timeout", "1", "wake"}, {{}, OutputForm::text, 1s, "wake", {}}},
      {{"--timeout", "86400", "wake"}, {{}, OutputForm::text, 86'400s, "wake", {}}},
      {{"--as", "a", "--as", "b", "wake"}, {"b", OutputForm::text, {}, "wake", {}}},
      {{"--json", "--timeout", "3", "--as", "a", "cat", "docuvend:p/i"}, {"a", OutputForm::json, 3s, "cat", {"docuvend:p/i"}}},
      {{"grant", "/x", "p", "c"}, {{}, OutputForm::text, {}, "grant", {"/x", "p", "c"}}},
      // What follows the command is its own, whatever it looks like.
      {{"cat", "--json"}, {{}, OutputForm::text, {}, "cat", {"--json"}}},
      {{"cat", "--help"}, {{}, OutputForm::text, {}, "cat", {"--help"}}},
      {{"--", "--json"}, {{}, OutputForm::text, {}, "--json", {}}},
      {{"--json", "--", "cat", "s"}, {{}, OutputForm::json, {}, "cat", {"s"}}},
      {{"unknown"}, {{}, OutputForm::text, {}, "unknown", {}}},
      {{""}, {{}, OutputForm::text, {}, "", {}}},
  };
  for (const auto& [words, expected] : table) {
    const auto parsed = parse(words);
    const auto* line = std::get_if<CommandLine>(&parsed);
    ASSERT_NE(line, nullptr) << shown(words);
    EXPECT_EQ(line->actAs, expected.actAs) << shown(words);
    EXPECT_EQ(line->form, expected.form) << shown(words);
    EXPECT_EQ(line->deadline, expected.deadline) << shown(words);
    EXPECT_EQ(line->command, expected.command) << shown(words);
    EXPECT_EQ(line->operands, expected.operands) << shown(words);
  }
}

TEST(CommandLine, BadOnesAreToldInOneLine) {
  const std::string seconds = "--timeout takes a number of seconds from 1 to 86400";
  const std::vector<std::pair<Words, std::string>> table = {
      {{}, "no command given; --help lists them"},
      {{"--json"}, "no command given; --help lists them"},
      {{"--"}, "no command given; --help lists them"},
      {{"--as"}, "--as needs a value"},
      {{"--timeout"}, "--timeout needs a value"},
      {{"--timeout", "0", "wake"}, seconds},
      {{"--timeout", "-1", "wake"}, seconds},
      {{"--timeout", "86401", "wake"}, seconds},
      {{"--timeout", "99999999999999999999", "wake"}, seconds},
      {{"--timeout", "", "wake"}, seconds},
      {{"--timeout", " 1", "wake"}, seconds},
      {{"--timeout", "1s", "wake"}, seconds},
      {{"--timeout", "1.5", "wake"}, seconds},
      {{"--unknown", "wake"}, "unknown option --unknown"},
      {{"--json=yes", "wake"}, "unknown option --json=yes"},
      {{"-x", "wake"}, "unknown option -x"},
      {{"--json", "-xh", "wake"}, "unknown option -x"},
      {{"-xh", "wake"}, "unknown option -x"},
  };
  for (const auto& [words, expected] : table) {
    const auto parsed = parse(words);
    const auto* error = std::get_if<UsageError>(&parsed);
    ASSERT_NE(error, nullptr) << shown(words);
    EXPECT_EQ(error->text, expected) << shown(words);
  }
}

TEST(CommandLine, HelpIsWantedBeforeAnythingElseIsLookedAt) {
  for (const Words& words : {Words{"--help"}, Words{"-h"}, Words{"--json", "--help", "wake"}, Words{"--help", "--unknown"}}) {
    EXPECT_TRUE(std::holds_alternative<HelpWanted>(parse(words))) << shown(words);
  }
}

}  // namespace
}  // namespace docuvend::ctl
