// docs/limits.md has every limit with the figure that the code has; check_limits.cmake holds its tests' names against the tests.
#include <gtest/gtest.h>

#include <cstdint>
#include <fstream>
#include <string>
#include <vector>

#include "acl/DVGrantLimits.h"
#include "common/DVLog.h"
#include "daemon/DVGrantPage.h"
#include "platform/linux/bundles/BundleIdentifier.h"
#include "platform/linux/bundles/BundleScan.h"
#include "platform/linux/coordination/AccessSession.h"
#include "platform/linux/coordination/ChangeNotices.h"
#include "platform/linux/coordination/FileAccesses.h"
#include "platform/linux/coordination/FileCoordinationServicer.h"
#include "platform/linux/coordination/Provisions.h"
#include "platform/linux/extension_host/ExtensionProcess.h"
#include "platform/linux/extension_host/OutputLines.h"
#include "platform/linux/extension_host/OutputLog.h"
#include "platform/linux/files/property_list_scalars.h"
#include "platform/linux/launch/LaunchArguments.h"
#include "platform/linux/launch/LaunchDescription.h"
#include "platform/linux/log/LogAllowance.h"
#include "platform/linux/log/LogText.h"
#include "platform/linux/rpc/BoundSocket.h"
#include "platform/linux/rpc/ConnectionLimiter.h"
#include "platform/linux/sandbox/DiskWork.h"
#include "platform/linux/sandbox/RedemptionLedger.h"
#include "platform/linux/sandbox/SandboxToken.h"
#include "platform/linux/sandbox/TokenFloors.h"
#include "platform/linux/sandbox/TokenSession.h"
#include "platform/linux/wire/Limits.h"

