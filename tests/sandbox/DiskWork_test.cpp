#include "platform/linux/sandbox/DiskWork.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <functional>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <system_error>
#include <vector>

#include "platform/linux/base/LogSubject.h"

namespace docuvend::linux_platform {
namespace {

using ::testing::ElementsAre;

constexpr std::chrono::seconds kPatience{60};

const std::string kElsewhere = "/elsewhere/";

// As many owners as may be at work in one directory are in the same.
std::string directoryOf(std::size_t owner) { return "/" + std::to_string(owner / DiskWork::kMostThreadsOfDirectory) + "/"; }

// Work that says when it begins and waits to be let go.
class Works {
 public:
  [[nodiscard]] std::function<void()> named(const std::string& name) {
    return [this, name] {
      std::unique_lock lock(mutex_);
      begun_.push_back(name);
      ++running_;
      most_ = std::max(most_, running_);
      changed_.notify_all();
      changed_.wait_for(lock, kPatience, [this, &name] { return released_.contains(name); });
      --running_;
      ++ended_;
      changed_.notify_all();
    };
  }
  void release(const std::string& name) {
    const std::lock_guard lock(mutex_);
    released_.insert(name);
    changed_.notify_all();
  }
  [[nodiscard]] bool awaitBegun(std::size_t count) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, kPatience, [this, count] { return begun_.size() >= count; });
  }
  [[nodiscard]] bool awaitEnded(std::size_t count) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, kPatience, [this, count] { return ended_ >= count; });
  }
  [[nodiscard]] std::vector<std::string> begun() {
    const std::lock_guard lock(mutex_);
    return begun_;
  }
  [[nodiscard]] int mostAtOnce() {
    const std::lock_guard lock(mutex_);
    return most_;
  }

 private:
  std::mutex mutex_;  // guards what follows
  std::condition_variable changed_;
  std::vector<std::string> begun_;
  std::set<std::string> released_;
  std::size_t ended_ = 0;
  int running_ = 0;
  int most_ = 0;
};

TEST(DiskWork, OfOneOwnerRunsOneAfterAnotherInItsOrder) {
  Works works;
  DiskWork disk;
  for (const char* name : {"first", "second", "third"}) {
    works.release(name);
    disk.submit("a", kElsewhere, works.named(name));
  }
  ASSERT_TRUE(works.awaitEnded(3));
  EXPECT_THAT(works.begun(), ElementsAre("first", "second", "third"));
  EXPECT_EQ(works.mostAtOnce(), 1);
}

TEST(DiskWork, OfOtherOwnersRunsBesideIt) {
  Works works;
  DiskWork disk;
  for (std::size_t owner = 1; owner <= DiskWork::kMostThreads; ++owner)
    disk.submit(std::to_string(owner), directoryOf(owner), works.named("long"));
  EXPECT_TRUE(works.awaitBegun(DiskWork::kMostThreads));
  works.release("long");
  EXPECT_TRUE(works.awaitEnded(DiskWork::kMostThreads));
}

TEST(DiskWork, IsForWhomItsSubmitterWasAtWork) {
  Works works;
  LogSubject::Name subject;
  DiskWork disk;
  works.release("a1");
  {
    const LogSubject submitters(std::make_shared<const std::string>("com.example.app"));
    disk.submit("a", kElsewhere, [&subject, work = works.named("a1")] {
      subject = LogSubject::current();
      work();
    });
  }
  ASSERT_TRUE(works.awaitEnded(1));
  ASSERT_TRUE(subject);
  EXPECT_EQ(*subject, "com.example.app");
}

