#include "platform/linux/coordination/FileKey.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <string>

#include "tests/files/TemporaryDirectory.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

struct FileKeyTest : ::testing::Test {
  void SetUp() override {
    fs::create_directories(root + "/folder/inner");
    fs::create_directories(root + "/second");
  }
  static std::variant<KeyedFile, QXError> placed(const std::string& text) { return KeyedFile::of(*QXURL::fromString("file://" + text)); }
  // A key of nothing when there is none.
  static FileKey key(const std::string& path) {
    const auto answer = KeyedFile::of(QXURL::fileURL(path, QXURLKind::file));
    const auto* found = std::get_if<KeyedFile>(&answer);
    EXPECT_NE(found, nullptr) << path << ": " << std::get<QXError>(answer).description();
    return found != nullptr ? found->key : FileKey{};
  }
  static void expectNone(const std::string& path, int error) {
    const QXURL url = QXURL::fileURL(path, QXURLKind::file);
    const auto answer = KeyedFile::of(url);
    const auto* failure = std::get_if<QXError>(&answer);
    ASSERT_NE(failure, nullptr) << path;
    EXPECT_EQ(failure->domain, kQXSystemErrorDomain) << path;
    EXPECT_EQ(failure->code, error) << path;
    EXPECT_EQ(failure->url, url);
  }

  const test::TemporaryDirectory directory;
  const std::string root = directory.path();
};

TEST_F(FileKeyTest, IsTheSameByWhateverWayTheDirectoryIsReached) {
  fs::create_directory_symlink(root + "/folder", root + "/way");
  const FileKey straight = key(root + "/folder/x.txt");
  EXPECT_EQ(straight.name, "x.txt");
  EXPECT_EQ(key(root + "/way/x.txt"), straight);
  EXPECT_EQ(key(root + "/folder/inner/../x.txt"), straight);
  EXPECT_EQ(key(root + "/folder/./x.txt"), straight);
  EXPECT_EQ(key(root + "//folder//x.txt"), straight);
  EXPECT_EQ(std::get<KeyedFile>(placed(root + "/folder/%78.txt")).key, straight);
}

TEST_F(FileKeyTest, TheFilesOwnURLHasNoLinkOnTheWayToItsDirectory) {
  fs::create_directory_symlink(root + "/folder", root + "/way");
  const auto urlOf = [](const std::string& path) { return std::get<KeyedFile>(placed(path)).url.absoluteString(); };
  const std::string folder = "file://" + fs::canonical(root).string() + "/folder";
  EXPECT_EQ(urlOf(root + "/way/x.txt"), folder + "/x.txt");
  EXPECT_EQ(urlOf(root + "/way/inner/../%78%20y"), folder + "/x%20y");
  EXPECT_EQ(urlOf(root + "/way/inner/"), folder + "/inner/");
  EXPECT_EQ(urlOf("/etc"), "file:///etc");
  fs::create_symlink(root + "/elsewhere", root + "/folder/link");
  EXPECT_EQ(urlOf(root + "/way/link"), folder + "/link") << "the name itself is not followed";
}

TEST_F(FileKeyTest, AFileIsInPlaceAsLongAsItsURLLeadsToItsDirectoryWithoutALink) {
  fs::create_directory_symlink(root + "/folder", root + "/way");
  const auto keyed = [](const std::string& path) { return std::get<KeyedFile>(KeyedFile::of(QXURL::fileURL(path, QXURLKind::file))); };
  const KeyedFile file = keyed(root + "/way/x.txt");
  EXPECT_TRUE(file.isInPlace()) << "it need not be there";
  fs::create_symlink(root + "/second", root + "/folder/x.txt");
  EXPECT_FALSE(file.isInPlace()) << "what has its name is a link";
  fs::remove(root + "/folder/x.txt");
  EXPECT_TRUE(file.isInPlace());
  fs::rename(root + "/folder", root + "/moved");
  EXPECT_FALSE(file.isInPlace());
  fs::create_directory(root + "/folder");
  EXPECT_FALSE(file.isInPlace()) << "another directory";
  fs::remove(root + "/folder");
  fs::create_directory_symlink(root + "/moved", root + "/folder");
  EXPECT_FALSE(file.isInPlace()) << "the same directory by a link";
}

