// Mounts: a confined process makes none where an item lies, nor undoes one; and what has been mounted over an item outside, where the
// user's own processes can, is not the item.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <linux/capability.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <climits>
#include <filesystem>

#include "tests/attacks/FileAttackTest.h"
#include "tests/attacks/namespaces.h"
#include "tests/support/Sanitizers.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using linux_platform::UniqueDescriptor;
using ::testing::AnyOf;
using ::testing::Each;
using ::testing::ElementsAre;

// --- From inside

class MountsInside : public FileAttackTest {
 protected:
  // All that could change what lies at `place`; `mounted` is a directory that the launch has mounted.
  static std::vector<std::string> tricks(const std::string& file, const std::string& place, const std::string& mounted) {
    return {"bind-here", file, place, "bind", file, place, "clone-tree", file, "new-filesystem", "make-writable", "/", "unmount", mounted};
  }
  static constexpr std::size_t kTricks = 6;
};

TEST_F(MountsInside, AnApplicationMountsAndUnmountsNothing) {
  const std::string container = house_.container(kAttacker);
  auto words = tricks("a", "b", container);
  words.insert(words.begin(), {"make", "a", "make", "b"});
  words.insert(words.end(), {"put", "b", "mine"});
  const auto lines = attack(words);
  ASSERT_EQ(lines.size(), 2 + kTricks + 1);
  EXPECT_THAT(std::vector(lines.begin() + 2, lines.end() - 1), Each(AnyOf("EPERM", "ENOSPC")));
  EXPECT_EQ(lines.back(), "ok");
  EXPECT_EQ(contentsOf(container + "/a"), "");
  EXPECT_EQ(contentsOf(container + "/b"), "mine");
}

TEST_F(MountsInside, AProviderMountsNothingAtAnItemsPlace) {
  const std::string group = fs::path(house_.storage(kAttacker + ".extension1")).parent_path();
  auto words = tricks(group + "/letter.txt", group + "/item.txt", group);
  words.insert(words.begin(), {"make", group + "/letter.txt", "make", group + "/item.txt"});
  const auto lines = attackAsExtension(words);
  ASSERT_EQ(lines.size(), 2 + kTricks);
  EXPECT_THAT(std::vector(lines.begin() + 2, lines.end()), Each(AnyOf("EPERM", "ENOSPC")));
  EXPECT_EQ(lines.front(), "ok");
}

TEST_F(MountsInside, WhoHasNamespacesOfItsOwnMayDoAllThat) {
  const std::string a = house_.home() + "/a";
  const std::string b = house_.home() + "/b";
  writeFile(a, "a");
  writeFile(b, "b");
  EXPECT_THAT(unconfined({"enter", "bind-here", a, b, "clone-tree", a, "new-filesystem", "make-writable", b, "unmount", b}), Each("ok"));
}

// --- From outside: everything runs where the user has made namespaces and may mount

