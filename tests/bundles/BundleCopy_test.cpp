#include "platform/linux/bundles/BundleCopy.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>

#include "platform/linux/bundles/BundleErrors.h"
#include "platform/linux/bundles/OpenInBundle.h"
#include "tests/bundles/BundleHouse.h"
#include "tests/bundles/InterposedLooks.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

// Seven entries in three floors, with 100 bytes.
class BundleCopyTest : public ::testing::Test {
 protected:
  void SetUp() override {
    BundleHouse::write(source_ + "/a/b/one", std::string(60, 'x'));
    BundleHouse::write(source_ + "/a/two", std::string(39, 'x'));
    BundleHouse::write(source_ + "/three", "x");
    BundleHouse::write(source_ + "/four", "");
    fs::create_symlink("four", source_ + "/link");
  }

  std::optional<QXError> copy(const BundleLimits& limits) {
    const std::string target = house_.root() + "/target";
    fs::remove_all(target);
    fs::create_directory(target);
    const UniqueDescriptor from(::open(source_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const UniqueDescriptor to(::open(target.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return copyBundle(from, to, limits);
  }
  void expectExactly(const BundleLimits& enough, const BundleLimits& less) {
    EXPECT_EQ(copy(enough), std::nullopt);
    const auto error = copy(less);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, kBundleErrorDomain);
    EXPECT_EQ(error->code, static_cast<std::int64_t>(BundleErrorCode::tooLarge));
  }

  BundleHouse house_;
  const std::string source_ = house_.root() + "/source";
};

TEST_F(BundleCopyTest, TakesAsManyFloorsAsTheLimitAndNoMore) {
  BundleLimits enough;
  BundleLimits less;
  enough.depth = 3;
  less.depth = 2;
  expectExactly(enough, less);
}

TEST_F(BundleCopyTest, TakesAsManyEntriesAsTheLimitAndNoMore) {
  BundleLimits enough;
  BundleLimits less;
  enough.entries = 7;
  less.entries = 6;
  expectExactly(enough, less);
}

TEST_F(BundleCopyTest, TakesAsManyBytesAsTheLimitAndNoMore) {
  BundleLimits enough;
  BundleLimits less;
  enough.bytes = 100;
  less.bytes = 99;
  expectExactly(enough, less);
}

TEST_F(BundleCopyTest, CopiesFilesThatAreLongerThanWhatIsCopiedAtOnce) {
  std::string text;
  for (int i = 0; i < 60'000; ++i) text += std::to_string(i);
  BundleHouse::write(source_ + "/three", text);
  EXPECT_EQ(copy({}), std::nullopt);
  std::ifstream file(house_.root() + "/target/three", std::ios::binary);
  EXPECT_TRUE(std::string(std::istreambuf_iterator<char>(file), {}) == text);
}

TEST_F(BundleCopyTest, FollowsALinkAgainThatARenameElsewhereLedAstray) {
  InterposedLooks looks;
  int walks = 0;
  int lost = kMostWalks - 1;
  looks.failWith([&walks, &lost](const InterposedLooks::Call& call) { return call.name == "openat2" && ++walks <= lost ? EAGAIN : 0; });
  EXPECT_EQ(copy({}), std::nullopt);
  EXPECT_EQ(walks, kMostWalks);

  walks = 0;
  lost = kMostWalks;
  EXPECT_EQ(copy({}), QXError::system(EAGAIN, "cannot copy \"link\""));
  EXPECT_EQ(walks, kMostWalks);
}

}  // namespace
}  // namespace docuvend::linux_platform
