// Stopping the daemon, and starving others of it: an application or a provider takes more than its part, and everybody else is served as
// if it were not there.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>

#include "common/DVErrors.h"
#include "platform/linux/coordination/AccessSession.h"
#include "platform/linux/coordination/ChangeNotices.h"
#include "platform/linux/extension_host/ExtensionTimes.h"
#include "platform/linux/rpc/ConnectionLimiter.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/rpc_errors.h"
#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {
namespace {

using linux_platform::AccessSession;
using linux_platform::ChangeNotices;
using linux_platform::FileCoordinationErrorCode;
using linux_platform::kFileCoordinationServiceName;
using linux_platform::kMaximumCallsPerPeer;
using linux_platform::kMaximumConnectionsPerPeer;
using linux_platform::kMaximumPendingCalls;
using linux_platform::kSandboxServiceName;
using ::testing::ElementsAre;

const ProviderID kTricksterID{kTrickster};

class Pressure : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    installAttacker(trueEntry("com.orvane.docuvend.acl-write"));
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    house_.installTrickster();
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    house_.startDaemon();
    letterString_ = house_.granted(letter_, kEditor);
  }

  // An application opens a document, and a program takes a turn at it.
  void expectOthersAreServed() const {
    EXPECT_EQ(house_.confined(kEditor, {"show", letterString_}).output, "Dear all\n");
    const Ending read = house_.ctl({"read", letter_});
    EXPECT_EQ(read.output, "Dear all\n") << read.errors;
  }
  [[nodiscard]] QXURL item(const std::string& name) const {
    return QXURL::fileURL(house_.storage(kTrickster) + "/" + name, QXURLKind::file);
  }
  [[nodiscard]] std::optional<QXError> grantItem(const std::string& name) const {
    return errorOf(house_.client(kPicker)->ask<&DVDaemon::extendSandboxForFileURL>(item(name), kTricksterID, ConsumerID{kAttacker}));
  }

  std::string letter_;
  std::string letterString_;
};

TEST_F(Pressure, AnApplicationHasItsNumberOfConnectionsHoweverManyItsProcessesAre) {
  const std::size_t half = kMaximumConnectionsPerPeer / 2;
  const auto first = holdingAttacker({"crowd", kDVServiceName, std::to_string(half)}, "first");
  const auto second = holdingAttacker({"crowd", kSandboxServiceName, std::to_string(half + 7)}, "second");
  expectOthersAreServed();
  EXPECT_THAT(attack({"crowd", kFileCoordinationServiceName, "1"}), ElementsAre("0 served, 1 refused"));
  const std::string served = std::to_string(half) + " served, ";
  EXPECT_THAT(letGo(*first, "first"), ElementsAre(served + "0 refused"));
  EXPECT_THAT(letGo(*second, "second"), ElementsAre(served + "7 refused"));
  // The places come back.
  eventually("it is served again", [this] {
    return attack({"crowd", kDVServiceName, "1"}) == std::vector<std::string>{"1 served, 0 refused"};
  });
}

TEST_F(Pressure, GarbageEndsItsConnectionAndNothingElse) {
  for (const char* service : {kDVServiceName, kSandboxServiceName, kFileCoordinationServiceName}) {
    EXPECT_THAT(attack({"garble", service, "crowd", service, "1"}), ElementsAre("9 of 9 ended", "1 served, 0 refused")) << service;
  }
  expectOthersAreServed();
  EXPECT_TRUE(house_.daemon().isRunning());
}

TEST_F(Pressure, HalfFramesOccupyTheirOwnConnectionsAlone) {
  const auto attacker = holdingAttacker({"half", kDVServiceName, "20", "half", kFileCoordinationServiceName, "20"}, "halves");
  expectOthersAreServed();
  EXPECT_THAT(letGo(*attacker, "halves"), ElementsAre("ok", "ok"));
}

