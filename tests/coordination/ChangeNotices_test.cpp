#include "platform/linux/coordination/ChangeNotices.h"

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <optional>
#include <random>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "tests/coordination/RecordingProvider.h"
#include "tests/coordination/Turns.h"

namespace docuvend::linux_platform {
namespace {

using testing::fileNamed;
using testing::RecordingProvider;

constexpr std::size_t kMost = ChangeNotices::kMaximumNoticesUnderWay;
const std::string kEditor = "com.example.editor";

struct ChangeNoticesTest : ::testing::Test {
  static FileChange change(const std::string& file, int process = 1, std::optional<std::string> application = {}) {
    return {{process, std::move(application)}, {fileNamed(file), QXURL::fileURL("/storage/" + file, QXURLKind::file)}};
  }
  static std::string numbered(std::size_t number) { return "f" + std::to_string(number); }
  // Each as its file's name and its writer.
  using Begun = std::vector<std::pair<std::string, int>>;
  Begun end(const std::string& file) {
    Begun begun;
    for (const auto& notice : notices.end(provider, fileNamed(file))) {
      EXPECT_EQ(notice.provider, provider);
      begun.emplace_back(notice.change.file.key.name, notice.change.writer.processIdentifier);
    }
    return begun;
  }
  // As many of an application as may be under way.
  void fill(const std::optional<std::string>& application = {}) {
    for (std::size_t i = 0; i < kMost; ++i)
      ASSERT_TRUE(notices.add(provider, change(application.value_or("") + numbered(i), 1, application)));
  }

