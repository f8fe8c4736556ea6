// docuvendctl doctor on this machine: what it finds is tried here as well, and the daemon is the real one.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <nlohmann/json.hpp>

#include "platform/linux/identity/KernelFacilities.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;
using JSON = nlohmann::json;

constexpr int kDone = 0;
constexpr int kNotPermitted = 3;
constexpr int kMissing = 11;
constexpr int kFatal = 12;

class Doctor : public SystemTest {
 protected:
  // The finding about a protection, as its state and its sentence.
  static std::pair<std::string, std::string> findingOf(const JSON& findings, const std::string& protection) {
    for (const auto& finding : findings) {
      if (finding.at("protection") == protection) return {finding.at("state"), finding.at("finding")};
    }
    return {};
  }
};

TEST_F(Doctor, FindsTheDaemonAndEveryProtectionThatThisKernelGives) {
  house_.install(kEditor);
  house_.startDaemon();
  const auto kernel = linux_platform::KernelFacilities::probe();
  const bool isNewest =
      kernel.peerPidfd && kernel.pidfdNamespaces && kernel.uniquePidfdInodes && kernel.refusedDescriptors && kernel.landlockLevel >= 6;
  const Ending ending = house_.ctl({"doctor", "--json"});
  EXPECT_EQ(ending.status, isNewest ? kDone : kMissing) << ending.output;
  EXPECT_EQ(ending.errors, "");
  const JSON findings = JSON::parse(ending.output);
  EXPECT_EQ(findingOf(findings, "daemon").second, "process " + std::to_string(house_.daemon().pid()) + " answers");
  for (const char* protection :
       {"ordinary user", "run-time directory", "user namespaces", "bubblewrap", "docuvend-confine", "Landlock", "system calls",
        "confinement", "directories", "bundles", "watches", "daemon", "daemon's kernel", "daemon's privileges"}) {
    EXPECT_EQ(findingOf(findings, protection).first, "in force") << protection << ": " << findingOf(findings, protection).second;
  }
}

TEST_F(Doctor, SaysALineForEachAndThatNoDaemonRuns) {
  const Ending ending = house_.ctl({"doctor"});
  EXPECT_EQ(ending.status, kMissing) << ending.output;
  EXPECT_THAT(ending.output, StartsWith("ordinary user\tin force\tnot root\n"));
  EXPECT_THAT(ending.output, HasSubstr("\ndaemon\tmissing\tnone answers: "));
  EXPECT_THAT(ending.output, HasSubstr("\nconfinement\tin force\ta confined process was started\n"));
}

TEST_F(Doctor, FindsBundlesThatOthersCouldChange) {
  house_.install(kEditor);
  house_.startDaemon();
  ASSERT_EQ(::chmod((house_.bundles() + "/" + kEditor).c_str(), 0777), 0);
  const Ending ending = house_.ctl({"doctor", "--json"});
  EXPECT_EQ(ending.status, kMissing);
  const auto [state, text] = findingOf(JSON::parse(ending.output), "bundles");
  EXPECT_EQ(state, "missing");
  EXPECT_EQ(text, house_.bundles() + "/" + kEditor + " can be written by everybody");
}

TEST_F(Doctor, FindsThatNothingStartsWhereOthersReachTheRunTimeDirectory) {
  ASSERT_EQ(::chmod(house_.runtime().c_str(), 0755), 0);
  const Ending ending = house_.ctl({"doctor", "--json"});
  EXPECT_EQ(ending.status, kFatal) << ending.output;
  const auto [state, text] = findingOf(JSON::parse(ending.output), "run-time directory");
  EXPECT_EQ(state, "fatal");
  EXPECT_THAT(text, HasSubstr("must have mode 700"));
  ASSERT_EQ(::chmod(house_.runtime().c_str(), 0700), 0);
}

TEST_F(Doctor, FindsThatNothingStartsFromAHomeThatApplicationsWouldSee) {
  auto environment = house_.environment();
  std::erase_if(environment, [](const std::string& variable) { return variable.starts_with("HOME="); });
  environment.emplace_back("HOME=/usr/local/somebody");
  const Ending ending = Process({{std::string(DOCUVEND_BIN) + "/docuvendctl", "doctor", "--json"}, environment, {}}).wait();
  EXPECT_EQ(ending.status, kFatal) << ending.output << ending.errors;
  const auto [state, text] = findingOf(JSON::parse(ending.output), "directories");
  EXPECT_EQ(state, "fatal");
  EXPECT_EQ(text, "/usr/local/somebody lies below /usr, which every application sees");
}

// In namespaces of bubblewrap's that allow no further ones, but in no confinement.
TEST_F(Doctor, FindsThatNothingStartsWhereNoUserNamespaceCanBeMade) {
  house_.startDaemon();
  const std::vector<std::string> around = {"/usr/bin/bwrap", "--unshare-user", "--disable-userns", "--dev-bind", "/", "/", "--"};
  const auto examined = [&](std::vector<std::string> words) {
    words.insert(words.end(), {std::string(DOCUVEND_BIN) + "/docuvendctl", "doctor", "--json"});
    return Process({words, house_.environment(), {}}).wait();
  };
  const Ending ending = examined(around);
  EXPECT_EQ(ending.status, kFatal) << ending.output << ending.errors;
  const JSON findings = JSON::parse(ending.output);
  EXPECT_EQ(findingOf(findings, "user namespaces").first, "fatal");
  EXPECT_THAT(findingOf(findings, "user namespaces").second, StartsWith("an ordinary user may not make one: "));
  EXPECT_EQ(findingOf(findings, "confinement").first, "fatal");
  EXPECT_THAT(findingOf(findings, "confinement").second, StartsWith("a confined process could not be started: bwrap: "));
  EXPECT_EQ(findingOf(JSON::parse(examined({}).output), "confinement").first, "in force");
}

TEST_F(Doctor, LeavesNothingBehind) {
  const auto entries = [this] {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(house_.home())) names.push_back(entry.path());
    for (const auto& entry : std::filesystem::directory_iterator(std::filesystem::temp_directory_path())) {
      if (entry.path().filename().string().starts_with("docuvend-trial-")) names.push_back(entry.path());
    }
    return names;
  };
  const auto before = entries();
  EXPECT_EQ(house_.ctl({"doctor"}).status, kMissing);
  EXPECT_EQ(entries(), before);
}

TEST_F(Doctor, DoesNotExamineFromInsideAConfinement) {
  const std::string bundle = "com.orvane.inside";
  house_.install(bundle, "docuvendctl", stringEntry("QXBundleIdentifier", bundle), "");
  house_.startDaemon();
  const Ending ending = house_.confined(bundle, {"doctor"});
  EXPECT_EQ(ending.status, kNotPermitted);
  EXPECT_THAT(ending.errors, HasSubstr("from inside a confinement"));
}

}  // namespace
}  // namespace docuvend::tests
