#include "platform/linux/bundles/Seen.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>

#include "tests/bundles/BundleHouse.h"
#include "tests/bundles/InterposedLooks.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Pair;
using Kind = DirectoryEntry::Kind;

constexpr int kAnswers[] = {ENOENT, ENOTDIR, ELOOP, ENAMETOOLONG, EINVAL, EXDEV, EACCES, EPERM, EAGAIN};
constexpr int kNoAnswers[] = {EMFILE, ENFILE, ENOMEM, EIO, EINTR, ESTALE, ENOTCONN, ETIMEDOUT, ENOSPC};

class SeenTest : public ::testing::Test {
 protected:
  // What there is; fails when it cannot be seen.
  [[nodiscard]] std::vector<std::pair<std::string, Kind>> entries(const std::string& directory) {
    const auto seen = entriesOf(directory);
    if (const auto* error = std::get_if<QXError>(&seen)) ADD_FAILURE() << error->description();
    std::vector<std::pair<std::string, Kind>> result;
    if (const auto* list = std::get_if<std::vector<DirectoryEntry>>(&seen)) {
      for (const auto& entry : *list) result.emplace_back(entry.name, entry.kind);
    }
    return result;
  }
  void fill() {
    fs::create_directories(place_ + "/d");
    BundleHouse::write(place_ + "/f", "");
    BundleHouse::write(place_ + "/.h", "");
    fs::create_symlink("d", place_ + "/l");
  }

  BundleHouse house_;
  InterposedLooks looks_;
  const std::string place_ = house_.root() + "/place";
};

TEST_F(SeenTest, AnswersAreWhatThePlaceMakesOfACall) {
  for (const int error : kAnswers) EXPECT_TRUE(isAnswer(error)) << error;
  for (const int error : kNoAnswers) EXPECT_FALSE(isAnswer(error)) << error;
}

TEST_F(SeenTest, ListsADirectoryInOrderOfName) {
  fill();
  EXPECT_THAT(entries(place_),
              ElementsAre(Pair(".h", Kind::other), Pair("d", Kind::directory), Pair("f", Kind::other), Pair("l", Kind::link)));
}

TEST_F(SeenTest, ListsTheSameWhereTheFileSystemDoesNotSayWhatAnEntryIs) {
  fill();
  looks_.hideKinds();
  EXPECT_THAT(entries(place_),
              ElementsAre(Pair(".h", Kind::other), Pair("d", Kind::directory), Pair("f", Kind::other), Pair("l", Kind::link)));
  looks_.failAt("lstat", place_ + "/d", ENOENT);
  EXPECT_THAT(entries(place_), ElementsAre(Pair(".h", Kind::other), Pair("f", Kind::other), Pair("l", Kind::link))) << "it has gone";
  looks_.failAt("lstat", place_ + "/d", EIO);
  EXPECT_EQ(std::get<QXError>(entriesOf(place_)), QXError::system(EIO, "cannot look at " + place_ + "/d"));
}

TEST_F(SeenTest, WhereNothingIsOrMayBeReadThereIsNothing) {
  EXPECT_THAT(entries(place_), IsEmpty());
  fill();
  EXPECT_THAT(entries(place_ + "/f"), IsEmpty());
  for (const std::string call : {"opendir", "readdir"}) {
    for (const int error : kAnswers) {
      looks_.failAt(call, call == "opendir" ? place_ : "", error);
      EXPECT_THAT(entries(place_), IsEmpty()) << call << " " << error;
    }
  }
}

TEST_F(SeenTest, ADirectoryThatCannotBeLookedAtIsNotAnEmptyOne) {
  fill();
  for (const std::string call : {"opendir", "readdir"}) {
    for (const int error : kNoAnswers) {
      looks_.failAt(call, call == "opendir" ? place_ : "", error);
      const auto seen = entriesOf(place_);
      ASSERT_TRUE(std::holds_alternative<QXError>(seen)) << call << " " << error;
      EXPECT_EQ(std::get<QXError>(seen), QXError::system(error, "cannot look at " + place_));
    }
  }
}

TEST_F(SeenTest, ADirectoryThatCannotBeReadToTheEndIsNotItsBeginning) {
  fill();
  int calls = 0;
  looks_.failWith([&calls](const InterposedLooks::Call& call) { return call.name == "readdir" && ++calls > 4 ? EIO : 0; });
  EXPECT_TRUE(std::holds_alternative<QXError>(entriesOf(place_)));
}

TEST_F(SeenTest, TheRealPathGoesAsFarAsThereIsOne) {
  fs::create_directories(place_ + "/d");
  fs::create_symlink(place_, house_.root() + "/alias");
  const std::string alias = house_.root() + "/alias";
  EXPECT_EQ(std::get<std::string>(realPath(alias + "/d")), place_ + "/d");
  EXPECT_EQ(std::get<std::string>(realPath(alias + "/d/not/there")), place_ + "/d/not/there");
  EXPECT_EQ(std::get<std::string>(realPath(alias + "//d//not/there")), place_ + "/d/not/there");
  EXPECT_EQ(std::get<std::string>(realPath("/not-there-at-all")), "/not-there-at-all");
}

TEST_F(SeenTest, TheRealPathIsThePathItselfWhereThereMayNotBeLooked) {
  fs::create_directories(place_ + "/d");
  fs::create_symlink(place_, house_.root() + "/alias");
  const std::string path = house_.root() + "/alias/d";
  for (const int error : {EACCES, ELOOP}) {
    looks_.failAt("realpath", path, error);
    EXPECT_EQ(std::get<std::string>(realPath(path)), path);
  }
  for (const int error : kNoAnswers) {
    looks_.failAt("realpath", path, error);
    EXPECT_EQ(std::get<QXError>(realPath(path)), QXError::system(error, "cannot look at " + path));
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
