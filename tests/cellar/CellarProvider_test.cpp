#include "examples/cellar/CellarProvider.h"

#include "tests/cellar/BeforeExchange.h"
#include "tests/cellar/CellarHouse.h"

namespace docuvend::cellar {
namespace {

using CellarProviderTest = CellarHouse;

TEST_F(CellarProviderTest, SetupMakesPlaceholdersOfTheRightSizeWithoutBlocks) {
  write(cloud + "/a.txt", "hello");
  write(cloud + "/b.txt", std::string(100'000, 'b'));
  setUp();
  EXPECT_EQ(names(storage), (std::vector<std::string>{"a.txt", "b.txt"}));
  EXPECT_EQ(fs::file_size(local("a.txt")), 5U);
  EXPECT_EQ(fs::file_size(local("b.txt")), 100'000U);
  EXPECT_TRUE(hasNoBlocks(local("a.txt")));
  EXPECT_TRUE(hasNoBlocks(local("b.txt")));
}

TEST_F(CellarProviderTest, SetupAgainChangesNothing) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const std::string before = identifier("a.txt");
  start("a.txt");
  setUp();
  EXPECT_EQ(identifier("a.txt"), before);
  EXPECT_EQ(read(local("a.txt")), "hello");
}

TEST_F(CellarProviderTest, DirectoriesLinksAndHiddenFilesAreNoDocuments) {
  fs::create_directory(cloud + "/directory");
  fs::create_symlink("/etc/passwd", cloud + "/link");
  write(cloud + "/.hidden", "h");
  setUp();
  EXPECT_TRUE(names(storage).empty());
}

TEST_F(CellarProviderTest, StartingBringsTheContents) {
  const std::string text = std::string(70'000, 'x') + "end";
  write(cloud + "/a.txt", text);
  setUp();
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), text);
  EXPECT_EQ(names(storage), std::vector<std::string>{"a.txt"});
}

TEST_F(CellarProviderTest, WhoHasThePlaceholderOpenKeepsIt) {
  write(cloud + "/a.txt", "hello");
  setUp();
  std::ifstream before(local("a.txt"));
  start("a.txt");
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(before), {}), std::string(5, '\0'));
  EXPECT_EQ(read(local("a.txt")), "hello");
}

TEST_F(CellarProviderTest, StartingWhatIsHereDoesNothing) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  const auto before = fs::last_write_time(local("a.txt"));
  std::ifstream open(local("a.txt"));
  start("a.txt");
  EXPECT_EQ(fs::last_write_time(local("a.txt")), before);
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(open), {}), "hello");
}

TEST_F(CellarProviderTest, StartingFetchesWhatIsNewerInTheCloud) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  write(cloud + "/a.txt", "hello again");
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "hello again");
}

TEST_F(CellarProviderTest, APlaceholderFollowsTheSizeInTheCloud) {
  write(cloud + "/a.txt", "hello");
  setUp();
  write(cloud + "/a.txt", "hello again");
  setUp();
  EXPECT_EQ(fs::file_size(local("a.txt")), 11U);
  EXPECT_TRUE(hasNoBlocks(local("a.txt")));
}

TEST_F(CellarProviderTest, StartingWhatIsGoneInTheCloudFailsAndLeavesThePlaceholder) {
  write(cloud + "/a.txt", "hello");
  setUp();
  fs::remove(cloud + "/a.txt");
  EXPECT_TRUE(isKind(provider->startProviding(url("a.txt")), CellarErrorCode::notInCloud));
  EXPECT_EQ(names(storage), std::vector<std::string>{"a.txt"});
  EXPECT_TRUE(hasNoBlocks(local("a.txt")));
}

TEST_F(CellarProviderTest, WhatIsWrittenHereIsNotOverwritten) {
  write(cloud + "/a.txt", "hello");
  setUp();
  write(local("a.txt"), "mine!");
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "mine!");
  setUp();
  EXPECT_EQ(read(local("a.txt")), "mine!");
}