TEST_F(Pressure, TurnsThatAreNeverEndedAreTheirOwnersAndOfALimitedNumber) {
  ASSERT_THAT(attack({"terminal"}), ElementsAre("none"));  // now its container is there
  const std::string own = house_.container(kAttacker) + "/own";
  writeFile(own, "");
  constexpr std::size_t kMost = AccessSession::kMaximumAccesses;
  const std::string tooMany = std::string(linux_platform::kQXFileCoordinationErrorDomain) + " " +
                              std::to_string(static_cast<int>(FileCoordinationErrorCode::tooManyAccesses));
  const auto attacker = holdingAttacker({"turns", own, std::to_string(kMost + 1), "turns", letter_, "1"}, "turns");
  expectOthersAreServed();
  EXPECT_EQ(house_.ctl({"write", letter_}, "Dear nobody\n").status, 0) << "nor is a writer of another file held up";
  const auto lines = letGo(*attacker, "turns");
  ASSERT_EQ(lines.size(), 2U);
  EXPECT_EQ(lines[0], std::to_string(kMost) + ", then " + tooMany);
  EXPECT_TRUE(lines[1].starts_with("0, then " + std::string(linux_platform::kQXFileCoordinationErrorDomain) + " " +
                                   std::to_string(static_cast<int>(FileCoordinationErrorCode::notPermitted))))
      << lines[1];
}

TEST_F(Pressure, RequestsThatAProviderNeverAnswersAreOfALimitedNumberAndHoldUpNobodyElse) {
  ASSERT_EQ(grantItem("stuck"), std::nullopt);
  const std::string path = item("stuck").fileSystemPath();
  const std::string tooMany = "QXRpcErrorDomain " + std::to_string(static_cast<int>(QXRpcErrorCode::tooManyCalls));
  const std::string all = std::to_string(kMaximumPendingCalls + 1);
  const auto attacker = holdingAttacker(
      {"start", path, kTrickster, kAttacker, all, "start-silently", path, kTrickster, kAttacker, "1", "crowd", kDVServiceName, "1"},
      "pile");
  ASSERT_TRUE(house_.awaitLog("com.orvane.trickster: is stuck"));
  expectOthersAreServed();
  EXPECT_EQ(grantItem("other"), std::nullopt) << "nor may others ask that provider";
  const auto lines = letGo(*attacker, "pile");
  ASSERT_EQ(lines.size(), 3U);
  EXPECT_TRUE(lines[0].starts_with(std::to_string(kMaximumCallsPerPeer + 1) + ": " + tooMany)) << lines[0];
  EXPECT_TRUE(lines[1].starts_with("1: " + tooMany)) << "over another connection: " << lines[1];
  EXPECT_EQ(lines[2], "1 served, 0 refused");
  const auto again = attack({"start", path, kTrickster, kAttacker, "1"});
  ASSERT_EQ(again.size(), 1U);
  EXPECT_TRUE(again[0].starts_with("1: " + tooMany)) << "what it left behind is still asked for: " << again[0];
  writeFile(house_.container(kTrickster) + "/free", "");
  eventually("it may ask again", [this, &path] {
    return attack({"start", path, kTrickster, kAttacker, "1"}) == std::vector<std::string>{"answered"};
  });
}

TEST_F(Pressure, RequestsWhoseAnswersNobodyWantsCountLikeOthers) {
  ASSERT_EQ(grantItem("stuck"), std::nullopt);
  const std::string path = item("stuck").fileSystemPath();
  const auto attacker =
      holdingAttacker({"start-silently", path, kTrickster, kAttacker, std::to_string(kMaximumPendingCalls + 1)}, "silence");
  ASSERT_TRUE(house_.awaitLog("com.orvane.trickster: is stuck"));
  EXPECT_EQ(grantItem("other"), std::nullopt);
  const auto lines = letGo(*attacker, "silence");
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_TRUE(lines[0].starts_with(std::to_string(kMaximumCallsPerPeer + 1) + ": QXRpcErrorDomain 5")) << lines[0];
  writeFile(house_.container(kTrickster) + "/free", "");
}

// Neither one document that is written again and again nor many documents.
TEST_F(Pressure, WritesThatASlowProviderIsToldOfLeaveRoomForEverybodyElse) {
  constexpr int kMost = ChangeNotices::kMaximumNoticesUnderWay;
  constexpr int kFiles = 2 * kMost;
  constexpr int kWrites = kMaximumPendingCalls + kMost;
  const std::string tellings = "[INFO] QXFileCoordinator is telling us the item at URL ";
  const auto told = [this, &tellings](const std::string& name) {
    return house_.loggedBeginning(tellings + item(name).absoluteString() + " was changed by writer ID ");
  };
  const std::string one = item("laggard-alone").fileSystemPath();
  EXPECT_THAT(attack({"scribble", one, kTrickster, kAttacker, "1", std::to_string(kWrites)}), ElementsAre(std::to_string(kWrites)));
  EXPECT_EQ(told("laggard-alone0"), 1);
  const std::string many = item("laggard").fileSystemPath();
  EXPECT_THAT(attack({"scribble", many, kTrickster, kAttacker, std::to_string(kFiles), "2"}), ElementsAre(std::to_string(2 * kFiles)));
  EXPECT_EQ(house_.loggedBeginning(tellings), kMost);
  expectOthersAreServed();
  EXPECT_EQ(grantItem("other"), std::nullopt) << "that provider is there for others";
  EXPECT_EQ(house_.ctl({"write", item("theirs").fileSystemPath()}, "new").status, 0);
  EXPECT_EQ(told("theirs"), 1) << "and hears of what they write";

  writeFile(house_.container(kTrickster) + "/free", "");
  eventually("it has been told of every document", [&told] {
    for (int file = 0; file < kFiles; ++file) {
      if (told("laggard" + std::to_string(file)) == 0) return false;
    }
    return true;
  });
  eventually("and of the last write of the first one", [&told] { return told("laggard-alone0") == 2; });
}

