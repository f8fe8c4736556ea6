// What lies at an item's path when it is granted, and what lies there when its token is used: only a regular file with one name, below its
// provider's storage, without a link on the way, is ever opened for anybody. The provider here takes everything for an item.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "common/DVErrors.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using linux_platform::QXSandboxRedemption;
using linux_platform::SandboxErrorCode;
namespace fs = std::filesystem;

const ProviderID kTricksterID{kTrickster};
const ConsumerID kPickerID{kPicker};

class BadFiles : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kPicker);
    house_.installTrickster();
    house_.startDaemon();
    caller_ = house_.client(kPicker);
    redeemer_ = house_.client(std::nullopt, linux_platform::kSandboxServiceName);
    storage_ = house_.storage(kTrickster);
    secret_ = house_.home() + "/secret";
    writeFile(secret_, "secret");
  }

  struct Granted {
    std::optional<QXError> error;
    std::optional<QXData> token;
    std::optional<QXData> siblingToken;
  };
  Granted grant(const std::string& path) {
    const auto answer = caller_->ask<&DVDaemon::extendSandboxForFileURL>(QXURL::fileURL(path, QXURLKind::file), kTricksterID, kPickerID);
    if (const auto* undelivered = std::get_if<QXError>(&answer)) {
      ADD_FAILURE() << undelivered->description();
      return {*undelivered, std::nullopt, std::nullopt};
    }
    const auto& [error, token, siblingURL, siblingToken] = std::get<0>(answer);
    return {error, token, siblingToken};
  }

  // None: it was opened.
  std::optional<QXError> redeem(const std::optional<QXData>& token, bool forWriting = false) {
    return errorOf(redeemer_->ask<&QXSandboxRedemption::redeemToken>(token, forWriting));
  }
  void expectRefused(const std::optional<QXError>& error, SandboxErrorCode code) const {
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, linux_platform::kQXSandboxErrorDomain);
    EXPECT_EQ(error->code, static_cast<std::int64_t>(code)) << error->description();
  }

  // The grant is made (the provider says that it is an item), but nothing opens it.
  void expectNoToken(const std::string& name) {
    const Granted granted = grant(storage_ + "/" + name);
    EXPECT_EQ(granted.error, std::nullopt) << name;
    EXPECT_EQ(granted.token, std::nullopt) << name;
    EXPECT_TRUE(house_.answers());
  }

  // The token is for the file of that name, under whatever other name it was asked for.
  void expectTokenFor(const std::string& asked, const std::string& name) {
    const Granted granted = grant(storage_ + "/" + asked);
    EXPECT_EQ(granted.error, std::nullopt) << asked;
    EXPECT_EQ(redeem(granted.token), std::nullopt) << asked;
    EXPECT_EQ(house_.loggedContaining("for URL " + QXURL::fileURL(storage_ + "/" + asked, QXURLKind::file).absoluteString() + " "), 0)
        << asked;
    fs::rename(storage_ + "/" + name, storage_ + "/moved");
    EXPECT_NE(redeem(granted.token), std::nullopt) << asked;
    fs::rename(storage_ + "/moved", storage_ + "/" + name);
  }

  // A token for a file that is there, and which then becomes something else.
  QXData tokenFor(const std::string& name) {
    writeFile(storage_ + "/" + name, "contents");
    const Granted granted = grant(storage_ + "/" + name);
    EXPECT_EQ(granted.error, std::nullopt);
    EXPECT_EQ(redeem(granted.token), std::nullopt);
    fs::remove(storage_ + "/" + name);
    return granted.token.value_or(QXData{});
  }

  std::unique_ptr<Client> caller_;
  std::unique_ptr<Client> redeemer_;
  std::string storage_;
  std::string secret_;
};

TEST_F(BadFiles, APathThatLeadsOutWithDotsBelongsToNobody) {
  const Granted granted = grant(storage_ + "/../../../../../../secret");
  ASSERT_TRUE(granted.error);
  EXPECT_EQ(granted.error->code, static_cast<std::int64_t>(DVErrorCode::sandboxExtensionFailed));
  EXPECT_EQ(granted.token, std::nullopt);
}

TEST_F(BadFiles, APathWithDotsThatStaysInsideIsTheFileThatItLeadsTo) {
  fs::create_directory(storage_ + "/sub");
  writeFile(storage_ + "/file", "");
  expectTokenFor("sub/../file", "file");
  expectTokenFor("./file", "file");
}

TEST_F(BadFiles, ALinkToAFileOutsideBelongsToNobody) {
  fs::create_symlink(secret_, storage_ + "/link");
  const Granted granted = grant(storage_ + "/link");
  ASSERT_TRUE(granted.error);
  EXPECT_EQ(granted.error->code, static_cast<std::int64_t>(DVErrorCode::sandboxExtensionFailed));
}