namespace docuvend::linux_platform {
namespace {

struct Limit {
  std::string constant;
  std::uint64_t value;
  friend bool operator==(const Limit&, const Limit&) = default;
};
void PrintTo(const Limit& limit, std::ostream* stream) { *stream << limit.constant << " " << limit.value; }

// A sanitizer's build sets no limit on memory; the page tells of the others.
constexpr std::uint64_t kMemoryWithoutSanitizer = std::uint64_t{4} << 30U;

std::vector<Limit> limits() {
  return {{"kMaximumFrameBytes", kMaximumFrameBytes},
          {"kMaximumTextBytes", kMaximumTextBytes},
          {"kMaximumNesting", kMaximumNesting},
          {"kMaximumElements", kMaximumElements},
          {"kMaximumDescriptors", kMaximumDescriptors},
          {"kMaximumPendingCalls", kMaximumPendingCalls},
          {"kMaximumCallBytes", kMaximumCallBytes},
          {"kMaximumOutputBytes", kMaximumOutputBytes},
          {"kMaximumOutputBeforeRequest", kMaximumOutputBeforeRequest},
          {"kMaximumOutputBeforeFrame", kMaximumOutputBeforeFrame},
          {"kMaximumUntakenAnswers", kMaximumUntakenAnswers},
          {"kTurn", static_cast<std::uint64_t>(kTurn.count())},
          {"kMaximumWaitingConnections", kMaximumWaitingConnections},
          {"kMaximumConnectionsPerPeer", kMaximumConnectionsPerPeer},
          {"kMaximumUnconfinedConnections", kMaximumUnconfinedConnections},
          {"kMaximumConnectionsOfNobody", kMaximumConnectionsOfNobody},
          {"kMaximumCallsPerPeer", kMaximumCallsPerPeer},
          {"kMaximumUnconfinedCalls", kMaximumUnconfinedCalls},
          {"kMaximumCallsOfNobody", kMaximumCallsOfNobody},
          {"kMaximumUntakenDescriptors", kMaximumUntakenDescriptors},
          {"kMaximumCallBytesPerPeer", kMaximumCallBytesPerPeer},
          {"kMaximumUnconfinedCallBytes", kMaximumUnconfinedCallBytes},
          {"kMaximumAccesses", AccessSession::kMaximumAccesses},
          {"kMaximumAccessesOfApplication", FileAccesses::kMaximumAccessesOfApplication},
          {"kMaximumUnconfinedAccesses", FileAccesses::kMaximumUnconfinedAccesses},
          {"WrittenDirectories::kMaximumHeld", WrittenDirectories::kMaximumHeld},
          {"WrittenDirectories::kMaximumUnconfinedHeld", WrittenDirectories::kMaximumUnconfinedHeld},
          {"Provisions::kMaximumRequestsUnderWay", Provisions::kMaximumRequestsUnderWay},
          {"ChangeNotices::kMaximumNoticesUnderWay", ChangeNotices::kMaximumNoticesUnderWay},
          {"ChangeNotices::kMaximumUntoldFiles", ChangeNotices::kMaximumUntoldFiles},
          {"ChangeNotices::kMaximumUntoldBytes", ChangeNotices::kMaximumUntoldBytes},
          {"ChangeNotices::kMaximumUnconfinedUntoldFiles", ChangeNotices::kMaximumUnconfinedUntoldFiles},
          {"ChangeNotices::kMaximumUnconfinedUntoldBytes", ChangeNotices::kMaximumUnconfinedUntoldBytes},
          {"kMaximumHoldersNamed", FileCoordinationServicer::kMaximumHoldersNamed},
          {"kDVMaximumGrantsOfPage", kDVMaximumGrantsOfPage},
          {"kDVMaximumTextBytesOfPage", kDVMaximumTextBytesOfPage},
          {"kDVLongestGrantedConsumerID", kDVLongestGrantedConsumerID},
          {"kDVLongestGrantedItemID", kDVLongestGrantedItemID},
          {"kDVMaximumConsumersOfItem", kDVMaximumConsumersOfItem},
          {"kDVConsumersKeptForEntitled", kDVConsumersKeptForEntitled},
          {"kDVMaximumBytesOfProvider", kDVMaximumBytesOfProvider},
          {"kDVBytesKeptForEntitled", kDVBytesKeptForEntitled},
          {"kMaximumTokenPathLength", kMaximumTokenPathLength},
          {"SandboxToken::kMaximumTextLength", SandboxToken::kMaximumTextLength},
          {"TokenFloors::kMaximumDirectories", TokenFloors::kMaximumDirectories},
          {"TokenSession::kLongestWaitForUses", static_cast<std::uint64_t>(TokenSession::kLongestWaitForUses.count())},
          {"RedemptionLedger::kMaximumObjectsPerInstance", RedemptionLedger::kMaximumObjectsPerInstance},
          {"RedemptionLedger::kMaximumInstances", RedemptionLedger::kMaximumInstances},
          {"kPropertyListMaximumBytes", kPropertyListMaximumBytes},
          {"kPropertyListMaximumElements", kPropertyListMaximumElements},
          {"kPropertyListMaximumDepth", kPropertyListMaximumDepth},
          {"kLongestIdentifier", kLongestIdentifier},
          {"kMostBundleDirectories", kMostBundleDirectories},
          {"kLongestDescription", kLongestDescription},
          {"kApplicationProcesses", kApplicationProcesses},
          {"kApplicationOpenFiles", kApplicationOpenFiles},
          {"kConfinedPendingSignals", kConfinedPendingSignals},
          {"kConfinedLockedMemory", kConfinedLockedMemory},
          {"kConfinedMessageQueueBytes", kConfinedMessageQueueBytes},
          {"DiskWork::kMostThreads", DiskWork::kMostThreads},
          {"DiskWork::kMostThreadsOfDirectory", DiskWork::kMostThreadsOfDirectory},
          {"kExtensionProcesses", kExtensionProcesses},
          {"kExtensionOpenFiles", kExtensionOpenFiles},
          {"kExtensionMemory", kExtensionMemory.value_or(kMemoryWithoutSanitizer)},
          {"ExtensionProcess::kMaximumQuestions", ExtensionProcess::kMaximumQuestions},
          {"OutputLines::kLongestLine", OutputLines::kLongestLine},
          {"OutputLog::kLinesAtOnce", OutputLog::kLinesAtOnce},
          {"kLongestLogText", kLongestLogText},
          {"kDVLongestLoggedValue", kDVLongestLoggedValue},
          {"LogAllowance::kLinesAtOnce", LogAllowance::kLinesAtOnce}};
}

std::vector<std::string> cellsOf(const std::string& row) {
  std::vector<std::string> cells;
  for (std::size_t from = 2, to = row.find(" |", from); to != std::string::npos; from = to + 3, to = row.find(" |", from)) {
    cells.push_back(row.substr(from, to - from));
  }
  return cells;
}

// The rows with a constant between back quotes, and nothing else.
std::vector<Limit> limitsOfPage() {
  std::vector<Limit> shown;
  std::ifstream page(DOCUVEND_DOCS "/limits.md");
  for (std::string line; std::getline(page, line);) {
    if (!line.starts_with("| ") || line.starts_with("| what |")) continue;
    const auto cells = cellsOf(line);
    if (cells.size() != 4 || cells[2].size() < 3) {
      ADD_FAILURE() << line;
      continue;
    }
    shown.push_back({cells[2].substr(1, cells[2].size() - 2), std::stoull(cells[1])});
  }
  return shown;
}

TEST(LimitsPage, HasEveryLimitWithTheFigureOfTheCode) { EXPECT_EQ(limitsOfPage(), limits()); }

}  // namespace
}  // namespace docuvend::linux_platform