// All of them take longer than one answer may.
TEST_F(Pressure, AProviderThatIsAskedForManyNamesAtOnceIsNotEndedWhileItAnswersOneAfterAnother) {
  ASSERT_EQ(grantItem("honest"), std::nullopt);
  const auto before = house_.processesOf("docuvend-trickster");
  ASSERT_EQ(before.size(), 1U);
  const auto began = std::chrono::steady_clock::now();
  EXPECT_THAT(attack({"name", item("weary").fileSystemPath(), std::to_string(kMaximumCallsPerPeer)}), ElementsAre("ok"));
  EXPECT_GT(std::chrono::steady_clock::now() - began, linux_platform::ExtensionTimes().answerLimit);
  EXPECT_EQ(house_.processesOf("docuvend-trickster"), before);
  EXPECT_EQ(house_.loggedContaining(" in time."), 0);
  EXPECT_EQ(grantItem("honest"), std::nullopt);
}

// Its process looks for itself when it is set up; nothing is told it twice.
TEST_F(Pressure, AProviderThatAnApplicationMadeEndIsToldOfTheNextWriteAndOfNoneTwice) {
  ASSERT_EQ(grantItem("bomb"), std::nullopt);
  const auto told = [this](const std::string& name) {
    return house_.loggedBeginning("[INFO] QXFileCoordinator is telling us the item at URL " + item(name).absoluteString() +
                                  " was changed by");
  };
  EXPECT_EQ(house_.ctl({"write", item("laggard").fileSystemPath()}, "new").status, 0);
  EXPECT_EQ(house_.ctl({"write", item("heard").fileSystemPath()}, "new").status, 0);
  const auto outcomes = attack({"start", item("bomb").fileSystemPath(), kTrickster, kAttacker, "1"});
  ASSERT_EQ(outcomes.size(), 1U);
  EXPECT_TRUE(house_.awaitLog("[ERROR] Cannot tell extension " + kTrickster + " that item at URL " + item("laggard").absoluteString()));
  EXPECT_EQ(house_.ctl({"write", item("heard").fileSystemPath()}, "newer").status, 0);
  eventually("it is told of the next write", [&told] { return told("heard") == 2; });
  EXPECT_EQ(told("laggard"), 1);
  writeFile(house_.container(kTrickster) + "/free", "");
  expectOthersAreServed();
}

class FaultyProvider : public Pressure, public ::testing::WithParamInterface<const char*> {};

// Whoever asked is told, and the next request finds a new process.
TEST_P(FaultyProvider, HarmsItself) {
  ASSERT_EQ(grantItem("honest"), std::nullopt);
  const auto before = house_.processesOf("docuvend-trickster");
  ASSERT_EQ(before.size(), 1U);
  const auto error = grantItem(GetParam());
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, kDVErrorDomain);
  EXPECT_EQ(error->code, static_cast<std::int64_t>(DVErrorCode::pluginOperationFailed));
  eventually("it is ended", [this, &before] {
    const auto now = house_.processesOf("docuvend-trickster");
    return now.empty() || now != before;
  });
  expectOthersAreServed();
  eventually("it works again", [this] { return grantItem("honest") == std::nullopt; });
}

// It closes its connection, sends what is no frame, answers what nobody asked, crashes.
INSTANTIATE_TEST_SUITE_P(OneThatSays, FaultyProvider, ::testing::Values("leave", "garbage", "unasked", "abort"),
                         [](const auto& info) { return std::string(info.param); });

}  // namespace
}  // namespace docuvend::tests
