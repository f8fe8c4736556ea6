#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>

#include "platform/linux/base/Sanitizers.h"
#include "tests/launch/ConfinedHouse.h"

namespace docuvend::linux_platform {
namespace {

using ::testing::HasSubstr;

struct Ending {
  int status = 0;
  std::string output;  // both streams
};

class DocuvendRun : public ConfinedTest {
 protected:
  enum class StandardDescriptors { open, closed };

  // `command` in front of docuvend-run, then its arguments.
  [[nodiscard]] Ending run(const std::vector<std::string>& arguments, const std::vector<std::string>& command = {},
                           StandardDescriptors descriptors = StandardDescriptors::open) {
    std::vector<std::string> words = command;
    words.push_back(std::string(DOCUVEND_BIN) + "/docuvend-run");
    words.insert(words.end(), arguments.begin(), arguments.end());
    std::vector<std::string> environment = {"PATH=/usr/bin:/bin", "HOME=" + house_.paths.home, "SECRET=x"};
    if (!runtime_.empty()) environment.push_back("XDG_RUNTIME_DIR=" + runtime_);
    auto process = startChild([&words, &environment, descriptors] {
      ::dup2(STDOUT_FILENO, STDERR_FILENO);
      if (descriptors == StandardDescriptors::closed) ::close(STDIN_FILENO);
      std::vector<char*> wordPointers;
      for (auto& word : words) wordPointers.push_back(word.data());
      wordPointers.push_back(nullptr);
      std::vector<char*> environmentPointers;
      for (auto& entry : environment) environmentPointers.push_back(entry.data());
      environmentPointers.push_back(nullptr);
      ::execvpe(wordPointers[0], wordPointers.data(), environmentPointers.data());
      return 99;
    });
    Ending ending;
    ending.output = process.output();
    ending.status = process.status();
    return ending;
  }

  std::string runtime_ = house_.root() + "/run";
};

TEST_F(DocuvendRun, StartsAnInstalledApplicationConfined) {
  const auto bundle = house_.installProbe("org.a");
  const auto ending = run({"org.a", "where", "am-i", "variable", "SECRET", "numbers", "/proc/self/fd", "exit", "5"});
  EXPECT_EQ(ending.output, "where am-i: " + bundle.container + "\nvariable SECRET: (absent)\nnumbers /proc/self/fd: 0 1 2\n");
  EXPECT_EQ(ending.status, 5);
}

TEST_F(DocuvendRun, EndsWithTheSignalThatEndedTheApplication) {
  (void)house_.installProbe("org.a");
  EXPECT_EQ(run({"org.a", "die", "15"}).status, 128 + 15);
}

TEST_F(DocuvendRun, GivesAnApplicationThatWasStartedWithoutThemItsStandardDescriptors) {
  (void)house_.installProbe("org.a");
  const auto ending = run({"org.a", "numbers", "/proc/self/fd"}, {}, StandardDescriptors::closed);
  EXPECT_EQ(ending.output, "numbers /proc/self/fd: 0 1 2\n");
}

TEST_F(DocuvendRun, SaysThatABundleIsNotInstalledAndWhy) {
  std::filesystem::create_directories(house_.paths.userBundles + "/broken");
  const auto ending = run({"org.missing"});
  EXPECT_EQ(ending.status, 127);
  EXPECT_EQ(ending.output, "docuvend-run: [ERROR] Ignoring the bundle at " + house_.paths.userBundles +
                               "/broken: has no Info.plist.\ndocuvend-run: no bundle org.missing is installed\n");
}

TEST_F(DocuvendRun, SaysWhatItCannotLookAtInsteadOfThatNothingIsInstalled) {
  if (kAddressSanitizer) GTEST_SKIP() << "the sanitizer looks at memory through descriptors of its own";
  BundleHouse::install(house_.paths.userBundles + "/org.a", "org.a");
  // Those that everybody has, one for the bundle's directory, and none for what is in it.
  for (const std::string identifier : {"org.a", "org.missing"}) {
    const auto ending = run({identifier}, {"sh", "-c", "exec 3<&-; ulimit -n 4; exec \"$@\"", "sh"});
    EXPECT_EQ(ending.status, 125);
    EXPECT_EQ(ending.output, "docuvend-run: QXSystemErrorDomain 24: cannot look at " + house_.paths.userBundles +
                                 "/org.a/Info.plist: Too many open files\n");
  }
}

TEST_F(DocuvendRun, ShowsWhatItReadsAndIsGivenInOneLineThatSteersNoTerminal) {
  std::filesystem::create_directories(house_.paths.userBundles + "/bro\nken\x1b[2J\u009b2J");
  const auto ending = run({"org.\r\u202egnissim"});
  EXPECT_EQ(ending.output, "docuvend-run: [ERROR] Ignoring the bundle at " + house_.paths.userBundles +
                               "/bro\\nken\\x1b[2J\\u{9b}2J: has no Info.plist.\n"
                               "docuvend-run: no bundle org.\\r\\u{202e}gnissim is installed\n");
}

TEST_F(DocuvendRun, ShowsTheNameOfAnExecutableThatDoesNotStartInTheSameWay) {
  const std::string directory = house_.paths.userBundles + "/org.a";
  const std::string name = "pro\ngram\u009b2J";
  BundleHouse::writeExecutable(directory + "/" + name,
                               "\x7f"
                               "ELF, but no program");
  BundleHouse::write(directory + "/Info.plist",
                     BundleHouse::propertyList(BundleHouse::entry("QXBundleIdentifier", BundleHouse::text("org.a")) +
                                               BundleHouse::entry("QXBundleExecutable", BundleHouse::text(name))));
  const auto ending = run({"org.a"});
  EXPECT_EQ(ending.status, 125);
  EXPECT_EQ(ending.output,
            "docuvend-confine: QXSystemErrorDomain 8: cannot execute " + directory + "/pro\\ngram\\u{9b}2J: Exec format error\n");
}

TEST_F(DocuvendRun, RefusesRoot) {
  (void)house_.installProbe("org.a");
  const auto ending = run({"org.a"}, {"unshare", "--user", "--map-root-user"});
  EXPECT_EQ(ending.status, 126);
  EXPECT_EQ(ending.output, "docuvend-run: root cannot be confined; run this as a user\n");
}

TEST_F(DocuvendRun, NeedsARunTimeDirectory) {
  (void)house_.installProbe("org.a");
  runtime_.clear();
  const auto ending = run({"org.a"});
  EXPECT_EQ(ending.status, 125);
  EXPECT_THAT(ending.output, HasSubstr("XDG_RUNTIME_DIR is not set to an absolute path"));
}

TEST_F(DocuvendRun, ExplainsItself) {
  EXPECT_EQ(run({}).status, 2);
  EXPECT_EQ(run({"--fast"}).status, 2);
  const auto help = run({"--help"});
  EXPECT_EQ(help.status, 0);
  EXPECT_THAT(help.output, HasSubstr("Usage: docuvend-run BUNDLE-ID [ARGUMENT...]"));
}

}  // namespace
}  // namespace docuvend::linux_platform
