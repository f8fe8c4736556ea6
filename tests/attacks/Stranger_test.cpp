// Another user's processes: what the system's permissions keep from them, and what the daemon keeps from them where those do not.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <future>
#include <optional>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "tests/attacks/FileAttackTest.h"
#include "tests/attacks/StrangerTest.h"
#include "tests/attacks/TwoApplications.h"
#include "tests/attacks/handing.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using linux_platform::kFileCoordinationServiceName;
using linux_platform::kSandboxServiceName;
using linux_platform::UniqueDescriptor;
using ::testing::Each;
using ::testing::ElementsAre;

const std::string kRefused = "QXRpcErrorDomain 9";
const std::string kNotForNobody = "QXRpcErrorDomain 10";

class StrangersAttacks : public WithStranger<FileAttackTest> {
 protected:
  void SetUp() override {
    WithStranger::SetUp();
    if (IsSkipped() || HasFatalFailure()) return;
    letter_ = put("letter.txt");
    tokens_ = grant(url(letter_));
    ASSERT_TRUE(tokens_.item);
  }

  [[nodiscard]] std::string directory() const { return house_.runtime() + "/docuvend"; }
  [[nodiscard]] Lines sockets() const {
    return {house_.publicSocket(kDVServiceName), house_.publicSocket(kSandboxServiceName),
            house_.publicSocket(kFileCoordinationServiceName), house_.administrationSocket()};
  }
  // What the user opens who thinks little of it: not what the daemon made.
  void openTheHouse() const {
    const fs::path share = fs::path(house_.bundles()).parent_path();
    for (const fs::path& path : {fs::path(house_.home()).parent_path(), fs::path(house_.home()), fs::path(house_.runtime()),
                                 share.parent_path().parent_path(), share.parent_path(), share}) {
      openToAll(path);
    }
    writeFile(house_.home() + "/open", "for all");
    openToAll(house_.home() + "/open");
  }
  // That, and everything on the way to the daemon's sockets.
  void openTheSockets() const {
    openTheHouse();
    for (const std::string& path : {directory(), directory() + "/public"}) openWide(path);
    for (const std::string& path : sockets()) openWide(path);
  }
  std::string letter_;
  FileAttackTest::Tokens tokens_;
};

TEST_F(StrangersAttacks, NothingThatTheDaemonMadeCanBeReachedByAnotherUser) {
  openTheHouse();
  Lines words;
  for (const std::string& socket : sockets()) words.insert(words.end(), {"reach", socket});
  for (const std::string& file : {directory() + "/token-key", directory() + "/token-floors", directory() + "/lock", directory(),
                                  house_.accessControlFile(), letter_, diary(), house_.storage(kCellar), house_.container(kCellar)}) {
    ASSERT_TRUE(fs::exists(file)) << file;
    words.insert(words.end(), {"read", file});
  }
  EXPECT_THAT(stranger(words), ::testing::AllOf(::testing::SizeIs(words.size() / 2), Each("EACCES")));
  EXPECT_THAT(unconfined(words), ::testing::AllOf(::testing::SizeIs(words.size() / 2), Each("ok")));
  EXPECT_THAT(stranger({"read", house_.home() + "/open"}), ElementsAre("ok"));
}

TEST_F(StrangersAttacks, TheListTheKeyAndTheSocketsAreClosedAlsoWhereTheirDirectoriesAreNot) {
  openTheHouse();
  openWide(directory());
  openWide(fs::path(house_.accessControlFile()).parent_path().parent_path());
  openWide(fs::path(house_.accessControlFile()).parent_path());
  EXPECT_THAT(stranger({"read", directory() + "/token-key", "read", directory() + "/token-floors", "read", directory() + "/lock", "read",
                        house_.accessControlFile(), "put", house_.accessControlFile(), "x", "reach", house_.administrationSocket()}),
              ::testing::AllOf(::testing::SizeIs(6), Each("EACCES")));
  EXPECT_THAT(unconfined({"read", directory() + "/token-key", "read", house_.accessControlFile(), "reach", house_.administrationSocket()}),
              ElementsAre("ok", "ok", "ok"));
}

