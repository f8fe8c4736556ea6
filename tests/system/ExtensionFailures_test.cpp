// Extensions that try to use up what they share with the daemon: they are held to their own part, whoever waits for them is told, and
// everybody else is served meanwhile. Each of these tests ends with a house in which no process is left.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <future>

#include "common/DVErrors.h"
#include "platform/linux/launch/LaunchArguments.h"
#include "tests/support/Sanitizers.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using linux_platform::kExtensionOpenFiles;
using linux_platform::kExtensionProcesses;
using ::testing::AllOf;
using ::testing::HasSubstr;

const ProviderID kTricksterID{kTrickster};
const ConsumerID kPickerID{kPicker};

class ExtensionFailures : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kCellar);
    house_.install(kEditor);
    house_.install(kPicker);
    house_.installTrickster();
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    limitDescriptors();
    house_.startDaemon();
    caller_ = house_.client(kPicker);
    letterString_ = house_.granted(letter_, kEditor);
  }

  QXURL item(const std::string& name) const { return QXURL::fileURL(house_.storage(kTrickster) + "/" + name, QXURLKind::file); }
  std::optional<QXError> grant(const std::string& name) {
    return errorOf(caller_->ask<&DVDaemon::extendSandboxForFileURL>(item(name), kTricksterID, kPickerID));
  }
  std::future<std::optional<QXError>> start(const std::string& name) {
    EXPECT_EQ(grant(name), std::nullopt);
    return std::async(std::launch::async, [this, name] {
      return errorOf(house_.client(kPicker)->ask<&DVDaemon::startProvidingItemAtURL>(item(name), kTricksterID, kPickerID));
    });
  }
  static void expectFailed(const std::optional<QXError>& error) {
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, kDVErrorDomain);
    EXPECT_EQ(error->code, static_cast<std::int64_t>(DVErrorCode::pluginOperationFailed)) << error->description();
    EXPECT_TRUE(error->underlying);
  }
  // An application opens another provider's document, which takes a passed descriptor.
  void expectOthersAreServed() { EXPECT_EQ(house_.confined(kEditor, {"show", letterString_}).output, "Dear all\n"); }
  void expectItWorksAgain() {
    eventually("it works again", [this] { return grant("other") == std::nullopt; });
  }

  // What a login gives to the daemon, if this process has more.
  static void limitDescriptors() {
    constexpr rlim_t kUsual = 1024;
    rlimit limit{};
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
    limit.rlim_cur = std::min(limit.rlim_cur, kUsual);
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &limit), 0);
  }
  std::size_t daemonsDescriptors() {
    const std::filesystem::directory_iterator all("/proc/" + std::to_string(house_.daemon().pid()) + "/fd");
    return static_cast<std::size_t>(std::distance(begin(all), end(all)));
  }
  // The number in the first message that begins so.
  int loggedNumber(const std::string& beginning) const {
    int number = 0;
    for (const std::string& line : house_.log()) {
      if (line.starts_with(beginning) && std::sscanf(line.c_str() + beginning.size(), "%d", &number) == 1) break;
    }
    return number;
  }

  std::string letter_;
  std::string letterString_;
  std::unique_ptr<Client> caller_;
};

TEST_F(ExtensionFailures, OneThatAllocatesWithoutEndEndsItselfAndNobodyElse) {
  if (kSanitized) GTEST_SKIP() << "a build with a memory sanitizer sets no such limit";
  auto answer = start("memory");
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  expectFailed(answer.get());
  expectOthersAreServed();
  expectItWorksAgain();
}

TEST_F(ExtensionFailures, OneThatForksWithoutEndIsStoppedAtItsLimitAndLeavesNoProcess) {
  auto answer = start("forks");
  ASSERT_TRUE(house_.awaitLog("com.orvane.trickster: has started "));
  const int children = loggedNumber("[INFO] com.orvane.trickster: has started ");
  EXPECT_GT(children, static_cast<int>(kExtensionProcesses) / 2);
  EXPECT_LT(children, static_cast<int>(kExtensionProcesses));
  expectOthersAreServed();
  EXPECT_EQ(grant("other"), std::nullopt) << "it has threads left for this";

  const auto processes = house_.processesOf("docuvend-trickster");
  EXPECT_EQ(processes.size(), static_cast<std::size_t>(children) + 1);
  // The parent of all others.
  const pid_t provider = *std::min_element(processes.begin(), processes.end());
  ASSERT_EQ(::kill(provider, SIGKILL), 0);
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  expectFailed(answer.get());
  eventually("its children are gone", [this] { return house_.processesOf("docuvend-trickster").empty(); });
  expectItWorksAgain();
}

TEST_F(ExtensionFailures, OneThatHoardsDescriptorsKeepsTheDaemonFromPassingNone) {
  ASSERT_EQ(grant("hoard"), std::nullopt);
  ASSERT_TRUE(house_.awaitLog("com.orvane.trickster: has hoarded "));
  EXPECT_GE(loggedNumber("[INFO] com.orvane.trickster: has hoarded "), static_cast<int>(kExtensionOpenFiles));
  expectOthersAreServed();
}

TEST_F(ExtensionFailures, OneThatFloodsTheDaemonWithFramesAndDescriptorsIsDropped) {
  ASSERT_EQ(grant("other"), std::nullopt);
  for (const pid_t process : house_.processesOf("docuvend-trickster")) ::kill(process, SIGKILL);
  eventually("it has ended", [this] { return house_.processesOf("docuvend-trickster").empty(); });
  const std::size_t before = daemonsDescriptors();

  writeFile(house_.container(kTrickster) + "/flood", "");
  auto answer = std::async(std::launch::async, [this] {
    return errorOf(house_.client(kPicker)->ask<&DVDaemon::extendSandboxForFileURL>(item("other"), kTricksterID, kPickerID));
  });
  expectOthersAreServed();
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  expectFailed(answer.get());
  eventually("it has ended", [this] { return house_.processesOf("docuvend-trickster").empty(); });
  eventually("all is closed that it sent", [this, before] { return daemonsDescriptors() <= before; });
  expectItWorksAgain();
}

TEST_F(ExtensionFailures, OneThatWritesWithoutEndIsHeardInPartAndNotHeldUp) {
  auto answer = start("chatter");
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  EXPECT_EQ(answer.get(), std::nullopt);
  for (const pid_t process : house_.processesOf("docuvend-trickster")) ::kill(process, SIGKILL);
  ASSERT_TRUE(house_.awaitLog(" lines more than are logged."));
  const int logged = house_.logged("[INFO] com.orvane.trickster: and another thing");
  EXPECT_GT(logged, 0);
  EXPECT_LT(logged, 10'000);
  EXPECT_GT(loggedNumber("[INFO] com.orvane.trickster wrote "), 0);
}

TEST_F(ExtensionFailures, OneThatCrashesAgainAndAgainIsRefusedAtOnceForAWhileAndThenStartedAgain) {
  const auto refusedForAWhile = [](const std::optional<QXError>& error) {
    return error && error->underlying && error->underlying->description().find("it can be started again in ") != std::string::npos;
  };
  std::optional<QXError> error;
  for (int i = 0; i < 10 && !refusedForAWhile(error); ++i) error = grant("abort");
  ASSERT_TRUE(refusedForAWhile(error));
  expectFailed(error);
  EXPECT_THAT(error->underlying->description(),
              AllOf(HasSubstr("The process of com.orvane.trickster ended too soon "), HasSubstr(" times in a row; ")));
  expectOthersAreServed();
  expectItWorksAgain();
}

}  // namespace
}  // namespace docuvend::tests
