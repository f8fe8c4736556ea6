// What lies at an item's place, and where an item's place is.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <functional>
#include <utility>

#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using linux_platform::UniqueDescriptor;
using ::testing::ElementsAre;

class Places : public FileAttackTest {
 protected:
  // Something else than a regular file takes the place of an item for which there was a token; then another file.
  void expectNoRegularFile(const std::string& what, const std::function<bool(const std::string& path)>& make) {
    const std::string item = put(what);
    const Tokens before = grant(url(item));
    ASSERT_TRUE(before.item && before.sibling) << what;
    ASSERT_EQ(redeem(before.item, Access::readWrite).contents(), kLetterText);
    for (const std::string& name : {what, "." + what}) {
      fs::remove(place(name));
      ASSERT_TRUE(make(place(name))) << what;
    }
    const Tokens after = grant(url(item));
    EXPECT_FALSE(after.item) << what;
    EXPECT_FALSE(after.sibling) << what;
    for (const auto& token : {before.item, before.sibling}) {
      EXPECT_EQ(redeem(token).outcome, kNotRegularFile) << what;
      EXPECT_EQ(redeem(token, Access::readWrite).outcome, kNotRegularFile) << what;
    }
    EXPECT_EQ(replace(before.item, before.sibling), kNotRegularFile) << what;
    fs::remove(place(what));
    (void)put(what, "again");
    EXPECT_EQ(redeem(before.item, Access::readWrite).contents(), "again");
  }
};

TEST_F(Places, ALinkAtAnItemsPlaceIsNotFollowed) {
  expectNoRegularFile("link", [this](const std::string& path) { return ::symlink(diary().c_str(), path.c_str()) == 0; });
  expectNoRegularFile("device", [](const std::string& path) { return ::symlink("/dev/null", path.c_str()) == 0; });
  EXPECT_EQ(contentsOf(diary()), kDiaryText);
}

TEST_F(Places, ASecondNameOfAForeignFileIsNotOpened) {
  expectNoRegularFile("second name", [this](const std::string& path) { return ::link(diary().c_str(), path.c_str()) == 0; });
  EXPECT_EQ(contentsOf(diary()), kDiaryText);
}

TEST_F(Places, APipeASocketAndADirectoryAreNotOpenedAndHoldUpNobody) {
  expectNoRegularFile("pipe", [](const std::string& path) { return ::mkfifo(path.c_str(), 0600) == 0; });
  expectNoRegularFile("folder", [](const std::string& path) { return ::mkdir(path.c_str(), 0700) == 0; });
  expectNoRegularFile("socket", [](const std::string& path) {
    // The path is too long for an address, its directory's descriptor is not.
    const UniqueDescriptor directory(::open(fs::path(path).parent_path().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    const std::string shortPath = "/proc/self/fd/" + std::to_string(directory.get()) + "/" + fs::path(path).filename().string();
    const UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    shortPath.copy(address.sun_path, sizeof address.sun_path - 1);
    return ::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  });
}

TEST_F(Places, NobodyCanMakeADeviceAtAnItemsPlace) {
  EXPECT_EQ(::mknod(place("device").c_str(), S_IFCHR | 0600, makedev(1, 3)), -1);
  EXPECT_EQ(errno, EPERM);
  EXPECT_THAT(attack({"node", "device", "make", "file", "read", "file"}), ElementsAre("EACCES", "ok", "ok"));
}

TEST_F(Places, AnApplicationCannotMountAFileInAnothersPlace) {
  EXPECT_THAT(attack({"make", "a", "make", "b", "bind", "a", "b"}), ElementsAre("ok", "ok", testing::AnyOf("EPERM", "ENOSPC")));
  // Outside a confinement this is possible, and changes nobody else's view.
  writeFile(house_.home() + "/a", "a");
  writeFile(house_.home() + "/b", "b");
  const Ending mounted = Process({{std::string(DOCUVEND_BIN) + "/docuvend-attacker", "bind", house_.home() + "/a", house_.home() + "/b"},
                                  house_.environment(),
                                  {}})
                             .wait();
  EXPECT_EQ(mounted.output, "ok\n");
  EXPECT_EQ(contentsOf(house_.home() + "/b"), "b");
}

TEST_F(Places, ALeaseMakesNobodyWait) {
  const std::string item = put("leased");
  const Tokens tokens = grant(url(item));
  UniqueDescriptor holder(::open(item.c_str(), O_RDWR | O_CLOEXEC));
  ASSERT_NE(::signal(SIGIO, SIG_IGN), SIG_ERR);
  ASSERT_EQ(::fcntl(holder.get(), F_SETLEASE, F_WRLCK), 0);
  EXPECT_EQ(redeem(tokens.item).outcome, kBusy);
  EXPECT_EQ(redeem(tokens.item, Access::readWrite).outcome, kBusy);
  EXPECT_TRUE(house_.answers());
  ASSERT_EQ(::fcntl(holder.get(), F_SETLEASE, F_UNLCK), 0);
  EXPECT_EQ(redeem(tokens.item).contents(), kLetterText);
}

TEST_F(Places, AWayThatIsBuiltAnewInPrivateDirectoriesLeadsToAnotherFile) {
  const std::string letter = put("letter.txt");
  const std::string address = url(letter).absoluteString();
  ASSERT_EQ(grant(url(letter)).outcome, "ok");
  // In its own view the path is there, and it may do with it what it likes.
  EXPECT_THAT(attack({"make",
                      letter,
                      "read",
                      letter,
                      "extend",
                      address,
                      kPicker,
                      "turn",
                      "reading",
                      address,
                      "turn",
                      "writing",
                      address,
                      "holders",
                      address,
                      "resolve",
                      stringFor("letter.txt"),
                      "turn-with",
                      "item",
                      "writing",
                      address,
                      "open",
                      "write",
                      "extend",
                      address,
                      kPicker}),
              ElementsAre("ok", "ok", kNotPermitted, kNoTurn, kNoTurn, kNoTurn, address, "ok", "ok", stringFor("letter.txt")));
}

TEST_F(Places, ALinkInPrivateDirectoriesLeadsToTheApplicationsOwnFile) {
  const std::string letter = put("letter.txt");
  const std::string address = url(letter).absoluteString();
  const std::string own = house_.container(kAttacker) + "/own.txt";
  EXPECT_THAT(attack({"make", own, "symlink", letter, own, "read", letter, "extend", address, kPicker, "turn", "writing", address, "turn",
                      "writing", url(own).absoluteString()}),
              ElementsAre("ok", "ok", "ok", kNotPermitted, kNoTurn, "ok"));
}

}  // namespace
}  // namespace docuvend::tests
