#include "platform/linux/sandbox/TokenRedeemer.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "tests/sandbox/SandboxHouse.h"
#include "tests/sandbox/SystemCalls.h"
#include "tests/support/Sanitizers.h"

namespace docuvend::linux_platform {
namespace {

using testing::read;
using testing::write;

constexpr int kRaceRounds = tests::kSanitized ? 20'000 : 100'000;

std::string contentsOf(const UniqueDescriptor& file) {
  std::array<char, 256> buffer{};
  const ssize_t length = ::pread(file.get(), buffer.data(), buffer.size(), 0);
  if (length < 0) {
    ADD_FAILURE() << "cannot read";
    return {};
  }
  return {buffer.data(), static_cast<std::size_t>(length)};
}

mode_t modeOf(const std::string& path) {
  struct stat status {};
  EXPECT_EQ(::lstat(path.c_str(), &status), 0) << path;
  return status.st_mode & 07777U;
}

bool puts(const UniqueDescriptor& file, const std::string& text) {
  return ::pwrite(file.get(), text.data(), text.size(), 0) == static_cast<ssize_t>(text.size());
}

class TokenRedeemerTest : public testing::SandboxHouse {
 protected:
  // A token as the sandbox would have issued it at some time, whatever lies at the path now.
  [[nodiscard]] std::string tokenFor(const std::string& path) const {
    return SandboxToken{TokenKind::readWrite, TokenFloors().number(), path, SandboxToken::freshNonce()}.sealed(key);
  }
  [[nodiscard]] UniqueDescriptor redeemed(const std::string& token, TokenUse use) const {
    auto result = redeemer.redeem(token, use);
    if (auto* file = std::get_if<RedeemedFile>(&result)) return std::move(file->file);
    ADD_FAILURE() << std::get<QXError>(result).description();
    return {};
  }
  void expectError(const std::string& token, TokenUse use, SandboxErrorCode expected, const std::string& what) const {
    const auto result = redeemer.redeem(token, use);
    const auto* error = std::get_if<QXError>(&result);
    ASSERT_NE(error, nullptr) << what;
    EXPECT_EQ(error->domain, kQXSandboxErrorDomain) << what;
    EXPECT_EQ(error->code, static_cast<std::int64_t>(expected)) << what << ": " << error->description();
  }
  void expectReplaceError(const std::string& item, const std::string& by, SandboxErrorCode expected, const std::string& what) const {
    const auto result = redeemer.replaceItem(item, by);
    const auto* error = std::get_if<QXError>(&result);
    ASSERT_NE(error, nullptr) << what;
    EXPECT_EQ(error->domain, kQXSandboxErrorDomain) << what;
    EXPECT_EQ(error->code, static_cast<std::int64_t>(expected)) << what << ": " << error->description();
  }