TEST_F(StrangersAttacks, WhoReachesTheSocketsIsNobodyThere) {
  openTheSockets();
  const std::string string = stringFor("letter.txt");
  const std::string token = tokens_.item->text();
  EXPECT_THAT(stranger({"reach", sockets()[0], "reach", sockets()[1], "reach", sockets()[2], "reach", sockets()[3]}),
              ElementsAre("ok", "ok", "ok", "ok"));
  const Lines acts = {"ask", string, "ask-as", kAttacker, string, "providers", "grant", letter_, kColluder, kAttacker};
  EXPECT_THAT(stranger(acts), ElementsAre(kNotForNobody, kRefused, kNotForNobody, kNotForNobody));
  EXPECT_THAT(stranger({"provide", letter_, kColluder, kAttacker, "pass-on", letter_, kAttacker, "redeem", token, "read", "redeem", token,
                        "write", "turn", "reading", url(letter_).absoluteString(), "holders", url(letter_).absoluteString()}),
              ::testing::AllOf(::testing::SizeIs(6), Each(kNotForNobody)));
  EXPECT_THAT(stranger({"knock", sockets()[3], "status", "knock", sockets()[3], "first-unlock"}), ElementsAre(kRefused, kRefused));
  EXPECT_EQ(house_.loggedContaining(" announces the first unlock."), 0);
  EXPECT_EQ(house_.loggedContaining(" declares itself to be com.orvane.attacker."), 0);
  EXPECT_GE(house_.loggedContaining(" is nobody: it belongs to another user."), 10);

  EXPECT_THAT(unconfined({"ask-as", kAttacker, string, "redeem", token, "read", "turn", "reading", url(letter_).absoluteString(), "knock",
                          sockets()[3], "first-unlock"}),
              ElementsAre("ok", "ok", "ok", "answered"));
}

TEST_F(StrangersAttacks, AStrangersConnectionInTheUsersHandsIsStillNobodys) {
  openTheSockets();
  // The process of this test acts for the picker already.
  ASSERT_EQ(errorOf(picker_->ask<&DVDaemon::extendSandboxForFileURL>(url(letter_), ProviderID{kColluder}, ConsumerID{kPicker})),
            std::nullopt);
  const std::string hatch = house_.home() + "/meeting/hatch";
  const auto listener = listenAt(hatch);
  openToAll(fs::path(hatch).parent_path());
  openWide(hatch);
  for (const std::optional<std::string>& declared : {std::optional<std::string>(), std::optional<std::string>(kPicker)}) {
    auto talking = std::async(std::launch::async, [this, &hatch] { return stranger({"connect", kDVServiceName, "hand-over", hatch}); });
    auto hand = acceptAt(listener);
    Client connection(takeOver(hand.get()), declared);
    EXPECT_EQ(told(errorOf(connection.ask<&DVDaemon::documentURLFromBookmarkableString>(stringFor("letter.txt")))),
              declared ? kRefused : kNotForNobody);
    hand.reset();
    EXPECT_THAT(talking.get(), ElementsAre("ok", "ok"));
  }
  // The rights over a connection are its maker's, whoever has it.
  auto talking = std::async(std::launch::async, [this, &hatch] {
    return stranger({"take-over", hatch, "ask-as", kPicker, stringFor("letter.txt")});
  });
  auto hand = acceptAt(listener);
  auto own = linux_platform::connectToSocket(house_.publicSocket(kDVServiceName));
  ASSERT_TRUE(handOver(hand.get(), std::get<UniqueDescriptor>(own).get()));
  EXPECT_THAT(talking.get(), ElementsAre("ok", "ok"));
}

TEST_F(StrangersAttacks, TheDaemonCanBeNeitherSignalledNorTracedNorLookedInto) {
  const std::string daemon = std::to_string(house_.daemon().pid());
  EXPECT_THAT(stranger({"signal", daemon, "trace", daemon, "read-memory", daemon, "take-descriptor", daemon}),
              ElementsAre("EPERM", "EPERM", "EPERM", "EPERM"));
  EXPECT_THAT(stranger({"read", "/proc/" + daemon + "/environ", "read", "/proc/" + daemon + "/mem", "read", "/proc/" + daemon + "/fd",
                        "read", "/proc/" + daemon + "/root"}),
              Each("EACCES"));
  EXPECT_THAT(
      stranger({"signal", "child", "trace", "child", "read-memory", "child", "take-descriptor", "child", "read", "/proc/self/environ"}),
      Each("ok"));
  EXPECT_TRUE(house_.answers());
}

}  // namespace
}  // namespace docuvend::tests
