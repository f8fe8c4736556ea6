// A directory that is renamed while a file in it is written.
#include "platform/linux/coordination/WrittenDirectories.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <optional>
#include <string>
#include <variant>

#include "tests/coordination/CoordinationHouse.h"
#include "tests/files/TemporaryDirectory.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;
using testing::accessID;
using testing::expectSuccess;

QXURL fileAt(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }

struct HeldDirectoryTest : ::testing::Test {
  void SetUp() override { fs::create_directories(root + "/upper/folder"); }
  [[nodiscard]] KeyedFile keyed(const std::string& path) const { return std::get<KeyedFile>(KeyedFile::of(fileAt(root + path))); }

  const test::TemporaryDirectory directory;
  const std::string root = fs::canonical(directory.path()).string();
};

TEST_F(HeldDirectoryTest, FindsAFileWhoseDirectoryWasRenamed) {
  const KeyedFile file = keyed("/upper/folder/x.txt");
  const auto held = HeldDirectory::of(file);
  ASSERT_TRUE(held);
  EXPECT_EQ(held->whereIsNow(file).url, file.url);
  fs::rename(root + "/upper/folder", root + "/upper/renamed");
  EXPECT_EQ(held->whereIsNow(file).url, fileAt(root + "/upper/renamed/x.txt"));
  EXPECT_EQ(held->whereIsNow(file).key, file.key);
  fs::rename(root + "/upper", root + "/above");
  fs::create_directories(root + "/upper/folder");
  EXPECT_EQ(held->whereIsNow(file).url, fileAt(root + "/above/renamed/x.txt")) << "not what has the old name";
}

TEST_F(HeldDirectoryTest, KeepsADirectorysKind) {
  const KeyedFile package = std::get<KeyedFile>(KeyedFile::of(QXURL::fileURL(root + "/upper/folder/x", QXURLKind::directory)));
  const auto held = HeldDirectory::of(package);
  fs::rename(root + "/upper/folder", root + "/upper/renamed");
  EXPECT_EQ(held->whereIsNow(package).url, QXURL::fileURL(root + "/upper/renamed/x", QXURLKind::directory));
}

TEST_F(HeldDirectoryTest, LeavesAFileWhereItWasThatIsNowhereNow) {
  const KeyedFile file = keyed("/upper/folder/x.txt");
  const auto held = HeldDirectory::of(file);
  fs::rename(root + "/upper/folder", root + "/upper/renamed");
  fs::create_symlink("elsewhere", root + "/upper/renamed/x.txt");
  EXPECT_EQ(held->whereIsNow(file).url, file.url) << "a link has its name";
  fs::remove_all(root + "/upper/renamed");
  EXPECT_EQ(held->whereIsNow(file).url, file.url);
  fs::create_directories(root + "/upper/renamed (deleted)");
  EXPECT_EQ(held->whereIsNow(file).url, file.url) << "another directory has the name that the kernel gives to what was removed";
}

TEST_F(HeldDirectoryTest, IsNoneOfAnotherDirectoryThatHasItsName) {
  const KeyedFile file = keyed("/upper/folder/x.txt");
  fs::rename(root + "/upper/folder", root + "/upper/renamed");
  EXPECT_FALSE(HeldDirectory::of(file));
  fs::create_directory(root + "/upper/folder");
  EXPECT_FALSE(HeldDirectory::of(file));
}

class WritesInARenamedDirectory : public testing::CoordinationHouse {
 protected:
  void SetUp() override {
    CoordinationHouse::SetUp();
    fs::create_directory(folder);
  }
  void rename() const { fs::rename(folder, renamed); }
  [[nodiscard]] std::vector<QXURL> told() const {
    std::vector<QXURL> urls;
    for (const auto& notice : provider->told) urls.push_back(notice.second);
    return urls;
  }

  const std::string folder = storage + "/folder";
  const std::string renamed = storage + "/renamed";
};

TEST_F(WritesInARenamedDirectory, AreToldByTheNewPath) {
  const auto writer = anybody();
  expectSuccess(*writer.write(fileAt(folder + "/x.txt"), accessID(1)));
  rename();
  expectSuccess(*writer.end(accessID(1)));
  EXPECT_EQ(told(), std::vector{fileAt(renamed + "/x.txt")});
}

TEST_F(WritesInARenamedDirectory, AreToldAlsoWhenTheWriterIsGone) {
  {
    const auto writer = anybody();
    expectSuccess(*writer.write(fileAt(folder + "/x.txt"), accessID(1)));
    rename();
  }
  EXPECT_EQ(told(), std::vector{fileAt(renamed + "/x.txt")});
}