  const TokenKey key = TokenKey::random();
  TokenSession session{paths.tokenFloors, key, TokenFloors(), log.defaultLog(), testing::kNotLong};
  GroupContainers containers{bundles};
  const TokenRedeemer redeemer{session, containers};
};

TEST_F(TokenRedeemerTest, OpensForReadingAlone) {
  const UniqueDescriptor file = redeemed(tokenFor(document), TokenUse::reading);
  EXPECT_EQ(contentsOf(file), "contents");
  EXPECT_FALSE(puts(file, "x"));
  EXPECT_EQ(::fcntl(file.get(), F_GETFL) & (O_ACCMODE | O_NONBLOCK | O_PATH), O_RDONLY);
  EXPECT_EQ(::fcntl(file.get(), F_GETFD), FD_CLOEXEC);
}

TEST_F(TokenRedeemerTest, OpensForReadingAndWritingWithoutTruncating) {
  const UniqueDescriptor file = redeemed(tokenFor(document), TokenUse::writing);
  EXPECT_EQ(contentsOf(file), "contents");
  EXPECT_TRUE(puts(file, "CON"));
  EXPECT_EQ(read(document), "CONtents");
  EXPECT_EQ(::ftruncate(file.get(), 2), 0);
  EXPECT_EQ(read(document), "CO");
  EXPECT_EQ(::fcntl(file.get(), F_GETFL) & (O_ACCMODE | O_NONBLOCK | O_PATH), O_RDWR);
  EXPECT_EQ(::fcntl(file.get(), F_GETFD), FD_CLOEXEC);
}

TEST_F(TokenRedeemerTest, ServesATokenAgainAndAgain) {
  const std::string token = tokenFor(document);
  EXPECT_EQ(contentsOf(redeemed(token, TokenUse::reading)), "contents");
  EXPECT_EQ(contentsOf(redeemed(token, TokenUse::writing)), "contents");
}

TEST_F(TokenRedeemerTest, RefusesABadToken) {
  const std::string token = tokenFor(document);
  const TokenKey renewed = TokenKey::random();
  for (const std::string& bad : {std::string(), std::string("x"), token.substr(1),
                                 SandboxToken{TokenKind::readWrite, TokenFloors().number(), document, {}}.sealed(renewed)}) {
    expectError(bad, TokenUse::reading, SandboxErrorCode::badToken, bad);
    expectReplaceError(bad, tokenFor(sibling), SandboxErrorCode::badToken, bad);
    expectReplaceError(token, bad, SandboxErrorCode::badToken, bad);
  }
}

TEST_F(TokenRedeemerTest, RefusesWhatTookTheFilesPlace) {
  const std::string second = storage + "/second.txt";
  const std::vector<std::pair<std::string, std::pair<std::function<int()>, SandboxErrorCode>>> table = {
      {"nothing", {[] { return 0; }, SandboxErrorCode::gone}},
      {"symbolic link", {[&] { return ::symlink((outside + "/secret.txt").c_str(), document.c_str()); }, SandboxErrorCode::notRegularFile}},
      {"hard link", {[&] { return ::link((outside + "/secret.txt").c_str(), document.c_str()); }, SandboxErrorCode::notRegularFile}},
      {"pipe", {[&] { return ::mkfifo(document.c_str(), 0600); }, SandboxErrorCode::notRegularFile}},
      {"directory", {[&] { return ::mkdir(document.c_str(), 0700); }, SandboxErrorCode::notRegularFile}},
  };
  const std::string token = tokenFor(document);
  for (const auto& [name, entry] : table) {
    std::filesystem::remove(document);
    ASSERT_EQ(entry.first(), 0) << name;
    for (const TokenUse use : {TokenUse::reading, TokenUse::writing}) expectError(token, use, entry.second, name);
  }
}

TEST_F(TokenRedeemerTest, RefusesADirectoryOnTheWayThatBecameALink) {
  const std::string token = tokenFor(document);
  write(outside + "/report.txt", "secret");
  std::filesystem::rename(storage, group + "/moved");
  ASSERT_EQ(::symlink(outside.c_str(), storage.c_str()), 0);
  const auto result = redeemer.redeem(token, TokenUse::reading);
  EXPECT_TRUE(std::holds_alternative<QXError>(result));
  std::filesystem::remove(storage);
  expectError(token, TokenUse::reading, SandboxErrorCode::gone, "no directory");
}

TEST_F(TokenRedeemerTest, ForgetsContainersOfRemovedBundles) {
  const std::string token = tokenFor(document);
  bundles.remove("com.example.cellar.provider");
  bundles.tellOfChange();
  expectError(token, TokenUse::reading, SandboxErrorCode::gone, "removed");
}

// A bearer owns the file that it was given, and may have taken the others' way to it.
TEST_F(TokenRedeemerTest, GivesTheOwnerBackTheAccessThatABearerTookAway) {
  for (const mode_t mode : {0000U, 0400U, 0200U, 0077U}) {
    for (const TokenUse use : {TokenUse::reading, TokenUse::writing}) {
      const UniqueDescriptor bearers = redeemed(tokenFor(document), TokenUse::reading);
      ASSERT_EQ(::fchmod(bearers.get(), mode), 0);
      EXPECT_EQ(contentsOf(redeemed(tokenFor(document), use)), "contents") << mode;
      const bool isEnough = use == TokenUse::reading && (mode & 0400U) != 0;
      EXPECT_EQ(modeOf(document), isEnough ? mode : mode | 0600U) << "no more than what was missing";
    }
  }
  ASSERT_TRUE(puts(redeemed(tokenFor(sibling), TokenUse::writing), "new"));
  ASSERT_EQ(::chmod(sibling.c_str(), 0), 0);
  ASSERT_TRUE(std::holds_alternative<ReplacedItem>(redeemer.replaceItem(tokenFor(document), tokenFor(sibling))));
  EXPECT_EQ(read(document), "new");
}

TEST_F(TokenRedeemerTest, GivesNothingBackToAFileThatIsNoItem) {
  ASSERT_EQ(::link(document.c_str(), (storage + "/second.txt").c_str()), 0);
  ASSERT_EQ(::chmod(document.c_str(), 0), 0);
  expectError(tokenFor(document), TokenUse::writing, SandboxErrorCode::notRegularFile, "two links");
  EXPECT_EQ(modeOf(document), 0U);
}

TEST_F(TokenRedeemerTest, AnswersBusyInsteadOfWaitingForALease) {
  ASSERT_NE(std::signal(SIGIO, SIG_IGN), SIG_ERR);
  ::alarm(20);  // the lease is broken by force after 45 s
  UniqueDescriptor holder(::open(document.c_str(), O_RDWR | O_CLOEXEC));
  ASSERT_EQ(::fcntl(holder.get(), F_SETLEASE, F_WRLCK), 0);
  for (const TokenUse use : {TokenUse::reading, TokenUse::writing}) expectError(tokenFor(document), use, SandboxErrorCode::busy, "lease");
  holder.reset();
  EXPECT_EQ(contentsOf(redeemed(tokenFor(document), TokenUse::writing)), "contents");
  ::alarm(0);
}

TEST_F(TokenRedeemerTest, AFileThatIsBeingReplacedIsTheOldOneOrTheNewOneAndNeverGone) {
  const std::string token = tokenFor(document);
  std::atomic<bool> stop{false};
  std::thread saver([this, &stop] {
    while (!stop.load()) {
      write(document + ".new", "contents");
      EXPECT_EQ(::rename((document + ".new").c_str(), document.c_str()), 0);
    }
  });
  for (int round = 0; round < kRaceRounds && !HasFailure(); ++round) {
    const auto result = redeemer.redeem(token, TokenUse::reading);
    if (const auto* file = std::get_if<RedeemedFile>(&result)) {
      EXPECT_EQ(contentsOf(file->file), "contents");
    } else {
      EXPECT_EQ(std::get<QXError>(result).code, static_cast<std::int64_t>(SandboxErrorCode::busy))
          << std::get<QXError>(result).description();
    }
  }
  stop.store(true);
  saver.join();
}

TEST_F(TokenRedeemerTest, MakesAMissingHiddenSiblingForWriting) {
  expectError(tokenFor(sibling), TokenUse::reading, SandboxErrorCode::gone, "reading makes nothing");
  EXPECT_FALSE(std::filesystem::exists(sibling));
  const UniqueDescriptor made = redeemed(tokenFor(sibling), TokenUse::writing);
  struct stat status {};
  ASSERT_EQ(::lstat(sibling.c_str(), &status), 0);
  EXPECT_TRUE(S_ISREG(status.st_mode));
  EXPECT_EQ(status.st_mode & 0777U, 0600U);
  EXPECT_TRUE(puts(made, "new"));
  EXPECT_EQ(contentsOf(made), "new");
  EXPECT_EQ(::fcntl(made.get(), F_GETFL) & (O_ACCMODE | O_NONBLOCK), O_RDWR);
  EXPECT_EQ(::fcntl(made.get(), F_GETFD), FD_CLOEXEC);
  EXPECT_EQ(contentsOf(redeemed(tokenFor(sibling), TokenUse::writing)), "new") << "one that is there is left as it is";
}

TEST_F(TokenRedeemerTest, MakesNothingElse) {
  ASSERT_EQ(::mkdir((storage + "/folder").c_str(), 0700), 0);
  ASSERT_EQ(::symlink("report.txt", (storage + "/link").c_str()), 0);
  for (const char* name : {"new.txt", ".new.txt", ".folder", ".link", "...", "..report.txt"}) {
    expectError(tokenFor(storage + "/" + name), TokenUse::writing, SandboxErrorCode::gone, name);
    EXPECT_FALSE(std::filesystem::exists(std::filesystem::symlink_status(storage + "/" + name))) << name;
  }
}

TEST_F(TokenRedeemerTest, RenamesTheHiddenSiblingOverItsItem) {
  const UniqueDescriptor before = redeemed(tokenFor(document), TokenUse::reading);
  const UniqueDescriptor written = redeemed(tokenFor(sibling), TokenUse::writing);
  ASSERT_TRUE(puts(written, "replaced"));
  const auto expected = std::get<ObjectStatus>(statusOf(written.get())).identity;

  const auto result = redeemer.replaceItem(tokenFor(document), tokenFor(sibling));
  ASSERT_TRUE(std::holds_alternative<ReplacedItem>(result)) << std::get<QXError>(result).description();
  EXPECT_EQ(std::get<ReplacedItem>(result).identity, expected);
  EXPECT_EQ(read(document), "replaced");
  EXPECT_FALSE(std::filesystem::exists(sibling));
  EXPECT_EQ(contentsOf(before), "contents") << "an open file stays what it was";
  EXPECT_EQ(contentsOf(redeemed(tokenFor(document), TokenUse::reading)), "replaced");
}

TEST_F(TokenRedeemerTest, GivesTheNewItemThePermissionBitsOfTheOld) {
  for (const mode_t mode : {0644U, 0600U, 0664U, 0755U, 0400U, 0002U, 04755U}) {
    ASSERT_EQ(::chmod(document.c_str(), mode), 0);
    static_cast<void>(redeemed(tokenFor(sibling), TokenUse::writing));
    const auto result = redeemer.replaceItem(tokenFor(document), tokenFor(sibling));
    ASSERT_TRUE(std::holds_alternative<ReplacedItem>(result)) << std::get<QXError>(result).description();
    EXPECT_EQ(modeOf(document), mode & 0777U);
  }
}

TEST_F(TokenRedeemerTest, LeavesTheSiblingsModeWhenItCannotBeRenamed) {
  ASSERT_EQ(::chmod(document.c_str(), 0444), 0);
  static_cast<void>(redeemed(tokenFor(sibling), TokenUse::writing));
  ASSERT_EQ(::chmod(storage.c_str(), 0500), 0);
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::notPermitted, "a directory that cannot be written");
  EXPECT_EQ(modeOf(sibling), 0600U);
  EXPECT_EQ(read(document), "contents");
}

TEST_F(TokenRedeemerTest, RefusesTokensThatWereTakenBackAndServesNewOnes) {
  const std::string item = tokenFor(document);
  const std::string by = tokenFor(sibling);
  const UniqueDescriptor open = redeemed(item, TokenUse::writing);
  ASSERT_EQ(session.takeBack({storage + "/"}), std::nullopt);
  for (const TokenUse use : {TokenUse::reading, TokenUse::writing}) {
    expectError(item, use, SandboxErrorCode::badToken, "item");
    expectError(by, use, SandboxErrorCode::badToken, "sibling");
  }
  EXPECT_FALSE(std::filesystem::exists(sibling)) << "nothing is made for an old token";
  EXPECT_TRUE(puts(open, "CON")) << "an open file stays open";

  const std::string newItem = session.issue(document).value_or("");
  const std::string newSibling = session.issue(sibling).value_or("");
  EXPECT_EQ(contentsOf(redeemed(newItem, TokenUse::reading)), "CONtents");
  static_cast<void>(redeemed(newSibling, TokenUse::writing));
  expectReplaceError(item, newSibling, SandboxErrorCode::badToken, "old item");
  expectReplaceError(newItem, by, SandboxErrorCode::badToken, "old sibling");
  EXPECT_EQ(read(document), "CONtents");
  EXPECT_TRUE(std::holds_alternative<ReplacedItem>(redeemer.replaceItem(newItem, newSibling)));
}

// The contents of the sibling may take as long as they like to get to disk.
TEST_F(TokenRedeemerTest, RenamesNothingByATokenThatIsTakenBackWhileTheSiblingIsFlushed) {
  ASSERT_EQ(::chmod(document.c_str(), 0640), 0);
  static_cast<void>(redeemed(tokenFor(sibling), TokenUse::writing));
  testing::SystemCalls calls;
  calls.beforeFlush = [this](int) { EXPECT_EQ(session.takeBack({storage + "/"}), std::nullopt); };
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::badToken, "taken back meanwhile");
  EXPECT_EQ(read(document), "contents");
  EXPECT_EQ(modeOf(sibling), 0600U);
}

