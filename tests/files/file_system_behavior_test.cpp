// What every adapter of the file system does, the fake included.

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <variant>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/linux/files/LinuxFileSystem.h"
#include "tests/files/TemporaryDirectory.h"

namespace docuvend {
namespace {

class FakeFiles {
 public:
  FakeFiles() { fileSystem_.setHomeDirectory("/top"); }

  QXFileSystem& fileSystem() { return fileSystem_; }
  static std::string top() { return "/top"; }
  void makeDirectory(const std::string& path) { fileSystem_.addDirectory(path); }
  void makeFile(const std::string& path) { fileSystem_.addFile(path); }
  void remove(const std::string& path) { fileSystem_.remove(path); }
  bool isDirectory(const std::string& path) { return fileSystem_.isDirectory(path); }

 private:
  fake_platform::FakeFileSystem fileSystem_;
};

class LinuxFiles {
 public:
  QXFileSystem& fileSystem() { return fileSystem_; }
  [[nodiscard]] std::string top() const { return directory_.path(); }
  static void makeDirectory(const std::string& path) { std::filesystem::create_directories(path); }
  static void makeFile(const std::string& path) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    test::writeText(path, "x");
  }
  static void remove(const std::string& path) { std::filesystem::remove_all(path); }
  static bool isDirectory(const std::string& path) { return std::filesystem::is_directory(path); }

 private:
  [[nodiscard]] linux_platform::Paths paths() const {
    linux_platform::Paths paths;
    paths.home = directory_.path();
    return paths;
  }

  test::TemporaryDirectory directory_;
  linux_platform::LinuxFileSystem fileSystem_{paths()};
};

template <class Files>
class FileSystemBehavior : public ::testing::Test {
 protected:
  QXFileSystem& fileSystem() { return files_.fileSystem(); }
  [[nodiscard]] std::string path(const std::string& name) const { return files_.top() + "/" + name; }
  [[nodiscard]] QXURL directoryURL(const std::string& name) const { return QXURL::fileURL(path(name), QXURLKind::directory); }
  [[nodiscard]] QXURL itemURL(const std::string& name) const { return QXURL::fileURL(path(name), QXURLKind::file); }