TEST_F(FileKeyTest, ADirectoryWhosePathIsNoTextHasNoKey) {
  fs::create_directory(root + "/\xff");
  fs::create_directory_symlink(root + "/\xff", root + "/odd");
  expectNone(root + "/odd/x.txt", EILSEQ);
}

TEST_F(FileKeyTest, TellsNamesAndDirectoriesApart) {
  const FileKey one = key(root + "/folder/x.txt");
  EXPECT_NE(key(root + "/folder/y.txt"), one);
  EXPECT_NE(key(root + "/second/x.txt"), one);
}

TEST_F(FileKeyTest, StaysWhenTheFileIsMadeExchangedAndRemoved) {
  const std::string path = root + "/folder/x.txt";
  const FileKey before = key(path);
  std::ofstream(path) << "one";
  EXPECT_EQ(key(path), before);
  std::ofstream(root + "/folder/new") << "two";
  fs::rename(root + "/folder/new", path);
  EXPECT_EQ(key(path), before);
  fs::remove(path);
  EXPECT_EQ(key(path), before);
}

TEST_F(FileKeyTest, StaysWhenTheDirectoryIsMovedAndChangesWhenItIsExchanged) {
  const FileKey before = key(root + "/folder/x.txt");
  fs::rename(root + "/folder", root + "/moved");
  EXPECT_EQ(key(root + "/moved/x.txt"), before);
  fs::create_directory(root + "/folder");
  EXPECT_NE(key(root + "/folder/x.txt"), before);
}

TEST_F(FileKeyTest, DoesNotFollowALinkThatBearsTheName) {
  fs::create_symlink(root + "/second/x.txt", root + "/folder/link");
  const FileKey link = key(root + "/folder/link");
  EXPECT_EQ(link.name, "link");
  EXPECT_NE(link, key(root + "/second/x.txt"));
}

TEST_F(FileKeyTest, KnowsADirectoryWithAndWithoutAFinalSlash) {
  const FileKey plain = key(root + "/folder");
  EXPECT_EQ(plain.name, "folder");
  EXPECT_EQ(std::get<KeyedFile>(placed(root + "/folder/")).key, plain);
  EXPECT_EQ(std::get<KeyedFile>(placed(root + "/folder//")).key, plain);
}

TEST_F(FileKeyTest, NamesADirectoryThatIsWrittenWithDots) {
  const FileKey folder = key(root + "/folder");
  EXPECT_EQ(key(root + "/folder/."), folder);
  EXPECT_EQ(key(root + "/folder/inner/.."), folder);
  EXPECT_NE(key(root + "/folder/..x"), folder);
  EXPECT_EQ(key(root + "/folder/..x").name, "..x");
  EXPECT_EQ(key(root + "/folder/x..").name, "x..");
  expectNone(root + "/missing/..", ENOENT);
}

TEST_F(FileKeyTest, IsASystemErrorWithoutADirectory) {
  expectNone(root + "/missing/x.txt", ENOENT);
  std::ofstream(root + "/file") << "one";
  expectNone(root + "/file/x.txt", ENOTDIR);
  fs::create_symlink("loop", root + "/loop");
  expectNone(root + "/loop/x.txt", ELOOP);
}

TEST_F(FileKeyTest, IsAFileOfTheRootButNotTheRootItself) {
  EXPECT_EQ(key("/x").name, "x");
  const std::string top = root.substr(0, root.find('/', 1));
  EXPECT_EQ(key(top), key(top + "/."));
  expectNone("/", EINVAL);
  expectNone("/.", EINVAL);
  expectNone(top + "/..", EINVAL);
}

}  // namespace
}  // namespace docuvend::linux_platform