// Two replace the same item by the same sibling.
TEST_F(TokenRedeemerTest, AnItemThatAnotherHasReplacedMeanwhileKeepsItsMode) {
  ASSERT_EQ(::chmod(document.c_str(), 0640), 0);
  ASSERT_TRUE(puts(redeemed(tokenFor(sibling), TokenUse::writing), "new"));
  testing::SystemCalls calls;
  calls.beforeFlush = [this](int) {
    EXPECT_TRUE(std::holds_alternative<ReplacedItem>(redeemer.replaceItem(tokenFor(document), tokenFor(sibling))));
  };
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::gone, "the other was faster");
  EXPECT_EQ(read(document), "new");
  EXPECT_EQ(modeOf(document), 0640U);
}

TEST_F(TokenRedeemerTest, TheItemGetsItsModeAlsoWhenAnotherWhoFailedGaveTheSiblingsBackMeanwhile) {
  ASSERT_EQ(::chmod(document.c_str(), 0640), 0);
  static_cast<void>(redeemed(tokenFor(sibling), TokenUse::writing));
  testing::SystemCalls calls;
  calls.beforeFlush = [this](int) { EXPECT_EQ(::chmod(sibling.c_str(), 0600), 0); };
  EXPECT_TRUE(std::holds_alternative<ReplacedItem>(redeemer.replaceItem(tokenFor(document), tokenFor(sibling))));
  EXPECT_EQ(modeOf(document), 0640U);
}

