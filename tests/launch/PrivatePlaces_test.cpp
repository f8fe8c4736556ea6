#include "platform/linux/launch/PrivatePlaces.h"

#include <gtest/gtest.h>

#include <filesystem>

#include "tests/launch/ConfinedHouse.h"

namespace docuvend::linux_platform {
namespace {

class PrivatePlaces : public ConfinedTest {
 protected:
  PrivatePlaces() {
    std::filesystem::create_directories(system_ + "/share");
    std::filesystem::create_directories(house_.paths.home);
    host_.systemDirectories = {system_};
  }
  [[nodiscard]] std::optional<std::string> exposed() const { return exposedPlace(host_, house_.paths); }
  [[nodiscard]] std::string sentenceFor(const std::string& path) const {
    return path + " lies below " + system_ + ", which every application sees";
  }

  const std::string system_ = house_.root() + "/system";
  HostLayout host_;
};

TEST_F(PrivatePlaces, AreHiddenBesideTheSystem) {
  EXPECT_EQ(exposed(), std::nullopt);
  house_.paths.home = system_ + "-of-mine";  // a name that begins alike
  EXPECT_EQ(exposed(), std::nullopt);
}

TEST_F(PrivatePlaces, AreExposedBelowADirectoryOfTheSystem) {
  const Paths hidden = house_.paths;
  for (std::string Paths::*place : {&Paths::home, &Paths::userBundles, &Paths::containers, &Paths::groupContainers, &Paths::runtime}) {
    house_.paths = hidden;
    house_.paths.*place = system_ + "/share/of/somebody";
    EXPECT_EQ(exposed(), sentenceFor(system_ + "/share/of/somebody"));
  }
}

TEST_F(PrivatePlaces, AreExposedWhenTheyAreADirectoryOfTheSystemThemselves) {
  house_.paths.home = system_;
  EXPECT_EQ(exposed(), sentenceFor(system_));
}

TEST_F(PrivatePlaces, AreExposedThroughALinkOnEitherSide) {
  std::filesystem::create_directory_symlink(system_ + "/share", house_.paths.home + "/Library");
  EXPECT_EQ(exposed(), sentenceFor(house_.paths.home + "/Library/Docuvend"));
  std::filesystem::remove(house_.paths.home + "/Library");
  EXPECT_EQ(exposed(), std::nullopt);
  std::filesystem::create_directory_symlink(house_.paths.home, house_.root() + "/linked");
  host_.systemDirectories = {house_.root() + "/linked"};
  EXPECT_EQ(exposed(), house_.paths.home + " lies below " + house_.root() + "/linked, which every application sees");
}

TEST_F(PrivatePlaces, AreExposedBelowWhatIsShownOfTheRest) {
  host_.systemDirectories.clear();
  host_.systemFiles = {system_};
  house_.paths.home = system_ + "/home";
  EXPECT_EQ(exposed(), sentenceFor(house_.paths.home));
  host_.networkFiles.swap(host_.systemFiles);
  EXPECT_EQ(exposed(), sentenceFor(house_.paths.home));
}

}  // namespace
}  // namespace docuvend::linux_platform