TEST_F(CellarProviderTest, WhatIsSavedWhileTheContentsArriveIsNotOverwritten) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const BeforeExchange middle({[this] { save("a.txt", "mine!"); }});
  start("a.txt");
  EXPECT_EQ(middle.count(), 2U);
  EXPECT_EQ(read(local("a.txt")), "mine!");
  EXPECT_EQ(names(storage), std::vector<std::string>{"a.txt"});
  change("a.txt");
  EXPECT_EQ(read(cloud + "/a.txt"), "mine!");
}

TEST_F(CellarProviderTest, StartingFailsWhenTheItemGoesElsewhereMeanwhile) {
  write(cloud + "/a.txt", "hello");
  setUp();
  {
    const BeforeExchange middle({[this] { fs::rename(local("a.txt"), local("b.txt")); }});
    EXPECT_TRUE(provider->startProviding(url("a.txt")));
  }
  EXPECT_EQ(names(storage), std::vector<std::string>{"b.txt"});
  start("b.txt");
  EXPECT_EQ(read(local("b.txt")), "hello");
}

TEST_F(CellarProviderTest, WhatIsSavedWhileAPlaceholderIsMadeIsNotOverwritten) {
  write(cloud + "/a.txt", "hello");
  setUp();
  write(cloud + "/a.txt", "hello again");
  const BeforeExchange middle({[this] { save("a.txt", "mine!"); }});
  setUp();
  EXPECT_EQ(middle.count(), 2U);
  EXPECT_EQ(read(local("a.txt")), "mine!");
  change("a.txt");
  EXPECT_EQ(read(cloud + "/a.txt"), "mine!");
}

TEST_F(CellarProviderTest, WhatIsWrittenHereIsProvidedEvenIfItIsGoneInTheCloud) {
  write(cloud + "/a.txt", "hello");
  setUp();
  save("a.txt", "mine!");
  fs::remove(cloud + "/a.txt");
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "mine!");
}

TEST_F(CellarProviderTest, AChangeGoesToTheCloud) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  write(local("a.txt"), "changed");
  change("a.txt");
  EXPECT_EQ(read(cloud + "/a.txt"), "changed");
  EXPECT_EQ(names(cloud), std::vector<std::string>{"a.txt"});
}

TEST_F(CellarProviderTest, AnAtomicSaveGoesToTheCloudAndKeepsTheIdentifier) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  const std::string before = identifier("a.txt");
  save("a.txt", "saved");
  EXPECT_EQ(identifier("a.txt"), before);
  change("a.txt");
  EXPECT_EQ(read(cloud + "/a.txt"), "saved");
  EXPECT_EQ(identifier("a.txt"), before);
}

TEST_F(CellarProviderTest, AReaderInTheCloudHasTheOldVersionOrTheNew) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  std::ifstream reader(cloud + "/a.txt");
  save("a.txt", "saved");
  change("a.txt");
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(reader), {}), "hello");
}

TEST_F(CellarProviderTest, WithoutAChangeNothingIsSent) {
  write(cloud + "/a.txt", "hello");
  setUp();
  change("a.txt");
  start("a.txt");
  std::ifstream reader(cloud + "/a.txt");
  write(cloud + "/a.txt", "newer");
  change("a.txt");
  EXPECT_EQ(read(cloud + "/a.txt"), "newer");
}

TEST_F(CellarProviderTest, ANewFileHereIsADocumentAndGoesToTheCloud) {
  setUp();
  write(local("new.txt"), "new");
  const std::string before = identifier("new.txt");
  EXPECT_FALSE(before.empty());
  change("new.txt");
  EXPECT_EQ(read(cloud + "/new.txt"), "new");
  setUp();
  EXPECT_EQ(identifier("new.txt"), before);
  EXPECT_EQ(read(local("new.txt")), "new");
}

