#include "tools/docuvendctl/Findings.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>

namespace docuvend::ctl {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

constexpr int kNewestLevel = 7;

std::vector<std::string> sentencesOf(const linux_platform::KernelFacilities& kernel) {
  const auto levels = protectionLevels(kernel);
  return {levels.peers, levels.namespaces, levels.tokens, levels.descriptors, levels.confinement};
}

// A machine where all is well.
MachineFacts soundMachine() {
  MachineFacts facts;
  facts.runtimeDirectory = "/run/user/1000";
  facts.bubblewrap = "/usr/bin/bwrap";
  facts.helper = "/usr/libexec/docuvend/docuvend-confine";
  facts.kernel = {true, true, true, true, kNewestLevel};
  facts.daemon = DaemonFacts{42, sentencesOf(facts.kernel), ProcessPrivileges{true, false, false, true}};
  return facts;
}

Finding findingOf(const MachineFacts& facts, const std::string& protection) {
  const auto findings = findingsFrom(facts);
  const auto found = std::find_if(findings.begin(), findings.end(), [&](const Finding& one) { return one.protection == protection; });
  if (found == findings.end()) {
    ADD_FAILURE() << "nothing is said of " << protection;
    return {};
  }
  return *found;
}

// That finding, and no other, is not in force; the command ends accordingly.
void expectOnly(const MachineFacts& facts, const std::string& protection, Verdict verdict, const std::string& text) {
  const auto findings = findingsFrom(facts);
  for (const Finding& finding : findings) {
    EXPECT_EQ(finding.verdict, finding.protection == protection ? verdict : Verdict::inForce) << finding.protection << ": " << finding.text;
  }
  EXPECT_THAT(findingOf(facts, protection).text, HasSubstr(text));
  EXPECT_EQ(reportOf(findings).status, verdict == Verdict::fatal ? ExitStatus::nothingStarts : ExitStatus::protectionMissing);
}

TEST(Findings, OnASoundMachineEverythingIsInForceAndTheStatusIsDone) {
  const auto findings = findingsFrom(soundMachine());
  EXPECT_EQ(findings.size(), 22U);
  for (const Finding& finding : findings) EXPECT_EQ(finding.verdict, Verdict::inForce) << finding.protection;
  EXPECT_EQ(reportOf(findings).status, ExitStatus::done);
}

TEST(Findings, NothingStartsForRoot) {
  MachineFacts facts = soundMachine();
  facts.isRoot = true;
  expectOnly(facts, "ordinary user", Verdict::fatal, "root");
}

TEST(Findings, NothingStartsWithoutAPrivateRunTimeDirectory) {
  MachineFacts facts = soundMachine();
  EXPECT_EQ(findingOf(facts, "run-time directory").text, "/run/user/1000 is this user's alone");
  facts.runtimeProblem = "must have mode 700";
  expectOnly(facts, "run-time directory", Verdict::fatal, "must have mode 700");
}

TEST(Findings, NothingStartsWhereNobodyMakesUserNamespaces) {
  MachineFacts facts = soundMachine();
  facts.userNamespaceProblem = "No space left on device";
  facts.launchProblem = "bwrap: no namespace";
  EXPECT_EQ(findingOf(facts, "user namespaces").verdict, Verdict::fatal);
  EXPECT_EQ(findingOf(facts, "user namespaces").text, "No space left on device");
  EXPECT_EQ(findingOf(facts, "confinement").verdict, Verdict::fatal);
  EXPECT_EQ(reportOf(findingsFrom(facts)).status, ExitStatus::nothingStarts);
}

TEST(Findings, ThatBubblewrapAloneMayMakeUserNamespacesIsEnough) {
  MachineFacts facts = soundMachine();
  facts.userNamespaceProblem = "Permission denied";
  EXPECT_EQ(findingOf(facts, "user namespaces").verdict, Verdict::inForce);
  EXPECT_THAT(findingOf(facts, "user namespaces").text, HasSubstr("bubblewrap alone"));
}

TEST(Findings, NothingStartsWithoutTheProgramsThatConfine) {
  MachineFacts facts = soundMachine();
  EXPECT_EQ(findingOf(facts, "bubblewrap").text, "/usr/bin/bwrap");
  facts.bubblewrap.clear();
  expectOnly(facts, "bubblewrap", Verdict::fatal, "not installed");
  facts = soundMachine();
  EXPECT_EQ(findingOf(facts, "docuvend-confine").text, "/usr/libexec/docuvend/docuvend-confine");
  facts.helper.clear();
  expectOnly(facts, "docuvend-confine", Verdict::fatal, "libexec");
}

TEST(Findings, NothingStartsWhereApplicationsWouldSeeTheUsersDirectories) {
  MachineFacts facts = soundMachine();
  facts.placesProblem = "/usr/home lies below /usr, which every application sees";
  expectOnly(facts, "directories", Verdict::fatal, "/usr/home lies below /usr");
}

TEST(Findings, NothingStartsWhereALaunchFails) {
  MachineFacts facts = soundMachine();
  facts.launchProblem = "bwrap: out of luck";
  expectOnly(facts, "confinement", Verdict::fatal, "bwrap: out of luck");
}

TEST(Findings, NothingStartsWhereSystemCallsAreNotRefused) {
  MachineFacts facts = soundMachine();
  facts.systemCallsProblem = "the kernel does not filter them";
  expectOnly(facts, "system calls", Verdict::fatal, "does not filter them");
}

TEST(Findings, NothingStartsWhereLandlockDoesNotRestrict) {
  MachineFacts facts = soundMachine();
  EXPECT_THAT(findingOf(facts, "Landlock").text, HasSubstr("level 7"));
  facts.landlockProblem = "a restricted process still opens files";
  expectOnly(facts, "Landlock", Verdict::fatal, "still opens files");
  facts.kernel.landlockLevel = 0;
  facts.landlockProblem.reset();
  EXPECT_EQ(findingOf(facts, "Landlock").verdict, Verdict::fatal);
}

// What each level of Landlock lacks.
struct Lack {
  int level;
  std::vector<std::string> protections;
};
void PrintTo(const Lack& lack, std::ostream* stream) { *stream << "level " << lack.level; }

class LandlockLevels : public testing::TestWithParam<Lack> {};

TEST_P(LandlockLevels, LackWhatOnlyANewerKernelHolds) {
  MachineFacts facts = soundMachine();
  facts.kernel.landlockLevel = GetParam().level;
  facts.daemon->protections = sentencesOf(facts.kernel);
  std::vector<std::string> missing;
  for (const Finding& finding : findingsFrom(facts)) {
    EXPECT_NE(finding.verdict, Verdict::fatal) << finding.protection;
    if (finding.verdict == Verdict::missing) missing.push_back(finding.protection);
  }
  EXPECT_EQ(missing, GetParam().protections);
}

const std::string kTruncation = "truncation";
const std::string kDevices = "device requests";
const std::string kScopes = "abstract sockets, signals";
const std::string kProcesses = "processes of an extension";

INSTANTIATE_TEST_SUITE_P(Findings, LandlockLevels,
                         testing::Values(Lack{1, {kTruncation, kDevices, kScopes, kProcesses}}, Lack{2, {kTruncation, kDevices, kScopes}},
                                         Lack{3, {kDevices, kScopes}}, Lack{4, {kDevices, kScopes}}, Lack{5, {kScopes}}, Lack{6, {}}));

TEST(Findings, AnOlderKernelsIdentitiesAreWeaker) {
  for (const auto& [facility, protection] : {std::pair{&linux_platform::KernelFacilities::peerPidfd, "peers"},
                                             {&linux_platform::KernelFacilities::pidfdNamespaces, "namespaces"},
                                             {&linux_platform::KernelFacilities::uniquePidfdInodes, "audit tokens"},
                                             {&linux_platform::KernelFacilities::refusedDescriptors, "sent descriptors"}}) {
    MachineFacts facts = soundMachine();
    facts.kernel.*facility = false;
    facts.daemon->protections = sentencesOf(facts.kernel);
    expectOnly(facts, protection, Verdict::missing, "");
  }
}

TEST(Findings, BundlesThatOthersCanWriteAreTold) {
  MachineFacts facts = soundMachine();
  facts.bundlesProblem = "/home/u can be written by everybody";
  expectOnly(facts, "bundles", Verdict::missing, "/home/u can be written by everybody");
}

TEST(Findings, AKernelThatWatchesNoMoreIsTold) {
  MachineFacts facts = soundMachine();
  facts.watchesProblem = "used up";
  expectOnly(facts, "watches", Verdict::missing, "used up");
}

TEST(Findings, WithoutADaemonWhatItHasIsNotKnown) {
  MachineFacts facts = soundMachine();
  facts.daemon.reset();
  facts.daemonProblem = "none answers";
  EXPECT_EQ(findingOf(facts, "daemon").text, "none answers");
  for (const char* protection : {"daemon", "daemon's kernel", "daemon's privileges"}) {
    EXPECT_EQ(findingOf(facts, protection).verdict, Verdict::missing) << protection;
  }
  EXPECT_EQ(reportOf(findingsFrom(facts)).status, ExitStatus::protectionMissing);
}

TEST(Findings, ADaemonThatFindsLessIsQuoted) {
  MachineFacts facts = soundMachine();
  facts.daemon->protections = sentencesOf({false, true, true, true, kNewestLevel});
  expectOnly(facts, "daemon's kernel", Verdict::missing, facts.daemon->protections.front());
  facts.daemon->protections.clear();
  expectOnly(facts, "daemon's kernel", Verdict::missing, "does not say");
}

TEST(Findings, EachPrivilegeOfTheDaemonIsTold) {
  const auto expectTold = [](const std::optional<ProcessPrivileges>& privileges, const std::string& text) {
    MachineFacts facts = soundMachine();
    facts.daemon->privileges = privileges;
    expectOnly(facts, "daemon's privileges", Verdict::missing, text);
  };
  expectTold(std::nullopt, "cannot be read");
  expectTold(ProcessPrivileges{true, false, true, true}, "root");
  expectTold(ProcessPrivileges{true, true, false, true}, "capabilities");
  expectTold(ProcessPrivileges{false, false, false, true}, "no_new_privs");
  expectTold(ProcessPrivileges{true, false, false, false}, "another user namespace");
}

TEST(Findings, AreARowEachAndTheWorstDecidesTheStatus) {
  const Report report = reportOf({{"one", Verdict::inForce, "a"}, {"two", Verdict::fatal, "b"}, {"three", Verdict::missing, "c"}});
  EXPECT_THAT(report.list.columns, ElementsAre("protection", "state", "finding"));
  EXPECT_THAT(report.list.rows, ElementsAre(ElementsAre(QXValue("one"), QXValue("in force"), QXValue("a")),
                                            ElementsAre(QXValue("two"), QXValue("fatal"), QXValue("b")),
                                            ElementsAre(QXValue("three"), QXValue("missing"), QXValue("c"))));
  EXPECT_EQ(report.status, ExitStatus::nothingStarts);
}

}  // namespace
}  // namespace docuvend::ctl
