// What a provider hears of writes while it is slow to answer, is replaced, or goes.
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/fake/FakeQueues.h"
#include "platform/linux/coordination/FileAccesses.h"
#include "tests/coordination/RecordingProvider.h"
#include "tests/coordination/Turns.h"

namespace docuvend::linux_platform {
namespace {

using testing::fileNamed;
using testing::partyOf;
using testing::RecordingProvider;

constexpr std::size_t kMost = ChangeNotices::kMaximumNoticesUnderWay;

struct SlowProviderTest : ::testing::Test {
  void SetUp() override {
    fileSystem.addDirectory("/storage");
    provider->isSlow = true;
    coordinator._addDocuvend(provider);
  }
  void TearDown() override {
    provider->answerAll();
    next->answerAll();
  }

  static QXURL url(const std::string& name) { return QXURL::fileURL("/storage/" + name, QXURLKind::file); }
  // A whole write of a process of its own; its end is answered inside.
  void write(const std::string& name) {
    const int process = ++processes;
    const AccessNumber number = accesses.newNumber();
    accesses.begin(number,
                   {fileNamed(name), url(name), AccessKind::writing, partyOf(static_cast<std::uint8_t>(process % 200)), {process, {}}},
                   [](const std::optional<QXError>& error) { EXPECT_FALSE(error); });
    bool isEnded = false;
    accesses.end(number, [&isEnded] { isEnded = true; });
    EXPECT_TRUE(isEnded) << "nobody waits for the provider's answer";
  }
  void writeMany(std::size_t files) {
    for (std::size_t i = 0; i < files; ++i) write("many" + std::to_string(i));
  }

  std::vector<InstalledStorage> installed = {{"com.example.provider", QXURL::fileURL("/storage", QXURLKind::directory)}};
  fake_platform::FakeFileSystem fileSystem;
  std::function<void()> onLook;  // when a file's owner is known
  LinuxFileCoordinator coordinator{fileSystem,
                                   {
                                       .installedStorages = [this] { return installed; },
                                       .isInPlace =
                                           [this](const KeyedFile&) {
                                             if (onLook) onLook();
                                             return true;
                                           },
                                   }};
  FileAccesses accesses{coordinator};
  const std::shared_ptr<RecordingProvider> provider =
      std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory), /*queue=*/nullptr, "com.example.provider");
  const std::shared_ptr<RecordingProvider> next = std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory));
  int processes = 0;
};

TEST_F(SlowProviderTest, HasOneNoticeOfAFileAtATimeHoweverOftenItIsWritten) {
  for (int i = 0; i < 2000; ++i) write("x");
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told[0].first.substr(0, 9), "writer 1-");
  provider->answer();
  ASSERT_EQ(provider->told.size(), 2U) << "one for all that were written meanwhile";
  EXPECT_EQ(provider->told[1].first.substr(0, 12), "writer 2000-");
  EXPECT_EQ(provider->told[1].second, url("x"));
  provider->answer();
  EXPECT_EQ(provider->told.size(), 2U);
  write("x");
  EXPECT_EQ(provider->told.size(), 3U) << "at once again";
}

TEST_F(SlowProviderTest, IsToldAfterTheLastWriteAlsoOfOneThatEndsWhileItsNoticeIsOnItsWay) {
  fake_platform::FakeQueues queues;
  coordinator._removeDocuvend(provider);
  const auto queued = std::make_shared<RecordingProvider>(QXURL::fileURL("/storage", QXURLKind::directory), queues.operationQueue());
  queued->isSlow = true;
  coordinator._addDocuvend(queued);
  const auto begin = [this](int process) {
    const AccessNumber number = accesses.newNumber();
    accesses.begin(number, {fileNamed("x"), url("x"), AccessKind::writing, partyOf(1), {process, {}}}, /*answer=*/{});
    return number;
  };
  const AccessNumber first = begin(1);
  const AccessNumber second = begin(2);
  int ended = 0;
  accesses.end(first, [&ended] { ++ended; });
  EXPECT_EQ(ended, 0) << "the provider has not been told";
  accesses.end(second, [&ended] { ++ended; });
  queues.runAll();
  EXPECT_EQ(ended, 2);
  EXPECT_EQ(queued->told.size(), 1U);
  queued->answer();
  queues.runAll();
  EXPECT_EQ(queued->told.size(), 2U);
  queued->answerAll();
}