TEST_F(TokenRedeemerTest, ForcesContentsAndModeBeforeTheRenameAndTheDirectoryAfterIt) {
  ASSERT_EQ(::chmod(document.c_str(), 0640), 0);
  ASSERT_TRUE(puts(redeemed(tokenFor(sibling), TokenUse::writing), "new"));
  std::vector<std::string> flushed;
  testing::SystemCalls calls;
  calls.beforeFlush = [this, &flushed](int descriptor) {
    const auto object = kernelPath(descriptor);
    struct stat status {};
    ASSERT_EQ(::fstat(descriptor, &status), 0);
    flushed.push_back(object.value_or("") + (S_ISDIR(status.st_mode) ? "/" : "") + (read(document) == "new" ? " after it" : " before it"));
    if (object == sibling) {
      EXPECT_EQ(status.st_mode & 0777U, 0640U);
    }
  };
  auto result = redeemer.replaceItem(tokenFor(document), tokenFor(sibling));
  ASSERT_TRUE(std::holds_alternative<ReplacedItem>(result));
  EXPECT_EQ(TokenRedeemer::forceToDisk(std::move(std::get<ReplacedItem>(result))), std::nullopt);
  EXPECT_EQ(flushed, (std::vector<std::string>{sibling + " before it", storage + "/ after it"}));
}

