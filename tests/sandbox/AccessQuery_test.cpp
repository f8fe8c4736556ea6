#include "platform/linux/sandbox/AccessQuery.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/inotify.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <string>

#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {

// How a failure prints it.
void PrintTo(AccessVerdict verdict, std::ostream* out) { *out << "verdict " << static_cast<int>(verdict); }

namespace {

using testing::write;

// A process with a user and a mount namespace of its own, which has run a script there as its root and now waits.
class OwnView {
 public:
  explicit OwnView(const std::string& script) {
    std::array<int, 2> input{};
    std::array<int, 2> output{};
    if (::pipe2(input.data(), O_CLOEXEC) != 0 || ::pipe2(output.data(), O_CLOEXEC) != 0) std::abort();
    const std::string all = "set -e\n" + script + "\necho ready\nread answer || true\n";
    pid_ = ::fork();
    if (pid_ == 0) {
      ::dup2(input[0], 0);
      ::dup2(output[1], 1);
      ::execlp("unshare", "unshare", "--user", "--map-root-user", "--mount", "sh", "-c", all.c_str(), nullptr);
      ::_exit(127);
    }
    ::close(input[0]);
    ::close(output[1]);
    input_.reset(input[1]);
    const UniqueDescriptor answer(output[0]);
    std::array<char, 6> text{};
    std::size_t length = 0;
    while (length < text.size()) {
      const ssize_t got = ::read(answer.get(), text.data() + length, text.size() - length);
      if (got <= 0) break;
      length += static_cast<std::size_t>(got);
    }
    isReady_ = std::string(text.data(), length) == "ready\n";
  }
  OwnView(const OwnView&) = delete;
  OwnView& operator=(const OwnView&) = delete;
  ~OwnView() {
    input_.reset();
    ::waitpid(pid_, nullptr, 0);
  }

  [[nodiscard]] pid_t pid() const { return pid_; }
  [[nodiscard]] bool isReady() const { return isReady_; }

 private:
  pid_t pid_ = -1;
  UniqueDescriptor input_;
  bool isReady_ = false;
};

class AccessQueryTest : public testing::SandboxHouse {
 protected:
  [[nodiscard]] AccessVerdict ask(const QXAuditToken& peer, const std::string& path) const {
    return sandbox.ask(peer, kQXSandboxFileWriteData, path);
  }
  [[nodiscard]] AccessVerdict askToRead(const QXAuditToken& peer, const std::string& path) const {
    return sandbox.ask(peer, kQXSandboxFileReadData, path);
  }
  [[nodiscard]] QXAuditToken unconfinedPeer() { return peers.add(thisProcess(Standing::unconfined)); }
  [[nodiscard]] std::string issued(const std::string& path) {
    auto token = sandbox.issueReadWriteExtension(path);
    EXPECT_TRUE(token) << path;
    return token.value_or("");
  }
  void redeemFor(const QXAuditToken& peer, const std::string& path, TokenUse use) {
    const auto result = testing::redeem(sandbox, peer, issued(path), use);
    EXPECT_TRUE(std::holds_alternative<UniqueDescriptor>(result)) << path;
  }