TEST_F(BadFiles, ALinkInsideIsTheFileThatItLeadsTo) {
  writeFile(storage_ + "/file", "");
  fs::create_symlink("file", storage_ + "/link");
  expectTokenFor("link", "file");
  fs::create_directory(storage_ + "/sub");
  writeFile(storage_ + "/sub/file", "");
  fs::create_directory_symlink("sub", storage_ + "/way");
  expectTokenFor("way/file", "sub/file");
}

TEST_F(BadFiles, ADanglingLinkIsTheFileThatIsMissing) {
  fs::create_symlink("nothing", storage_ + "/link");
  const Granted granted = grant(storage_ + "/link");
  EXPECT_EQ(granted.error, std::nullopt);
  expectRefused(redeem(granted.token), SandboxErrorCode::gone);
}

TEST_F(BadFiles, ASecondHardLinkGetsNoToken) {
  fs::create_hard_link(secret_, storage_ + "/linked");
  expectNoToken("linked");
}

TEST_F(BadFiles, ADirectoryGetsNoToken) {
  fs::create_directory(storage_ + "/directory");
  expectNoToken("directory");
}

TEST_F(BadFiles, APipeGetsNoTokenAndNobodyWaitsForItsOtherEnd) {
  ASSERT_EQ(::mkfifo((storage_ + "/pipe").c_str(), 0600), 0);
  expectNoToken("pipe");
}

TEST_F(BadFiles, TheHiddenSiblingIsHeldToTheSameRules) {
  writeFile(storage_ + "/file", "");
  fs::create_symlink(secret_, storage_ + "/.file");
  const Granted granted = grant(storage_ + "/file");
  EXPECT_EQ(granted.error, std::nullopt);
  EXPECT_TRUE(granted.token);
  EXPECT_EQ(granted.siblingToken, std::nullopt);
}

TEST_F(BadFiles, ATokenDoesNotOpenWhatALinkInTheFilesPlaceLeadsTo) {
  const QXData token = tokenFor("file");
  fs::create_symlink(secret_, storage_ + "/file");
  expectRefused(redeem(token), SandboxErrorCode::notRegularFile);
  expectRefused(redeem(token, true), SandboxErrorCode::notRegularFile);
  EXPECT_EQ(contentsOf(secret_), "secret");
}

TEST_F(BadFiles, ATokenDoesNotOpenBelowALinkInADirectorysPlace) {
  fs::create_directory(storage_ + "/sub");
  writeFile(storage_ + "/sub/secret", "");
  const QXData token = grant(storage_ + "/sub/secret").token.value_or(QXData{});
  ASSERT_EQ(redeem(token), std::nullopt);
  fs::remove_all(storage_ + "/sub");
  fs::create_directory_symlink(house_.home(), storage_ + "/sub");
  expectRefused(redeem(token), SandboxErrorCode::notRegularFile);
}

TEST_F(BadFiles, ATokenDoesNotOpenAFileThatHasASecondName) {
  const QXData token = tokenFor("file");
  fs::create_hard_link(secret_, storage_ + "/file");
  expectRefused(redeem(token), SandboxErrorCode::notRegularFile);
}

TEST_F(BadFiles, ATokenDoesNotOpenADirectory) {
  const QXData token = tokenFor("file");
  fs::create_directory(storage_ + "/file");
  expectRefused(redeem(token), SandboxErrorCode::notRegularFile);
}

TEST_F(BadFiles, ATokenDoesNotWaitForAPipesOtherEnd) {
  const QXData token = tokenFor("file");
  ASSERT_EQ(::mkfifo((storage_ + "/file").c_str(), 0600), 0);
  expectRefused(redeem(token), SandboxErrorCode::notRegularFile);
  expectRefused(redeem(token, true), SandboxErrorCode::notRegularFile);
}

TEST_F(BadFiles, ATokenOfAFileThatIsGoneSaysSoAndIsGoodAgainWhenItIsBack) {
  const QXData token = tokenFor("file");
  expectRefused(redeem(token), SandboxErrorCode::gone);
  writeFile(storage_ + "/file", "back");
  EXPECT_EQ(redeem(token), std::nullopt);
}

TEST_F(BadFiles, AFileThatSomebodyHoldsALeaseOnIsBusyAtOnce) {
  writeFile(storage_ + "/file", "");
  const QXData token = grant(storage_ + "/file").token.value_or(QXData{});
  const linux_platform::UniqueDescriptor held(::open((storage_ + "/file").c_str(), O_RDONLY | O_CLOEXEC));
  // The holder is told of the other's wish by a signal, which must not end this process.
  ASSERT_EQ(::fcntl(held.get(), F_SETSIG, SIGURG), 0);
  ASSERT_EQ(::fcntl(held.get(), F_SETLEASE, F_WRLCK), 0);
  expectRefused(redeem(token), SandboxErrorCode::busy);
  ASSERT_EQ(::fcntl(held.get(), F_SETLEASE, F_UNLCK), 0);
  EXPECT_EQ(redeem(token), std::nullopt);
}

}  // namespace
}  // namespace docuvend::tests