TEST_F(CellarProviderTest, IdentifiersAreDifferentAndLeadBack) {
  write(cloud + "/a.txt", "a");
  write(cloud + "/b.txt", "b");
  setUp();
  EXPECT_NE(identifier("a.txt"), identifier("b.txt"));
  const auto found = provider->itemURL(ItemID{identifier("b.txt")});
  ASSERT_TRUE(std::holds_alternative<QXURL>(found));
  EXPECT_EQ(std::get<QXURL>(found), url("b.txt"));
  EXPECT_TRUE(std::holds_alternative<QXError>(provider->itemURL(ItemID{"none"})));
}

TEST_F(CellarProviderTest, IdentifiersOutliveTheProcess) {
  write(cloud + "/a.txt", "a");
  setUp();
  const std::string before = identifier("a.txt");
  restart();
  EXPECT_EQ(identifier("a.txt"), before);
}

TEST_F(CellarProviderTest, AnIdentifierSurvivesARenameHereAndTheCloudFollows) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const std::string before = identifier("a.txt");
  restart();
  fs::rename(local("a.txt"), local("b.txt"));
  EXPECT_EQ(identifier("b.txt"), before);
  EXPECT_EQ(names(cloud), std::vector<std::string>{"b.txt"});
  start("b.txt");
  EXPECT_EQ(read(local("b.txt")), "hello");
}

TEST_F(CellarProviderTest, AnIdentifierSurvivesARenameInTheCloudAndTheFileFollows) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const std::string before = identifier("a.txt");
  fs::rename(cloud + "/a.txt", cloud + "/b.txt");
  setUp();
  EXPECT_EQ(identifier("b.txt"), before);
  EXPECT_EQ(names(storage), std::vector<std::string>{"b.txt"});
}

TEST_F(CellarProviderTest, AnIdentifierSurvivesSavingAndRenamingBeforeAnybodyLooked) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const std::string before = identifier("a.txt");
  save("a.txt", "saved");
  ASSERT_EQ(identifier("a.txt"), before);
  fs::rename(local("a.txt"), local("b.txt"));
  EXPECT_EQ(identifier("b.txt"), before);
}

TEST_F(CellarProviderTest, ARenameOntoATakenNameOverwritesNothingInTheCloud) {
  write(cloud + "/a.txt", "from a");
  write(cloud + "/b.txt", "from b");
  setUp();
  start("a.txt");
  const std::string a = identifier("a.txt");
  fs::rename(local("a.txt"), local("b.txt"));
  EXPECT_EQ(identifier("b.txt"), a);
  setUp();
  EXPECT_EQ(read(local("b.txt")), "from a");
  EXPECT_EQ(read(cloud + "/a.txt"), "from a");
  EXPECT_EQ(read(cloud + "/b.txt"), "from b");
}

TEST_F(CellarProviderTest, WhatIsNoDocumentIsRefusedByEveryOperation) {
  write(cloud + "/a.txt", "a");
  fs::create_directories(storage + "/sub");
  write(storage + "/sub/a.txt", "a");
  write(storage + "/.hidden", "h");
  write(root + "/outside.txt", "o");
  setUp();
  for (const std::string& path : {root + "/outside.txt", storage + "/sub/a.txt", storage + "/sub", storage + "/.hidden", storage,
                                  storage + "/../Docuvend Storage/a.txt", storage + "/missing.txt", cloud + "/a.txt"}) {
    const QXURL given = QXURL::fileURL(path, QXURLKind::file);
    EXPECT_TRUE(isKind(provider->providePlaceholder(given), CellarErrorCode::notAnItem)) << path;
    EXPECT_TRUE(isKind(provider->startProviding(given), CellarErrorCode::notAnItem)) << path;
    EXPECT_TRUE(isKind(provider->itemChanged(given), CellarErrorCode::notAnItem)) << path;
    EXPECT_TRUE(isKind(provider->stopProviding(given), CellarErrorCode::notAnItem)) << path;
    EXPECT_TRUE(std::holds_alternative<QXError>(provider->identifierForItem(given))) << path;
  }
}