  LinuxSandbox sandbox{loadedSession(), bundles, peers};
};

TEST_F(AccessQueryTest, RefusesNobodyAndEveryOtherOperation) {
  const QXAuditToken peer = unconfinedPeer();
  EXPECT_EQ(ask(QXAuditToken{}, document), AccessVerdict::nobody);
  QXAuditToken unknown;
  unknown.bytes.fill(0xFF);
  EXPECT_EQ(ask(unknown, document), AccessVerdict::nobody);
  EXPECT_EQ(ask(peers.add(thisProcess(Standing::nobody)), document), AccessVerdict::nobody);
  PeerIdentity stranger = thisProcess(Standing::unconfined);
  ++stranger.uid;
  EXPECT_EQ(ask(peers.add(std::move(stranger)), document), AccessVerdict::nobody);
  for (const char* operation : {"", "file-read-data ", "file-read-metadata", "file-write-data ", "FILE-WRITE-DATA"}) {
    EXPECT_EQ(sandbox.ask(peer, operation, document), AccessVerdict::unknownOperation) << operation;
  }
  EXPECT_NE(sandbox.checkWithoutReport(QXAuditToken{}, kQXSandboxFileWriteData, document), 0);
  EXPECT_NE(sandbox.checkWithoutReport(peer, "file-read-metadata", document), 0);
  EXPECT_EQ(sandbox.checkWithoutReport(peer, kQXSandboxFileReadData, document), 0);
  EXPECT_EQ(sandbox.checkWithoutReport(peer, kQXSandboxFileWriteData, document), 0);
}

// The zero token is nobody even if somebody were known by it.
TEST_F(AccessQueryTest, NeverLooksTheZeroTokenUp) {
  class Everybody final : public PeerDirectory {
   public:
    std::shared_ptr<const PeerIdentity> identify(int) override { return peer; }
    std::shared_ptr<const PeerIdentity> declare(const PeerIdentity&, const std::string&) override { return nullptr; }
    bool isCurrent(const PeerIdentity&) override { return true; }
    std::shared_ptr<const PeerIdentity> find(const QXAuditToken&) override { return peer; }
    std::shared_ptr<const PeerIdentity> peer;
  } everybody;
  PeerIdentity self = thisProcess(Standing::unconfined);
  self.pidfd = UniqueDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, self.pid, 0)));
  everybody.peer = std::make_shared<const PeerIdentity>(std::move(self));
  LinuxSandbox open(loadedSession(), bundles, everybody);
  QXAuditToken somebody;
  somebody.bytes[0] = 1;
  EXPECT_EQ(open.ask(somebody, kQXSandboxFileWriteData, document), AccessVerdict::allowedByAccess);
  EXPECT_EQ(open.ask(QXAuditToken{}, kQXSandboxFileWriteData, document), AccessVerdict::nobody);
  const auto result = testing::redeem(open, QXAuditToken{}, issued(document), TokenUse::reading);
  EXPECT_TRUE(std::holds_alternative<QXError>(result));
}

TEST_F(AccessQueryTest, FollowsTheSystemsAccessRules) {
  const QXAuditToken peer = unconfinedPeer();
  EXPECT_EQ(ask(peer, document), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(peer, storage), AccessVerdict::allowedByAccess);
  ASSERT_EQ(::chmod(document.c_str(), 0400), 0);
  EXPECT_EQ(ask(peer, document), AccessVerdict::accessDenied) << "it may be read, not written";
  EXPECT_NE(sandbox.checkWithoutReport(peer, kQXSandboxFileWriteData, document), 0);
  ASSERT_EQ(::chmod(document.c_str(), 0200), 0);
  EXPECT_EQ(ask(peer, document), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(peer, "/etc/passwd"), AccessVerdict::accessDenied);
  ASSERT_EQ(::chmod(storage.c_str(), 0), 0);
  EXPECT_EQ(ask(peer, document), AccessVerdict::accessDenied);
}

