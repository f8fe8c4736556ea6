// Contents are given up when nobody needs them, and only then; and a placeholder is one whatever was ended in the middle.
#include "tests/cellar/BeforeExchange.h"
#include "tests/cellar/CellarHouse.h"

namespace docuvend::cellar {
namespace {

using CellarStoppingTest = CellarHouse;

TEST_F(CellarStoppingTest, StoppingLeavesAPlaceholder) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  EXPECT_FALSE(provider->stopProviding(url("a.txt")));
  EXPECT_EQ(fs::file_size(local("a.txt")), 5U);
  EXPECT_TRUE(hasNoBlocks(local("a.txt")));
  EXPECT_FALSE(provider->stopProviding(url("a.txt")));
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "hello");
}

TEST_F(CellarStoppingTest, StoppingDoesNotGiveUpWhatIsNotSaved) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  save("a.txt", "mine!");
  EXPECT_TRUE(isKind(provider->stopProviding(url("a.txt")), CellarErrorCode::notSaved));
  EXPECT_EQ(read(local("a.txt")), "mine!");
  change("a.txt");
  fs::remove(cloud + "/a.txt");
  EXPECT_TRUE(isKind(provider->stopProviding(url("a.txt")), CellarErrorCode::notSaved));
  EXPECT_EQ(read(local("a.txt")), "mine!");
}

TEST_F(CellarStoppingTest, StoppingDoesNotGiveUpWhatWasWrittenOverAPlaceholder) {
  write(cloud + "/a.txt", "hello");
  setUp();
  write(local("a.txt"), "mine!");
  EXPECT_TRUE(isKind(provider->stopProviding(url("a.txt")), CellarErrorCode::notSaved));
  EXPECT_EQ(read(local("a.txt")), "mine!");
}

TEST_F(CellarStoppingTest, StoppingDoesNotTakeTheContentsFromWhoHasThemOpen) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  {
    const std::ifstream reader(local("a.txt"));
    EXPECT_TRUE(isKind(provider->stopProviding(url("a.txt")), CellarErrorCode::inUse));
    EXPECT_EQ(read(local("a.txt")), "hello");
  }
  EXPECT_FALSE(provider->stopProviding(url("a.txt")));
  EXPECT_TRUE(hasNoBlocks(local("a.txt")));
}

TEST_F(CellarStoppingTest, WhatIsNotSavedIsSaidToBeSoAlsoWhileSomebodyHasItOpen) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  write(local("a.txt"), "mine!");
  const std::ifstream reader(local("a.txt"));
  EXPECT_TRUE(isKind(provider->stopProviding(url("a.txt")), CellarErrorCode::notSaved));
}

TEST_F(CellarStoppingTest, StoppingDoesNotTakeWhatIsSavedInTheMiddle) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  const BeforeExchange middle({[this] { save("a.txt", "mine!"); }});
  EXPECT_TRUE(isKind(provider->stopProviding(url("a.txt")), CellarErrorCode::inUse));
  EXPECT_EQ(read(local("a.txt")), "mine!");
  change("a.txt");
  EXPECT_EQ(read(cloud + "/a.txt"), "mine!");
}

TEST_F(CellarStoppingTest, StoppingWhereThereAreNoContentsIsDoneAtOnce) {
  write(cloud + "/a.txt", "hello");
  write(cloud + "/b.txt", "hello");
  setUp();
  fs::remove(local("a.txt"));
  EXPECT_FALSE(provider->stopProviding(url("a.txt")));
  fs::remove(cloud + "/b.txt");
  EXPECT_FALSE(provider->stopProviding(url("b.txt")));
}

TEST_F(CellarStoppingTest, ThePlaceholderOfStoppingGoesWithTheDocumentInTheCloud) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  EXPECT_FALSE(provider->stopProviding(url("a.txt")));
  fs::remove(cloud + "/a.txt");
  setUp();
  EXPECT_TRUE(names(storage).empty());
}

TEST_F(CellarStoppingTest, StoppingLeavesNoOtherFile) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  EXPECT_FALSE(provider->stopProviding(url("a.txt")));
  start("a.txt");
  {
    const std::ifstream reader(local("a.txt"));
    EXPECT_TRUE(provider->stopProviding(url("a.txt")));
  }
  save("a.txt", "mine!");
  EXPECT_TRUE(provider->stopProviding(url("a.txt")));
  EXPECT_EQ(names(storage), std::vector<std::string>{"a.txt"});
}

TEST_F(CellarStoppingTest, AWriteAfterStoppingIsAChangeLikeAnyOther) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  EXPECT_FALSE(provider->stopProviding(url("a.txt")));
  save("a.txt", "mine!");
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "mine!");
  change("a.txt");
  EXPECT_EQ(read(cloud + "/a.txt"), "mine!");
}

// --- Ended between putting a file in its place and saving the index

TEST_F(CellarStoppingTest, APlaceholderOfStoppingIsOneAlsoIfTheIndexDoesNotSaySo) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  const std::string index = read(container + "/index");
  EXPECT_FALSE(provider->stopProviding(url("a.txt")));
  write(container + "/index", index);
  restart();
  change("a.txt");
  EXPECT_EQ(read(cloud + "/a.txt"), "hello") << "zeros were taken for a change";
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "hello");
}

TEST_F(CellarStoppingTest, APlaceholderOfTheFirstSetupIsOneAlsoIfTheIndexDoesNotSaySo) {
  write(cloud + "/a.txt", "hello");
  const std::string before = identifier("a.txt");  // makes the index, with no file
  const std::string index = read(container + "/index");
  setUp();
  write(container + "/index", index);
  restart();
  EXPECT_EQ(identifier("a.txt"), before);
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "hello");
}

TEST_F(CellarStoppingTest, APlaceholderOfANewerVersionIsOneAlsoIfTheIndexDoesNotSaySo) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const std::string index = read(container + "/index");
  write(cloud + "/a.txt", "hello again");
  setUp();
  EXPECT_EQ(fs::file_size(local("a.txt")), 11U);
  write(container + "/index", index);
  restart();
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "hello again");
}

TEST_F(CellarStoppingTest, ContentsOfAStartStayAlsoIfTheIndexDoesNotSaySo) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const std::string index = read(container + "/index");
  start("a.txt");
  write(container + "/index", index);
  restart();
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "hello");
}

TEST_F(CellarStoppingTest, ACopyOfAPlaceholderIsNotTheProvidersToRemove) {
  write(cloud + "/a.txt", "hello");
  setUp();
  write(local("copy.txt"), std::string(5, '\0'));
  setModified(local("copy.txt"), modified(local("a.txt")));
  setUp();
  EXPECT_EQ(names(storage), (std::vector<std::string>{"a.txt", "copy.txt"}));
}

}  // namespace
}  // namespace docuvend::cellar
