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
const std::string kOther = "com.example.other";
const ChangeNotices::Owner kBundle = std::string("com.example.provider");

struct ChangeNoticesTest : ::testing::Test {
  static FileChange change(const std::string& file, int process = 1, std::optional<std::string> application = {}) {
    return {{fileNamed(file), QXURL::fileURL("/storage/" + file, QXURLKind::file)}, {{std::move(application), process}}};
  }
  static std::string numbered(std::size_t number) { return "f" + std::to_string(number); }
  // Each as its file's name and its writer.
  using Begun = std::vector<std::pair<std::string, int>>;
  Begun end(const std::string& file) {
    Begun begun;
    for (const auto& notice : notices.end(provider, fileNamed(file))) {
      EXPECT_EQ(notice.provider, provider);
      begun.emplace_back(notice.file.key.name, notice.writer.processIdentifier);
    }
    return begun;
  }
  // As many of an application as may be under way, when so many of others are.
  void fill(const std::optional<std::string>& application = {}, std::size_t underWay = 0) {
    for (std::size_t i = underWay; i < kMost; ++i)
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
  EXPECT_EQ(end(kEditor + numbered(3)), (Begun{{"y", 3}}));
  EXPECT_EQ(end("y"), (Begun{{"z", 2}}));
  EXPECT_EQ(end("z"), Begun{});
}

TEST_F(ChangeNoticesTest, WhatAFileOwesWaitsBehindTheOthersThatWait) {
  fill();
  EXPECT_FALSE(notices.add(provider, change(numbered(0), 2)));
  EXPECT_FALSE(notices.add(provider, change("y", 1)));
  EXPECT_EQ(end(numbered(0)), (Begun{{"y", 1}}));
  EXPECT_FALSE(notices.add(provider, change(numbered(0), 3))) << "it waits already";
  EXPECT_EQ(end("y"), (Begun{{numbered(0), 3}})) << "in the name of whoever wrote last";
}

TEST_F(ChangeNoticesTest, AnotherApplicationOrObjectIsNotHeldUp) {
  fill(kEditor);
  EXPECT_FALSE(notices.add(provider, change("y", 1, kEditor)));
  EXPECT_TRUE(notices.add(provider, change("z", 1, kOther)));
  EXPECT_TRUE(notices.add(provider, change("a", 1, /*application=*/{})));
  EXPECT_TRUE(notices.add(other, change("b", 1, kEditor)));
}

TEST_F(ChangeNoticesTest, OneApplicationsWriteOfAFileThatAnothersNoticeIsOfIsToldInItsOwnLine) {
  fill(kEditor);
  EXPECT_FALSE(notices.add(provider, change("y", 1, kEditor)));
  EXPECT_FALSE(notices.add(provider, change(kEditor + numbered(0), 7, /*application=*/{})));
  EXPECT_EQ(end(kEditor + numbered(0)), (Begun{{"y", 1}, {kEditor + numbered(0), 7}}));
}

// However much another one keeps waiting.
TEST_F(ChangeNoticesTest, AnApplicationsWriteOfAFileThatWaitsInAnothersLineIsToldInItsOwn) {
  fill(kEditor);
  EXPECT_FALSE(notices.add(provider, change("y", 1, kEditor)));
  const auto begun = notices.add(provider, change("y", 7, kOther));
  ASSERT_TRUE(begun);
  EXPECT_EQ(begun->file.key, fileNamed("y"));
  EXPECT_EQ(begun->writer.processIdentifier, 7);
  EXPECT_EQ(end(kEditor + numbered(0)), Begun{}) << "the one notice is for both, and it is the other one's";
  fill(kOther, /*underWay=*/1);
  EXPECT_FALSE(notices.add(provider, change("z", 7, kOther)));
  EXPECT_EQ(end("y"), (Begun{{"z", 7}}));
}

TEST_F(ChangeNoticesTest, AFileThatSeveralHaveWrittenIsOwedToEachOfThem) {
  fill(kEditor);
  EXPECT_FALSE(notices.add(provider, change("y", 1, kEditor)));
  EXPECT_FALSE(notices.add(provider, change(kEditor + numbered(0), 7, kOther)));
  EXPECT_FALSE(notices.add(provider, change(kEditor + numbered(0), 8, kEditor))) << "whoever wrote last takes it out of nobody's line";
  EXPECT_EQ(end(kEditor + numbered(0)), (Begun{{"y", 1}, {kEditor + numbered(0), 7}}));
}

TEST_F(ChangeNoticesTest, WhatAnObjectWasStillToBeToldIsMovedOnceAndIsNotToldToIt) {
  fill();
  EXPECT_FALSE(notices.add(provider, change(numbered(0), 2)));
  EXPECT_FALSE(notices.add(provider, change("y")));
  EXPECT_TRUE(notices.add(other, change("z", 1)));
  EXPECT_FALSE(notices.add(other, change("z", 2)));
  const auto untold = notices.untoldOfAllBut({other});
  std::set<std::string> names;
  for (const auto& one : untold) {
    EXPECT_EQ(one.owner, ChangeNotices::Owner(provider));
    names.insert(one.file.key.name);
    EXPECT_TRUE(notices.move(one, ChangeNotices::Owner(other)));
    EXPECT_FALSE(notices.move(one, ChangeNotices::Owner(other))) << "somebody else may have moved it meanwhile";
  }
  EXPECT_EQ(names, (std::set<std::string>{numbered(0), "y"}));
  EXPECT_TRUE(notices.untoldOfAllBut({other}).empty());
  for (std::size_t i = 0; i < kMost; ++i) EXPECT_EQ(end(numbered(i)), Begun{});
  EXPECT_TRUE(notices.add(provider, change("y"))) << "nothing is left of it";
  EXPECT_EQ(notices.end(other, fileNamed("z")).size(), 1U) << "the others keep theirs";
}

TEST_F(ChangeNoticesTest, WhatIsKeptForABundleIsToldToTheObjectThatComesForEveryoneWhoWroteIt) {
  fill(kEditor);
  EXPECT_FALSE(notices.add(kBundle, change("x", 1, kOther)));
  EXPECT_FALSE(notices.add(kBundle, change("x", 2, kEditor)));
  const auto untold = notices.untoldOfAllBut({provider});
  ASSERT_EQ(untold.size(), 1U) << "each file once";
  EXPECT_FALSE(notices.move(untold[0], kBundle)) << "nobody has come";
  const auto begun = notices.move(untold[0], ChangeNotices::Owner(provider));
  ASSERT_TRUE(begun) << "the editor's line is full, the other one's is not";
  EXPECT_EQ(begun->writer.bundleIdentifier, kOther);
  EXPECT_EQ(end("x"), Begun{});
}

TEST_F(ChangeNoticesTest, WhatIsNobodysAnyMoreIsForgotten) {
  EXPECT_FALSE(notices.add(kBundle, change("x")));
  EXPECT_FALSE(notices.move(notices.untoldOfAllBut({}).at(0), std::nullopt));
  EXPECT_TRUE(notices.isEmpty());
}

TEST_F(ChangeNoticesTest, AFileIsToldOfByTheURLThatItHadLast) {
  EXPECT_FALSE(notices.add(kBundle, change("x")));
  FileChange moved = change("x", 2);
  moved.file.url = QXURL::fileURL("/renamed/x", QXURLKind::file);
  EXPECT_FALSE(notices.add(kBundle, moved));
  const auto begun = notices.move(notices.untoldOfAllBut({}).at(0), ChangeNotices::Owner(provider));
  ASSERT_TRUE(begun);
  EXPECT_EQ(begun->file.url, moved.file.url);
  EXPECT_EQ(end("x"), Begun{});
  EXPECT_TRUE(notices.isEmpty());
}

// What one application may make a provider be told of later, whether the provider is not there or does not answer.
TEST_F(ChangeNoticesTest, ThatAnApplicationIsOwedAreOfALimitedNumberOfFiles) {
  fill(kEditor);
  for (const auto& owner : {ChangeNotices::Owner(provider), kBundle}) {
    for (std::size_t i = 0; i < ChangeNotices::kMaximumUntoldFiles; ++i) {
      ASSERT_TRUE(notices.hasRoomFor(owner, kEditor, change("w" + numbered(i)).file)) << i;
      EXPECT_FALSE(notices.add(owner, change("w" + numbered(i), 1, kEditor)));
    }
    EXPECT_FALSE(notices.hasRoomFor(owner, kEditor, change("one more").file));
    EXPECT_TRUE(notices.hasRoomFor(owner, kEditor, change("w" + numbered(0)).file)) << "it waits already";
    EXPECT_TRUE(notices.hasRoomFor(owner, kOther, change("one more").file));
    EXPECT_TRUE(notices.hasRoomFor(owner, /*application=*/{}, change("one more").file));
    EXPECT_TRUE(notices.hasRoomFor(other, kEditor, change("one more").file));
  }
  EXPECT_EQ(end(kEditor + numbered(0)).size(), 1U);
  EXPECT_TRUE(notices.hasRoomFor(provider, kEditor, change("one more").file)) << "one of them is being told";
  EXPECT_FALSE(notices.hasRoomFor(kBundle, kEditor, change("one more").file));
}

TEST_F(ChangeNoticesTest, ThatAllUnconfinedProcessesAreOwedAreOfALimitedNumberOfFiles) {
  for (std::size_t i = 0; i < ChangeNotices::kMaximumUnconfinedUntoldFiles; ++i) {
    ASSERT_TRUE(notices.hasRoomFor(kBundle, /*application=*/{}, change(numbered(i)).file)) << i;
    EXPECT_FALSE(notices.add(kBundle, change(numbered(i))));
  }
  EXPECT_FALSE(notices.hasRoomFor(kBundle, /*application=*/{}, change("one more").file));
}

TEST_F(ChangeNoticesTest, ThatAreOwedHaveURLsOfALimitedLength) {
  const auto sized = [](const std::string& name, std::size_t bytes) {
    FileChange made = change(name, 1, kEditor);
    made.file.url = QXURL::fileURL("/" + std::string(bytes - std::string("file:///").size(), 'x'), QXURLKind::file);
    EXPECT_EQ(made.file.url.absoluteString().size(), bytes);
    return made;
  };
  constexpr std::size_t kQuarter = ChangeNotices::kMaximumUntoldBytes / 4;
  for (const char* name : {"a", "b", "c"}) EXPECT_FALSE(notices.add(kBundle, sized(name, kQuarter)));
  EXPECT_TRUE(notices.hasRoomFor(kBundle, kEditor, sized("d", kQuarter).file));
  EXPECT_FALSE(notices.hasRoomFor(kBundle, kEditor, sized("d", kQuarter + 1).file));
  EXPECT_FALSE(notices.add(kBundle, sized("c", 2 * kQuarter))) << "it was renamed, and counts as it is called now";
  EXPECT_FALSE(notices.hasRoomFor(kBundle, kEditor, sized("d", kQuarter).file));
  FileChange unconfined = sized("e", ChangeNotices::kMaximumUnconfinedUntoldBytes - kQuarter);
  unconfined.writers = {{std::nullopt, 1}};
  EXPECT_FALSE(notices.add(kBundle, unconfined));
  EXPECT_TRUE(notices.hasRoomFor(kBundle, /*application=*/{}, sized("f", kQuarter).file));
  EXPECT_FALSE(notices.hasRoomFor(kBundle, /*application=*/{}, sized("f", kQuarter + 1).file));
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
    const auto begins = [&](const ChangeNotices::Notice& begun) {
      const std::string& name = begun.file.key.name;
      ASSERT_TRUE(underWay.emplace(name, begun.writer.bundleIdentifier).second) << "two at once of " << name << ", seed " << seed;
      untold.erase(name);
      std::size_t ofApplication = 0;
      for (const auto& [file, application] : underWay) ofApplication += application == begun.writer.bundleIdentifier ? 1 : 0;
      ASSERT_LE(ofApplication, kMost) << "seed " << seed;
    };
    const auto ends = [&](const std::string name) {  // a copy: the key goes
      underWay.erase(name);
      for (const auto& notice : tried.end(provider, fileNamed(name))) begins(notice);
    };
    for (int step = 0; step < kSteps; ++step) {
      if (upTo(2) > 0 || underWay.empty()) {
        const auto application = upTo(1) == 0 ? std::optional(kEditor) : std::nullopt;
        const FileChange written = change(numbered(upTo(50)), step, application);
        untold.insert(written.file.key.name);
        if (const auto begun = tried.add(provider, written)) begins(*begun);
      } else {
        ends(std::next(underWay.begin(), static_cast<std::ptrdiff_t>(upTo(underWay.size() - 1)))->first);
      }
      if (HasFatalFailure()) return;
    }
    while (!underWay.empty()) {
      ends(underWay.begin()->first);
      if (HasFatalFailure()) return;
    }
    EXPECT_TRUE(untold.empty()) << "seed " << seed;
    EXPECT_TRUE(tried.isEmpty()) << "seed " << seed;
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
