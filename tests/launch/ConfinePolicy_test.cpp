#include "platform/linux/launch/policy/ConfinePolicy.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

using ::testing::ElementsAre;
using Words = std::vector<std::string>;

TEST(ConfinePolicy, IsReadAsItWasWritten) {
  ConfineCommand command;
  command.policy.rules = {{PathAccess::readExecute, "/usr"},
                          {PathAccess::read, "/etc/passwd"},
                          {PathAccess::readWrite, "/home/a b"},
                          {PathAccess::device, "/dev/null"}};
  command.policy.descriptors = 4;
  command.policy.processes = 7;
  command.policy.memory = 1ULL << 40U;
  command.policy.openFiles = 9;
  command.policy.pendingSignals = 11;
  command.policy.lockedMemory = 13;
  command.policy.leases = Leases::taken;
  command.command = {"/bin/x", "--", "--read", ""};
  const auto parsed = parseConfineArguments(confineArguments(command));
  ASSERT_TRUE(std::holds_alternative<ConfineCommand>(parsed)) << std::get<std::string>(parsed);
  EXPECT_EQ(std::get<ConfineCommand>(parsed), command);
}

TEST(ConfinePolicy, IsWrittenAsWords) {
  EXPECT_THAT(
      confineArguments(
          {{{{PathAccess::readWrite, "/a"}}, 3, std::nullopt, std::nullopt, std::nullopt, std::nullopt, std::nullopt, Leases::refused},
           {"/b", "c"}}),
      ElementsAre("--read-write", "/a", "--descriptors", "3", "--", "/b", "c"));
  EXPECT_THAT(confineArguments({{{}, 4, 1, 2, 3, 5, 6, Leases::taken}, {"/b"}}),
              ElementsAre("--descriptors", "4", "--processes", "1", "--memory", "2", "--open-files", "3", "--pending-signals", "5",
                          "--locked-memory", "6", "--leases", "taken", "--", "/b"));
}

TEST(ConfinePolicy, IsNotGuessed) {
  struct Case {
    Words words;
    std::string problem;
  };
  for (const auto& [words, problem] : std::vector<Case>{
           {{}, "no \"--\" before the command"},
           {{"--"}, "--descriptors is missing"},
           {{"--descriptors", "3"}, "no \"--\" before the command"},
           {{"--descriptors", "3", "--"}, "no command"},
           {{"--descriptors", "3", "--", "sh"}, "the command is not an absolute path"},
           {{"--descriptors", "3", "--", ""}, "the command is not an absolute path"},
           {{"--descriptors", "2", "--", "/sh"}, "--descriptors cannot be \"2\""},
           {{"--descriptors", "5", "--", "/sh"}, "--descriptors cannot be \"5\""},
           {{"--descriptors", "-3", "--", "/sh"}, "--descriptors cannot be \"-3\""},
           {{"--descriptors", "3x", "--", "/sh"}, "--descriptors cannot be \"3x\""},
           {{"--descriptors", "3", "--read"}, "option \"--read\" has no value"},
           {{"--descriptors", "3", "--read", "etc", "--", "/sh"}, "--read needs an absolute path, not \"etc\""},
           {{"--descriptors", "3", "--processes", "0", "--", "/sh"}, "--processes cannot be \"0\""},
           {{"--descriptors", "3", "--memory", "99999999999999999999", "--", "/sh"}, "--memory cannot be \"99999999999999999999\""},
           {{"--descriptors", "3", "--open-files", "many", "--", "/sh"}, "--open-files cannot be \"many\""},
           {{"--descriptors", "3", "--leases", "refused", "--", "/sh"}, "--leases cannot be \"refused\""},
           {{"--descriptors", "3", "--all", "/", "--", "/sh"}, "unknown option \"--all\""},
       }) {
    const auto parsed = parseConfineArguments(words);
    ASSERT_TRUE(std::holds_alternative<std::string>(parsed)) << ::testing::PrintToString(words);
    EXPECT_EQ(std::get<std::string>(parsed), problem);
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