// With every thread but one occupied.
TEST(DiskWork, IsDoneByTurnsHoweverMuchOneOwnerHas) {
  Works works;
  DiskWork disk;
  for (std::size_t owner = 1; owner < DiskWork::kMostThreads; ++owner)
    disk.submit(std::to_string(owner), directoryOf(owner), works.named("long"));
  ASSERT_TRUE(works.awaitBegun(DiskWork::kMostThreads - 1));
  disk.submit("a", kElsewhere, works.named("a1"));
  ASSERT_TRUE(works.awaitBegun(DiskWork::kMostThreads));
  for (const char* name : {"a2", "a3"}) disk.submit("a", kElsewhere, works.named(name));
  for (const char* name : {"b1", "b2"}) disk.submit("b", kElsewhere, works.named(name));
  for (const char* name : {"a1", "a2", "a3", "b1", "b2"}) works.release(name);
  ASSERT_TRUE(works.awaitEnded(5));
  auto begun = works.begun();
  begun.erase(begun.begin(), begun.begin() + DiskWork::kMostThreads - 1);
  EXPECT_THAT(begun, ElementsAre("a1", "b1", "a2", "b2", "a3"));
  works.release("long");
}

// However many want something in a directory that is locked, others find a thread.
TEST(DiskWork, InOneDirectoryTakesItsPartOfTheThreadsAndNoMore) {
  Works works;
  DiskWork disk;
  constexpr std::size_t kOwners = DiskWork::kMostThreads + 1;
  for (std::size_t owner = 0; owner < kOwners; ++owner) disk.submit(std::to_string(owner), "/locked/", works.named("held"));
  ASSERT_TRUE(works.awaitBegun(DiskWork::kMostThreadsOfDirectory));
  works.release("free");
  disk.submit("b", kElsewhere, works.named("free"));
  disk.submit("0", kElsewhere, works.named("its own"));
  ASSERT_TRUE(works.awaitEnded(1));
  const auto begun = works.begun();
  EXPECT_EQ(std::count(begun.begin(), begun.end(), "held"), DiskWork::kMostThreadsOfDirectory);
  EXPECT_THAT(begun, ::testing::Contains("free"));
  EXPECT_THAT(begun, ::testing::Not(::testing::Contains("its own"))) << "it waits for its owner's turn";
  works.release("held");
  works.release("its own");
  EXPECT_TRUE(works.awaitEnded(kOwners + 2)) << "all of it is done in the end";
}

TEST(DiskWork, GoesOnWithEverybodyForWhomOneThatEndsMakesRoom) {
  Works works;
  DiskWork disk;
  for (std::size_t owner = 0; owner <= DiskWork::kMostThreadsOfDirectory; ++owner) {
    disk.submit(std::to_string(owner), "/locked/", works.named("held " + std::to_string(owner)));
  }
  disk.submit("0", kElsewhere, works.named("its own"));
  ASSERT_TRUE(works.awaitBegun(DiskWork::kMostThreadsOfDirectory));
  works.release("held 0");
  EXPECT_TRUE(works.awaitBegun(DiskWork::kMostThreadsOfDirectory + 2))
      << "the next one in the directory, and what its own owner has elsewhere";
  works.release("its own");
  for (std::size_t owner = 1; owner <= DiskWork::kMostThreadsOfDirectory; ++owner) works.release("held " + std::to_string(owner));
  EXPECT_TRUE(works.awaitEnded(DiskWork::kMostThreadsOfDirectory + 2));
}

TEST(DiskWork, ThatHasNotBegunIsDroppedAtTheEnd) {
  Works works;
  const auto held = std::make_shared<int>(0);
  {
    DiskWork disk;
    disk.submit("a", kElsewhere, works.named("running"));
    ASSERT_TRUE(works.awaitBegun(1));
    disk.submit("a", kElsewhere, [held] { ++*held; });
    works.release("running");
  }
  EXPECT_EQ(held.use_count(), 1);
}

constexpr int kAsExpected = 3;

TEST(DiskWorkDeathTest, NeedsAThreadAtLeast) {
  testing::GTEST_FLAG(death_test_style) = "threadsafe";
  const auto make = [] {
    const rlimit none{1, 1};
    if (::setrlimit(RLIMIT_NPROC, &none) != 0) std::_Exit(EXIT_FAILURE);
    try {
      const DiskWork disk;
    } catch (const std::system_error&) {
      std::_Exit(kAsExpected);
    }
    std::_Exit(EXIT_FAILURE);
  };
  EXPECT_EXIT(make(), testing::ExitedWithCode(kAsExpected), "");
}

}  // namespace
}  // namespace docuvend::linux_platform
