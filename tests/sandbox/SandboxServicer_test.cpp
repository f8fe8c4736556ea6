#include "platform/linux/sandbox/SandboxServicer.h"

#include <gtest/gtest.h>

#include <array>
#include <chrono>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/fake/FakeLog.h"
#include "platform/fake/FakeRpc.h"
#include "platform/linux/sandbox/SandboxListenerDelegate.h"
#include "tests/sandbox/SandboxHouse.h"
#include "tests/sandbox/SystemCalls.h"

namespace docuvend::linux_platform {
namespace {

struct Redeemed {
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
    if (connection) earlier.push_back(connection);
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
  std::future<Redeemed> redeeming(std::optional<QXData> token, std::optional<bool> forWriting) {
    const auto answer = std::make_shared<std::promise<Redeemed>>();
    QXRemote<QXSandboxRedemption>(connection->peer())
        .call<&QXSandboxRedemption::redeemToken>(std::move(token), forWriting,
                                                 [answer](std::optional<QXError> error, std::optional<QXDescriptor> file) {
                                                   answer->set_value({std::move(error), std::move(file)});
                                                 });
    return answer->get_future();
  }
  Redeemed redeem(std::optional<QXData> token, std::optional<bool> forWriting) { return redeeming(std::move(token), forWriting).get(); }
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
  std::vector<std::shared_ptr<fake_platform::FakeRpcConnection>> earlier;  // they stay, for they may be answered yet
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

constexpr std::chrono::seconds kNow{0};

// Whether it is answered already.
template <class Answer>
bool isReady(std::future<Answer>& answer) {
  return answer.wait_for(kNow) == std::future_status::ready;
}

// A document is written without end, and something is to be done to it or to its directory that needs the lock.
class LockedStorage : public SandboxServicerTest {
 protected:
  void SetUp() override {
    SandboxServicerTest::SetUp();
    testing::write(another_, "another");
    testing::write(elsewhere_, "elsewhere");
  }
  [[nodiscard]] QXData newSiblingIn(const std::string& directory, const std::string& name) {
    testing::write(directory + "/" + name, "");
    return issued(directory + "/." + name);
  }
  void connectAsBundle(const std::string& bundle) { connectAs(peers.add(confined(bundle, bundle))); }

  const std::string another_ = storage + "/another.txt";
  const std::string elsewhere_ = otherGroup + "/elsewhere.txt";
};

TEST_F(LockedStorage, KeepsNobodyFromWhatIsThere) {
  testing::LockedDirectory locked(storage);
  auto making = redeeming(issued(sibling), true);
  ASSERT_TRUE(locked.awaitWaiting(1));
  auto there = redeeming(issued(document), true);
  EXPECT_TRUE(isReady(there)) << "the same connection is served at once";
  EXPECT_TRUE(there.get().file);
  EXPECT_FALSE(isReady(making));
  locked.unlock();
  EXPECT_TRUE(making.get().file);
}

TEST_F(LockedStorage, HoldsUpNoThreadThatServesWhenAFilesModeIsGivenBack) {
  ASSERT_EQ(::chmod(document.c_str(), 0), 0);
  testing::LockedDirectory locked(storage);
  auto redemption = redeeming(issued(document), true);
  ASSERT_TRUE(locked.awaitWaiting(1));
  auto there = redeeming(issued(another_), true);
  EXPECT_TRUE(isReady(there));
  EXPECT_FALSE(isReady(redemption));
  locked.unlock();
  EXPECT_TRUE(redemption.get().file);
}

TEST_F(LockedStorage, HoldsUpNeitherOtherBundlesNorTheUnconfinedElsewhere) {
  ASSERT_TRUE(redeem(issued(sibling), true).file);
  std::vector<std::future<Redeemed>> held;
  testing::LockedDirectory locked(storage);
  auto replacement = replacing(issued(document), issued(sibling));
  // More honest applications than there are threads save other documents in the same directory.
  for (std::size_t i = 0; i <= DiskWork::kMostThreads; ++i) {
    connectAsBundle("com.example.saver" + std::to_string(i));
    held.push_back(redeeming(newSiblingIn(storage, std::to_string(i)), true));
  }
  ASSERT_TRUE(locked.awaitWaiting(DiskWork::kMostThreadsOfDirectory));
  connectAsBundle("com.example.other");
  EXPECT_TRUE(redeem(newSiblingIn(otherGroup, "others"), true).file);
  EXPECT_EQ(replace(issued(otherGroup + "/others"), issued(otherGroup + "/.others")), std::nullopt);
  connectAs(peers.add(thisProcess(Standing::unconfined)));
  EXPECT_TRUE(redeem(newSiblingIn(otherGroup, "unconfined"), true).file);
  EXPECT_FALSE(isReady(replacement));
  locked.unlock();
  EXPECT_EQ(replacement.get(), std::nullopt);
  for (auto& redemption : held) EXPECT_TRUE(redemption.get().file);
}

TEST_F(LockedStorage, KeepsTheOrderInWhichOneBundleAsksForASiblingAndItsReplacement) {
  testing::LockedDirectory locked(storage);
  auto making = redeeming(issued(sibling), true);
  auto replacement = replacing(issued(document), issued(sibling));
  ASSERT_TRUE(locked.awaitWaiting(1));
  locked.unlock();
  EXPECT_TRUE(making.get().file);
  EXPECT_EQ(replacement.get(), std::nullopt);
  EXPECT_EQ(testing::read(document), "");
}

TEST_F(LockedStorage, IsRedeemedForATokenThatWasTakenBackMeanwhileByNobody) {
  const auto item = issued(document);
  const auto by = issued(sibling);
  testing::LockedDirectory locked(storage);
  auto making = redeeming(by, true);
  ASSERT_TRUE(locked.awaitWaiting(1));
  EXPECT_EQ(sandbox.invalidateReadWriteExtensions(otherGroup), std::nullopt) << "that concerns nothing under way";
  auto revocation = std::async(std::launch::async, [this] { return sandbox.invalidateReadWriteExtensions(storage); });
  while (!redeem(item, false).error) std::this_thread::yield();
  locked.unlock();
  EXPECT_EQ(revocation.get(), std::nullopt) << "it has waited for that";
  const Redeemed redeemed = making.get();
  expectError(redeemed.error, SandboxErrorCode::badToken);
  EXPECT_FALSE(redeemed.file);
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