  Files files_;
};

using Adapters = ::testing::Types<FakeFiles, LinuxFiles>;
TYPED_TEST_SUITE(FileSystemBehavior, Adapters);

TYPED_TEST(FileSystemBehavior, KnowsTheHomeDirectory) { EXPECT_EQ(this->fileSystem().homeDirectory(), this->files_.top()); }

TYPED_TEST(FileSystemBehavior, AnythingThatIsThereExists) {
  this->files_.makeFile(this->path("a/file"));
  EXPECT_TRUE(this->fileSystem().exists(this->path("a/file")));
  EXPECT_TRUE(this->fileSystem().exists(this->path("a")));
  EXPECT_TRUE(this->fileSystem().exists(this->path("a/")));
  EXPECT_TRUE(this->fileSystem().exists("/"));
  EXPECT_FALSE(this->fileSystem().exists(this->path("a/other")));
  this->files_.remove(this->path("a"));
  EXPECT_FALSE(this->fileSystem().exists(this->path("a/file")));
}

TYPED_TEST(FileSystemBehavior, CreatesADirectoryWithThoseAboveIt) {
  EXPECT_FALSE(this->fileSystem().createDirectory(this->path("a/b/c")));
  EXPECT_TRUE(this->files_.isDirectory(this->path("a")));
  EXPECT_TRUE(this->files_.isDirectory(this->path("a/b/c")));
}

TYPED_TEST(FileSystemBehavior, ADirectoryThatIsThereNeedNotBeCreated) {
  this->files_.makeFile(this->path("a/file"));
  EXPECT_FALSE(this->fileSystem().createDirectory(this->path("a")));
  EXPECT_FALSE(this->fileSystem().createDirectory(this->path("a/")));
  EXPECT_TRUE(this->fileSystem().exists(this->path("a/file")));
}

TYPED_TEST(FileSystemBehavior, AFileIsInTheWayOfADirectory) {
  this->files_.makeFile(this->path("file"));
  const auto same = this->fileSystem().createDirectory(this->path("file"));
  ASSERT_TRUE(same);
  EXPECT_EQ(same->domain, kQXSystemErrorDomain);
  EXPECT_EQ(same->code, EEXIST);
  const auto below = this->fileSystem().createDirectory(this->path("file/a/b"));
  ASSERT_TRUE(below);
  EXPECT_EQ(below->code, ENOTDIR);
}

struct Case {
  std::string item;
  QXRelationship answer;
};

TYPED_TEST(FileSystemBehavior, TellsHowADirectoryAndAnItemLieToEachOther) {
  this->files_.makeFile(this->path("items/sub/file"));
  this->files_.makeFile(this->path("items2/file"));
  this->files_.makeFile(this->path("file"));
  for (const Case& item : std::vector<Case>{
           {"items/sub/file", QXRelationship::contains},
           {"items/sub", QXRelationship::contains},
           {"items/sub/../sub/file", QXRelationship::contains},
           {"items2/../items/sub/file", QXRelationship::contains},
           {"items//sub/./file", QXRelationship::contains},
           {"items/missing", QXRelationship::contains},
           {"items/missing/deeper/still", QXRelationship::contains},
           {"items/sub/../missing", QXRelationship::contains},
           {"items", QXRelationship::same},
           {"items/", QXRelationship::same},
           {"items/.", QXRelationship::same},
           {"items/sub/..", QXRelationship::same},
           {"items2/../items", QXRelationship::same},
           {"items2", QXRelationship::other},
           {"items2/file", QXRelationship::other},
           {"items/../file", QXRelationship::other},
           {"items/..", QXRelationship::other},
           {"items/../missing", QXRelationship::other},
           {"missing/file", QXRelationship::other},
           {"ITEMS/sub/file", QXRelationship::other},
       }) {
    const auto answer = this->fileSystem().relationship(this->directoryURL("items"), this->itemURL(item.item));
    ASSERT_TRUE(std::holds_alternative<QXRelationship>(answer)) << item.item << ": " << std::get<QXError>(answer).description();
    EXPECT_EQ(std::get<QXRelationship>(answer), item.answer) << item.item;
  }
}

TYPED_TEST(FileSystemBehavior, TheRootContainsEverythingElse) {
  const QXURL root = QXURL::fileURL("/", QXURLKind::directory);
  EXPECT_EQ(std::get<QXRelationship>(this->fileSystem().relationship(root, this->itemURL("missing"))), QXRelationship::contains);
  EXPECT_EQ(std::get<QXRelationship>(this->fileSystem().relationship(root, QXURL::fileURL("/missing", QXURLKind::file))),
            QXRelationship::contains);
  EXPECT_EQ(std::get<QXRelationship>(this->fileSystem().relationship(root, root)), QXRelationship::same);
}

TYPED_TEST(FileSystemBehavior, AMissingDirectoryIsAnErrorThatNamesItsURL) {
  const QXURL directory = this->directoryURL("missing/items");
  const auto answer = this->fileSystem().relationship(directory, this->itemURL("missing/items/file"));
  ASSERT_TRUE(std::holds_alternative<QXError>(answer));
  const auto& error = std::get<QXError>(answer);
  EXPECT_EQ(error.domain, kQXGeneralErrorDomain);
  EXPECT_EQ(error.code, kQXFileReadNoSuchFileError);
  EXPECT_EQ(error.url, directory);
}

TYPED_TEST(FileSystemBehavior, ADirectoryThatIsAFileIsAnotherError) {
  this->files_.makeFile(this->path("items"));
  const auto answer = this->fileSystem().relationship(this->directoryURL("items"), this->itemURL("items"));
  ASSERT_TRUE(std::holds_alternative<QXError>(answer));
  EXPECT_EQ(std::get<QXError>(answer).domain, kQXSystemErrorDomain);
  EXPECT_EQ(std::get<QXError>(answer).code, ENOTDIR);
}

}  // namespace
}  // namespace docuvend
