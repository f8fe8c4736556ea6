// A name that the kernel has not in its cache is waited for while somebody keeps its directory locked. Here that is "group", and what is
// looked up completely below it would be waited for.

#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <limits>
#include <string>
#include <variant>

#include "platform/linux/files/LinuxFileSystem.h"
#include "tests/files/TemporaryDirectory.h"
#include "tests/files/system_calls.h"

namespace docuvend::linux_platform {
namespace {

using test::Opening;
using test::SystemCalls;
using test::TemporaryDirectory;
using test::writeText;
namespace fs = std::filesystem;

constexpr int kContains = 0;
constexpr int kSame = 1;
constexpr int kOther = 2;
constexpr std::size_t kAlways = std::numeric_limits<std::size_t>::max();

class LinuxFileSystemWaiting : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(path("group/items/sub"));
    fs::create_directories(path("group2"));
    fs::create_directory_symlink("group", path("alias"));
    for (const char* name : {"group/items/file", "group/file", "group2/file"}) writeText(path(name), "x");
  }

  [[nodiscard]] std::string path(const std::string& name) const { return directory_.path(name); }

  // The relationship as a number, minus the error's code for one of the item, and for one of the directory minus that again below
  // kOfDirectory.
  static constexpr int kOfDirectory = -1000;
  [[nodiscard]] int lies(const std::string& item, const std::string& directory = "group/items") {
    const QXURL directoryURL = QXURL::fileURL(path(directory), QXURLKind::directory);
    const QXURL itemURL = QXURL::fileURL(path(item), QXURLKind::file);
    const auto answer = fileSystem_.relationship(directoryURL, itemURL);
    const auto* error = std::get_if<QXError>(&answer);
    if (error == nullptr) return static_cast<int>(std::get<QXRelationship>(answer));
    EXPECT_TRUE(error->url == directoryURL || error->url == itemURL);
    return (error->url == directoryURL ? kOfDirectory : 0) - static_cast<int>(error->code);
  }
  static constexpr int kMissing = kOfDirectory - static_cast<int>(kQXFileReadNoSuchFileError);

  void hideFromCache(const std::string& name) { calls_.failInCache(path(name), EAGAIN, kAlways); }

  [[nodiscard]] auto completeLooksBelow(const std::string& name) const {
    return std::count_if(calls_.openings().begin(), calls_.openings().end(), [above = path(name) + "/"](const Opening& opening) {
      const std::string opened = fs::path(opening.path).lexically_normal().string();
      return !opening.isInCacheAlone && opened.size() > above.size() && opened.starts_with(above);
    });
  }
  [[nodiscard]] auto looksAt(const std::string& name) const {
    return std::count_if(calls_.openings().begin(), calls_.openings().end(),
                         [wanted = path(name)](const Opening& opening) { return opening.path == wanted; });
  }

  TemporaryDirectory directory_;
  LinuxFileSystem fileSystem_{Paths{}};
  SystemCalls calls_;
};

TEST_F(LinuxFileSystemWaiting, WhatLiesElsewhereDoesNotWaitForADirectoryThatWasTakenAway) {
  fs::rename(path("group/items"), path("group/away"));
  for (const char* item : {"group2/file", "group2/missing", "group2", "missing/file", "group"}) EXPECT_EQ(lies(item), kOther) << item;
  EXPECT_EQ(lies("group2/file", "group/items/"), kOther);
  EXPECT_EQ(lies("group2/file", "group//items"), kOther);
  EXPECT_EQ(completeLooksBelow("group"), 0);
}

TEST_F(LinuxFileSystemWaiting, WhatLiesElsewhereDoesNotWaitForADirectoryOutsideTheCache) {
  hideFromCache("group/items");
  for (const char* item : {"group2/file", "group2/missing", "group2", "missing/file", "group"}) EXPECT_EQ(lies(item), kOther) << item;
  EXPECT_EQ(completeLooksBelow("group"), 0);
}

TEST_F(LinuxFileSystemWaiting, TheWayToTheDirectoryMayGoOverLinks) {
  hideFromCache("alias/items");
  EXPECT_EQ(lies("group2/file", "alias/items"), kOther);
  EXPECT_EQ(completeLooksBelow("alias"), 0);
  EXPECT_EQ(lies("group/items/file", "alias/items"), kContains);
}

TEST_F(LinuxFileSystemWaiting, WhatLiesBesideADirectoryOutsideTheCacheIsAnsweredByLookingAtIt) {
  hideFromCache("group/items");
  EXPECT_EQ(lies("group/items/file"), kContains);
  EXPECT_EQ(lies("group/items/missing"), kContains);
  EXPECT_EQ(lies("group/items"), kSame);
  EXPECT_EQ(lies("group/file"), kOther);
  EXPECT_EQ(lies("alias/items/file"), kOther);
  fs::rename(path("group/items"), path("group/away"));
  for (const char* item : {"group/items/file", "group/items", "group/file", "group/missing"}) EXPECT_EQ(lies(item), kMissing) << item;
}

