// Whose turns are granted: confined applications with and without what opens the file, and what each caller is told of the others.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/coordination/AccessSession.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "tests/system/house/TurnTest.h"

namespace docuvend::tests {
namespace {

using linux_platform::AccessSession;
using linux_platform::FileCoordinationErrorCode;
using linux_platform::kFileCoordinationServiceName;
using linux_platform::kQXFileCoordinationErrorDomain;
using linux_platform::QXFileCoordination;
using ::testing::ElementsAre;
using ::testing::SizeIs;

constexpr const char* kNotPermitted = "QXFileCoordinationErrorDomain 2";

std::optional<FileCoordinationErrorCode> codeOf(const std::optional<QXError>& error) {
  if (!error || error->domain != kQXFileCoordinationErrorDomain) return std::nullopt;
  return static_cast<FileCoordinationErrorCode>(error->code);
}

class CoordinationCallers : public TurnTest {
 protected:
  void SetUp() override {
    TurnTest::SetUp();
    string_ = house_.granted(letter_.fileSystemPath(), kTurner);
    file_ = letter_.absoluteString();
  }
  [[nodiscard]] std::string confinedPlace(const std::string& name) const { return house_.container(kTurner) + "/" + name; }
  void expectNothingHappened() const {
    EXPECT_EQ(timesAsked(letter_), 0);
    EXPECT_EQ(timesTold(letter_), 0);
    EXPECT_TRUE(holders(letter_).empty());
  }

