#include "providers/DVRefreshPlan.h"

#include <gtest/gtest.h>

#include <ostream>
#include <string>

#include "platform/fake/FakeExtensionHost.h"

namespace docuvend {
namespace {

using fake_platform::FakeExtension;
using Action = DVRefreshPlan::Action;

std::shared_ptr<QXExtension> extension(std::optional<std::string> identifier, int version = 1) {
  return std::make_shared<FakeExtension>(std::move(identifier), version);
}

struct Row {
  std::string name;
  std::vector<std::pair<std::string, int>> registered;                // identifier and version
  std::vector<std::pair<std::optional<std::string>, int>> installed;  // likewise
  std::vector<DVRefreshPlan::Step> steps;
  std::vector<ProviderID> toUnregister;
};

std::ostream& operator<<(std::ostream& out, const Row& row) { return out << row.name; }

class DVRefreshPlanTest : public testing::TestWithParam<Row> {};

const ProviderID kA{"a"};
const ProviderID kB{"b"};
const ProviderID kEmpty{""};

const std::vector<Row> kRows = {
    {"NothingInstalledAndNothingRegistered", {}, {}, {}, {}},
    {"ANewExtensionIsMade", {}, {{"a", 1}}, {{Action::make, kA}}, {}},
    {"AnUnchangedExtensionIsKept", {{"a", 1}}, {{"a", 1}}, {{Action::keep, kA}}, {}},
    {"AChangedExtensionIsMadeAndTheOldOneUnregistered", {{"a", 1}}, {{"a", 2}}, {{Action::make, kA}}, {kA}},
    {"AVanishedExtensionIsUnregistered", {{"a", 1}, {"b", 1}}, {{"b", 1}}, {{Action::keep, kB}}, {kA}},
    {"EveryExtensionVanishes", {{"a", 1}, {"b", 1}}, {}, {}, {kA, kB}},
    {"AnExtensionWithoutIdentifierIsIgnored", {}, {{std::nullopt, 1}, {"a", 1}}, {{Action::ignore, std::nullopt}, {Action::make, kA}}, {}},
    {"AnEmptyIdentifierIsAnIdentifier", {}, {{"", 1}}, {{Action::make, kEmpty}}, {}},
    {"TheOrderIsThatOfTheExtensions", {{"a", 1}}, {{"b", 1}, {"a", 1}}, {{Action::make, kB}, {Action::keep, kA}}, {}},
    {"TwoNewOnesOfOneIdentifierAreBothMade", {}, {{"a", 1}, {"a", 2}}, {{Action::make, kA}, {Action::make, kA}}, {}},
    {"AfterAKeptOneASecondOfItsIdentifierIsMadeAndNothingUnregistered",
     {{"a", 1}},
     {{"a", 1}, {"a", 2}},
     {{Action::keep, kA}, {Action::make, kA}},
     {}},
    {"EvenAnEqualSecondOneIsMade", {{"a", 1}}, {{"a", 1}, {"a", 1}}, {{Action::keep, kA}, {Action::make, kA}}, {}},
    {"AfterAChangedOneTheUnchangedOneIsStillKept", {{"a", 1}}, {{"a", 2}, {"a", 1}}, {{Action::make, kA}, {Action::keep, kA}}, {}},
};

TEST_P(DVRefreshPlanTest, FollowsFromWhatIsRegisteredAndWhatIsInstalled) {
  std::map<ProviderID, std::shared_ptr<QXExtension>> registered;
  for (const auto& [identifier, version] : GetParam().registered)
    registered.emplace(ProviderID{identifier}, extension(identifier, version));
  std::vector<std::shared_ptr<QXExtension>> installed;
  for (const auto& [identifier, version] : GetParam().installed) installed.push_back(extension(identifier, version));
  const DVRefreshPlan plan = dvPlanRefresh(std::move(registered), installed);
  EXPECT_TRUE(plan.steps == GetParam().steps);
  EXPECT_EQ(plan.toUnregister, GetParam().toUnregister);
}

TEST(DVRefreshPlanSteps, AreEqualWhenActionAndIdentifierAre) {
  const DVRefreshPlan::Step step{Action::keep, kA};
  EXPECT_TRUE(step == (DVRefreshPlan::Step{Action::keep, kA}));
  EXPECT_FALSE(step == (DVRefreshPlan::Step{Action::make, kA}));
  EXPECT_FALSE(step == (DVRefreshPlan::Step{Action::keep, kB}));
}

INSTANTIATE_TEST_SUITE_P(Plan, DVRefreshPlanTest, testing::ValuesIn(kRows),
                         [](const testing::TestParamInfo<Row>& info) { return info.param.name; });

}  // namespace
}  // namespace docuvend