// Takes this process into namespaces of its own. It gives up what it may do there, as the daemon could not look into it otherwise; a child
// keeps that.
class MountingHand {
 public:
  MountingHand() {
    std::array<int, 2> ends{-1, -1};
    if (kThreadSanitizer || !enterNamespaces(CLONE_NEWUSER | CLONE_NEWNS)) return;
    if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) return;
    line_.reset(ends[0]);
    UniqueDescriptor childs(ends[1]);
    child_ = ::fork();
    if (child_ == 0) {
      line_.reset();
      serve(childs.get());
    }
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    const std::array<__user_cap_data_struct, _LINUX_CAPABILITY_U32S_3> none{};
    isReady_ = child_ > 0 && ::syscall(SYS_capset, &header, none.data()) == 0;
  }
  ~MountingHand() { end(); }
  MountingHand(const MountingHand&) = delete;
  MountingHand& operator=(const MountingHand&) = delete;

  [[nodiscard]] bool isReady() const { return isReady_; }
  // Puts one file or directory in another's place; takes away again what was put there.
  [[nodiscard]] bool mountOver(const std::string& what, const std::string& place) const { return ask(what + '\0' + place); }
  [[nodiscard]] bool unmount(const std::string& place) const { return ask(place); }
  void end() {
    line_.reset();
    if (child_ > 0) ::waitpid(child_, nullptr, 0);
    child_ = -1;
  }

 private:
  [[nodiscard]] bool ask(const std::string& request) const {
    char good = 0;
    return ::send(line_.get(), request.data(), request.size(), MSG_NOSIGNAL) > 0 && ::recv(line_.get(), &good, 1, 0) == 1 && good == 1;
  }
  [[noreturn]] static void serve(int line) {
    std::array<char, 2 * PATH_MAX> bytes{};
    for (;;) {
      const ssize_t count = ::recv(line, bytes.data(), bytes.size(), 0);
      if (count <= 0) ::_exit(0);
      const std::string request(bytes.data(), static_cast<std::size_t>(count));
      const std::size_t middle = request.find('\0');
      const int result = middle == std::string::npos ? ::umount2(request.c_str(), MNT_DETACH)
                                                     : ::mount(request.c_str(), request.c_str() + middle + 1, nullptr, MS_BIND, nullptr);
      const char good = result == 0 ? 1 : 0;
      if (::send(line, &good, 1, MSG_NOSIGNAL) != 1) ::_exit(1);
    }
  }

  UniqueDescriptor line_;
  pid_t child_ = -1;
  bool isReady_ = false;
};

class MountsOutside : protected MountingHand, public FileAttackTest {
 protected:
  void SetUp() override {
    if (kThreadSanitizer) GTEST_SKIP() << "the sanitizer has a thread of its own, and two threads cannot enter a user namespace";
    ASSERT_TRUE(isReady());
    FileAttackTest::SetUp();
  }
  // The house waits for every child.
  void TearDown() override { end(); }
};

TEST_F(MountsOutside, AForeignFileMountedOverAnItemIsNotTheItem) {
  const std::string letter = put("letter.txt");
  const Tokens before = grant(url(letter));
  ASSERT_EQ(redeem(before.item).contents(), kLetterText);
  ASSERT_TRUE(mountOver(diary(), letter));
  ASSERT_EQ(contentsOf(letter), kDiaryText);
  for (const Access access : {Access::read, Access::readWrite}) EXPECT_EQ(redeem(before.item, access).outcome, "QXSandboxErrorDomain 5");
  EXPECT_FALSE(grant(url(letter)).item);
  EXPECT_EQ(redeem(before.sibling, Access::readWrite).outcome, kGone) << "there is no item beside which one could be made";
  EXPECT_NE(replace(before.item, before.sibling), "ok");
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "token", "item", "read", letter}),
              ElementsAre(url(letter).absoluteString(), "", AnyOf("ENOENT", "EACCES")));
  ASSERT_TRUE(unmount(letter));
  EXPECT_EQ(redeem(before.item).contents(), kLetterText);
  EXPECT_EQ(contentsOf(diary()), kDiaryText);
  EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "open", "read", "contents"}),
              ElementsAre(url(letter).absoluteString(), "ok", kLetterText));
}

TEST_F(MountsOutside, AForeignDirectoryMountedInAProvidersIsNotEntered) {
  fs::create_directory(place("folder"));
  const std::string item = put("folder/diary.txt");
  const Tokens before = grant(url(item));
  ASSERT_EQ(redeem(before.item).contents(), kLetterText);
  ASSERT_TRUE(mountOver(house_.storage(kCellar), place("folder")));
  ASSERT_EQ(contentsOf(item), kDiaryText);
  EXPECT_EQ(redeem(before.item).outcome, "QXSandboxErrorDomain 5");
  EXPECT_EQ(redeem(before.sibling, Access::readWrite).outcome, "QXSandboxErrorDomain 5");
  EXPECT_FALSE(grant(url(item)).item);
  ASSERT_TRUE(unmount(place("folder")));
  EXPECT_EQ(redeem(before.item).contents(), kLetterText);
  EXPECT_EQ(contentsOf(diary()), kDiaryText);
  EXPECT_FALSE(fs::exists(house_.document(".diary.txt")));
}

}  // namespace
}  // namespace docuvend::tests
