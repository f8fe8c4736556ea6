// The units of a user's service manager: what they give up, and that none of it takes from the daemon what it knows its peers by.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <sstream>
#include <utility>
#include <vector>

#include "platform/linux/rpc/BoundSocket.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "service/DVAdministration.h"
#include "service/DVDaemon.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::Pair;
using ::testing::UnorderedElementsAre;

using Directives = std::vector<std::pair<std::string, std::string>>;

std::string unit(const std::string& name) { return contentsOf(std::string(DOCUVEND_UNITS) + "/" + name); }

Directives directivesOf(const std::string& text) {
  Directives result;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    const std::size_t equals = line.find('=');
    if (line.starts_with("#") || equals == std::string::npos) continue;
    result.emplace_back(line.substr(0, equals), line.substr(equals + 1));
  }
  return result;
}

// Each has, in a user's service manager, a user namespace made for the service, or works in one alone.
const std::vector<std::string> kMakeANamespace = {"PrivateUsers",
                                                  "PrivateTmp",
                                                  "PrivateDevices",
                                                  "PrivateNetwork",
                                                  "PrivateIPC",
                                                  "PrivateMounts",
                                                  "PrivatePIDs",
                                                  "ProtectSystem",
                                                  "ProtectHome",
                                                  "ProtectProc",
                                                  "ProcSubset",
                                                  "ProtectClock",
                                                  "ProtectHostname",
                                                  "ProtectKernelTunables",
                                                  "ProtectKernelModules",
                                                  "ProtectKernelLogs",
                                                  "ProtectControlGroups",
                                                  "ReadWritePaths",
                                                  "ReadOnlyPaths",
                                                  "InaccessiblePaths",
                                                  "ExecPaths",
                                                  "NoExecPaths",
                                                  "TemporaryFileSystem",
                                                  "BindPaths",
                                                  "BindReadOnlyPaths",
                                                  "RootDirectory",
                                                  "RootImage",
                                                  "RootHash",
                                                  "RootVerity",
                                                  "MountImages",
                                                  "ExtensionImages",
                                                  "ExtensionDirectories",
                                                  "MountAPIVFS",
                                                  "MountFlags",
                                                  "NetworkNamespacePath",
                                                  "IPCNamespacePath",
                                                  "DynamicUser",
                                                  "User",
                                                  "Group",
                                                  "SupplementaryGroups",
                                                  "CapabilityBoundingSet",
                                                  "AmbientCapabilities",
                                                  "SecureBits",
                                                  "LogNamespace"};

// Filters on system calls. They go to bubblewrap and to every extension, which need what they forbid; RestrictSUIDSGID takes openat2 away
// altogether, by which tokens are redeemed.
const std::vector<std::string> kFilterSystemCalls = {
    "SystemCallFilter",        "SystemCallLog",       "SystemCallArchitectures", "SystemCallErrorNumber", "RestrictNamespaces",
    "RestrictAddressFamilies", "RestrictFileSystems", "RestrictSUIDSGID",        "RestrictRealtime",      "LockPersonality",
    "MemoryDenyWriteExecute",  "IPAddressDeny",       "SocketBindDeny",          "DevicePolicy"};

bool isAny(const std::vector<std::string>& names, const std::string& name) {
  return std::find(names.begin(), names.end(), name) != names.end();
}

TEST(ServiceUnit, GivesTheDaemonNoNamespaceOfItsOwn) {
  for (const auto& [name, value] : directivesOf(unit("docuvend.service"))) EXPECT_FALSE(isAny(kMakeANamespace, name)) << name;
}

TEST(ServiceUnit, PutsNoFilterOnTheSystemCallsOfWhatTheDaemonStarts) {
  for (const auto& [name, value] : directivesOf(unit("docuvend.service"))) EXPECT_FALSE(isAny(kFilterSystemCalls, name)) << name;
}

// A directive that somebody adds is looked at here: what it does in a user's service manager, and what bubblewrap inherits of it.
TEST(ServiceUnit, HasTheseDirectivesAndNoOthers) {
  EXPECT_THAT(directivesOf(unit("docuvend.service")),
              UnorderedElementsAre(Pair("Description", ::testing::_), Pair("Requires", "docuvend.socket"), Pair("After", "docuvend.socket"),
                                   Pair("Type", "exec"), Pair("ExecStart", "/usr/bin/docuvendd"), Pair("Restart", "on-abnormal"),
                                   Pair("RestartSec", "1"), Pair("NoNewPrivileges", "yes"), Pair("UMask", "0077"),
                                   Pair("KeyringMode", "private"), Pair("OOMPolicy", "continue"), Pair("KillMode", "control-group"),
                                   Pair("Also", "docuvend.socket"), Pair("WantedBy", "default.target")));
}

TEST(SocketUnit, ListensWhereClientsLookAndForTheUserAlone) {
  const std::string place = "%t/docuvend/";
  EXPECT_THAT(directivesOf(unit("docuvend.socket")),
              UnorderedElementsAre(Pair("Description", ::testing::_), Pair("ListenStream", place + "public/" + kDVServiceName),
                                   Pair("ListenStream", place + "public/" + linux_platform::kSandboxServiceName),
                                   Pair("ListenStream", place + "public/" + linux_platform::kFileCoordinationServiceName),
                                   Pair("ListenStream", place + kDVAdministrationServiceName), Pair("DirectoryMode", "0700"),
                                   Pair("SocketMode", "0600"), Pair("Backlog", std::to_string(linux_platform::kMaximumWaitingConnections)),
                                   Pair("WantedBy", "sockets.target")));
}

// With this build's daemon in place of the installed one.
class VerifiedUnits : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    if (!fs::exists(kVerifier)) GTEST_SKIP() << kVerifier << " is not installed";
    fs::create_directory(directory());
    writeFile(directory() + "/docuvend.socket", unit("docuvend.socket"));
  }
  [[nodiscard]] std::string directory() const { return house_.home() + "/units"; }
  Ending verify(std::string service) {
    const std::string installed = "/usr/bin/docuvendd";
    service.replace(service.find(installed), installed.size(), std::string(DOCUVEND_BIN) + "/docuvendd");
    writeFile(directory() + "/docuvend.service", service);
    return Process({{kVerifier, "--user", "--man=no", "verify", directory() + "/docuvend.service", directory() + "/docuvend.socket"},
                    house_.environment(),
                    {}})
        .wait();
  }

  static constexpr const char* kVerifier = "/usr/bin/systemd-analyze";
};

TEST_F(VerifiedUnits, AreUnderstoodByTheServiceManager) {
  const Ending good = verify(unit("docuvend.service"));
  EXPECT_EQ(good.status, 0) << good.errors;
  EXPECT_EQ(good.errors, "");
  // The verifier looks: it finds what is wrong.
  const Ending bad = verify(unit("docuvend.service") + "\n[Service]\nNoNewPrivilege=yes\n");
  EXPECT_THAT(bad.errors, ::testing::HasSubstr("NoNewPrivilege"));
}

}  // namespace
}  // namespace docuvend::tests