TEST_F(CellarProviderTest, APlaceholderIsMadeForADocumentWithoutAFile) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const std::string before = identifier("a.txt");
  fs::remove(local("a.txt"));
  EXPECT_FALSE(provider->providePlaceholder(url("a.txt")));
  EXPECT_EQ(fs::file_size(local("a.txt")), 5U);
  EXPECT_EQ(identifier("a.txt"), before);
  write(cloud + "/b.txt", "later");
  EXPECT_FALSE(provider->providePlaceholder(url("b.txt")));
  EXPECT_EQ(fs::file_size(local("b.txt")), 5U);
}

TEST_F(CellarProviderTest, APlaceholderIsNotMadeOverContents) {
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  EXPECT_FALSE(provider->providePlaceholder(url("a.txt")));
  EXPECT_EQ(read(local("a.txt")), "hello");
}

TEST_F(CellarProviderTest, WhatIsRemovedInTheCloudGoesHereUnlessItsContentsAreHere) {
  write(cloud + "/a.txt", "a");
  write(cloud + "/b.txt", "b");
  setUp();
  start("b.txt");
  fs::remove(cloud + "/a.txt");
  fs::remove(cloud + "/b.txt");
  setUp();
  EXPECT_EQ(names(storage), std::vector<std::string>{"b.txt"});
  EXPECT_EQ(read(local("b.txt")), "b");
}

TEST_F(CellarProviderTest, WhatAnEarlierProcessLeftHalfDoneIsRemoved) {
  setUp();
  write(storage + "/.0123.cellar-new", "half");
  write(cloud + "/.0123.cellar-new", "half");
  write(storage + "/.mine", "not the provider's");
  restart();
  EXPECT_EQ(names(storage), std::vector<std::string>{".mine"});
  EXPECT_TRUE(names(cloud).empty());
}

TEST_F(CellarProviderTest, ADamagedIndexIsAnErrorAndLeftAsItIs) {
  write(cloud + "/a.txt", "hello");
  setUp();
  write(container + "/index", "garbage");
  EXPECT_TRUE(provider->performInitialSetup());
  EXPECT_TRUE(provider->startProviding(url("a.txt")));
  EXPECT_TRUE(std::holds_alternative<QXError>(provider->identifierForItem(url("a.txt"))));
  EXPECT_EQ(read(container + "/index"), "garbage");
}

TEST_F(CellarProviderTest, WithoutAContainerSetupFails) {
  unsetenv("HOME");
  restart();
  EXPECT_TRUE(isKind(provider->performInitialSetup(), CellarErrorCode::noDirectory));
}

TEST_F(CellarProviderTest, SetupTakesNoContentsForANewerVersionInTheCloud) {
  write(cloud + "/a.txt", "hello");
  write(cloud + "/b.txt", "hello");
  setUp();
  start("a.txt");
  start("b.txt");
  write(local("b.txt"), "mine!");
  write(cloud + "/a.txt", "hello again");
  write(cloud + "/b.txt", "hello again");
  setUp();
  EXPECT_EQ(read(local("a.txt")), "hello");
  EXPECT_EQ(read(local("b.txt")), "mine!");
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "hello again");
}

TEST_F(CellarProviderTest, TheKernelsClockHidesNoWrite) {
  // Two writes in one tick may have the same time. What is fetched has an old one, and what is sent is read when a tick has passed.
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  EXPECT_EQ(modified(local("a.txt")), modified(cloud + "/a.txt"));
  for (const char* text : {"one  ", "two  ", "three"}) {
    write(local("a.txt"), text);
    setModified(local("a.txt"), coarseClock() + 80'000'000);
    change("a.txt");
    EXPECT_GT(coarseClock(), modified(local("a.txt"))) << "the next write could hide behind this one";
    EXPECT_EQ(read(cloud + "/a.txt"), text);
  }
}

}  // namespace
}  // namespace docuvend::cellar
