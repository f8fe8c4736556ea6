#include "platform/linux/sandbox/SandboxServicer.h"

#include <gtest/gtest.h>

#include <array>
#include <chrono>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "platform/fake/FakeLog.h"
#include "platform/fake/FakeRpc.h"
#include "platform/linux/sandbox/SandboxListenerDelegate.h"
#include "tests/sandbox/SandboxHouse.h"
#include "tests/sandbox/SystemCalls.h"

namespace docuvend::linux_platform {
namespace {

struct Redeemed {
  int answers = 0;
  std::optional<QXError> error;
  std::optional<QXDescriptor> file;
};

class SandboxServicerTest : public testing::SandboxHouse {
 protected:
  void SetUp() override {
    testing::SandboxHouse::SetUp();
    listener.setDelegate(delegate);
    listener.resume();
    connectAs(peers.add(confined("com.example.editor", "1")));
  }
  void connectAs(const QXAuditToken& token) {
    connection = fake_platform::FakeRpcConnection::create();
    connection->setProcessIdentifier(4711);
    connection->setAuditToken(token);
    listener.connect(connection);
  }
  [[nodiscard]] QXData issued(const std::string& path) {
    const auto token = sandbox.issueReadWriteExtension(path);
    EXPECT_TRUE(token) << path;
    return QXData::fromText(token.value_or(""));
  }
  Redeemed redeem(std::optional<QXData> token, std::optional<bool> forWriting) {
    Redeemed heard;
    QXRemote<QXSandboxRedemption>(connection->peer())
        .call<&QXSandboxRedemption::redeemToken>(std::move(token), forWriting,
                                                 [&heard](std::optional<QXError> error, std::optional<QXDescriptor> file) {
                                                   ++heard.answers;
                                                   heard.error = std::move(error);
                                                   heard.file = std::move(file);
                                                 });
    EXPECT_EQ(heard.answers, 1);
    return heard;
  }
  // Its answer comes from a thread that waits for the disk.
  std::future<std::optional<QXError>> replacing(std::optional<QXData> item, std::optional<QXData> by) {
    const auto answer = std::make_shared<std::promise<std::optional<QXError>>>();
    QXRemote<QXSandboxRedemption>(connection->peer())
        .call<&QXSandboxRedemption::replaceItemWithToken>(std::move(item), std::move(by),
                                                          [answer](std::optional<QXError> error) { answer->set_value(std::move(error)); });
    return answer->get_future();
  }
  std::optional<QXError> replace(std::optional<QXData> item, std::optional<QXData> by) {
    return replacing(std::move(item), std::move(by)).get();
  }
  static void expectError(const std::optional<QXError>& error, SandboxErrorCode code) {
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, kQXSandboxErrorDomain);
    EXPECT_EQ(error->code, static_cast<std::int64_t>(code)) << error->description();
  }

  static std::vector<fake_platform::FakeLogEntry> refusals(const std::string& why) {
    return {{QXLogType::defaultType, "[NOTICE] Refusing a sandbox token from PID 4711: QXSandboxErrorDomain 1: " + why}};
  }