TEST_F(SlowProviderTest, HasALimitedNumberOfNoticesHoweverManyFilesAreWrittenAndHearsOfAllInTheEnd) {
  constexpr std::size_t kFiles = 3000;
  writeMany(kFiles);
  writeMany(kFiles);
  EXPECT_EQ(provider->told.size(), kMost);
  while (!provider->unanswered.empty()) {
    ASSERT_LE(provider->unanswered.size(), kMost);
    provider->answer();
  }
  EXPECT_EQ(provider->told.size(), kFiles + kMost) << "those that were under way owe a second one";
}

TEST_F(SlowProviderTest, ThatIsReplacedLeavesWhatItWasStillToHearToTheNextOne) {
  writeMany(kMost + 2);
  write("many0");
  ASSERT_EQ(provider->told.size(), kMost);
  coordinator._removeDocuvend(provider);
  EXPECT_TRUE(next->told.empty());
  coordinator._addDocuvend(next);
  EXPECT_EQ(next->told.size(), 3U);
  while (!provider->unanswered.empty()) provider->answer();
  EXPECT_EQ(provider->told.size(), kMost) << "nor does the old one hear of it";
  EXPECT_EQ(next->told.size(), 3U);
}

TEST_F(SlowProviderTest, ThatIsReplacedByOneThatComesFirstLeavesItTheSame) {
  writeMany(kMost + 1);
  coordinator._addDocuvend(next);
  EXPECT_TRUE(next->told.empty());
  coordinator._removeDocuvend(provider);
  ASSERT_EQ(next->told.size(), 1U);
  EXPECT_EQ(next->told[0].second, url("many" + std::to_string(kMost)));
}

TEST_F(SlowProviderTest, ThatIsRemovedBetweenTheLookAndTheNoteLeavesItTheSame) {
  const KeyedFile file{fileNamed("x"), url("x")};
  write("x");
  const FileOwner before = coordinator.ownerOf(file, LinuxFileCoordinator::DirectoryItself::counts);
  coordinator._removeDocuvend(provider);
  coordinator._addDocuvend(next);
  bool isAnswered = false;
  coordinator.tellFinishedWriting(before, {2, {}}, file, [&isAnswered] { isAnswered = true; });
  EXPECT_TRUE(isAnswered);
  EXPECT_EQ(next->told.size(), 1U);
}

// One thread has found it to be the owner of the last file; before that is noted another one has replaced it, and found the last file where
// it was noted before.
TEST_F(SlowProviderTest, ThatIsReplacedWhileItIsToldWhatWasWrittenBeforeItCameLeavesTheRestToTheNextOne) {
  static constexpr auto kGenerous = std::chrono::seconds(60);
  coordinator._removeDocuvend(provider);
  writeMany(kMost + 1);
  std::promise<void> isSeenByTheSecond;
  std::promise<void> isNotedByTheFirst;
  std::thread second;
  std::size_t looks = 0;  // the two go on by turns
  onLook = [this, &looks, &second, &isSeenByTheSecond, &isNotedByTheFirst] {
    ++looks;
    if (looks == kMost + 1) {
      second = std::thread([this] {
        coordinator._removeDocuvend(provider);
        coordinator._addDocuvend(next);
      });
      EXPECT_EQ(isSeenByTheSecond.get_future().wait_for(kGenerous), std::future_status::ready);
    } else if (looks == kMost + 3) {
      isSeenByTheSecond.set_value();
      EXPECT_EQ(isNotedByTheFirst.get_future().wait_for(kGenerous), std::future_status::ready);
    }
  };
  coordinator._addDocuvend(provider);
  isNotedByTheFirst.set_value();
  second.join();
  onLook = {};
  EXPECT_EQ(provider->told.size(), kMost);
  EXPECT_EQ(next->told.size(), 1U) << "it was noted at one that was gone by then";
}

TEST_F(SlowProviderTest, ThatIsUninstalledIsToldNothingMore) {
  writeMany(kMost + 1);
  installed.clear();
  coordinator._removeDocuvend(provider);
  while (!provider->unanswered.empty()) provider->answer();
  EXPECT_EQ(provider->told.size(), kMost);
  coordinator._addDocuvend(next);
  EXPECT_TRUE(next->told.empty()) << "the file was nobody's";
}

}  // namespace
}  // namespace docuvend::linux_platform
