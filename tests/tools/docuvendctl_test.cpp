// The program itself, where it needs no daemon.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "platform/linux/base/Sanitizers.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/bundles/BundleHouse.h"
#include "tests/system/house/Process.h"

namespace docuvend::ctl {
namespace {

using ::testing::EndsWith;
using ::testing::MatchesRegex;
using ::testing::StartsWith;
using tests::Ending;

Ending run(const std::vector<std::string>& arguments, const std::vector<std::string>& environment = {}) {
  std::vector<std::string> words = {std::string(DOCUVEND_BIN) + "/docuvendctl"};
  words.insert(words.end(), arguments.begin(), arguments.end());
  return tests::Process({words, environment, {}}).wait();
}

void expectOneLine(const std::string& text) {
  ASSERT_FALSE(text.empty());
  EXPECT_EQ(text.find('\n'), text.size() - 1) << text;
}

TEST(Docuvendctl, ExplainsItselfAndACommandInBothWays) {
  const Ending help = run({"--help"});
  EXPECT_EQ(help.status, 0);
  EXPECT_EQ(help.errors, "");
  EXPECT_THAT(help.output, StartsWith("docuvendctl [--as BUNDLE] [--json] [--timeout SECONDS] COMMAND [OPERAND...]\n"));
  EXPECT_EQ(run({"help"}).output, help.output);
  const Ending grant = run({"grant", "--help"});
  EXPECT_EQ(grant.status, 0);
  EXPECT_THAT(grant.output, StartsWith("docuvendctl grant URL PROVIDER CONSUMER\n"));
  EXPECT_EQ(run({"help", "grant"}).output, grant.output);
  EXPECT_THAT(run({"--json", "grant", "--help"}).output, StartsWith("{\"help\":\"docuvendctl grant "));
}

TEST(Docuvendctl, TellsItsVersion) {
  for (const char* word : {"version", "--version"}) {
    const Ending version = run({word});
    EXPECT_EQ(version.status, 0);
    EXPECT_THAT(version.output, MatchesRegex("[0-9]+\\.[0-9]+\\.[0-9]+\n"));
  }
  EXPECT_THAT(run({"version", "--json"}).output, MatchesRegex("\\{\"version\":\"[0-9.]+\"\\}\n"));
}

TEST(Docuvendctl, AWrongCommandLineIsOneLineAndStatus2) {
  for (const auto& arguments : std::vector<std::vector<std::string>>{{},
                                                                     {"--what"},
                                                                     {"dance"},
                                                                     {"wake", "up"},
                                                                     {"grant", "/x", "p"},
                                                                     {"cat"},
                                                                     {"--timeout", "0", "wake"},
                                                                     {"help", "dance"},
                                                                     {"platform"},
                                                                     {"wake", "--what"}}) {
    const Ending ending = run(arguments);
    EXPECT_EQ(ending.status, 2) << ending.errors;
    EXPECT_EQ(ending.output, "");
    EXPECT_THAT(ending.errors, StartsWith("docuvendctl: "));
    expectOneLine(ending.errors);
  }
}

TEST(Docuvendctl, AWordThatWouldSteerATerminalIsShownHarmlessly) {
  const Ending ending = run({"\x1b[31m\nwake"});
  EXPECT_EQ(ending.status, 2);
  EXPECT_EQ(ending.errors, "docuvendctl: unknown command \\x1b[31m\\nwake; --help lists them\n");
}

TEST(Docuvendctl, WithoutADaemonItSaysSoWithStatus7) {
  std::string place = (std::filesystem::temp_directory_path() / "dvXXXXXX").string();
  ASSERT_NE(::mkdtemp(place.data()), nullptr);
  for (const auto& environment : std::vector<std::vector<std::string>>{{}, {"XDG_RUNTIME_DIR=r"}, {"XDG_RUNTIME_DIR=" + place}}) {
    const Ending ending = run({"wake"}, environment);
    EXPECT_EQ(ending.status, 7) << ending.errors;
    expectOneLine(ending.errors);
  }
  std::filesystem::remove(place);
}

TEST(Docuvendctl, SaysThatItCannotLookAtABundleInsteadOfThatItIsNone) {
  if (linux_platform::kAddressSanitizer) GTEST_SKIP() << "the sanitizer looks at memory through descriptors of its own";
  linux_platform::BundleHouse house;
  const std::string bundle = house.root() + "/bundle";
  linux_platform::BundleHouse::install(bundle, "org.a");
  // Those that everybody has, one for the bundle's directory, and none for what is in it.
  const Ending ending = tests::Process({{"/bin/sh", "-c", "exec 3<&-; ulimit -n 4; exec \"$@\"", "sh",
                                         std::string(DOCUVEND_BIN) + "/docuvendctl", "install", bundle},
                                        {"HOME=" + house.paths.home, "XDG_RUNTIME_DIR=" + house.root() + "/run"},
                                        {}})
                            .wait();
  EXPECT_EQ(ending.status, 9);
  EXPECT_EQ(ending.errors, "docuvendctl: QXSystemErrorDomain 24: cannot look at " + bundle + "/Info.plist: Too many open files\n");
}

TEST(Docuvendctl, AWrongCommandLineInJSONIsOneObject) {
  const Ending ending = run({"dance", "--json"});
  EXPECT_EQ(ending.status, 2);
  EXPECT_EQ(ending.output, "");
  EXPECT_EQ(
      ending.errors,
      "{\"error\":{\"domain\":\"DVControlErrorDomain\",\"code\":1,\"description\":\"DVControlErrorDomain 1: unknown command dance; --help "
      "lists them\"}}\n");
}

// What it ends with when its output goes there.
Ending runInto(const linux_platform::UniqueDescriptor& output) {
  tests::Command command{{std::string(DOCUVEND_BIN) + "/docuvendctl", "version"}, {}, {}};
  command.output = output.get();
  return tests::Process(command).wait();
}

TEST(Docuvendctl, AnAnswerThatCannotBeWrittenIsAFailure) {
  const Ending ending = runInto(linux_platform::UniqueDescriptor(::open("/dev/full", O_WRONLY | O_CLOEXEC)));
  EXPECT_EQ(ending.status, 9);
  EXPECT_THAT(ending.errors, StartsWith("docuvendctl: QXSystemErrorDomain 28: cannot write"));
}

TEST(Docuvendctl, EndsQuietlyWhenNobodyReadsOn) {
  int ends[2] = {-1, -1};
  ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
  ::close(ends[0]);
  const Ending ending = runInto(linux_platform::UniqueDescriptor(ends[1]));
  EXPECT_EQ(ending.status, 128 + SIGPIPE);
  EXPECT_EQ(ending.errors, "");
}

TEST(Docuvendctl, AFailureInJSONIsOneObject) {
  const Ending ending = run({"--json", "wake"});
  EXPECT_EQ(ending.status, 7);
  EXPECT_EQ(ending.output, "");
  EXPECT_THAT(ending.errors, StartsWith("{\"error\":{\"domain\":\"DVConsumerErrorDomain\",\"code\":1,\"description\":\""));
  EXPECT_THAT(ending.errors, EndsWith("}}\n"));
  expectOneLine(ending.errors);
}

}  // namespace
}  // namespace docuvend::ctl
