#include "platform/linux/coordination/Remnants.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <variant>

#include "platform/linux/files/LinuxFileSystem.h"
#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

struct RemnantsTest : ::testing::Test {
  void SetUp() override { fs::create_directories(storage + "/deeper"); }

  // A file of that many bytes with none on the disk.
  [[nodiscard]] static std::string placeholder(const std::string& path) {
    testing::write(path, "");
    fs::resize_file(path, 100'000);
    return path;
  }
  [[nodiscard]] bool hasPlaceholder(const std::string& path) const {
    const auto file = KeyedFile::of(QXURL::fileURL(path, QXURLKind::file));
    if (!std::holds_alternative<KeyedFile>(file)) {
      ADD_FAILURE() << path;
      return false;
    }
    return remnants.hasPlaceholder(std::get<KeyedFile>(file));
  }
  [[nodiscard]] static Paths pathsWithHome(const std::string& home) {
    Paths paths;
    paths.home = home;
    return paths;
  }

  const testing::TemporaryDirectory directory;
  const std::string groups = directory.path() + "/groups";
  const std::string storage = groups + "/com.example.gone/Docuvend Storage";
  LinuxFileSystem fileSystem{pathsWithHome(directory.path())};
  const Remnants remnants{fileSystem, QXURL::fileURL(groups, QXURLKind::directory)};
};

TEST_F(RemnantsTest, HaveThePlaceholdersOfEveryStorage) {
  EXPECT_TRUE(hasPlaceholder(placeholder(storage + "/letter.txt")));
  EXPECT_TRUE(hasPlaceholder(placeholder(storage + "/deeper/letter.txt")));
  fs::create_directories(storage + "/deeper/Docuvend Storage");
  EXPECT_TRUE(hasPlaceholder(placeholder(storage + "/deeper/Docuvend Storage/letter.txt")));
}

TEST_F(RemnantsTest, HaveNoPlaceholderWhereContentsAreOrNoneCanBe) {
  testing::write(storage + "/whole.txt", std::string(100'000, 'x'));
  EXPECT_FALSE(hasPlaceholder(storage + "/whole.txt"));
  testing::write(storage + "/zeros", std::string(100'000, '\0'));
  EXPECT_FALSE(hasPlaceholder(storage + "/zeros")) << "somebody has written them";
  testing::write(storage + "/empty.txt", "");
  EXPECT_FALSE(hasPlaceholder(storage + "/empty.txt"));
  EXPECT_FALSE(hasPlaceholder(storage + "/none.txt"));
  EXPECT_FALSE(hasPlaceholder(storage + "/deeper"));
  fs::create_symlink(placeholder(storage + "/letter.txt"), storage + "/link");
  EXPECT_FALSE(hasPlaceholder(storage + "/link"));
}

TEST_F(RemnantsTest, HaveNothingThatLiesElsewhere) {
  EXPECT_FALSE(hasPlaceholder(placeholder(directory.path() + "/disk.img"))) << "a file of anybody's";
  EXPECT_FALSE(hasPlaceholder(placeholder(groups + "/com.example.gone/disk.img"))) << "beside the storage";
  fs::create_directories(directory.path() + "/Docuvend Storage");
  EXPECT_FALSE(hasPlaceholder(placeholder(directory.path() + "/Docuvend Storage/disk.img"))) << "of the same name";
  fs::create_directories(groups + "/deeper/com.example.gone/Docuvend Storage");
  EXPECT_FALSE(hasPlaceholder(placeholder(groups + "/deeper/com.example.gone/Docuvend Storage/disk.img"))) << "too deep";
  fs::create_directories(groups + "/Docuvend Storage");
  EXPECT_FALSE(hasPlaceholder(placeholder(groups + "/Docuvend Storage/disk.img"))) << "not deep enough";
}

TEST_F(RemnantsTest, AreFoundWhereTheGroupsAreReachedByALinkAndAreNoneWhereThereAreNoGroups) {
  const std::string letter = placeholder(storage + "/letter.txt");
  fs::create_directory_symlink(directory.path(), directory.path() + "/link");
  const auto file = std::get<KeyedFile>(KeyedFile::of(QXURL::fileURL(letter, QXURLKind::file)));
  EXPECT_TRUE(Remnants(fileSystem, QXURL::fileURL(directory.path() + "/link/groups", QXURLKind::directory)).hasPlaceholder(file));
  EXPECT_FALSE(Remnants(fileSystem, QXURL::fileURL(directory.path() + "/none", QXURLKind::directory)).hasPlaceholder(file));
}

}  // namespace
}  // namespace docuvend::linux_platform
