// What every file-coordination service does with registrations, the one in memory and the real one.
#include "platform/file_coordination.h"

#include <gtest/gtest.h>

#include <memory>

#include "platform/fake/FakeFileCoordinator.h"
#include "platform/fake/FakeFileSystem.h"
#include "platform/linux/coordination/LinuxFileCoordinator.h"
#include "tests/coordination/RecordingProvider.h"

namespace docuvend {
namespace {

using linux_platform::testing::RecordingProvider;

struct Fake {
  fake_platform::FakeFileCoordinator service;
};
struct Linux {
  fake_platform::FakeFileSystem fileSystem;
  linux_platform::LinuxFileCoordinator service{fileSystem};
};

template <class Platform>
struct QXFileCoordinatorTest : ::testing::Test {
  QXFileCoordinator& service() { return platform.service; }

  Platform platform;
  std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>();
  // The fake remembers its calls, and with them the objects: what it still has registered counts.
  bool isKept() {
    if constexpr (std::is_same_v<Platform, Fake>) {
      return !platform.service.providers().empty();
    } else {
      return provider.use_count() > 1;
    }
  }
};

using Platforms = ::testing::Types<Fake, Linux>;
TYPED_TEST_SUITE(QXFileCoordinatorTest, Platforms);

TYPED_TEST(QXFileCoordinatorTest, KeepsAnObjectUntilItWasRemovedAsOftenAsAdded) {
  EXPECT_FALSE(this->isKept());
  this->service()._addDocuvend(this->provider);
  this->service()._addDocuvend(this->provider);
  EXPECT_TRUE(this->isKept());
  this->service()._removeDocuvend(this->provider);
  EXPECT_TRUE(this->isKept());
  this->service()._removeDocuvend(this->provider);
  EXPECT_FALSE(this->isKept());
}

TYPED_TEST(QXFileCoordinatorTest, IsNotDisturbedByTheRemovalOfAnObjectThatIsNotThere) {
  this->service()._removeDocuvend(this->provider);
  this->service()._addDocuvend(this->provider);
  this->service()._removeDocuvend(std::make_shared<RecordingProvider>());
  EXPECT_TRUE(this->isKept());
  this->service()._removeDocuvend(this->provider);
  this->service()._removeDocuvend(this->provider);
  EXPECT_FALSE(this->isKept());
  this->service()._addDocuvend(this->provider);
  EXPECT_TRUE(this->isKept());
}

}  // namespace
}  // namespace docuvend
