#include "platform/linux/sandbox/GroupContainers.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <string>

#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {
namespace {

class GroupContainersTest : public testing::SandboxHouse {
 protected:
  [[nodiscard]] PlacedItem placed(const std::string& path) {
    auto place = containers.place(path);
    if (auto* item = std::get_if<PlacedItem>(&place)) return std::move(*item);
    ADD_FAILURE() << path << ": " << describe(std::get<PathRefusal>(place));
    return {};
  }
  void expectRefusal(const std::string& path, PathRefusal expected) {
    const auto place = containers.place(path);
    const auto* refusal = std::get_if<PathRefusal>(&place);
    ASSERT_NE(refusal, nullptr) << path;
    EXPECT_EQ(*refusal, expected) << path << ": " << describe(*refusal);
  }

  GroupContainers containers{bundles};
};

TEST_F(GroupContainersTest, PlaceARegularFileWithOneLink) {
  const PlacedItem item = placed(document);
  EXPECT_EQ(item.path, document);
  EXPECT_EQ(item.name, "report.txt");
  ASSERT_TRUE(item.file);
  EXPECT_EQ(kernelPath(item.file->path.get()), document);
  EXPECT_EQ(kernelPath(item.directory.get()), storage);
}

TEST_F(GroupContainersTest, PlaceAFileThatDoesNotExistYet) {
  const PlacedItem item = placed(storage + "/new.txt");
  EXPECT_EQ(item.name, "new.txt");
  EXPECT_FALSE(item.file);
  EXPECT_FALSE(placed(group + "/new.txt").file);
  expectRefusal(storage + "/missing/new.txt", PathRefusal::noParent);
  expectRefusal(document + "/new.txt", PathRefusal::noParent);
}

TEST_F(GroupContainersTest, SpellADirectoryWithAndWithoutTheLinksOfEachPartOfItsWay) {
  using Spellings = std::vector<std::string>;
  EXPECT_EQ(containers.spellingsOf(storage), Spellings{storage + "/"});
  EXPECT_EQ(containers.spellingsOf("/" + storage + "//"), Spellings{storage + "/"});
  EXPECT_EQ(containers.spellingsOf(storage + "/missing/deeper"), Spellings{storage + "/missing/deeper/"});
  EXPECT_EQ(containers.spellingsOf("/no such directory/x"), Spellings{"/no such directory/x/"});
  ASSERT_EQ(::symlink(group.c_str(), (home + "/a").c_str()), 0);
  ASSERT_EQ(::symlink(outside.c_str(), (group + "/b").c_str()), 0);
  EXPECT_EQ(containers.spellingsOf(home + "/a/b/c"), (Spellings{home + "/a/b/c/", group + "/b/c/", outside + "/c/"}));
  for (const char* path : {"", "/", "//", "relative", "/a/../b"}) EXPECT_EQ(containers.spellingsOf(path), Spellings{"/"}) << path;
}

TEST_F(GroupContainersTest, TakeDoubledSlashesAsOne) { EXPECT_EQ(placed("//" + group + "///Docuvend Storage//report.txt").path, document); }

TEST_F(GroupContainersTest, RefuseASecondSpelling) {
  for (const char* end : {"/../Docuvend Storage/report.txt", "/Docuvend Storage/../../com.example.other/x", "/./report.txt", "/..", "/.",
                          "/Docuvend Storage/", "/Docuvend Storage/report.txt/"}) {
    expectRefusal(group + end, PathRefusal::malformed);
  }
  expectRefusal(document + std::string("\0x", 2), PathRefusal::malformed);
  expectRefusal(storage + "/" + std::string(5000, 'x'), PathRefusal::malformed);
  expectRefusal(storage + "/" + std::string(300, 'x'), PathRefusal::unreachable);
  expectRefusal(document.substr(1), PathRefusal::notAbsolute);
  expectRefusal("", PathRefusal::notAbsolute);
  expectRefusal("/", PathRefusal::malformed);
}

TEST_F(GroupContainersTest, RefuseWhatLiesInNone) {
  expectRefusal(outside + "/secret.txt", PathRefusal::outsideContainers);
  expectRefusal(home + "/groups/com.example.unknown/x", PathRefusal::outsideContainers);
  expectRefusal(group, PathRefusal::outsideContainers);
  expectRefusal(group + "2/x", PathRefusal::outsideContainers);
  expectRefusal(editorContainer + "/x", PathRefusal::outsideContainers);
  expectRefusal("/dev/null", PathRefusal::outsideContainers);
}

TEST_F(GroupContainersTest, KeepEveryContainerToItself) {
  testing::write(otherGroup + "/theirs.txt", "theirs");
  EXPECT_EQ(placed(otherGroup + "/theirs.txt").path, otherGroup + "/theirs.txt");
  ASSERT_EQ(::symlink((otherGroup + "/theirs.txt").c_str(), (storage + "/link.txt").c_str()), 0);
  expectRefusal(storage + "/link.txt", PathRefusal::symbolicLink);
}

TEST_F(GroupContainersTest, RefuseASymbolicLinkAnywhereBelow) {
  ASSERT_EQ(::symlink("report.txt", (storage + "/end.txt").c_str()), 0);
  ASSERT_EQ(::symlink("nothing", (storage + "/dangling.txt").c_str()), 0);
  ASSERT_EQ(::symlink("Docuvend Storage", (group + "/middle").c_str()), 0);
  ASSERT_EQ(::symlink(outside.c_str(), (group + "/away").c_str()), 0);
  ASSERT_EQ(::symlink("/proc/self/cwd", (group + "/magic").c_str()), 0);
  expectRefusal(storage + "/end.txt", PathRefusal::symbolicLink);
  expectRefusal(storage + "/dangling.txt", PathRefusal::symbolicLink);
  for (const char* middle : {"/middle/report.txt", "/away/secret.txt", "/away/new.txt", "/magic/x"}) {
    const auto place = containers.place(group + middle);
    EXPECT_TRUE(std::holds_alternative<PathRefusal>(place)) << middle;
  }
  expectRefusal(group + "/middle/x/report.txt", PathRefusal::symbolicLink);
}

TEST_F(GroupContainersTest, RefuseEverythingButARegularFile) {
  ASSERT_EQ(::mkdir((storage + "/directory").c_str(), 0700), 0);
  ASSERT_EQ(::mkfifo((storage + "/pipe").c_str(), 0600), 0);
  const UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string name = storage + "/socket";
  ASSERT_LT(name.size(), sizeof address.sun_path);
  std::memcpy(address.sun_path, name.data(), name.size());
  ASSERT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  for (const char* entry : {"/directory", "/pipe", "/socket"}) expectRefusal(storage + entry, PathRefusal::notRegularFile);

  Bundle devices;
  devices.identifier = "com.example.devices";
  devices.groups = {{"com.example.devices", "/dev"}};
  bundles.put(devices);
  bundles.tellOfChange();
  expectRefusal("/dev/null", PathRefusal::notRegularFile);
}

TEST_F(GroupContainersTest, RefuseAFileWithASecondLink) {
  ASSERT_EQ(::link(document.c_str(), (outside + "/second.txt").c_str()), 0);
  expectRefusal(document, PathRefusal::severalLinks);
  ASSERT_EQ(::unlink((outside + "/second.txt").c_str()), 0);
  EXPECT_TRUE(placed(document).file);
}

TEST_F(GroupContainersTest, AreKnownUnderTheirSpellingAndTheirCanonicalPath) {
  const std::string alias = directory.path() + "/alias";
  ASSERT_EQ(::symlink(home.c_str(), alias.c_str()), 0);
  Bundle provider = *bundles.find("com.example.cellar.provider");
  provider.groups = {{"com.example.cellar", alias + "/groups/com.example.cellar/"}};
  bundles.put(provider);
  bundles.tellOfChange();
  EXPECT_EQ(placed(alias + "/groups/com.example.cellar/Docuvend Storage/report.txt").path, document);
  EXPECT_EQ(placed(document).path, document);
}

TEST_F(GroupContainersTest, FollowWhatTheRegistryTells) {
  EXPECT_TRUE(placed(document).file);
  bundles.remove("com.example.cellar.provider");
  EXPECT_TRUE(placed(document).file) << "asked again although nothing was told";
  bundles.tellOfChange();
  expectRefusal(document, PathRefusal::outsideContainers);
}

TEST_F(GroupContainersTest, RefuseAllPathsInAContainerThatIsNotThere) {
  std::filesystem::remove_all(group);
  expectRefusal(document, PathRefusal::noParent);
}

TEST_F(GroupContainersTest, NeverTakeTheWholeFileSystemForAContainer) {
  Bundle everything;
  everything.identifier = "com.example.everything";
  everything.groups = {{"a", "/"}, {"b", "//"}, {"c", ""}, {"d", "relative"}};
  bundles.put(everything);
  bundles.tellOfChange();
  expectRefusal(outside + "/secret.txt", PathRefusal::outsideContainers);
}

}  // namespace
}  // namespace docuvend::linux_platform
