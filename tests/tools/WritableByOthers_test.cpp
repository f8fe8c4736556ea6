#include "tools/docuvendctl/WritableByOthers.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

namespace docuvend::ctl {
namespace {

namespace fs = std::filesystem;
using ::testing::EndsWith;
using ::testing::Optional;

class WritableByOthersTest : public testing::Test {
 protected:
  WritableByOthersTest() {
    std::string place = (fs::temp_directory_path() / "dvXXXXXX").string();
    if (::mkdtemp(place.data()) != nullptr) place_ = place;
    fs::create_directories(bundles() + "/org.example.one");
    std::ofstream(bundles() + "/org.example.one/Info.plist") << "x";
    for (const char* below : {"/share", "/share/bundles", "/share/bundles/org.example.one"}) set(below, 0755);
    set("/share/bundles/org.example.one/Info.plist", 0644);
  }
  ~WritableByOthersTest() override { fs::remove_all(place_); }

  [[nodiscard]] std::string bundles() const { return place_ + "/share/bundles"; }
  void set(const std::string& below, mode_t mode) const { ASSERT_EQ(::chmod((place_ + below).c_str(), mode), 0); }
  [[nodiscard]] std::optional<std::string> found() const { return writableByOthers(bundles()); }

  std::string place_;
};

TEST_F(WritableByOthersTest, WhatOnlyItsOwnerWritesIsNot) {
  EXPECT_EQ(found(), std::nullopt);
  set("/share/bundles", 0775);  // this user's own group
  EXPECT_EQ(found(), std::nullopt);
}

TEST_F(WritableByOthersTest, TheDirectoryWhatIsBelowAndTheWayToItAreLookedAt) {
  for (const char* below : {"/share", "/share/bundles", "/share/bundles/org.example.one", "/share/bundles/org.example.one/Info.plist"}) {
    struct stat before {};
    ASSERT_EQ(::stat((place_ + below).c_str(), &before), 0);
    set(below, before.st_mode | S_IWOTH);
    EXPECT_THAT(found(), Optional(place_ + below + " can be written by everybody"));
    set(below, before.st_mode);
    EXPECT_EQ(found(), std::nullopt);
  }
}

TEST_F(WritableByOthersTest, ADirectoryWhereOnlyOwnersRemoveThingsMayLieOnTheWay) {
  set("/share", 01777);
  EXPECT_EQ(found(), std::nullopt);
}

TEST_F(WritableByOthersTest, WhatIsNotThereNobodyWritesButTheWayCounts) {
  EXPECT_EQ(writableByOthers(place_ + "/nowhere/bundles"), std::nullopt);
  set("/share", 0777);
  EXPECT_THAT(writableByOthers(place_ + "/share/nowhere/bundles"), Optional(place_ + "/share can be written by everybody"));
}

TEST_F(WritableByOthersTest, ALinkIsNotFollowed) {
  fs::create_directory(place_ + "/open");
  set("/open", 0777);
  fs::create_directory_symlink(place_ + "/open", bundles() + "/link");
  EXPECT_EQ(found(), std::nullopt);
}

TEST_F(WritableByOthersTest, WhatCannotBeLookedThroughIsSaid) {
  ASSERT_NE(::geteuid(), 0U) << "run this test as an unprivileged user: root looks through everything";
  set("/share/bundles", 0);
  EXPECT_THAT(found(), Optional(EndsWith("could not be looked through: Permission denied")));
  set("/share/bundles", 0755);
}

}  // namespace
}  // namespace docuvend::ctl
