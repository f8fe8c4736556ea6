#include "platform/linux/files/LinuxFileSystem.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <string>
#include <variant>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/files/StraightURL.h"
#include "tests/files/TemporaryDirectory.h"

namespace docuvend::linux_platform {
namespace {

using test::TemporaryDirectory;
using test::writeText;
namespace fs = std::filesystem;

constexpr int kContains = 0;
constexpr int kSame = 1;
constexpr int kOther = 2;

class LinuxFileSystemTest : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(path("items/sub"));
    fs::create_directories(path("outside"));
    writeText(path("items/file"), "x");
    writeText(path("outside/file"), "x");
  }

  [[nodiscard]] std::string path(const std::string& name) const { return directory_.path(name); }

  // Where it leads, by its one name.
  [[nodiscard]] std::string straight(const std::string& item) const {
    return straightURL(QXURL::fileURL(path(item), QXURLKind::file)).fileSystemPath();
  }
  // The relationship as a number, or minus the error's code.
  [[nodiscard]] int lies(const std::string& item, const std::string& directory = "items") {
    return liesAt(QXURL::fileURL(path(directory), QXURLKind::directory), QXURL::fileURL(path(item), QXURLKind::file));
  }
  [[nodiscard]] int liesAt(const QXURL& directory, const QXURL& item) {
    const auto answer = fileSystem_.relationship(directory, item);
    const auto* error = std::get_if<QXError>(&answer);
    return error != nullptr ? -static_cast<int>(error->code) : static_cast<int>(std::get<QXRelationship>(answer));
  }

  TemporaryDirectory directory_;
  LinuxFileSystem fileSystem_{Paths{}};
};

TEST_F(LinuxFileSystemTest, ADanglingLinkExists) {
  fs::create_symlink("nowhere", path("link"));
  EXPECT_TRUE(fileSystem_.exists(path("link")));
  fs::create_symlink("link2", path("link2"));
  EXPECT_TRUE(fileSystem_.exists(path("link2")));
}

TEST_F(LinuxFileSystemTest, DirectoriesAreCreatedThroughLinks) {
  fs::create_directory_symlink("outside", path("link"));
  EXPECT_FALSE(fileSystem_.createDirectory(path("link/a/b")));
  EXPECT_TRUE(fs::is_directory(path("outside/a/b")));
  EXPECT_FALSE(fileSystem_.createDirectory(path("link")));
  EXPECT_FALSE(fileSystem_.createDirectory("/"));
}

TEST_F(LinuxFileSystemTest, ADirectoryIsNotCreatedAtADanglingLinkNorRelatively) {
  fs::create_symlink("nowhere", path("link"));
  const auto error = fileSystem_.createDirectory(path("link"));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, EEXIST);
  EXPECT_TRUE(fileSystem_.createDirectory("relative"));
  EXPECT_TRUE(fileSystem_.createDirectory(""));
}