  LinuxSandbox sandbox{loadedSession(), bundles, peers};
  const std::shared_ptr<SandboxListenerDelegate> delegate = std::make_shared<SandboxListenerDelegate>(sandbox, log.defaultLog());
  fake_platform::FakeRpcListener listener;
  std::shared_ptr<fake_platform::FakeRpcConnection> connection;
};

TEST_F(SandboxServicerTest, HandsOutTheOpenFile) {
  const Redeemed reading = redeem(issued(document), false);
  EXPECT_EQ(reading.error, std::nullopt);
  ASSERT_TRUE(reading.file);
  std::array<char, 16> buffer{};
  EXPECT_EQ(::pread(reading.file->number, buffer.data(), buffer.size(), 0), 8);
  EXPECT_EQ(std::string(buffer.data(), 8), "contents");
  EXPECT_EQ(::pwrite(reading.file->number, "x", 1, 0), -1);
  EXPECT_EQ(::pwrite(redeem(issued(document), std::nullopt).file->number, "x", 1, 0), -1) << "an absent answer is no";
  EXPECT_EQ(::pwrite(redeem(issued(document), true).file->number, "C", 1, 0), 1);
  EXPECT_EQ(testing::read(document), "Contents");
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(SandboxServicerTest, ReplacesAnItemByItsSibling) {
  const Redeemed sibling = redeem(issued(this->sibling), true);
  ASSERT_TRUE(sibling.file);
  ASSERT_EQ(::pwrite(sibling.file->number, "saved", 5, 0), 5);
  EXPECT_EQ(replace(issued(document), issued(this->sibling)), std::nullopt);
  EXPECT_EQ(testing::read(document), "saved");
  expectError(replace(issued(document), issued(this->sibling)), SandboxErrorCode::gone);
}

TEST_F(SandboxServicerTest, RefusesABadTokenAndLogsThatOnceWithoutIt) {
  QXData bad = issued(document);
  bad.bytes[30] ^= 1U;
  const Redeemed refused = redeem(bad, false);
  expectError(refused.error, SandboxErrorCode::badToken);
  EXPECT_FALSE(refused.file);
  expectError(redeem(std::nullopt, true).error, SandboxErrorCode::badToken);
  expectError(replace(bad, issued(sibling)), SandboxErrorCode::badToken);
  expectError(replace(issued(document), std::nullopt), SandboxErrorCode::badToken);
  EXPECT_EQ(log.entries(), refusals("the token is not valid"));
  EXPECT_TRUE(redeem(issued(document), false).file) << "the daemon goes on";
}

TEST_F(SandboxServicerTest, ServesEveryBearerOfThisUser) {
  const QXData token = issued(document);
  connectAs(peers.add(thisProcess(Standing::unconfined)));
  EXPECT_TRUE(redeem(token, true).file);
  connectAs(peers.add(confined("com.example.other", "9")));
  EXPECT_TRUE(redeem(token, true).file);
}

TEST_F(SandboxServicerTest, RefusesATokenThatWasTakenBackAndServesItsSuccessor) {
  const QXData token = issued(document);
  const Redeemed before = redeem(token, true);
  EXPECT_EQ(sandbox.invalidateReadWriteExtensions(storage), std::nullopt);
  expectError(redeem(token, false).error, SandboxErrorCode::badToken);
  EXPECT_EQ(::pwrite(before.file->number, "C", 1, 0), 1) << "an open file stays open";
  EXPECT_TRUE(redeem(issued(document), true).file);
}

TEST_F(SandboxServicerTest, ServesNobodyElse) {
  PeerIdentity stranger = thisProcess(Standing::unconfined);
  ++stranger.uid;
  QXAuditToken unknown;
  unknown.bytes.fill(0xFF);
  for (const QXAuditToken& token : {QXAuditToken{}, unknown, peers.add(thisProcess(Standing::nobody)), peers.add(std::move(stranger))}) {
    connectAs(token);
    expectError(redeem(issued(document), false).error, SandboxErrorCode::notPermitted);
    expectError(redeem(issued(sibling), true).error, SandboxErrorCode::notPermitted);
    EXPECT_FALSE(std::filesystem::exists(sibling));
    expectError(replace(issued(document), issued(sibling)), SandboxErrorCode::notPermitted);
  }
}

// A disk that has taken up a flush and does not end it, until it is let go.
class StuckDisk {
 public:
  StuckDisk() {
    calls_.beforeFlush = [this](int) {
      if (std::exchange(hasFlushed_, true)) return;
      reached_.set_value();
      static_cast<void>(go_.wait_for(kPatience));
    };
  }
  StuckDisk(const StuckDisk&) = delete;
  StuckDisk& operator=(const StuckDisk&) = delete;
  ~StuckDisk() = default;

  [[nodiscard]] bool awaitFlush() { return reached_.get_future().wait_for(kPatience) == std::future_status::ready; }
  void letGo() { let_.set_value(); }

 private:
  static constexpr std::chrono::seconds kPatience{60};
  std::promise<void> reached_;
  std::promise<void> let_;
  const std::shared_future<void> go_ = let_.get_future().share();
  bool hasFlushed_ = false;  // only on the thread that flushes
  testing::SystemCalls calls_;
};

TEST_F(SandboxServicerTest, ServesTheNextRequestsWhileAReplacementWaitsForTheDisk) {
  ASSERT_EQ(::pwrite(redeem(issued(sibling), true).file->number, "saved", 5, 0), 5);
  StuckDisk disk;
  auto replacement = replacing(issued(document), issued(sibling));
  ASSERT_TRUE(disk.awaitFlush());
  EXPECT_TRUE(redeem(issued(document), true).file);
  QXData bad = issued(document);
  bad.bytes[30] ^= 1U;
  expectError(replace(bad, issued(sibling)), SandboxErrorCode::badToken);
  EXPECT_EQ(testing::read(document), "contents");
  disk.letGo();
  EXPECT_EQ(replacement.get(), std::nullopt);
  EXPECT_EQ(testing::read(document), "saved");
}

TEST_F(SandboxServicerTest, MakesAnotherBundlesReplacementWhileOneWaitsForTheDisk) {
  const std::string another = storage + "/another.txt";
  testing::write(another, "contents");
  ASSERT_TRUE(redeem(issued(storage + "/.another.txt"), true).file);
  ASSERT_EQ(::pwrite(redeem(issued(sibling), true).file->number, "saved", 5, 0), 5);
  StuckDisk disk;
  auto replacement = replacing(issued(document), issued(sibling));
  ASSERT_TRUE(disk.awaitFlush());
  const auto waiting = connection;
  connectAs(peers.add(confined("com.example.other", "9")));
  EXPECT_EQ(replace(issued(another), issued(storage + "/.another.txt")), std::nullopt);
  EXPECT_EQ(testing::read(another), "");
  EXPECT_EQ(testing::read(document), "contents") << "it has not waited for that";
  disk.letGo();
  EXPECT_EQ(replacement.get(), std::nullopt);
}

TEST_F(SandboxServicerTest, MakesAReplacementThoughItsCallerLeavesMeanwhile) {
  ASSERT_EQ(::pwrite(redeem(issued(sibling), true).file->number, "saved", 5, 0), 5);
  StuckDisk disk;
  auto servicer = std::make_shared<SandboxServicer>(sandbox, log.defaultLog(), connection);
  const auto answer = std::make_shared<std::promise<std::optional<QXError>>>();
  servicer->replaceItemWithToken(issued(document), issued(sibling),
                                 [answer](std::optional<QXError> error) { answer->set_value(std::move(error)); });
  ASSERT_TRUE(disk.awaitFlush());
  servicer.reset();
  connection.reset();
  disk.letGo();
  EXPECT_EQ(answer->get_future().get(), std::nullopt);
  EXPECT_EQ(testing::read(document), "saved");
}

TEST_F(SandboxServicerTest, LogsATokenThatIsTakenBackBeforeTheDiskHasTheReplacement) {
  ASSERT_TRUE(redeem(issued(sibling), true).file);
  StuckDisk disk;
  auto replacement = replacing(issued(document), issued(sibling));
  ASSERT_TRUE(disk.awaitFlush());
  EXPECT_EQ(sandbox.invalidateReadWriteExtensions(storage), std::nullopt);
  disk.letGo();
  expectError(replacement.get(), SandboxErrorCode::badToken);
  EXPECT_EQ(log.entries(), refusals("the token was taken back"));
}

TEST_F(SandboxServicerTest, IsNobodyOnceItsConnectionIsGone) {
  const auto gone = std::make_shared<SandboxServicer>(sandbox, log.defaultLog(), /*connection=*/std::weak_ptr<QXRpcConnection>());
  SandboxServicer& servicer = *gone;
  std::optional<QXError> heard;
  servicer.redeemToken(issued(document), true, [&heard](std::optional<QXError> error, std::optional<QXDescriptor> file) {
    heard = std::move(error);
    EXPECT_FALSE(file);
  });
  expectError(heard, SandboxErrorCode::notPermitted);
  servicer.redeemToken(issued(document), true, /*completionHandler=*/{});
  servicer.replaceItemWithToken(issued(document), issued(sibling), /*completionHandler=*/{});
}

}  // namespace
}  // namespace docuvend::linux_platform