  std::string string_;
  std::string file_;
};

TEST_F(CoordinationCallers, AConfinedApplicationWithATokenTakesTurns) {
  const auto app = askConfined({"bring", string_, "reading", file_, "hold", "reader", "end", "writing", file_, "end"});
  awaitHolding(confinedPlace("reader"));
  EXPECT_EQ(contentsOf(letter_.fileSystemPath()), kLetterText) << "its provider has brought it";
  const auto writer = waiter("writing", letter_);
  letGo(confinedPlace("reader"));
  EXPECT_THAT(linesOf(*app), ElementsAre(file_, "ok", "ok", "ok", "ok", "ok"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok"));
  eventually("the provider has been told of both", [this] { return timesTold(letter_) == 2; });
}

TEST_F(CoordinationCallers, AConfinedWriterThatIsKilledInTheMiddleIsAChange) {
  const auto app = askConfined({"bring", string_, "writing", file_, "hold", "writer", "end"});
  awaitHolding(confinedPlace("writer"));
  const auto reader = waiter("reading", letter_);
  const auto processes = holdingProcesses(letter_);
  ASSERT_THAT(processes, SizeIs(1));
  ASSERT_EQ(::kill(processes.front(), SIGKILL), 0);
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok"));
  EXPECT_EQ(timesTold(letter_), 1);
  EXPECT_NE(app->wait().status, 0);
}

TEST_F(CoordinationCallers, AConfinedApplicationWithoutATokenIsRefusedThoughItHasTheGrant) {
  EXPECT_THAT(confinedAnswers({"reading", file_, "writing", file_, "holders", file_}),
              ElementsAre(kNotPermitted, kNotPermitted, kNotPermitted));
  expectNothingHappened();
}

TEST_F(CoordinationCallers, ATokenOpensNoOtherFilesTurn) {
  const QXURL other = url(house_.putInCloud("other.txt", "Another one.\n"));
  const std::string string = house_.granted(other.fileSystemPath(), kTurner);
  EXPECT_THAT(confinedAnswers({"bring", string, "reading", file_, "writing", file_, "holders", file_}),
              ElementsAre(other.absoluteString(), kNotPermitted, kNotPermitted, kNotPermitted));
  expectNothingHappened();
}

TEST_F(CoordinationCallers, TheHiddenSiblingsTokenOpensTheSiblingsTurnAndNotTheItems) {
  EXPECT_THAT(confinedAnswers({"bring-sibling", string_, "reading", file_, "writing", file_}),
              ElementsAre(::testing::_, kNotPermitted, kNotPermitted));
  expectNothingHappened();
}

TEST_F(CoordinationCallers, TheItemsTokenDoesNotOpenTheHiddenSiblingsTurn) {
  const std::string sibling = confinedAnswers({"bring-sibling", string_}).front();
  EXPECT_THAT(confinedAnswers({"bring", string_, "writing", sibling}), ElementsAre(file_, kNotPermitted));
  EXPECT_THAT(confinedAnswers({"bring-sibling", string_, "writing", sibling, "end"}), ElementsAre(sibling, "ok", "ok"));
}

TEST_F(CoordinationCallers, ATokenThatWasTakenBackOpensNothing) {
  const auto app = askConfined({"bring", string_, "hold", "app", "reading", file_, "writing", file_, "holders", file_});
  awaitHolding(confinedPlace("app"));
  const Ending revoked = house_.ctl({"revoke", kCellar, string_.substr(string_.find('/') + 1), kTurner});
  ASSERT_EQ(revoked.status, 0) << revoked.errors;
  letGo(confinedPlace("app"));
  EXPECT_THAT(linesOf(*app), ElementsAre(file_, "ok", kNotPermitted, kNotPermitted, kNotPermitted));
  expectNothingHappened();
}

TEST_F(CoordinationCallers, ATurnThatItHasStaysWhenItsTokenIsTakenBack) {
  const auto app = askConfined({"bring", string_, "writing", file_, "hold", "app", "end", "writing", file_});
  awaitHolding(confinedPlace("app"));
  const Ending revoked = house_.ctl({"revoke", kCellar, string_.substr(string_.find('/') + 1), kTurner});
  ASSERT_EQ(revoked.status, 0) << revoked.errors;
  EXPECT_THAT(holders(letter_), ElementsAre("writing holding"));
  letGo(confinedPlace("app"));
  EXPECT_THAT(linesOf(*app), ElementsAre(file_, "ok", "ok", "ok", kNotPermitted));
  EXPECT_EQ(timesTold(letter_), 1);
}

TEST_F(CoordinationCallers, OneThatBuiltTheSamePathInItsOwnDirectoriesIsRefused) {
  // In its own view the path is there, and it may write it: another file under the same name.
  EXPECT_THAT(confinedAnswers({"make", letter_.fileSystemPath(), "reading", file_, "writing", file_, "holders", file_}),
              ElementsAre("ok", kNotPermitted, kNotPermitted, kNotPermitted));
  expectNothingHappened();
}

TEST_F(CoordinationCallers, OneThatHasRedeemedTheTokenForWritingNeedsNotBringIt) {
  EXPECT_THAT(answers({"reading", file_, "end"}), ElementsAre("ok", "ok")) << "the contents have come, and with them another object";
  EXPECT_THAT(confinedAnswers({"reading", file_, "write", string_, "reading", file_, "end", "writing", file_, "end"}),
              ElementsAre(kNotPermitted, "ok", "ok", "ok", "ok", "ok"));
}

TEST_F(CoordinationCallers, AConfinedApplicationTakesTurnsAtItsOwnFilesAndNobodyIsAsked) {
  const std::string own = url(confinedPlace("own.txt")).absoluteString();
  EXPECT_THAT(confinedAnswers({"make", confinedPlace("own.txt"), "reading", own, "end", "writing", own, "holders", own, "end"}),
              ElementsAre("ok", "ok", "ok", "ok", "writing holding own", "ok"));
  EXPECT_EQ(house_.loggedContaining("QXFileCoordinator "), 0);
}

// --- What is told of the others

TEST_F(CoordinationCallers, AnUnconfinedCallerIsToldOfProcessesAndBundlesAndAConfinedOneIsNot) {
  const auto app = askConfined({"bring", string_, "reading", file_, "hold", "app", "holders", file_, "end"});
  awaitHolding(confinedPlace("app"));
  const auto reader = holder("reading", letter_, "reader");
  const auto writer = waiter("writing", letter_);
  const std::string appLine = std::string("reading holding process ") + kTurner;
  EXPECT_THAT(answers({"holders", file_}), ElementsAre(appLine + ", reading holding process, writing waiting process"));
  EXPECT_THAT(holdingProcesses(letter_), ElementsAre(::testing::_, reader->pid()));
  letGo(confinedPlace("app"));
  EXPECT_THAT(linesOf(*app), ElementsAre(file_, "ok", "ok", "reading holding own, reading holding, writing waiting", "ok"));
  letGo(place("reader"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok"));
}

TEST_F(CoordinationCallers, WhatIsMissingInARequestIsNamed) {
  const auto client = house_.client(std::nullopt, kFileCoordinationServiceName);
  const QXUUID access{{1}};
  const auto reading = [&](const std::optional<QXURL>& file, const std::optional<QXUUID>& id) {
    return codeOf(errorOf(client->ask<&QXFileCoordination::coordinateReadingItemAtURL>(file, std::nullopt, id, std::nullopt)));
  };
  EXPECT_EQ(reading(std::nullopt, access), FileCoordinationErrorCode::missingURL);
  EXPECT_EQ(reading(letter_, std::nullopt), FileCoordinationErrorCode::invalidAccessID);
  EXPECT_EQ(reading(url(house_.home() + "/none/file"), access), FileCoordinationErrorCode::noDirectory);
  expectNothingHappened();
  EXPECT_EQ(reading(letter_, access), std::nullopt);
  EXPECT_EQ(reading(letter_, access), FileCoordinationErrorCode::invalidAccessID) << "in use";
  EXPECT_EQ(codeOf(errorOf(client->ask<&QXFileCoordination::endAccess>(QXUUID{{2}}))), FileCoordinationErrorCode::invalidAccessID);
  // Another connection's access.
  EXPECT_EQ(codeOf(errorOf(house_.client(std::nullopt, kFileCoordinationServiceName)->ask<&QXFileCoordination::endAccess>(access))),
            FileCoordinationErrorCode::invalidAccessID);
  EXPECT_EQ(errorOf(client->ask<&QXFileCoordination::endAccess>(access)), std::nullopt);
  EXPECT_EQ(codeOf(errorOf(client->ask<&QXFileCoordination::endAccess>(access))), FileCoordinationErrorCode::invalidAccessID) << "over";
}

TEST_F(CoordinationCallers, OneConnectionHasOnlySoManyAccesses) {
  const QXURL own = url(house_.home() + "/own.txt");
  const auto reading = [&own](Client& client, std::size_t number) {
    QXUUID access;
    access.bytes = {static_cast<std::uint8_t>(number), static_cast<std::uint8_t>(number >> 8U)};
    return errorOf(client.ask<&QXFileCoordination::coordinateReadingItemAtURL>(own, std::nullopt, access, std::nullopt));
  };
  const auto greedy = house_.client(std::nullopt, kFileCoordinationServiceName);
  for (std::size_t i = 0; i < AccessSession::kMaximumAccesses; ++i) ASSERT_EQ(reading(*greedy, i), std::nullopt) << i;
  EXPECT_EQ(codeOf(reading(*greedy, AccessSession::kMaximumAccesses)), FileCoordinationErrorCode::tooManyAccesses);
  EXPECT_THAT(holders(own), SizeIs(AccessSession::kMaximumAccesses));
  EXPECT_EQ(reading(*house_.client(std::nullopt, kFileCoordinationServiceName), 0), std::nullopt) << "somebody else's";
  EXPECT_EQ(errorOf(greedy->ask<&QXFileCoordination::endAccess>(QXUUID{})), std::nullopt);
  EXPECT_EQ(reading(*greedy, AccessSession::kMaximumAccesses), std::nullopt) << "there is room again";
}

}  // namespace
}  // namespace docuvend::tests
