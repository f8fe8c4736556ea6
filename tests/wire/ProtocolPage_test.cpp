// docs/protocol.md says what the code does.
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <iterator>
#include <sstream>

#include "common/DVErrorCodes.h"
#include "daemon/DVGrantPage.h"
#include "platform/linux/base/confinement.h"
#include "platform/linux/bundles/BundleIdentifier.h"
#include "platform/linux/coordination/AccessSession.h"
#include "platform/linux/coordination/FileCoordinationServicer.h"
#include "platform/linux/extension_host/ExtensionErrors.h"
#include "platform/linux/extension_host/ExtensionTimes.h"
#include "platform/linux/rpc/ConnectionLimiter.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/rpc_errors.h"
#include "platform/rpc_protocol.h"
#include "providers/_QXDocuvendVendor.h"
#include "service/DVAdministration.h"
#include "service/DVDaemon.h"
#include "tests/wire/ErrorNames.h"
#include "tests/wire/ProtocolRows.h"
#include "tests/wire/WorkedExchange.h"

namespace docuvend::tests {
namespace {

class ProtocolPageTest : public testing::Test {
 protected:
  void SetUp() override {
    std::ifstream file(DOCUVEND_DOCS "/protocol.md");
    page.assign(std::istreambuf_iterator<char>(file), {});
    ASSERT_FALSE(page.empty());
  }

  // The text between a heading and the next one.
  std::string section(const std::string& heading) const {
    const std::size_t begin = page.find("## " + heading + "\n");
    return begin == std::string::npos ? "" : page.substr(begin, page.find("\n## ", begin) - begin);
  }
  // The rows of a section's first table, without its head.
  std::vector<std::string> rows(const std::string& heading) const {
    std::vector<std::string> found;
    std::istringstream lines(section(heading));
    for (std::string line; std::getline(lines, line);) {
      if (line.starts_with("| ")) found.push_back(line);
      if (!found.empty() && !line.starts_with("|")) break;
    }
    if (!found.empty()) found.erase(found.begin());
    return found;
  }
  // The cells of a row of the section's first table that begins with that one; empty, and a failure, when there is not exactly one.
  std::vector<std::string> row(const std::string& heading, const std::string& firstCell) const {
    std::vector<std::string> found;
    int count = 0;
    for (const std::string& line : rows(heading)) {
      if (!line.starts_with("| " + firstCell + " |")) continue;
      ++count;
      found.clear();
      for (std::size_t from = 2, to = line.find(" |", from); to != std::string::npos; from = to + 3, to = line.find(" |", from)) {
        found.push_back(line.substr(from, to - from));
      }
    }
    EXPECT_EQ(count, 1) << heading << ": " << firstCell;
    return found;
  }
  // Every code from 1 on that has a name is in the table with it, and nothing else.
  template <class Code>
  void expectCodes(const std::string& heading) const {
    std::vector<std::string> due;
    for (std::int64_t code = 1; const char* name = nameOf(static_cast<Code>(code)); ++code) {
      due.push_back("| " + std::to_string(code) + " | " + name + " |");
    }
    ASSERT_GT(due.size(), 1U);
    std::vector<std::string> shown = rows(heading);
    for (std::string& line : shown) line.resize(line.find('|', line.find('|', 1) + 1) + 1);
    EXPECT_EQ(shown, due) << heading;
  }
  void expectExchange(const std::string& heading, const std::vector<ExchangeStep>& exchange) const {
    std::size_t due = 0;
    for (const auto& [title, frame] : exchange) {
      std::istringstream lines(hexLines(frame));
      std::string expected = title + "\n\n";
      for (std::string line; std::getline(lines, line); ++due) expected += "    " + line + "\n";
      EXPECT_TRUE(says(heading, expected + "\n") || section(heading).ends_with(expected)) << expected;
    }
    // And nothing else: as many lines of bytes as the frames have.
    std::size_t shown = 0;
    std::istringstream lines(section(heading));
    for (std::string line; std::getline(lines, line);) shown += line.starts_with("    ") ? 1U : 0U;
    EXPECT_EQ(shown, due);
  }
  bool says(const std::string& heading, const std::string& text) const { return section(heading).find(text) != std::string::npos; }
  // The same for words that may stand on two lines.
  bool tells(const std::string& heading, const std::string& words) const {
    std::string folded = section(heading);
    std::replace(folded.begin(), folded.end(), '\n', ' ');
    return folded.find(words) != std::string::npos;
  }