TEST_F(TokenRedeemerTest, RedeemsAtOnceWhatNeedsNoLock) {
  const testing::LockedDirectory locked(group);
  for (const TokenUse use : {TokenUse::reading, TokenUse::writing}) {
    const auto redeemed = redeemer.redeemAtOnce(tokenFor(document), use);
    ASSERT_TRUE(redeemed);
    EXPECT_EQ(contentsOf(std::get<RedeemedFile>(*redeemed).file), "contents");
  }
  const auto refused = redeemer.redeemAtOnce("x", TokenUse::reading);
  ASSERT_TRUE(refused);
  EXPECT_EQ(std::get<QXError>(*refused).code, static_cast<std::int64_t>(SandboxErrorCode::badToken));
}

TEST_F(TokenRedeemerTest, DoesNothingAtOnceThatMayHaveToWait) {
  const testing::LockedDirectory locked(group);
  EXPECT_FALSE(redeemer.redeemAtOnce(tokenFor(sibling), TokenUse::writing)) << "it would be made";
  EXPECT_FALSE(std::filesystem::exists(sibling));
  EXPECT_FALSE(redeemer.redeemAtOnce(tokenFor(storage + "/none.txt"), TokenUse::reading)) << "it would be looked for";
  EXPECT_FALSE(redeemer.redeemAtOnce(tokenFor(storage + "/none/none.txt"), TokenUse::reading)) << "its directory would be looked for";
  const UniqueDescriptor bearers = redeemed(tokenFor(document), TokenUse::writing);
  testing::SystemCalls none;
  ASSERT_EQ(::fchmod(bearers.get(), 0), 0);
  EXPECT_FALSE(redeemer.redeemAtOnce(tokenFor(document), TokenUse::reading)) << "its mode would be changed";
  EXPECT_EQ(modeOf(document), 0U);
}