TEST_F(WritesInARenamedDirectory, ThatLeftItsProvidersAreNobodys) {
  const auto writer = anybody();
  expectSuccess(*writer.write(fileAt(folder + "/x.txt"), accessID(1)));
  fs::rename(folder, outside + "/folder");
  expectSuccess(*writer.end(accessID(1)));
  EXPECT_TRUE(told().empty());
}

// The room was asked for at whoever was the owner when the write began.
TEST_F(WritesInARenamedDirectory, FindNoMoreRoomAtAnotherOwnerThanAnyWrite) {
  provider->isSlow = true;
  const std::string moving = outside + "/moving";
  const auto writer = client(unconfinedAs("com.example.editor"));
  constexpr std::size_t kMost = ChangeNotices::kMaximumNoticesUnderWay + ChangeNotices::kMaximumUntoldFiles;
  const auto writeWhileItMovesIn = [&](std::size_t number) {
    fs::create_directories(moving);
    expectSuccess(*writer.write(fileAt(moving + "/" + std::to_string(number)), accessID(1)));
    fs::rename(moving, renamed);
    expectSuccess(*writer.end(accessID(1)));
    fs::rename(renamed, moving);
  };
  for (std::size_t i = 0; i < kMost + 10; ++i) writeWhileItMovesIn(i);
  while (!provider->unanswered.empty()) provider->answer();
  EXPECT_EQ(provider->told.size(), kMost);
}

TEST_F(WritesInARenamedDirectory, HoldADescriptorOnlyUntilTheyAreOver) {
  const auto openDescriptors = [] { return std::distance(fs::directory_iterator("/proc/self/fd"), {}); };
  const auto writer = anybody();
  const auto other = anybody();
  const AccessParty alone{unconfined(), 0};
  const auto before = openDescriptors();
  expectSuccess(*other.read(plain, accessID(1)));
  EXPECT_EQ(openDescriptors(), before) << "nobody is told of a read";
  expectSuccess(*other.end(accessID(1)));
  expectSuccess(*writer.write(plain, accessID(1)));
  const auto waiting = other.write(plain, accessID(2));
  EXPECT_EQ(openDescriptors(), before + 2);
  expectSuccess(*other.end(accessID(2)));
  EXPECT_EQ(openDescriptors(), before + 1) << "it was given up";
  expectSuccess(*writer.end(accessID(1)));
  EXPECT_EQ(openDescriptors(), before);

  KeyedFile keyed = std::get<KeyedFile>(KeyedFile::of(plain));
  for (std::size_t i = 0; i < FileAccesses::kMaximumAccessesOfApplication; ++i) {
    accesses.begin(accesses.newNumber(), {keyed.key, keyed.url, AccessKind::reading, alone, {1, "com.example.many"}}, {});
  }
  accesses.begin(accesses.newNumber(), {keyed.key, keyed.url, AccessKind::writing, alone, {1, "com.example.many"}}, {});
  EXPECT_EQ(openDescriptors(), before) << "it was refused";
}

TEST_F(WritesInARenamedDirectory, AreOfALimitedNumberForEachApplication) {
  const auto numbered = [](const std::string& directory, std::size_t number) { return fileAt(directory + "/" + std::to_string(number)); };
  for (const auto& [application, most] : {std::pair(std::optional<std::string>("com.example.many"), WrittenDirectories::kMaximumHeld),
                                          std::pair(std::optional<std::string>(), WrittenDirectories::kMaximumUnconfinedHeld)}) {
    std::vector<AccessNumber> writes;
    const auto begin = [&, application = application](std::size_t file) {
      const KeyedFile keyed = std::get<KeyedFile>(KeyedFile::of(numbered(folder, file)));
      writes.push_back(accesses.newNumber());
      accesses.begin(writes.back(), {keyed.key, keyed.url, AccessKind::writing, AccessParty{unconfined(), 0}, {1, application}}, {});
    };
    const auto isToldOf = [&](std::size_t file) {
      rename();
      accesses.end(writes[file], [] {});
      fs::rename(renamed, folder);
      const auto urls = told();
      return !urls.empty() && urls.back() == numbered(renamed, file);
    };
    for (std::size_t i = 0; i <= most; ++i) begin(i);
    EXPECT_FALSE(isToldOf(most)) << "one more";
    EXPECT_TRUE(isToldOf(most - 1));
    begin(most + 1);
    EXPECT_TRUE(isToldOf(most + 1)) << "there is room again";
    for (const AccessNumber write : writes) accesses.end(write, [] {});
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
