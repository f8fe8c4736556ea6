// Taking tokens back, with everything that is behind the seam and files on the real file system.
#include "platform/linux/sandbox/LinuxSandbox.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <filesystem>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "tests/sandbox/SandboxHouse.h"
#include "tests/sandbox/SystemCalls.h"

namespace docuvend::linux_platform {
namespace {

using testing::read;
using testing::write;

class TakingTokensBack : public testing::SandboxHouse {
 protected:
  void SetUp() override {
    testing::SandboxHouse::SetUp();
    write(otherDocument, "other");
    editor = peers.add(confined("com.example.editor", "1"));
    sandbox = restarted();
  }
  [[nodiscard]] std::unique_ptr<LinuxSandbox> restarted() { return std::make_unique<LinuxSandbox>(loadedSession(), bundles, peers); }

  [[nodiscard]] std::string issued(const std::string& path) const {
    auto token = sandbox->issueReadWriteExtension(path);
    EXPECT_TRUE(token) << path;
    return token.value_or("");
  }
  void takeBack(const std::optional<std::string>& directory) const {
    const auto error = sandbox->invalidateReadWriteExtensions(directory);
    EXPECT_EQ(error, std::nullopt) << error->description();
  }
  [[nodiscard]] bool opens(const std::string& token) const {
    return std::holds_alternative<UniqueDescriptor>(testing::redeem(*sandbox, editor, token, TokenUse::writing));
  }
  static void expectBadToken(const QXError& error) {
    EXPECT_EQ(error.domain, kQXSandboxErrorDomain);
    EXPECT_EQ(error.code, static_cast<std::int64_t>(SandboxErrorCode::badToken)) << error.description();
  }
  void expectTakenBack(const std::string& token, const std::string& what) const {
    const auto result = testing::redeem(*sandbox, editor, token, TokenUse::reading);
    ASSERT_TRUE(std::holds_alternative<QXError>(result)) << what;
    expectBadToken(std::get<QXError>(result));
  }