// A cut does not wait for ever for those who stand in line for a lock.
TEST_F(TokenRedeemerTest, HandsNothingOutForATokenThatIsTakenBackWhileTheFileIsLocked) {
  ASSERT_EQ(::chmod(document.c_str(), 0), 0);
  for (const std::string& path : {document, sibling}) {
    testing::SystemCalls calls;
    int cuts = 0;
    calls.beforeLocking = [this, &cuts, &path](const std::string& object) {
      if (object != path && object != storage) return;
      const auto error = session.takeBack({storage + "/"});
      ASSERT_TRUE(error);
      EXPECT_EQ(error->code, EBUSY);
      ++cuts;
    };
    expectError(session.issue(path).value_or(""), TokenUse::writing, SandboxErrorCode::badToken, path);
    EXPECT_EQ(cuts, 1);
  }
  EXPECT_EQ(log.writes(), 2U);
}

TEST_F(TokenRedeemerTest, RenamesForATokenThatIsTakenBackWhileTheItemIsLockedAndSaysThatItIsNoGood) {
  ASSERT_TRUE(puts(redeemed(tokenFor(sibling), TokenUse::writing), "new"));
  testing::SystemCalls calls;
  calls.beforeLocking = [this](const std::string& object) {
    if (object == storage) {
      EXPECT_TRUE(session.takeBack({storage + "/"}));
    }
  };
  const auto result = redeemer.replaceItem(tokenFor(document), tokenFor(sibling));
  ASSERT_TRUE(std::holds_alternative<ReplacedItem>(result));
  EXPECT_EQ(read(document), "new") << "nobody can call it back";
  EXPECT_FALSE(session.isGood(std::get<ReplacedItem>(result).inUse.token));
}

// One that goes on writing would put it off.
TEST_F(TokenRedeemerTest, ForcesNothingToDiskThatARevocationWouldWaitFor) {
  ASSERT_TRUE(puts(redeemed(tokenFor(sibling), TokenUse::writing), "new"));
  int cuts = 0;
  testing::SystemCalls calls;
  auto replaced = redeemer.replaceItem(tokenFor(document), tokenFor(sibling));
  ASSERT_TRUE(std::holds_alternative<ReplacedItem>(replaced));
  calls.beforeFlush = [this, &cuts](int) {
    EXPECT_EQ(session.takeBack({storage + "/"}), std::nullopt);
    ++cuts;
  };
  EXPECT_EQ(TokenRedeemer::forceToDisk(std::move(std::get<ReplacedItem>(replaced))), std::nullopt);
  EXPECT_EQ(cuts, 1);
}

TEST_F(TokenRedeemerTest, RenamesNothingButAHiddenSiblingOverItsItem) {
  const std::string folder = storage + "/folder";
  std::filesystem::create_directory(folder);
  for (const std::string& path : {sibling, storage + "/other.txt", storage + "/.other.txt", folder + "/.report.txt"}) write(path, "other");
  const std::vector<std::pair<std::string, std::string>> table = {
      {sibling, document},
      {document, document},
      {document, storage + "/other.txt"},
      {document, storage + "/.other.txt"},
      {document, folder + "/.report.txt"},
      {storage + "/other.txt", sibling},
  };
  for (const auto& [item, by] : table) {
    expectReplaceError(tokenFor(item), tokenFor(by), SandboxErrorCode::notSiblings, item + " by " + by);
  }
  EXPECT_EQ(read(document), "contents");
  EXPECT_EQ(read(sibling), "other");
}