TEST_F(LinuxFileSystemTest, NewDirectoriesHaveTheModeThatTheMaskLeaves) {
  const mode_t before = ::umask(027);
  EXPECT_FALSE(fileSystem_.createDirectory(path("new")));
  ::umask(before);
  struct stat status {};
  ASSERT_EQ(::stat(path("new").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0750U);
}

TEST_F(LinuxFileSystemTest, AnItemThatIsNamedThroughALinkLiesElsewhereWhereverTheLinkLeads) {
  fs::create_symlink(path("outside/file"), path("items/out"));
  fs::create_symlink(path("items/file"), path("outside/in"));
  fs::create_directory_symlink("items", path("alias"));
  fs::create_directory_symlink("../../outside", path("items/sub/away"));
  EXPECT_EQ(lies("items/out"), kOther);
  EXPECT_EQ(lies("outside/in"), kOther);
  EXPECT_EQ(lies("alias/file"), kOther);
  EXPECT_EQ(lies("alias"), kOther);
  EXPECT_EQ(lies("items/sub/away/file"), kOther);
  EXPECT_EQ(lies("items/sub/away/missing"), kOther);
  EXPECT_EQ(lies("items/sub/away/../items/missing"), kOther);
  EXPECT_EQ(lies("outside/../items/file"), kContains) << "no link on the way";
}

TEST_F(LinuxFileSystemTest, LinksOnTheWayToTheDirectoryAreFollowed) {
  fs::create_directory(path("real"));
  fs::rename(path("items"), path("real/items"));
  fs::create_directory_symlink("real", path("alias"));
  EXPECT_EQ(lies("real/items/file", "alias/items"), kContains);
  EXPECT_EQ(lies("real/items", "alias/items"), kSame);
}

TEST_F(LinuxFileSystemTest, AStraightNameHasNoLinksAndNoDots) {
  fs::create_symlink(path("outside/file"), path("items/out"));
  fs::create_symlink("out", path("items/chain"));
  fs::create_directory_symlink("../../outside", path("items/sub/away"));
  EXPECT_EQ(straight("items/file"), path("items/file"));
  EXPECT_EQ(straight("items/missing/below"), path("items/missing/below"));
  EXPECT_EQ(straight("items/out"), path("outside/file"));
  EXPECT_EQ(straight("items/chain"), path("outside/file"));
  EXPECT_EQ(straight("items/sub/away/file"), path("outside/file"));
  EXPECT_EQ(straight("items/sub/away/missing"), path("outside/missing"));
  EXPECT_EQ(straight("items/sub/away/../items/file"), path("items/file")) << "up from where the link leads";
  EXPECT_EQ(straight("items/./sub//../file"), path("items/file"));
  EXPECT_EQ(straight("items/missing/./x"), path("items/missing/x"));
  EXPECT_EQ(straight("items/missing/../file"), path("items/missing/../file")) << "leads nowhere";
}

TEST_F(LinuxFileSystemTest, AStraightURLKeepsItsTextAndALinkedOnesKind) {
  fs::create_directory_symlink("items", path("alias"));
  const auto escaped = QXURL::fromString("file://" + path("items/%66ile"));
  ASSERT_TRUE(escaped);
  EXPECT_EQ(straightURL(*escaped), *escaped);
  EXPECT_EQ(straightURL(*QXURL::fromString("file://" + path("//items///%66ile"))), *escaped) << "but for slashes";
  EXPECT_EQ(straightURL(*QXURL::fromString("file://" + path("items%2F%2F%66ile"))), QXURL::fileURL(path("items/file"), QXURLKind::file));
  const QXURL directory = QXURL::fileURL(path("items/sub"), QXURLKind::directory);
  EXPECT_EQ(straightURL(directory), directory);
  EXPECT_EQ(straightURL(*QXURL::fromString("file://" + path("items//sub//"))), directory);
  EXPECT_EQ(straightURL(QXURL::fileURL(path("alias/sub"), QXURLKind::directory)), directory);
  EXPECT_EQ(straightURL(QXURL::fileURL(path("alias/file"), QXURLKind::file)), QXURL::fileURL(path("items/file"), QXURLKind::file));
}

TEST_F(LinuxFileSystemTest, ALinkToWhatDoesNotExistYetLeadsWhereItPoints) {
  fs::create_symlink(path("outside/missing"), path("items/out"));
  fs::create_symlink(path("items/missing"), path("outside/in"));
  fs::create_symlink("../items/missing", path("outside/relative"));
  fs::create_symlink("relative", path("outside/chain"));
  fs::create_symlink("../outside/missing", path("items/directory"));
  fs::create_symlink("missing/../../items/x", path("outside/up"));
  EXPECT_EQ(straight("items/out"), path("outside/missing"));
  EXPECT_EQ(straight("outside/in"), path("items/missing"));
  EXPECT_EQ(straight("outside/relative"), path("items/missing"));
  EXPECT_EQ(straight("outside/chain"), path("items/missing"));
  EXPECT_EQ(straight("items/directory/below"), path("outside/missing/below"));
  EXPECT_EQ(straight("outside/in/below"), path("items/missing/below"));
  EXPECT_EQ(straight("outside/up"), path("outside/up")) << "leads nowhere";
  EXPECT_EQ(lies("outside/up"), -ENOENT);
}

TEST_F(LinuxFileSystemTest, AMissingComponentCannotBeLeftUpwards) {
  EXPECT_EQ(lies("items/missing/../file"), -ENOENT);
  EXPECT_EQ(lies("items/missing/../../outside/file"), -ENOENT);
  EXPECT_EQ(lies("outside/missing/../../items/file"), -ENOENT);
  EXPECT_EQ(lies("items/missing/.."), -ENOENT);
}

TEST_F(LinuxFileSystemTest, ALoopOfLinksIsAnError) {
  fs::create_symlink("b", path("a"));
  fs::create_symlink("a", path("b"));
  EXPECT_EQ(lies("a"), -ELOOP);
  EXPECT_EQ(lies("a/below"), -ELOOP);
  EXPECT_EQ(lies("items/file", "a/below"), -ELOOP);
}

TEST_F(LinuxFileSystemTest, AFileHasNothingBelowIt) {
  EXPECT_EQ(lies("items/file/below"), -ENOTDIR);
  EXPECT_EQ(lies("outside/file/below"), -ENOTDIR);
}

TEST_F(LinuxFileSystemTest, AnErrorNamesTheURLThatItIsAbout) {
  const QXURL item = QXURL::fileURL(path("items/file/below"), QXURLKind::file);
  const auto answer = fileSystem_.relationship(QXURL::fileURL(path("items"), QXURLKind::directory), item);
  ASSERT_TRUE(std::holds_alternative<QXError>(answer));
  EXPECT_EQ(std::get<QXError>(answer).domain, kQXSystemErrorDomain);
  EXPECT_EQ(std::get<QXError>(answer).url, item);
}

TEST_F(LinuxFileSystemTest, AHardLinkLiesWhereItsNameIs) {
  fs::create_hard_link(path("items/file"), path("outside/hard"));
  EXPECT_EQ(lies("outside/hard"), kOther);
}

TEST_F(LinuxFileSystemTest, APipeIsPlacedWithoutWaitingForAWriter) {
  ASSERT_EQ(::mkfifo(path("items/pipe").c_str(), 0600), 0);
  EXPECT_EQ(lies("items/pipe"), kContains);
}

TEST_F(LinuxFileSystemTest, ADirectoryThatIsALinkHoldsNothing) {
  fs::create_directory_symlink("items", path("alias"));
  fs::create_symlink("nowhere", path("link"));
  for (const char* directory : {"alias", "alias/", "link"}) EXPECT_EQ(lies("items/file", directory), -ENOTDIR) << directory;
  EXPECT_EQ(lies("alias/file", "alias"), -ENOTDIR);
  // One on the way is followed.
  EXPECT_EQ(lies("items/sub/file", "alias/sub"), kContains);
}

TEST_F(LinuxFileSystemTest, NamesThatLookRemovedAreNames) {
  writeText(path("items/report (deleted)"), "x");
  EXPECT_EQ(lies("items/report (deleted)"), kContains);
  fs::create_directory(path("other (deleted)"));
  writeText(path("other (deleted)/file"), "x");
  EXPECT_EQ(lies("other (deleted)/file", "other (deleted)"), kContains);
  EXPECT_EQ(lies("other (deleted)", "other (deleted)"), kSame);
}

TEST_F(LinuxFileSystemTest, ADirectoryThatHasBeenRemovedIsNowhere) {
  const UniqueDescriptor sub(::open(path("items/sub").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  fs::remove(path("items/sub"));
  fs::create_directory(path("items/sub (deleted)"));
  const QXURL items = QXURL::fileURL(path("items"), QXURLKind::directory);
  // Not by the link itself, which would be no directory.
  const QXURL itself = QXURL::fileURL("/proc/self/fd/" + std::to_string(sub.get()) + "/.", QXURLKind::file);
  EXPECT_EQ(liesAt(itself, items), -EAGAIN);
}

TEST_F(LinuxFileSystemTest, WhatAProcessHasOpenIsNoNameOfAnItem) {
  const UniqueDescriptor file(::open(path("items/file").c_str(), O_RDONLY | O_CLOEXEC));
  const QXURL opened = QXURL::fileURL("/proc/self/fd/" + std::to_string(file.get()), QXURLKind::file);
  EXPECT_EQ(liesAt(QXURL::fileURL(path("items"), QXURLKind::directory), opened), -ELOOP);
  EXPECT_EQ(straightURL(opened), opened);
  const QXURL current = QXURL::fileURL("/proc/self/cwd/file", QXURLKind::file);
  EXPECT_EQ(straightURL(current), current);
}

TEST_F(LinuxFileSystemTest, ALongWayThatIsMissingIsFoundWithFewLookups) {
  std::string way = "items";
  for (int i = 0; i < 1500; ++i) way += "/m";
  EXPECT_EQ(lies(way), kContains);
  EXPECT_EQ(straight(way), path(way));
  EXPECT_EQ(lies(way + "/../x"), -ENOENT);
}

TEST_F(LinuxFileSystemTest, ManyLinksToMissingTargetsAreTooMany) {
  constexpr int kLinks = 30;
  for (int i = 0; i < kLinks; ++i) fs::create_symlink(std::to_string(i + 1), path("outside/" + std::to_string(i)));
  EXPECT_EQ(straight("outside/" + std::to_string(kLinks - 2)), path("outside/" + std::to_string(kLinks)));
  EXPECT_EQ(lies("outside/0"), -ELOOP);
  EXPECT_EQ(straight("outside/0"), path("outside/0"));
}

TEST_F(LinuxFileSystemTest, AStraightNameLeadsBelowADirectoryAlsoWhenThatIsReachedOverALink) {
  fs::create_directory_symlink("items", path("alias"));
  const QXURL item = QXURL::fileURL(path("items/file"), QXURLKind::file);
  EXPECT_TRUE(leadsBelow(item, path("items")));
  EXPECT_TRUE(leadsBelow(item, path("alias")));
  EXPECT_FALSE(leadsBelow(item, path("outside")));
  EXPECT_FALSE(leadsBelow(item, path("items/sub")));
  EXPECT_FALSE(leadsBelow(item, path("missing")));
  EXPECT_FALSE(leadsBelow(QXURL::fileURL(path("items"), QXURLKind::directory), path("items")));
}

TEST_F(LinuxFileSystemTest, EscapedURLsNameTheSameFiles) {
  writeText(path("items/a b"), "x");
  const auto item = QXURL::fromString("file://localhost" + path("items/a") + "%20b");
  ASSERT_TRUE(item);
  EXPECT_EQ(liesAt(QXURL::fileURL(path("items"), QXURLKind::directory), *item), kContains);
}

class LinuxFileSystemMounts : public LinuxFileSystemTest {
 protected:
  // Mounts one directory on another where no other process sees it, and asks there how items lie to a directory.
  [[nodiscard]] std::string askWithMount(const std::string& from, const std::string& to, const std::string& directory,
                                         const std::vector<std::string>& items) const {
    std::string command = "unshare --user --map-root-user --mount sh -c 'mount --bind \"$1\" \"$2\" && shift 2 && exec \"$@\"' sh " +
                          path(from) + " " + path(to) + " " + DOCUVEND_BIN + "/relationship_probe " + path(directory);
    for (const std::string& item : items) command += " " + path(item);
    std::string output;
    FILE* pipe = ::popen(command.c_str(), "re");
    if (pipe == nullptr) return "no process";
    for (int c = std::fgetc(pipe); c != EOF; c = std::fgetc(pipe)) output += static_cast<char>(c);
    return ::pclose(pipe) == 0 ? output : "the command failed: " + command;
  }
};

TEST_F(LinuxFileSystemMounts, ADirectoryMountedElsewhereIsAnotherPlace) {
  fs::create_directory(path("mounted"));
  EXPECT_EQ(askWithMount("items", "mounted", "items", {"mounted/file", "mounted", "mounted/missing", "items/file"}), "2 2 2 0\n");
  EXPECT_EQ(askWithMount("items", "mounted", "mounted", {"mounted/file", "mounted", "items/file"}), "0 1 2\n");
}

TEST_F(LinuxFileSystemMounts, AMountInsideADirectoryLiesInIt) {
  EXPECT_EQ(askWithMount("outside", "items/sub", "items", {"items/sub/file", "items/sub", "outside/file"}), "0 0 2\n");
}

}  // namespace
}  // namespace docuvend::linux_platform
