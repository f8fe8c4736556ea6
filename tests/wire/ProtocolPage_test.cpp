// docs/protocol.md says what the code does.
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <sstream>

#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/rpc_errors.h"
#include "platform/rpc_protocol.h"
#include "providers/_QXDocuvendVendor.h"
#include "service/DVAdministration.h"
#include "service/DVDaemon.h"
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
  // The table rows of a section, without its head.
  std::vector<std::string> rows(const std::string& heading) const {
    std::vector<std::string> found;
    std::istringstream lines(section(heading));
    for (std::string line; std::getline(lines, line);) {
      if (line.starts_with("| ")) found.push_back(line);
    }
    if (!found.empty()) found.erase(found.begin());
    return found;
  }
  bool says(const std::string& heading, const std::string& text) const { return section(heading).find(text) != std::string::npos; }

  std::string page;
};

TEST_F(ProtocolPageTest, ShowsTheBytesOfTheWorkedExchange) {
  std::string expected;
  for (const auto& [title, frame] : workedExchange()) {
    std::istringstream lines(hexLines(frame));
    expected = title + "\n\n";
    for (std::string line; std::getline(lines, line);) expected += "    " + line + "\n";
    EXPECT_TRUE(says("A worked exchange", expected + "\n") || says("A worked exchange", expected)) << expected;
  }
  // And nothing else: as many bytes as the frames have.
  std::size_t shown = 0;
  std::istringstream lines(section("A worked exchange"));
  for (std::string line; std::getline(lines, line);) shown += line.starts_with("    ") ? 1U : 0U;
  std::size_t due = 0;
  for (const auto& step : workedExchange()) {
    const std::string text = hexLines(step.frame);
    due += static_cast<std::size_t>(std::count(text.begin(), text.end(), '\n'));
  }
  EXPECT_EQ(shown, due);
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

TEST_F(ProtocolPageTest, GivesEveryErrorItsCode) {
  const std::vector<std::pair<QXRpcErrorCode, std::string>> codes = {{QXRpcErrorCode::unknownOperation, "unknownOperation"},
                                                                     {QXRpcErrorCode::invalidArguments, "invalidArguments"},
                                                                     {QXRpcErrorCode::invalidReply, "invalidReply"},
                                                                     {QXRpcErrorCode::notTransmissible, "notTransmissible"},
                                                                     {QXRpcErrorCode::tooManyCalls, "tooManyCalls"},
                                                                     {QXRpcErrorCode::malformedFrame, "malformedFrame"},
                                                                     {QXRpcErrorCode::unsupportedVersion, "unsupportedVersion"},
                                                                     {QXRpcErrorCode::peerDoesNotRead, "peerDoesNotRead"},
                                                                     {QXRpcErrorCode::refused, "refused"}};
  for (const auto& [code, name] : codes) {
    const std::string row = "| " + std::to_string(static_cast<std::int64_t>(code)) + " | " + name + " | ";
    EXPECT_TRUE(says("Errors of the protocol itself", row)) << row;
  }
  EXPECT_EQ(rows("Errors of the protocol itself").size(), codes.size());
}

TEST_F(ProtocolPageTest, GivesTheLimits) {
  using namespace linux_platform;
  for (const std::size_t limit : {kMaximumFrameBytes, kMaximumTextBytes, kMaximumNesting, kMaximumElements, kMaximumDescriptors,
                                  kMaximumPendingCalls, kMaximumOutputBytes}) {
    const std::string cell = "| " + std::to_string(limit);
    EXPECT_TRUE(says("Limits", cell + " |") || says("Limits", cell + " bytes |") || says("Limits", cell + ";")) << limit;
  }
}

}  // namespace
}  // namespace docuvend::tests