TEST_F(TokenRedeemerTest, RenamesNothingWhenEitherIsMissingOrNotAFile) {
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::gone, "no sibling");
  ASSERT_EQ(::symlink((outside + "/secret.txt").c_str(), sibling.c_str()), 0);
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::notRegularFile, "link");
  std::filesystem::remove(sibling);
  ASSERT_EQ(::link((outside + "/secret.txt").c_str(), sibling.c_str()), 0);
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::notRegularFile, "hard link");
  std::filesystem::remove(sibling);
  ASSERT_EQ(::mkfifo(sibling.c_str(), 0600), 0);
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::notRegularFile, "pipe");
  std::filesystem::remove(sibling);
  EXPECT_EQ(read(document), "contents");

  write(sibling, "new");
  std::filesystem::remove(document);
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::gone, "no item");
  ASSERT_EQ(::mkdir(document.c_str(), 0700), 0);
  expectReplaceError(tokenFor(document), tokenFor(sibling), SandboxErrorCode::notRegularFile, "directory");
  EXPECT_EQ(read(sibling), "new");
}

// Somebody exchanges, all the time, the file or its directory for a symbolic link that leads outside.
class SwapRace : public TokenRedeemerTest, public ::testing::WithParamInterface<const char*> {
 protected:
  void SetUp() override {
    TokenRedeemerTest::SetUp();
    if (HasFatalFailure()) return;
    folder = group + "/a";
    std::filesystem::create_directory(folder);
    write(folder + "/x.txt", "inside");
    write(outside + "/x.txt", "outside");
    insideIdentity = identityOf(folder + "/x.txt");
    outsideIdentity = identityOf(outside + "/x.txt");
    const std::string kind = GetParam();
    victim = kind == "directory" ? folder : folder + "/x.txt";
    const std::string target = kind == "directory" ? outside : outside + "/x.txt";
    ASSERT_EQ(::symlink(target.c_str(), (victim + "-link").c_str()), 0);
  }
  static ObjectIdentity identityOf(const std::string& path) {
    const UniqueDescriptor file(::open(path.c_str(), O_PATH | O_CLOEXEC));
    return std::get<ObjectStatus>(statusOf(file.get())).identity;
  }
  void swapUntilTold() const {
    const std::string link = victim + "-link";
    while (!stop.load()) ::renameat2(AT_FDCWD, victim.c_str(), AT_FDCWD, link.c_str(), RENAME_EXCHANGE);
  }

  std::string folder;
  std::string victim;
  ObjectIdentity insideIdentity;
  ObjectIdentity outsideIdentity;
  std::atomic<bool> stop{false};
};

TEST_P(SwapRace, NeverLeadsOutside) {
  ASSERT_NE(insideIdentity, outsideIdentity);
  const std::string token = tokenFor(folder + "/x.txt");
  std::thread swapper([this] { swapUntilTold(); });
  for (int round = 0; round < kRaceRounds && !HasFailure(); ++round) {
    const auto place = containers.place(folder + "/x.txt");
    if (const auto* item = std::get_if<PlacedItem>(&place); item != nullptr && item->file) {
      EXPECT_EQ(item->file->identity, insideIdentity) << "placed outside in round " << round;
    }
    const auto result = redeemer.redeem(token, round % 2 == 0 ? TokenUse::reading : TokenUse::writing);
    if (const auto* file = std::get_if<RedeemedFile>(&result)) {
      EXPECT_EQ(std::get<ObjectStatus>(statusOf(file->file.get())).identity, insideIdentity) << "opened outside in round " << round;
    }
  }
  stop.store(true);
  swapper.join();
  EXPECT_EQ(read(outside + "/x.txt"), "outside");
}

INSTANTIATE_TEST_SUITE_P(Of, SwapRace, ::testing::Values("directory", "file"), [](const auto& info) { return std::string(info.param); });

}  // namespace
}  // namespace docuvend::linux_platform