TEST_F(AccessQueryTest, AsksTheDirectoryOfAFileThatDoesNotExistYet) {
  const QXAuditToken peer = unconfinedPeer();
  EXPECT_EQ(ask(peer, storage + "/new.txt"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(peer, storage + "/missing/new.txt"), AccessVerdict::notFound);
  ASSERT_EQ(::symlink("nothing", (storage + "/dangling").c_str()), 0);
  EXPECT_EQ(ask(peer, storage + "/dangling"), AccessVerdict::anotherObject);
  for (const mode_t mode : {0500U, 0600U}) {
    ASSERT_EQ(::chmod(storage.c_str(), mode), 0);
    EXPECT_EQ(ask(peer, storage + "/new.txt"), AccessVerdict::accessDenied) << mode;
  }
}

TEST_F(AccessQueryTest, LetsReadWhatTheSystemLetsRead) {
  const QXAuditToken peer = unconfinedPeer();
  EXPECT_EQ(askToRead(peer, document), AccessVerdict::allowedByAccess);
  EXPECT_EQ(askToRead(peer, "/etc/passwd"), AccessVerdict::allowedByAccess);
  ASSERT_EQ(::chmod(document.c_str(), 0200), 0);
  EXPECT_EQ(askToRead(peer, document), AccessVerdict::accessDenied) << "it may be written, not read";
  EXPECT_NE(sandbox.checkWithoutReport(peer, kQXSandboxFileReadData, document), 0);
  ASSERT_EQ(::chmod(document.c_str(), 0400), 0);
  EXPECT_EQ(askToRead(peer, document), AccessVerdict::allowedByAccess);
  EXPECT_EQ(askToRead(QXAuditToken{}, document), AccessVerdict::nobody);
  EXPECT_EQ(askToRead(peers.add(thisProcess(Standing::nobody)), document), AccessVerdict::nobody);
}

TEST_F(AccessQueryTest, LetsAFileThatDoesNotExistYetBeReadByWhoeverMaySearchItsDirectory) {
  const QXAuditToken peer = unconfinedPeer();
  EXPECT_EQ(askToRead(peer, storage + "/missing/new.txt"), AccessVerdict::notFound);
  ASSERT_EQ(::symlink("nothing", (storage + "/dangling").c_str()), 0);
  EXPECT_EQ(askToRead(peer, storage + "/dangling"), AccessVerdict::anotherObject);
  ASSERT_EQ(::chmod(storage.c_str(), 0100), 0);
  EXPECT_EQ(askToRead(peer, storage + "/new.txt"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(peer, storage + "/new.txt"), AccessVerdict::accessDenied);
  ASSERT_EQ(::chmod(storage.c_str(), 0600), 0);
  EXPECT_EQ(askToRead(peer, storage + "/new.txt"), AccessVerdict::accessDenied);
}

TEST_F(AccessQueryTest, LetsAConfinedPeerReadItsContainersItsBundleAndTheSystem) {
  Bundle bundle = *bundles.find("com.example.editor");
  bundle.directory = home + "/bundles/com.example.editor";
  std::filesystem::create_directories(bundle.directory);
  write(bundle.directory + "/Info.plist", "info");
  bundles.put(bundle);
  const QXAuditToken editor = peers.add(confined("com.example.editor", "1"));
  EXPECT_EQ(askToRead(editor, editorContainer + "/draft.txt"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(askToRead(editor, bundle.directory + "/Info.plist"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(editor, bundle.directory + "/Info.plist"), AccessVerdict::outsideProfile);
  EXPECT_EQ(askToRead(editor, bundle.directory + "2"), AccessVerdict::outsideProfile);
  EXPECT_EQ(askToRead(editor, "/usr/bin/env"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(askToRead(editor, "/etc/passwd"), AccessVerdict::allowedByAccess) << "a file, not a directory, is in every profile";
  EXPECT_EQ(askToRead(editor, "/etc/fstab.missing"), AccessVerdict::outsideProfile);
  EXPECT_EQ(askToRead(editor, "/dev/null"), AccessVerdict::outsideProfile) << "it has device files of its own";
  EXPECT_EQ(askToRead(editor, document), AccessVerdict::outsideProfile);
  EXPECT_EQ(askToRead(editor, outside + "/secret.txt"), AccessVerdict::outsideProfile);
  EXPECT_EQ(askToRead(editor, outside + "/new.txt"), AccessVerdict::outsideProfile);
  ASSERT_EQ(::symlink(document.c_str(), (editorContainer + "/link").c_str()), 0);
  EXPECT_EQ(askToRead(editor, editorContainer + "/link"), AccessVerdict::outsideProfile) << "the object counts, not the name";

  const QXAuditToken provider = peers.add(confined("com.example.cellar.provider", "1"));
  EXPECT_EQ(askToRead(provider, document), AccessVerdict::allowedByAccess);
  EXPECT_EQ(askToRead(provider, bundle.directory + "/Info.plist"), AccessVerdict::outsideProfile) << "another's bundle";
  EXPECT_EQ(askToRead(peers.add(confined("com.example.unknown", "1")), "/etc/passwd"), AccessVerdict::outsideProfile);
}

TEST_F(AccessQueryTest, LetsALaunchReadWhatItRedeemedForWritingAlone) {
  const QXAuditToken editor = peers.add(confined("com.example.editor", "1"));
  redeemFor(editor, document, TokenUse::reading);
  EXPECT_EQ(askToRead(editor, document), AccessVerdict::outsideProfile) << "of reading nothing is remembered";
  redeemFor(editor, document, TokenUse::writing);
  EXPECT_EQ(askToRead(editor, document), AccessVerdict::allowedByRedemption);
  EXPECT_EQ(askToRead(peers.add(confined("com.example.editor", "2")), document), AccessVerdict::outsideProfile);
}

TEST_F(AccessQueryTest, ReachesAFileWithATokenForExactlyThatFile) {
  const QXAuditToken editor = peers.add(confined("com.example.editor", "1"));
  const auto reaches = [&](const QXAuditToken& peer, const std::string& path, const std::optional<std::string>& token) {
    const bool reading = sandbox.mayReach(peer, kQXSandboxFileReadData, path, token);
    EXPECT_EQ(sandbox.mayReach(peer, kQXSandboxFileWriteData, path, token), reading) << path;
    return reading;
  };
  const std::string token = issued(document);
  EXPECT_TRUE(reaches(editor, document, token));
  EXPECT_TRUE(reaches(editor, storage + "//report.txt", token)) << "another spelling";
  EXPECT_FALSE(reaches(editor, document, std::nullopt));
  EXPECT_FALSE(reaches(editor, document, ""));
  EXPECT_FALSE(reaches(editor, document, token + "0"));
  EXPECT_FALSE(reaches(editor, sibling, token));
  EXPECT_FALSE(reaches(editor, document, issued(sibling)));
  EXPECT_TRUE(reaches(editor, sibling, issued(sibling))) << "the sibling is not there yet";
  EXPECT_FALSE(reaches(editor, outside + "/secret.txt", token));
  EXPECT_TRUE(reaches(editor, editorContainer + "/draft.txt", std::nullopt)) << "its own files need none";
  EXPECT_TRUE(reaches(editor, editorContainer + "/draft.txt", token)) << "nor does another's token harm";
  EXPECT_EQ(ask(editor, document), AccessVerdict::outsideProfile) << "nothing is remembered";

  EXPECT_FALSE(reaches(QXAuditToken{}, document, token));
  EXPECT_FALSE(reaches(peers.add(thisProcess(Standing::nobody)), document, token));
  PeerIdentity stranger = thisProcess(Standing::unconfined);
  ++stranger.uid;
  EXPECT_FALSE(reaches(peers.add(std::move(stranger)), document, token));

  ASSERT_EQ(sandbox.invalidateReadWriteExtensions(storage), std::nullopt);
  EXPECT_FALSE(reaches(editor, document, token)) << "taken back";
  EXPECT_TRUE(reaches(editor, document, issued(document)));
}

TEST_F(AccessQueryTest, ReachesNothingWithATokenOfAnotherSession) {
  const QXAuditToken editor = peers.add(confined("com.example.editor", "1"));
  const std::string token = issued(document);
  std::filesystem::remove(paths.tokenKey);
  const LinuxSandbox next(loadedSession(), bundles, peers);
  EXPECT_TRUE(sandbox.mayReach(editor, kQXSandboxFileReadData, document, token));
  EXPECT_FALSE(next.mayReach(editor, kQXSandboxFileReadData, document, token));
}

TEST_F(AccessQueryTest, RefusesAPathThatIsNone) {
  const QXAuditToken peer = unconfinedPeer();
  for (const std::string& path : {std::string(), std::string("report.txt"), document + std::string("\0x", 2)}) {
    EXPECT_EQ(ask(peer, path), AccessVerdict::malformedPath) << path;
  }
  EXPECT_FALSE(isAllowed(ask(peer, document + "/x")));
  EXPECT_FALSE(isAllowed(ask(peer, "/proc/self/fd/0")));
}

TEST_F(AccessQueryTest, HoldsAConfinedPeerToItsContainers) {
  const QXAuditToken provider = peers.add(confined("com.example.cellar.provider", "1"));
  EXPECT_EQ(ask(provider, document), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(provider, storage + "/new.txt"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(provider, group), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(provider, otherGroup + "/x"), AccessVerdict::outsideProfile);
  EXPECT_EQ(ask(provider, outside + "/secret.txt"), AccessVerdict::outsideProfile);
  EXPECT_EQ(ask(provider, group + "2"), AccessVerdict::outsideProfile);

  const QXAuditToken editor = peers.add(confined("com.example.editor", "2"));
  EXPECT_EQ(ask(editor, editorContainer + "/draft.txt"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(editor, document), AccessVerdict::outsideProfile);
  ASSERT_EQ(::symlink(document.c_str(), (editorContainer + "/link").c_str()), 0);
  EXPECT_EQ(ask(editor, editorContainer + "/link"), AccessVerdict::outsideProfile) << "the object counts, not the name";

  EXPECT_EQ(ask(peers.add(confined("com.example.unknown", "3")), document), AccessVerdict::outsideProfile);
  EXPECT_EQ(ask(peers.add(thisProcess(Standing::confined)), document), AccessVerdict::outsideProfile);
}

TEST_F(AccessQueryTest, AllowsALaunchWhatItRedeemedForWriting) {
  const QXAuditToken editor = peers.add(confined("com.example.editor", "1"));
  const QXAuditToken again = peers.add(confined("com.example.editor", "1"));
  const QXAuditToken another = peers.add(confined("com.example.editor", "2"));
  write(storage + "/second.txt", "second");
  redeemFor(editor, storage + "/second.txt", TokenUse::writing);
  redeemFor(editor, document, TokenUse::reading);
  EXPECT_EQ(ask(editor, document), AccessVerdict::outsideProfile) << "reading gives nothing";
  redeemFor(editor, document, TokenUse::writing);
  EXPECT_EQ(ask(editor, document), AccessVerdict::allowedByRedemption);
  EXPECT_EQ(sandbox.checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0);
  EXPECT_EQ(ask(again, document), AccessVerdict::allowedByRedemption) << "another connection of the same launch";
  EXPECT_EQ(ask(another, document), AccessVerdict::outsideProfile);
  EXPECT_EQ(ask(editor, storage), AccessVerdict::outsideProfile);

  std::filesystem::remove(document);
  write(document, "another file of that name");
  EXPECT_EQ(ask(editor, document), AccessVerdict::outsideProfile);
}

TEST_F(AccessQueryTest, GivesTheOneWhoReplacedAnItemTheNewObject) {
  const QXAuditToken first = peers.add(confined("com.example.editor", "1"));
  const QXAuditToken second = peers.add(confined("com.example.editor", "2"));
  redeemFor(first, sibling, TokenUse::writing);
  EXPECT_EQ(testing::replaceItem(sandbox, second, issued(document), issued(sibling)), std::nullopt);
  EXPECT_EQ(ask(second, document), AccessVerdict::allowedByRedemption);
  EXPECT_EQ(ask(first, document), AccessVerdict::allowedByRedemption) << "it holds the very file";
}

TEST_F(AccessQueryTest, RefusesAPeerThatIsGone) {
  const pid_t child = ::fork();
  if (child == 0) ::_exit(0);
  PeerIdentity peer = confined("com.example.cellar.provider", "1");
  peer.pid = child;
  const QXAuditToken token = peers.add(std::move(peer));
  const QXAuditToken living = peers.add(confined("com.example.cellar.provider", "1"));
  redeemFor(living, document, TokenUse::writing);
  EXPECT_EQ(ask(living, document), AccessVerdict::allowedByRedemption);
  siginfo_t ignored{};
  ASSERT_EQ(::waitid(P_PID, static_cast<id_t>(child), &ignored, WEXITED | WNOWAIT), 0);
  EXPECT_EQ(ask(token, document), AccessVerdict::peerGone) << "ended, not reaped";
  ASSERT_EQ(::waitpid(child, nullptr, 0), child);
  EXPECT_EQ(ask(token, document), AccessVerdict::peerGone);
}

TEST_F(AccessQueryTest, RefusesAPeerWhoseLifeNothingTells) {
  EXPECT_EQ(ask(peers.addAsItIs(thisProcess(Standing::unconfined)), document), AccessVerdict::peerGone);
}

TEST_F(AccessQueryTest, AsksInThePeersOwnView) {
  write(outside + "/plain.txt", "plain");
  const std::string readOnly = otherGroup;
  write(readOnly + "/fixed.txt", "fixed");
  // The peer rebuilds the provider's path inside a private file system, and sees another directory read-only.
  const OwnView view("mount -t tmpfs none '" + group + "'\nmkdir '" + storage + "'\necho mine > '" + document + "'\nmount --bind '" +
                     readOnly + "' '" + readOnly + "'\nmount -o remount,bind,ro '" + readOnly + "'");
  ASSERT_TRUE(view.isReady()) << "a user namespace with a mount namespace could not be made";
  PeerIdentity peer = thisProcess(Standing::unconfined);
  peer.pid = view.pid();
  const QXAuditToken token = peers.add(std::move(peer));

  EXPECT_EQ(ask(token, outside + "/plain.txt"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(token, document), AccessVerdict::anotherObject);
  EXPECT_EQ(ask(token, storage + "/new.txt"), AccessVerdict::anotherObject);
  EXPECT_EQ(ask(token, readOnly + "/fixed.txt"), AccessVerdict::accessDenied);
  EXPECT_EQ(askToRead(token, readOnly + "/fixed.txt"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(askToRead(token, document), AccessVerdict::anotherObject);
  EXPECT_EQ(askToRead(token, storage + "/new.txt"), AccessVerdict::anotherObject);
  EXPECT_EQ(ask(token, readOnly + "/new.txt"), AccessVerdict::accessDenied);
  std::filesystem::remove(document);
  EXPECT_EQ(ask(token, document), AccessVerdict::anotherObject) << "there for the peer alone";

  // With the same paths, a confined peer that holds the file open is told yes.
  write(document, "contents");
  PeerIdentity holder = confined("com.example.editor", "1");
  holder.pid = view.pid();
  const QXAuditToken holding = peers.add(std::move(holder));
  EXPECT_EQ(ask(holding, document), AccessVerdict::anotherObject);
  redeemFor(holding, document, TokenUse::writing);
  EXPECT_EQ(ask(holding, document), AccessVerdict::allowedByRedemption);
}

TEST_F(AccessQueryTest, LeavesNoTrace) {
  const QXAuditToken peer = unconfinedPeer();
  const UniqueDescriptor watch(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
  ASSERT_GE(::inotify_add_watch(watch.get(), storage.c_str(), IN_ALL_EVENTS), 0);
  ASSERT_GE(::inotify_add_watch(watch.get(), document.c_str(), IN_ALL_EVENTS), 0);
  EXPECT_EQ(ask(peer, document), AccessVerdict::allowedByAccess);
  EXPECT_EQ(ask(peer, storage + "/new.txt"), AccessVerdict::allowedByAccess);
  EXPECT_EQ(askToRead(peer, document), AccessVerdict::allowedByAccess);
  EXPECT_TRUE(sandbox.mayReach(peers.add(confined("com.example.editor", "1")), kQXSandboxFileReadData, document, issued(document)));
  std::array<char, 4096> events{};
  EXPECT_EQ(::read(watch.get(), events.data(), events.size()), -1);
  EXPECT_EQ(errno, EAGAIN);
  { std::ifstream opened(document); }
  EXPECT_GT(::read(watch.get(), events.data(), events.size()), 0) << "the watch sees an open";
}

}  // namespace
}  // namespace docuvend::linux_platform