  const std::string otherDocument = otherGroup + "/other.txt";
  QXAuditToken editor;
  std::unique_ptr<LinuxSandbox> sandbox;
};

TEST_F(TakingTokensBack, CutsWhatLiesBelowTheDirectoryAndNothingElse) {
  const std::string token = issued(document);
  const std::string siblingToken = issued(sibling);
  write(group + "/beside.txt", "beside");
  const std::string beside = issued(group + "/beside.txt");
  const std::string other = issued(otherDocument);
  takeBack(storage);
  expectTakenBack(token, "item");
  expectTakenBack(siblingToken, "sibling");
  EXPECT_FALSE(std::filesystem::exists(sibling));
  EXPECT_TRUE(opens(beside));
  EXPECT_TRUE(opens(other));
  EXPECT_TRUE(opens(issued(document)));
  takeBack(group + "/");
  expectTakenBack(beside, "a final slash");
  EXPECT_TRUE(opens(other));
}

TEST_F(TakingTokensBack, CutsEveryTokenWithoutADirectory) {
  const std::string token = issued(document);
  const std::string other = issued(otherDocument);
  takeBack(std::nullopt);
  expectTakenBack(token, "item");
  expectTakenBack(other, "another provider's");
  EXPECT_TRUE(opens(issued(document)));
  EXPECT_TRUE(opens(issued(otherDocument)));
}

TEST_F(TakingTokensBack, CutsTooMuchRatherThanTooLittleForAPathThatIsNone) {
  for (const std::string& path : {std::string(), std::string("/"), std::string("relative"), group + "/../x", group + "/./x",
                                  storage + std::string("\0", 1), "/" + std::string(5000, 'a')}) {
    const std::string token = issued(document);
    takeBack(path);
    expectTakenBack(token, path);
  }
}

TEST_F(TakingTokensBack, HoldsAfterARestart) {
  const std::string token = issued(document);
  const std::string other = issued(otherDocument);
  takeBack(storage);
  sandbox = restarted();
  expectTakenBack(token, "item");
  EXPECT_TRUE(opens(other));
  EXPECT_TRUE(opens(issued(document)));
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(TakingTokensBack, LeavesOpenFilesOpen) {
  const auto open = testing::redeem(*sandbox, editor, issued(document), TokenUse::writing);
  ASSERT_TRUE(std::holds_alternative<UniqueDescriptor>(open));
  takeBack(storage);
  EXPECT_EQ(::pwrite(std::get<UniqueDescriptor>(open).get(), "CON", 3, 0), 3);
  EXPECT_EQ(read(document), "CONtents");
}

TEST_F(TakingTokensBack, HoldsWhateverBecomesOfTheDirectory) {
  const std::string token = issued(document);
  const std::string away = group + "/away";
  std::filesystem::rename(storage, away);
  takeBack(storage);
  std::filesystem::rename(away, storage);
  expectTakenBack(token, "cut while it was gone");

  const std::string second = issued(document);
  std::filesystem::rename(storage, away);
  ASSERT_EQ(::symlink(outside.c_str(), storage.c_str()), 0);
  takeBack(storage);
  std::filesystem::remove(storage);
  std::filesystem::rename(away, storage);
  expectTakenBack(second, "cut while a link was in its place");
}

TEST_F(TakingTokensBack, HoldsWhenTheBundleIsRemovedAndComesBack) {
  const std::string token = issued(document);
  const auto provider = bundles.find("com.example.cellar.provider");
  bundles.remove("com.example.cellar.provider");
  bundles.tellOfChange();
  takeBack(storage);
  bundles.put(*provider);
  bundles.tellOfChange();
  expectTakenBack(token, "item");
}

// A bundle of each of these groups, beside the one that is there; the group's container is the provider's too.
class LeavingGroups : public TakingTokensBack {
 protected:
  void SetUp() override {
    TakingTokensBack::SetUp();
    provider_ = *bundles.find("com.example.cellar.provider");
    token_ = issued(document);
    other_ = issued(otherDocument);
  }
  void become(const Bundle& bundle) {
    bundles.put(bundle);
    changed();
  }
  void changed() {
    bundles.tellOfChange();
    EXPECT_EQ(sandbox->followInstalledBundles(), std::nullopt);
    sandbox->settleInstalledBundles();
  }

  Bundle provider_;
  std::string token_;
  std::string other_;
};

TEST_F(LeavingGroups, EndsTheTokensForItsContainerAndNoOthers) {
  Bundle left = provider_;
  left.groups = {{"com.example.cellar.v2", home + "/groups/com.example.cellar.v2"}};
  become(left);
  EXPECT_FALSE(opens(token_)) << "nobody has the group";
  become(provider_);
  expectTakenBack(token_, "the same group again");
  EXPECT_TRUE(opens(other_));
  EXPECT_TRUE(opens(issued(document)));
}

TEST_F(LeavingGroups, EndsThemAlsoWhenAnotherBundleStays) {
  Bundle member = *bundles.find("com.example.other");
  member.groups.insert(*provider_.groups.begin());
  become(member);
  EXPECT_TRUE(opens(token_)) << "who comes ends nothing";
  Bundle left = provider_;
  left.groups.clear();
  become(left);
  expectTakenBack(token_, "another's");
  EXPECT_TRUE(opens(other_));
}

TEST_F(LeavingGroups, EndsThemWhenTheBundleIsRemovedAndInstalledAgain) {
  ASSERT_NE(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0);
  ASSERT_TRUE(opens(token_));
  ASSERT_EQ(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0);
  bundles.remove(provider_.identifier);
  changed();
  become(provider_);
  expectTakenBack(token_, "removed");
  EXPECT_NE(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0);
}

TEST_F(LeavingGroups, TakesFromNobodyWhatIsOfOtherGroups) {
  ASSERT_TRUE(opens(other_));
  ASSERT_EQ(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, otherDocument), 0);
  bundles.remove(provider_.identifier);
  changed();
  EXPECT_EQ(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, otherDocument), 0);
}

TEST_F(LeavingGroups, IsHeldToAfterARestart) {
  bundles.remove(provider_.identifier);
  changed();
  sandbox = restarted();
  become(provider_);
  sandbox = restarted();
  expectTakenBack(token_, "removed");
  EXPECT_TRUE(opens(other_));
}

TEST_F(LeavingGroups, IsNoticedByTheNextProcessWhenNoneWasThere) {
  sandbox = restarted();
  EXPECT_TRUE(opens(token_)) << "nothing has changed";
  sandbox.reset();
  bundles.remove(provider_.identifier);
  sandbox = restarted();
  become(provider_);
  expectTakenBack(token_, "removed");
  expectTakenBack(other_, "what had changed is not known any more");
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(LeavingGroups, IsFollowedByARevocationThatTheRegistryHasNotAnnouncedYet) {
  Bundle left = provider_;
  left.groups.clear();
  bundles.put(left);
  takeBack(otherGroup);
  bundles.put(provider_);
  expectTakenBack(token_, "left before the other was taken back");
}

TEST_F(LeavingGroups, IsFollowedByWhoIssuesTheNextTokenAndThenNotForgotten) {
  Bundle joined = *bundles.find("com.example.other");
  joined.groups["com.example.third"] = home + "/groups/com.example.third";
  std::filesystem::create_directories(joined.groups["com.example.third"]);
  bundles.put(joined);
  bundles.tellOfChange();
  const std::string third = issued(home + "/groups/com.example.third/new.txt");
  sandbox = restarted();
  EXPECT_TRUE(opens(token_)) << "the session has been told of the third";
  write(home + "/groups/com.example.third/new.txt", "third");
  EXPECT_TRUE(opens(third));
}

TEST_F(LeavingGroups, EndsThemInThisProcessWhenItCannotBeWritten) {
  bundles.remove(provider_.identifier);
  bundles.tellOfChange();
  ASSERT_EQ(::chmod(directory.path().c_str(), 0500), 0);
  EXPECT_TRUE(sandbox->followInstalledBundles());
  EXPECT_EQ(sandbox->issueReadWriteExtension(otherDocument), std::nullopt) << "a restart could not tell";
  bundles.put(provider_);
  bundles.tellOfChange();
  expectTakenBack(token_, "removed");
  ASSERT_EQ(::chmod(directory.path().c_str(), 0700), 0);
  EXPECT_TRUE(opens(issued(document)));
  sandbox = restarted();
  expectTakenBack(token_, "removed");
}

// Whoever tells of the change, or asks for the next token, is one who serves others.
TEST_F(LeavingGroups, IsFollowedWithoutWaitingForWhoIsHeldUpByWhoeverIssuesTheNextToken) {
  ASSERT_TRUE(opens(issued(sibling)));
  sandbox = std::make_unique<LinuxSandbox>(loadedSession(testing::kNotLong), bundles, peers);
  const std::string item = issued(document);
  const std::string by = issued(sibling);
  ASSERT_EQ(::chmod(document.c_str(), 0600), 0);  // as the sibling has it: the rename is the first to wait
  const auto answer = std::make_shared<std::promise<std::optional<QXError>>>();
  auto replaced = answer->get_future();
  {
    testing::LockedDirectory locked(storage);
    sandbox->replaceItem(editor, item, by, [answer](std::optional<QXError> error) { answer->set_value(std::move(error)); });
    ASSERT_TRUE(locked.awaitWaiting(1));
    bundles.remove(provider_.identifier);
    bundles.tellOfChange();
    EXPECT_TRUE(opens(issued(otherDocument)));
    EXPECT_EQ(sandbox->followInstalledBundles(), std::nullopt);
    EXPECT_TRUE(log.entries().empty()) << "nobody has waited";
    expectTakenBack(item, "removed");
    sandbox->settleInstalledBundles();
    EXPECT_EQ(log.entries(), (std::vector<fake_platform::FakeLogEntry>{
                                 {QXLogType::fault,
                                  "[ERROR] Tokens were taken back, and what 2 of them had begun before is still under way, the first of "
                                  "them for " +
                                      document + "."}}));
    locked.unlock();
    replaced.wait();
  }
  EXPECT_EQ(replaced.get(), std::nullopt);
  become(provider_);
  EXPECT_NE(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0) << "it is not remembered to have written the item";
}

// The registry's way to the container leads through links; a token has none.
class TakingTokensBackBehindLinks : public TakingTokensBack {
 protected:
  void SetUp() override {
    TakingTokensBack::SetUp();
    ASSERT_EQ(::symlink(home.c_str(), linkedHome.c_str()), 0);
    auto provider = bundles.find("com.example.cellar.provider");
    provider->groups = {{"com.example.cellar", linkedHome + "/groups/com.example.cellar"}};
    bundles.put(*provider);
    bundles.tellOfChange();
  }
  const std::string linkedHome = directory.path() + "/linked";
  const std::string linkedStorage = linkedHome + "/groups/com.example.cellar/Docuvend Storage";
};

TEST_F(TakingTokensBackBehindLinks, CutsWhicheverWayTheDirectoryIsSpelled) {
  for (const std::string& spelling : {linkedStorage, storage, linkedHome + "/groups", linkedHome, home + "/groups"}) {
    for (const std::string& asked : {linkedStorage, storage}) {
      const std::string token = issued(asked + "/report.txt");
      takeBack(spelling);
      expectTakenBack(token, asked + " by " + spelling);
    }
  }
}

TEST_F(TakingTokensBackBehindLinks, CutsADirectoryThatIsGoneWithItsContainer) {
  const std::string token = issued(document);
  std::filesystem::rename(group, home + "/away");
  bundles.remove("com.example.cellar.provider");
  bundles.tellOfChange();
  takeBack(linkedStorage);
  std::filesystem::rename(home + "/away", group);
  auto provider = *bundles.find("com.example.other");
  provider.groups["com.example.cellar"] = group;
  bundles.put(provider);
  bundles.tellOfChange();
  expectTakenBack(token, "item");
}

TEST_F(TakingTokensBackBehindLinks, CutsBehindALinkThatAProviderPutInItsDirectorysPlace) {
  const std::string token = issued(document);
  std::filesystem::rename(storage, group + "/away");
  ASSERT_EQ(::symlink(outside.c_str(), storage.c_str()), 0);
  takeBack(linkedStorage);
  std::filesystem::remove(storage);
  std::filesystem::rename(group + "/away", storage);
  expectTakenBack(token, "item");
}

TEST_F(TakingTokensBack, CutsAContainerBelowTheDirectoryThatIsALinkOutOfIt) {
  const std::string elsewhere = directory.path() + "/elsewhere";
  std::filesystem::rename(group, elsewhere);
  ASSERT_EQ(::symlink(elsewhere.c_str(), group.c_str()), 0);
  const std::string token = issued(document);
  takeBack(home + "/groups");
  expectTakenBack(token, "item");
}

TEST_F(TakingTokensBack, TakesBackWhatWasGainedByRedeeming) {
  const QXAuditToken another = peers.add(confined("com.example.editor", "2"));
  static_cast<void>(testing::redeem(*sandbox, another, issued(document), TokenUse::writing));
  ASSERT_TRUE(opens(issued(otherDocument)));
  ASSERT_TRUE(opens(issued(sibling)));
  ASSERT_EQ(testing::replaceItem(*sandbox, editor, issued(document), issued(sibling)), std::nullopt);
  ASSERT_EQ(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0);
  takeBack(storage);
  for (const QXAuditToken& peer : {editor, another}) {
    for (const std::string& path : {document, otherDocument}) {
      EXPECT_NE(sandbox->checkWithoutReport(peer, kQXSandboxFileWriteData, path), 0) << path;
    }
  }
  ASSERT_TRUE(opens(issued(document)));
  EXPECT_EQ(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0) << "a new token gives it again";
}

TEST_F(TakingTokensBack, HoldsInThisProcessWhenItCannotBeWritten) {
  const std::string token = issued(document);
  ASSERT_TRUE(opens(token));
  ASSERT_EQ(::chmod(directory.path().c_str(), 0500), 0);
  EXPECT_TRUE(sandbox->invalidateReadWriteExtensions(storage));
  expectTakenBack(token, "item");
  EXPECT_NE(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0);
  EXPECT_EQ(sandbox->issueReadWriteExtension(document), std::nullopt);
  EXPECT_TRUE(opens(issued(otherDocument)));
  ASSERT_EQ(::chmod(directory.path().c_str(), 0700), 0);
  EXPECT_TRUE(opens(issued(document)));
}

TEST_F(TakingTokensBack, RefusesToReplaceByOldTokens) {
  const std::string item = issued(document);
  const std::string by = issued(sibling);
  ASSERT_TRUE(opens(by));
  takeBack(storage);
  for (const auto& [first, second] : {std::pair(item, by), std::pair(item, issued(sibling)), std::pair(issued(document), by)}) {
    const auto error = testing::replaceItem(*sandbox, editor, first, second);
    ASSERT_TRUE(error);
    expectBadToken(*error);
  }
  EXPECT_EQ(read(document), "contents");
  EXPECT_EQ(testing::replaceItem(*sandbox, editor, issued(document), issued(sibling)), std::nullopt);
}

TEST_F(TakingTokensBack, LetsNoOldTokenOpenAnythingOnceItIsDone) {
  constexpr int kRounds = 30;
  constexpr int kRedeemers = 3;
  for (int round = 0; round < kRounds; ++round) {
    const std::string token = issued(document);
    std::atomic<bool> done{false};
    std::atomic<int> opened{0};
    std::atomic<int> openedLate{0};
    std::vector<std::thread> redeemers;
    for (int i = 0; i < kRedeemers; ++i) {
      redeemers.emplace_back([this, &token, &done, &opened, &openedLate, i] {
        for (bool last = false; !last;) {
          last = done.load();  // one more after that
          const auto result = testing::redeem(*sandbox, editor, token, i == 0 ? TokenUse::reading : TokenUse::writing);
          if (!std::holds_alternative<UniqueDescriptor>(result)) continue;
          ++opened;
          if (last) ++openedLate;
        }
      });
    }
    while (opened.load() < kRedeemers) std::this_thread::yield();
    takeBack(storage);
    // What was redeemed in between is gone from the ledger, and nobody enters more.
    const int verdict = sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document);
    done.store(true);
    for (auto& redeemer : redeemers) redeemer.join();
    EXPECT_NE(verdict, 0) << round;
    EXPECT_EQ(openedLate.load(), 0) << round;
    EXPECT_NE(sandbox->checkWithoutReport(editor, kQXSandboxFileWriteData, document), 0) << round;
  }
}

TEST_F(TakingTokensBack, LetsNoOldTokenChangeTheDirectoryOnceItIsDone) {
  constexpr int kRounds = 30;
  for (int round = 0; round < kRounds; ++round) {
    const std::string item = issued(document);
    const std::string by = issued(sibling);
    std::atomic<bool> stop{false};
    std::atomic<int> replaced{0};
    std::thread saver([this, &item, &by, &stop, &replaced] {
      while (!stop.load()) {
        static_cast<void>(testing::redeem(*sandbox, editor, by, TokenUse::writing));
        if (!testing::replaceItem(*sandbox, editor, item, by)) ++replaced;
      }
    });
    while (replaced.load() == 0) std::this_thread::yield();
    takeBack(storage);
    const bool siblingIsThere = std::filesystem::exists(sibling);
    struct stat before {};
    EXPECT_EQ(::stat(document.c_str(), &before), 0);
    for (int i = 0; i < 10; ++i) std::this_thread::yield();
    stop.store(true);
    saver.join();
    struct stat after {};
    EXPECT_EQ(::stat(document.c_str(), &after), 0);
    EXPECT_EQ(after.st_ino, before.st_ino) << round;
    EXPECT_EQ(std::filesystem::exists(sibling), siblingIsThere) << round;
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
