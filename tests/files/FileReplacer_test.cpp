#include "platform/linux/files/FileReplacer.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <set>
#include <string>
#include <variant>
#include <vector>

#include "tests/files/TemporaryDirectory.h"
#include "tests/files/system_calls.h"

namespace docuvend::linux_platform {
namespace {

using test::readText;
using test::SystemCalls;
using test::TemporaryDirectory;
using test::writeText;

class FileReplacerTest : public ::testing::Test {
 protected:
  [[nodiscard]] FileReplacer begun() const {
    auto result = FileReplacer::begin(path_);
    if (const auto* error = std::get_if<QXError>(&result)) ADD_FAILURE() << error->description();
    return std::get<FileReplacer>(std::move(result));
  }

  TemporaryDirectory directory_;
  const std::string path_ = directory_.path("list");
};

TEST_F(FileReplacerTest, TheNewFileIsInPlaceOnceItIsCommitted) {
  writeText(path_, "old");
  FileReplacer replacer = begun();
  ASSERT_FALSE(replacer.write("new "));
  ASSERT_FALSE(replacer.write("file"));
  EXPECT_EQ(readText(path_), "old");
  ASSERT_FALSE(replacer.commit());
  EXPECT_EQ(readText(path_), "new file");
}

TEST_F(FileReplacerTest, CreatesAFileThatWasNotThere) {
  FileReplacer replacer = begun();
  ASSERT_FALSE(replacer.write("new"));
  ASSERT_FALSE(replacer.commit());
  EXPECT_EQ(readText(path_), "new");
}

TEST_F(FileReplacerTest, WithoutACommitNothingIsLeft) {
  writeText(path_, "old");
  {
    FileReplacer replacer = begun();
    ASSERT_FALSE(replacer.write("new"));
    EXPECT_EQ(directory_.names().size(), 2U);
  }
  EXPECT_EQ(directory_.names(), std::set<std::string>{"list"});
  EXPECT_EQ(readText(path_), "old");
}

TEST_F(FileReplacerTest, AMovedObjectTakesTheTemporaryFileAlong) {
  FileReplacer first = begun();
  FileReplacer second = std::move(first);
  ASSERT_FALSE(second.write("new"));
  ASSERT_FALSE(second.commit());
  EXPECT_EQ(readText(path_), "new");
}

TEST_F(FileReplacerTest, OnlyTheOwnerMayReadTheNewFile) {
  writeText(path_, "old");
  std::filesystem::permissions(path_, std::filesystem::perms::all);
  FileReplacer replacer = begun();
  struct stat status {};
  ASSERT_EQ(::fstat(replacer.descriptor(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
  ASSERT_FALSE(replacer.commit());
  ASSERT_EQ(::stat(path_.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
}

TEST_F(FileReplacerTest, TemporaryFilesHaveNamesOfTheirOwn) {
  const FileReplacer first = begun();
  const FileReplacer second = begun();
  EXPECT_EQ(directory_.names().size(), 2U);
}

TEST_F(FileReplacerTest, ForcesTheFileToDiskBeforeTheNameAndTheDirectoryAfterIt) {
  SystemCalls calls;
  FileReplacer replacer = begun();
  ASSERT_FALSE(replacer.write("new"));
  ASSERT_FALSE(replacer.commit());
  EXPECT_EQ(calls.names(), (std::vector<std::string>{"open", "getrandom", "openat", "write", "fsync", "renameat", "fsync"}));
}

TEST_F(FileReplacerTest, WritesEverythingThoughTheSystemTakesOneByteAtATime) {
  FileReplacer replacer = begun();
  {
    SystemCalls calls;
    calls.limitWrites(1);
    ASSERT_FALSE(replacer.write("new file"));
    EXPECT_EQ(calls.names().size(), 8U);
  }
  ASSERT_FALSE(replacer.commit());
  EXPECT_EQ(readText(path_), "new file");
}

TEST_F(FileReplacerTest, GoesOnAfterAnInterruptedWrite) {
  FileReplacer replacer = begun();
  {
    SystemCalls calls({.number = 1, .span = test::FailureSpan::once, .error = EINTR});
    ASSERT_FALSE(replacer.write("new"));
    EXPECT_TRUE(calls.hasFailed());
  }
  ASSERT_FALSE(replacer.commit());
  EXPECT_EQ(readText(path_), "new");
}

TEST_F(FileReplacerTest, AFullDiskIsAnErrorThatSaysSo) {
  writeText(path_, "old");
  {
    FileReplacer replacer = begun();
    SystemCalls calls({.number = 1, .span = test::FailureSpan::forGood, .error = ENOSPC});
    const auto error = replacer.write("new");
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, kQXSystemErrorDomain);
    EXPECT_EQ(error->code, ENOSPC);
    EXPECT_NE(error->description().find(path_), std::string::npos) << error->description();
  }
  EXPECT_EQ(directory_.names(), std::set<std::string>{"list"});
  EXPECT_EQ(readText(path_), "old");
}

TEST_F(FileReplacerTest, ALinkAtThePathIsReplacedAndItsTargetIsNot) {
  writeText(directory_.path("target"), "target");
  std::filesystem::create_symlink("target", path_);
  FileReplacer replacer = begun();
  ASSERT_FALSE(replacer.write("new"));
  ASSERT_FALSE(replacer.commit());
  EXPECT_FALSE(std::filesystem::is_symlink(path_));
  EXPECT_EQ(readText(path_), "new");
  EXPECT_EQ(readText(directory_.path("target")), "target");
}

TEST_F(FileReplacerTest, StaysInItsDirectoryWhenThatIsRenamed) {
  std::filesystem::create_directory(directory_.path("before"));
  auto begun = FileReplacer::begin(directory_.path("before/list"));
  ASSERT_TRUE(std::holds_alternative<FileReplacer>(begun));
  std::filesystem::rename(directory_.path("before"), directory_.path("after"));
  ASSERT_FALSE(std::get<FileReplacer>(begun).commit());
  EXPECT_TRUE(std::filesystem::exists(directory_.path("after/list")));
}

TEST_F(FileReplacerTest, RefusesPathsThatNameNoFileInADirectory) {
  for (const std::string& path : {std::string("list"), std::string(), directory_.path() + "/", directory_.path("missing/list")}) {
    EXPECT_TRUE(std::holds_alternative<QXError>(FileReplacer::begin(path))) << path;
  }
}

TEST_F(FileReplacerTest, ADirectoryIsNotReplaced) {
  std::filesystem::create_directory(path_);
  EXPECT_TRUE(begun().commit());
  EXPECT_EQ(directory_.names(), std::set<std::string>{"list"});
}

TEST_F(FileReplacerTest, TheOldFileIsKeptUnderTheFirstFreeNumber) {
  writeText(path_, "old");
  writeText(directory_.path("list.kept-1"), "older");
  FileReplacer replacer = begun();
  ASSERT_FALSE(replacer.keepOld(".kept-"));
  EXPECT_EQ(readText(path_), "old");
  ASSERT_FALSE(replacer.commit());
  EXPECT_EQ(readText(directory_.path("list.kept-1")), "older");
  EXPECT_EQ(readText(directory_.path("list.kept-2")), "old");
}

TEST_F(FileReplacerTest, WhereAFileHasOneNameTheOldOneMovesAside) {
  writeText(path_, "old");
  FileReplacer replacer = begun();
  ASSERT_FALSE(replacer.write("new"));
  {
    SystemCalls calls({.number = 1, .span = test::FailureSpan::once, .error = EPERM});
    ASSERT_FALSE(replacer.keepOld(".kept-"));
    EXPECT_EQ(calls.names(), (std::vector<std::string>{"linkat", "fstatat", "renameat2", "fsync"}));
  }
  EXPECT_FALSE(std::filesystem::exists(path_));
  ASSERT_FALSE(replacer.commit());
  EXPECT_EQ(readText(directory_.path("list.kept-1")), "old");
  EXPECT_EQ(readText(path_), "new");
}

TEST_F(FileReplacerTest, ADirectoryIsNeverMovedAside) {
  std::filesystem::create_directory(path_);
  EXPECT_TRUE(begun().keepOld(".kept-"));
  EXPECT_EQ(directory_.names(), std::set<std::string>{"list"});
}

}  // namespace
}  // namespace docuvend::linux_platform