TEST_F(LinuxFileSystemWaiting, ALinkOutsideTheCacheIsNoDirectoryEither) {
  fs::create_directory_symlink("items", path("group/link"));
  hideFromCache("group/link");
  EXPECT_EQ(lies("group/items/file", "group/link"), kOfDirectory - ENOTDIR);
}

TEST_F(LinuxFileSystemWaiting, ADirectoryInTheCacheIsLookedAtThereAlone) {
  EXPECT_EQ(lies("group/items/file"), kContains);
  EXPECT_EQ(lies("group2/file"), kOther);
  EXPECT_EQ(looksAt("group/items/file"), 1);
  EXPECT_EQ(completeLooksBelow("group"), 1) << "the item";
}

TEST_F(LinuxFileSystemWaiting, ADirectoryThatIsMissingByTheCacheIsReportedWhereverTheItemLies) {
  calls_.failInCache(path("group/items"), ENOENT, kAlways);
  EXPECT_EQ(lies("group2/file"), kMissing);
  EXPECT_EQ(lies("group/items/file"), kMissing);
  EXPECT_EQ(completeLooksBelow("group"), 0);
  EXPECT_EQ(looksAt("group2/file"), 0);
}

TEST_F(LinuxFileSystemWaiting, ADirectoryWithNothingAroundItIsReportedWhereverTheItemLies) {
  hideFromCache("missing/items");
  EXPECT_EQ(lies("group2/file", "missing/items"), kMissing);
  EXPECT_EQ(looksAt("group2/file"), 0);
  hideFromCache("group/file/items");
  EXPECT_EQ(lies("group2/file", "group/file/items"), kOfDirectory - ENOTDIR);
}

TEST_F(LinuxFileSystemWaiting, AnItemIsLookedAtOnce) {
  hideFromCache("group/items");
  EXPECT_EQ(lies("group/items/file"), kContains);
  EXPECT_EQ(looksAt("group/items/file"), 1);
  EXPECT_EQ(lies("group2/file"), kOther);
  EXPECT_EQ(looksAt("group2/file"), 1);
}

TEST_F(LinuxFileSystemWaiting, AnItemThatLeadsNowhereDoesNotWaitEither) {
  hideFromCache("group/items");
  EXPECT_EQ(lies("group2/file/below"), -ENOTDIR);
  EXPECT_EQ(completeLooksBelow("group"), 0);
}

TEST_F(LinuxFileSystemWaiting, ACacheThatDoesNotTellAtOnceIsAskedAgain) {
  calls_.failInCache(path("group/items"), EAGAIN, 2);
  EXPECT_EQ(lies("group2/file"), kOther);
  EXPECT_EQ(looksAt("group/items"), 3);
  EXPECT_EQ(looksAt("group/"), 0) << "the place around it";
}

TEST_F(LinuxFileSystemWaiting, AnOlderKernelLooksCompletely) {
  calls_.failInCache(path("group/items"), EINVAL, kAlways);
  EXPECT_EQ(lies("group/items/file"), kContains);
  EXPECT_EQ(lies("group2/file"), kOther);
  fs::rename(path("group/items"), path("group/away"));
  EXPECT_EQ(lies("group2/file"), kMissing);
}

TEST_F(LinuxFileSystemWaiting, ADirectoryThatIsNamedByDotsDoesNotLieWhereItsNameIsLookedUp) {
  const QXURL item = QXURL::fileURL(path("group2/file"), QXURLKind::file);
  for (const char* name : {"/group/items/../..", "/group/.."}) {
    const std::string directory = path("") + name;
    calls_.failInCache(directory, EAGAIN, kAlways);
    const auto answer = fileSystem_.relationship(QXURL::fileURL(directory, QXURLKind::directory), item);
    ASSERT_TRUE(std::holds_alternative<QXRelationship>(answer)) << name;
    EXPECT_EQ(std::get<QXRelationship>(answer), QXRelationship::contains) << name;
  }
  hideFromCache("group/items/.");
  EXPECT_EQ(lies("group/items", "group/items/."), kSame);
  const QXURL root = QXURL::fileURL("/", QXURLKind::directory);
  calls_.failInCache("/", EAGAIN, kAlways);
  EXPECT_EQ(std::get<QXRelationship>(fileSystem_.relationship(root, item)), QXRelationship::contains);
  EXPECT_EQ(std::get<QXRelationship>(fileSystem_.relationship(root, root)), QXRelationship::same);
}

TEST_F(LinuxFileSystemWaiting, ANameThatLooksRemovedIsNotLookedUpForWhatLiesElsewhere) {
  fs::create_directory(path("group/other (deleted)"));
  EXPECT_EQ(lies("group2/file", "group/other (deleted)"), kOther);
  EXPECT_EQ(std::count(calls_.names().begin(), calls_.names().end(), "lstat"), 0);
  EXPECT_EQ(completeLooksBelow("group"), 0);
  EXPECT_EQ(lies("group/other (deleted)/file", "group/other (deleted)"), kContains);
}

}  // namespace
}  // namespace docuvend::linux_platform
