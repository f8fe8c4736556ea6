// The provider itself, in this process, over a throw-away container.
#include "examples/cellar/CellarProvider.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

namespace docuvend::cellar {
namespace {

namespace fs = std::filesystem;

class CellarProviderTest : public ::testing::Test {
 protected:
  CellarProviderTest() {
    std::string pattern = (fs::temp_directory_path() / "cellar-XXXXXX").string();
    if (mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory for a test");
    root = fs::canonical(pattern).string();
    container = root + "/containers/com.orvane.cellar";
    cloud = container + "/cloud";
    storage = root + "/groups/" + kGroup + "/Docuvend Storage";
    fs::create_directories(cloud);
    fs::create_directories(root + "/groups/" + kGroup);
    setenv("HOME", container.c_str(), 1);
    restart();
  }
  ~CellarProviderTest() override {
    std::error_code ignored;
    fs::remove_all(root, ignored);
  }

  void restart() { provider = std::make_unique<CellarProvider>(); }

  static void write(const std::string& path, const std::string& text) { std::ofstream(path, std::ios::trunc) << text; }
  static std::string read(const std::string& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  }
  // As a program saves: a hidden sibling, renamed over the file.
  void save(const std::string& name, const std::string& text) const {
    write(storage + "/." + name, text);
    fs::rename(storage + "/." + name, storage + "/" + name);
  }
  static bool hasNoBlocks(const std::string& path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 && status.st_blocks == 0;
  }
  static std::int64_t nanoseconds(const timespec& time) { return time.tv_sec * 1'000'000'000 + time.tv_nsec; }
  static std::int64_t modified(const std::string& path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 ? nanoseconds(status.st_mtim) : -1;
  }
  static void setModified(const std::string& path, std::int64_t time) {
    const timespec times[2] = {{0, UTIME_OMIT}, {time / 1'000'000'000, time % 1'000'000'000}};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
  }
  static std::int64_t coarseClock() {
    timespec now{};
    clock_gettime(CLOCK_REALTIME_COARSE, &now);
    return nanoseconds(now);
  }
  [[nodiscard]] std::string local(const std::string& name) const { return storage + "/" + name; }
  [[nodiscard]] QXURL url(const std::string& name) const { return QXURL::fileURL(local(name), QXURLKind::file); }
  [[nodiscard]] std::string identifier(const std::string& name) const {
    const auto result = provider->identifierForItem(url(name));
    const auto* identifier = std::get_if<ItemID>(&result);
    return identifier != nullptr ? identifier->value : "";
  }
  void setUp() const {
    const auto error = provider->performInitialSetup();
    ASSERT_FALSE(error) << error->description();
  }
  void start(const std::string& name) const {
    const auto error = provider->startProviding(url(name));
    ASSERT_FALSE(error) << error->description();
  }
  void change(const std::string& name) const {
    const auto error = provider->itemChanged(url(name));
    ASSERT_FALSE(error) << error->description();
  }
  [[nodiscard]] std::vector<std::string> names(const std::string& directory) const {
    std::vector<std::string> result;
    for (const auto& entry : fs::directory_iterator(directory)) result.push_back(entry.path().filename().string());
    std::sort(result.begin(), result.end());
    return result;
  }
  static bool isKind(const Provider::Failure& error, CellarErrorCode code) {
    return error && error->domain == kErrorDomain && error->code == static_cast<std::int64_t>(code);
  }

  std::string root;
  std::string container;
  std::string cloud;
  std::string storage;
  std::unique_ptr<CellarProvider> provider;
};

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

TEST_F(CellarProviderTest, StoppingLeavesAPlaceholder) {
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

TEST_F(CellarProviderTest, StoppingDoesNotGiveUpWhatIsNotSaved) {
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

TEST_F(CellarProviderTest, StoppingDoesNotGiveUpWhatWasWrittenOverAPlaceholder) {
  write(cloud + "/a.txt", "hello");
  setUp();
  write(local("a.txt"), "mine!");
  EXPECT_TRUE(isKind(provider->stopProviding(url("a.txt")), CellarErrorCode::notSaved));
  EXPECT_EQ(read(local("a.txt")), "mine!");
}

TEST_F(CellarProviderTest, StoppingDoesNotTakeTheContentsFromWhoHasThemOpen) {
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

TEST_F(CellarProviderTest, StoppingLeavesNoOtherFile) {
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

TEST_F(CellarProviderTest, AWriteAfterStoppingIsAChangeLikeAnyOther) {
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

TEST_F(CellarProviderTest, TheKernelsClockHidesNoWrite) {
  // Two writes in one tick may have the same time. What is fetched has an old one, and what is sent is read when a tick has passed.
  write(cloud + "/a.txt", "hello");
  setUp();
  start("a.txt");
  EXPECT_EQ(modified(local("a.txt")), modified(cloud + "/a.txt"));
  for (const char* text : {"one  ", "two  ", "three"}) {
    write(local("a.txt"), text);
    setModified(local("a.txt"), coarseClock() + 20'000'000);
    change("a.txt");
    EXPECT_GT(coarseClock(), modified(local("a.txt"))) << "the next write could hide behind this one";
    EXPECT_EQ(read(cloud + "/a.txt"), text);
  }
}

// --- Ended between putting a file in its place and saving the index

TEST_F(CellarProviderTest, APlaceholderOfStoppingIsOneAlsoIfTheIndexDoesNotSaySo) {
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

TEST_F(CellarProviderTest, APlaceholderOfTheFirstSetupIsOneAlsoIfTheIndexDoesNotSaySo) {
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

TEST_F(CellarProviderTest, APlaceholderOfANewerVersionIsOneAlsoIfTheIndexDoesNotSaySo) {
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

TEST_F(CellarProviderTest, ContentsOfAStartStayAlsoIfTheIndexDoesNotSaySo) {
  write(cloud + "/a.txt", "hello");
  setUp();
  const std::string index = read(container + "/index");
  start("a.txt");
  write(container + "/index", index);
  restart();
  start("a.txt");
  EXPECT_EQ(read(local("a.txt")), "hello");
}

TEST_F(CellarProviderTest, ACopyOfAPlaceholderIsNotTheProvidersToRemove) {
  write(cloud + "/a.txt", "hello");
  setUp();
  write(local("copy.txt"), std::string(5, '\0'));
  setModified(local("copy.txt"), modified(local("a.txt")));
  setUp();
  EXPECT_EQ(names(storage), (std::vector<std::string>{"a.txt", "copy.txt"}));
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

}  // namespace
}  // namespace docuvend::cellar