  std::string page;
};

TEST_F(ProtocolPageTest, ShowsTheBytesOfTheWorkedExchanges) {
  expectExchange("A worked exchange: a client", workedExchange());
  expectExchange("A worked exchange: a provider extension", workedProviderExchange());
}

TEST_F(ProtocolPageTest, GivesEveryFrameItsNumber) {
  const QXError error = QXError::make("Test", 1, "no");
  const std::vector<std::pair<linux_platform::Frame, std::string>> frames = {
      {linux_platform::Hello{linux_platform::kProtocolVersion, std::nullopt}, "hello"},
      {linux_platform::RequestFrame{1, true, "a", {}}, "request"},
      {linux_platform::ReplyFrame{1, {}}, "reply"},
      {linux_platform::FailureFrame{1, error}, "failure"},
      {linux_platform::EndFrame{error}, "end"},
      {linux_platform::PingFrame{}, "ping"},
      {linux_platform::PongFrame{}, "pong"}};
  ASSERT_EQ(frames.size(), std::variant_size_v<linux_platform::Frame>);
  for (const auto& [frame, name] : frames) {
    const std::string row = "| " + std::to_string(bytesOf(frame)[linux_platform::kFrameLengthBytes]) + " | " + name + " | ";
    EXPECT_TRUE(says("Frames", row)) << row;
  }
}

TEST_F(ProtocolPageTest, ShowsTheBytesOfAPingAndAPong) {
  const std::string shown = "\n\n    " + hexLines(linux_platform::PingFrame{}) + "    " + hexLines(linux_platform::PongFrame{}) + "\n";
  EXPECT_TRUE(says("Signs of life", shown)) << shown;
}

TEST_F(ProtocolPageTest, ListsTheOperationsOfTheDaemonInOrder) {
  EXPECT_EQ(rows("Operations: `DVDaemon`"), protocolRows(qxInterfaceOf<DVDaemon>()));
}

TEST_F(ProtocolPageTest, ListsTheOperationsOfTheAdministrationInOrder) {
  EXPECT_EQ(rows("Operations: `DVAdministration`"), protocolRows(qxInterfaceOf<DVAdministration>()));
}

TEST_F(ProtocolPageTest, ListsTheOperationsOfThePlatformsServicesInOrder) {
  EXPECT_EQ(rows("Operations: `QXSandboxRedemption`"), protocolRows(qxInterfaceOf<linux_platform::QXSandboxRedemption>()));
  EXPECT_EQ(rows("Operations: `QXFileCoordination`"), protocolRows(qxInterfaceOf<linux_platform::QXFileCoordination>()));
}

TEST_F(ProtocolPageTest, ListsTheOperationsOfAProviderExtensionInOrder) {
  EXPECT_EQ(rows("Operations: `_QXDocuvendVendor`"), protocolRows(qxInterfaceOf<_QXDocuvendVendor>()));
}

TEST_F(ProtocolPageTest, GivesEveryKindItsNumber) {
  for (std::uint8_t kind = 0; kind <= static_cast<std::uint8_t>(QXValueKind::descriptor); ++kind) {
    const std::string row = "| " + std::to_string(kind) + " | " + std::string(qxKindName(static_cast<QXValueKind>(kind))) + " | ";
    EXPECT_TRUE(says("Values", row)) << row;
  }
}

TEST_F(ProtocolPageTest, NamesTheServicesAndTheirErrors) {
  for (const char* service :
       {kDVServiceName, linux_platform::kSandboxServiceName, linux_platform::kFileCoordinationServiceName, kDVAdministrationServiceName}) {
    EXPECT_TRUE(tells("Where", service)) << service;
  }
  EXPECT_TRUE(tells("Errors of the protocol itself", std::string("Domain `") + kQXRpcErrorDomain + "`"));
  EXPECT_TRUE(tells("Errors of the operations", std::string("`") + kQXSystemErrorDomain + "`"));
}

TEST_F(ProtocolPageTest, GivesEveryErrorItsCode) {
  expectCodes<QXRpcErrorCode>("Errors of the protocol itself");
  expectCodes<DVErrorCode>(std::string("Errors: `") + kDVErrorDomain + "`");
  expectCodes<linux_platform::SandboxErrorCode>(std::string("Errors: `") + linux_platform::kQXSandboxErrorDomain + "`");
  expectCodes<linux_platform::FileCoordinationErrorCode>(std::string("Errors: `") + linux_platform::kQXFileCoordinationErrorDomain + "`");
  expectCodes<linux_platform::ExtensionHostErrorCode>(std::string("Errors: `") + linux_platform::kExtensionHostErrorDomain + "`");
}

TEST_F(ProtocolPageTest, GivesTheLimits) {
  using namespace linux_platform;
  const std::vector<std::pair<std::string, std::string>> limits = {
      {"length of a frame (what follows the length field)", std::to_string(kMaximumFrameBytes) + " bytes"},
      {"a text", std::to_string(kMaximumTextBytes) + " bytes"},
      {"nesting of arrays, dictionaries and errors in one another", std::to_string(kMaximumNesting)},
      {"values and error texts of one frame, on all levels together", std::to_string(kMaximumElements)},
      {"descriptors of one frame", std::to_string(kMaximumDescriptors)},
      {"descriptors beside bytes of no frame that declares them", "0"},
      {"pings of one direction without a pong", "1; one more is malformed once it is noticed"},
      {"requests of one direction that wait for a reply", std::to_string(kMaximumPendingCalls) + "; one more fails with error 5"},
      {"bytes of such requests", std::to_string(kMaximumCallBytes) + "; one more fails with error 5"},
      {"bytes written for a peer that it does not read", std::to_string(kMaximumOutputBytes) + "; then the connection ends"},
      {"the same with one more request", std::to_string(kMaximumOutputBeforeRequest) + "; the request is not made and fails with error 5"},
      {"the same of a bundle's or of a process without an identity",
       std::to_string(kMaximumOutputBeforeFrame) + "; until they are taken the daemon reads no further"},
      {"answers with descriptors that such a process is due or has not taken, of one connection",
       std::to_string(kMaximumUntakenAnswers) + "; until some are taken the daemon reads no further"},
      {"descriptors of such answers of one bundle, over all its connections, ended ones too",
       std::to_string(kMaximumUntakenDescriptors) + "; a request for one more fails with error 5"},
      {"connections of one bundle to the daemon", std::to_string(kMaximumConnectionsPerPeer) + "; one more is ended with error 9"},
      {"connections of all unconfined processes together",
       std::to_string(kMaximumUnconfinedConnections) + "; one more is ended with error 9"},
      {"connections of all processes without an identity together",
       std::to_string(kMaximumConnectionsOfNobody) + "; one more is ended with error 9"},
      {"requests of one bundle that wait for a reply of the daemon, over all its connections",
       std::to_string(kMaximumCallsPerPeer) + "; one more fails with error 5"},
      {"the same of all unconfined processes together", std::to_string(kMaximumUnconfinedCalls) + "; one more fails with error 5"},
      {"the same of all processes without an identity together", std::to_string(kMaximumCallsOfNobody) + "; one more fails with error 5"},
      {"bytes of such requests of one bundle", std::to_string(kMaximumCallBytesPerPeer) + "; one more fails with error 5"},
      {"bytes of such requests of all unconfined processes together",
       std::to_string(kMaximumUnconfinedCallBytes) + "; one more fails with error 5"},
      {"accesses of one connection to `com.orvane.FileCoordination`",
       std::to_string(AccessSession::kMaximumAccesses) + "; one more is refused"},
      {"accesses of one application, over all its connections",
       std::to_string(FileAccesses::kMaximumAccessesOfApplication) + "; one more is refused"},
      {"accesses of all unconfined processes together",
       std::to_string(FileAccesses::kMaximumUnconfinedAccesses) + "; one more is refused"}};
  for (const auto& limit : limits) EXPECT_EQ(row("Limits", limit.first), (std::vector{limit.first, limit.second}));
  EXPECT_EQ(rows("Limits").size(), limits.size());
  EXPECT_TRUE(tells("Frames", ", at most " + std::to_string(kMaximumFrameBytes) + " |"));
  EXPECT_TRUE(tells("Frames", "The version is " + std::to_string(kProtocolVersion) + "."));
}

TEST_F(ProtocolPageTest, GivesTheLimitsOfTheServices) {
  EXPECT_TRUE(tells("Operations: `QXFileCoordination`",
                    std::to_string(linux_platform::FileCoordinationServicer::kMaximumHoldersNamed) + " at most"));
  const std::string administration = "Operations: `DVAdministration`";
  EXPECT_TRUE(tells(administration, "after " + std::to_string(kDVMaximumGrantsOfPage) + " grants"));
  EXPECT_TRUE(tells(administration, "more than " + std::to_string(kDVMaximumTextBytesOfPage) + " bytes together"));
  EXPECT_TRUE(tells(administration, "more than " + std::to_string(kDVLongestIdentifier) + " bytes is left out"));
}

TEST_F(ProtocolPageTest, SaysWhatAnExtensionIsGivenAndHowLong) {
  using namespace linux_platform;
  const std::string heading = "A provider extension";
  EXPECT_TRUE(tells(heading, "- descriptor " + std::to_string(kExtensionSocketNumber) + " is its end"));
  const auto seconds = [](ExtensionTimes::Duration time) {
    return std::to_string(std::chrono::duration_cast<std::chrono::seconds>(time).count()) + " s";
  };
  const ExtensionTimes times;
  const std::vector<std::pair<std::string, std::string>> expected = {
      {"to answer the initial setup", seconds(times.answerLimit) + "; then the process is ended"},
      {"to answer an identifier or a URL",
       seconds(times.answerLimit) + " from when all that were asked for before are answered; then the process is ended"},
      {"to answer the others", "none, as long as it gives signs of life"},
      {"between two pings, while it owes an answer", seconds(times.livenessInterval)},
      {"to answer a ping", seconds(times.answerLimit) + "; then the process is ended"},
      {"without requests, until its connection is closed", seconds(times.linger)},
      {"to end by itself after that, and then again after SIGTERM", seconds(times.endGrace)},
      {"to answer what is open when its bundle is removed, or an update takes a group or an entitlement from it",
       "none: the process is ended at once"},
      {"to answer what is open when its bundle is updated otherwise", seconds(times.updateGrace) + "; then the process is ended"}};
  for (const auto& time : expected) EXPECT_EQ(row(heading, time.first), (std::vector{time.first, time.second}));
  EXPECT_EQ(rows(heading).size(), expected.size());
  EXPECT_TRUE(tells("Bundles", "at most " + std::to_string(kLongestIdentifier) + " bytes"));
}

}  // namespace
}  // namespace docuvend::tests