  const ChangeNotices::Provider provider = std::make_shared<RecordingProvider>();
  const ChangeNotices::Provider other = std::make_shared<RecordingProvider>();
  ChangeNotices notices;
};

TEST_F(ChangeNoticesTest, WritesDuringANoticeOweOneMoreOfTheLastOfThem) {
  EXPECT_TRUE(notices.add(provider, change("x", 1)));
  for (int process = 2; process <= 1000; ++process) EXPECT_FALSE(notices.add(provider, change("x", process)));
  EXPECT_EQ(end("x"), (Begun{{"x", 1000}}));
  EXPECT_EQ(end("x"), Begun{});
  EXPECT_TRUE(notices.isEmpty());
  EXPECT_TRUE(notices.add(provider, change("x", 1))) << "the next one begins at once again";
}

TEST_F(ChangeNoticesTest, FilesAndObjectsAreToldEachForItself) {
  EXPECT_TRUE(notices.add(provider, change("x")));
  EXPECT_TRUE(notices.add(provider, change("y")));
  EXPECT_TRUE(notices.add(other, change("x")));
  EXPECT_EQ(end("x"), Begun{});
  EXPECT_FALSE(notices.add(other, change("x"))) << "it is still being told";
}

TEST_F(ChangeNoticesTest, AnApplicationsAreOfALimitedNumberAndTheRestWaitsInItsOrder) {
  fill(kEditor);
  EXPECT_FALSE(notices.add(provider, change("y", 1, kEditor)));
  EXPECT_FALSE(notices.add(provider, change("z", 2, kEditor)));
  EXPECT_FALSE(notices.add(provider, change("y", 3, kEditor))) << "it waits already";
  EXPECT_EQ(end(kEditor + numbered(3)), (Begun{{"y", 1}}));
  EXPECT_EQ(end("y"), (Begun{{"z", 2}}));
  EXPECT_EQ(end("z"), Begun{});
}

TEST_F(ChangeNoticesTest, WhatAFileOwesWaitsBehindTheOthersThatWait) {
  fill();
  EXPECT_FALSE(notices.add(provider, change(numbered(0), 2)));
  EXPECT_FALSE(notices.add(provider, change("y", 1)));
  EXPECT_EQ(end(numbered(0)), (Begun{{"y", 1}}));
  EXPECT_FALSE(notices.add(provider, change(numbered(0), 3))) << "it waits already";
  EXPECT_EQ(end("y"), (Begun{{numbered(0), 2}}));
}

TEST_F(ChangeNoticesTest, AnotherApplicationOrObjectIsNotHeldUp) {
  fill(kEditor);
  EXPECT_FALSE(notices.add(provider, change("y", 1, kEditor)));
  EXPECT_TRUE(notices.add(provider, change("z", 1, "com.example.other")));
  EXPECT_TRUE(notices.add(provider, change("a", 1, /*application=*/{})));
  EXPECT_TRUE(notices.add(other, change("b", 1, kEditor)));
}

TEST_F(ChangeNoticesTest, OneApplicationsWriteOfAFileThatAnothersNoticeIsOfIsToldInItsOwnLine) {
  fill(kEditor);
  EXPECT_FALSE(notices.add(provider, change("y", 1, kEditor)));
  EXPECT_FALSE(notices.add(provider, change(kEditor + numbered(0), 7, /*application=*/{})));
  EXPECT_EQ(end(kEditor + numbered(0)), (Begun{{"y", 1}, {kEditor + numbered(0), 7}}));
}

TEST_F(ChangeNoticesTest, WhatAnObjectWasStillToBeToldCanBeTakenOnceAndIsNotToldToIt) {
  fill();
  EXPECT_FALSE(notices.add(provider, change(numbered(0), 2)));
  EXPECT_FALSE(notices.add(provider, change("y")));
  EXPECT_TRUE(notices.add(other, change("z", 1)));
  EXPECT_FALSE(notices.add(other, change("z", 2)));
  const auto taken = notices.takeFromAllBut({other});
  std::set<std::string> names;
  for (const FileChange& one : taken) names.insert(one.file.key.name);
  EXPECT_EQ(names, (std::set<std::string>{numbered(0), "y"}));
  EXPECT_TRUE(notices.takeFromAllBut({other}).empty());
  for (std::size_t i = 0; i < kMost; ++i) EXPECT_EQ(end(numbered(i)), Begun{});
  EXPECT_TRUE(notices.add(provider, change("y"))) << "nothing is left of it";
  EXPECT_EQ(notices.end(other, fileNamed("z")).size(), 1U) << "the others keep theirs";
}

TEST_F(ChangeNoticesTest, ANoticeThatIsNotUnderWayEndsWithoutConsequence) {
  EXPECT_EQ(end("x"), Begun{});
  EXPECT_TRUE(notices.isEmpty());
}

// Random writes and ends. After the last write of each file a notice has begun, no file has two at once, no application too many, and in
// the end nothing is left.
TEST_F(ChangeNoticesTest, LoseNoWriteInWhateverOrderTheyCome) {
  constexpr unsigned kSequences = 300;
  constexpr int kSteps = 400;
  for (unsigned seed = 0; seed < kSequences; ++seed) {
    std::mt19937 random(seed);
    const auto upTo = [&random](std::size_t most) { return std::uniform_int_distribution<std::size_t>(0, most)(random); };
    ChangeNotices tried;
    std::map<std::string, std::optional<std::string>> underWay;  // file to application
    std::set<std::string> untold;                                // written, and no notice has begun since
    const auto begins = [&](const FileChange& begun) {
      const std::string& name = begun.file.key.name;
      ASSERT_TRUE(underWay.emplace(name, begun.writer.bundleIdentifier).second) << "two at once of " << name << ", seed " << seed;
      untold.erase(name);
      std::size_t ofApplication = 0;
      for (const auto& [file, application] : underWay) ofApplication += application == begun.writer.bundleIdentifier ? 1 : 0;
      ASSERT_LE(ofApplication, kMost) << "seed " << seed;
    };
    const auto ends = [&](const std::string& name) {
      underWay.erase(name);
      for (const auto& notice : tried.end(provider, fileNamed(name))) begins(notice.change);
    };
    for (int step = 0; step < kSteps; ++step) {
      if (upTo(2) > 0 || underWay.empty()) {
        const auto application = upTo(1) == 0 ? std::optional(kEditor) : std::nullopt;
        const FileChange written = change(numbered(upTo(50)), step, application);
        untold.insert(written.file.key.name);
        if (tried.add(provider, written)) begins(written);
      } else {
        ends(std::next(underWay.begin(), static_cast<std::ptrdiff_t>(upTo(underWay.size() - 1)))->first);
      }
      if (HasFatalFailure()) return;
    }
    while (!underWay.empty()) {
      ends(std::string(underWay.begin()->first));
      if (HasFatalFailure()) return;
    }
    EXPECT_TRUE(untold.empty()) << "seed " << seed;
    EXPECT_TRUE(tried.isEmpty()) << "seed " << seed;
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
