#include "platform/linux/coordination/Provisions.h"

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "tests/coordination/RecordingProvider.h"
#include "tests/coordination/Turns.h"

namespace docuvend::linux_platform {
namespace {

using testing::fileNamed;
using testing::processNumber;
using testing::RecordingProvider;

using Numbers = std::vector<AccessNumber>;
using Wait = Provisions::Wait;

constexpr std::size_t kMost = Provisions::kMaximumRequestsUnderWay;
const Application kEditor = "com.example.editor";
const Application kOther = "com.example.other";

struct ProvisionsTest : ::testing::Test {
  // As many of an application as may be under way, of accesses with numbers from there on.
  std::vector<ProvideRequest> fill(const Application& application = kEditor, AccessNumber from = 1000) {
    std::vector<ProvideRequest> requests;
    for (std::size_t i = 0; i < kMost; ++i) {
      const auto joined = provisions.join(provider, fileNamed("many" + std::to_string(from - 1000 + i)), from + i, a, application);
      EXPECT_EQ(joined.wait, Wait::forNewRequest);
      requests.push_back(joined.request);
    }
    return requests;
  }

  const FileKey f = fileNamed("f");
  const FileKey g = fileNamed("g");
  const QXAuditToken a = processNumber(1);
  const QXAuditToken b = processNumber(2);
  const std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>();
  Provisions provisions;
};

TEST_F(ProvisionsTest, MakeOneRequestOfAnObjectForAFile) {
  const auto first = provisions.join(provider, f, 1, a, kEditor);
  EXPECT_EQ(first.wait, Wait::forNewRequest);
  const auto second = provisions.join(provider, f, 2, b, kEditor);
  EXPECT_EQ(second.wait, Wait::forRunningRequest);
  EXPECT_EQ(second.request, first.request);
  const auto finished = provisions.finish(first.request);
  ASSERT_TRUE(finished);
  EXPECT_EQ(finished->provider, provider);
  EXPECT_EQ(finished->file, f);
  EXPECT_EQ(finished->waiting, (Numbers{1, 2}));
  EXPECT_EQ(finished->processes, (std::set<QXAuditToken>{a, b}));
  EXPECT_TRUE(provisions.isEmpty());
}

TEST_F(ProvisionsTest, MakeARequestForEveryFileAndObject) {
  const auto first = provisions.join(provider, f, 1, a, kEditor);
  const auto otherFile = provisions.join(provider, g, 2, a, kEditor);
  const auto otherObject = provisions.join(std::make_shared<RecordingProvider>(), f, 3, a, kEditor);
  EXPECT_EQ(otherFile.wait, Wait::forNewRequest);
  EXPECT_EQ(otherObject.wait, Wait::forNewRequest);
  EXPECT_EQ(provisions.finish(otherFile.request)->waiting, Numbers{2});
  EXPECT_EQ(provisions.finish(otherObject.request)->waiting, Numbers{3});
  EXPECT_EQ(provisions.finish(first.request)->waiting, Numbers{1});
}

TEST_F(ProvisionsTest, FinishARequestOnce) {
  const auto first = provisions.join(provider, f, 1, a, kEditor);
  EXPECT_TRUE(provisions.finish(first.request));
  EXPECT_FALSE(provisions.finish(first.request));
  const auto second = provisions.join(provider, f, 2, a, kEditor);
  EXPECT_EQ(second.wait, Wait::forNewRequest);
  EXPECT_FALSE(provisions.finish(first.request));
  EXPECT_EQ(provisions.finish(second.request)->waiting, Numbers{2});
}

TEST_F(ProvisionsTest, GoOnWithARequestForWhichNobodyWaits) {
  const auto first = provisions.join(provider, f, 1, a, kEditor);
  provisions.leave(1);
  EXPECT_FALSE(provisions.isEmpty());
  const auto second = provisions.join(provider, f, 2, b, kEditor);
  EXPECT_EQ(second.request, first.request);
  provisions.leave(2);
  const auto finished = provisions.finish(first.request);
  ASSERT_TRUE(finished);
  EXPECT_EQ(finished->waiting, Numbers{});
  EXPECT_EQ(finished->processes, (std::set<QXAuditToken>{a, b})) << "those too that left";
}

TEST_F(ProvisionsTest, LetThoseGoOnWaitingWhoHaveNotLeft) {
  const auto request = provisions.join(provider, f, 1, a, kEditor).request;
  (void)provisions.join(provider, f, 2, b, kEditor);
  (void)provisions.join(provider, f, 3, b, kEditor);
  provisions.leave(2);
  provisions.leave(2);
  provisions.leave(77);
  EXPECT_EQ(provisions.finish(request)->waiting, (Numbers{1, 3}));
  EXPECT_TRUE(provisions.isEmpty());
}

TEST_F(ProvisionsTest, OfOneApplicationAreOfALimitedNumberAndTheRestWaitsInItsOrder) {
  const auto requests = fill();
  const auto first = provisions.join(provider, f, 1, a, kEditor);
  EXPECT_EQ(first.wait, Wait::inLine);
  const auto second = provisions.join(provider, g, 2, a, kEditor);
  EXPECT_EQ(second.wait, Wait::inLine);
  EXPECT_EQ(provisions.join(provider, f, 3, b, kEditor).wait, Wait::inLine);
  EXPECT_EQ(provisions.join(provider, fileNamed("many0"), 4, b, kEditor).wait, Wait::forRunningRequest);
  auto finished = provisions.finish(requests[5]);
  ASSERT_TRUE(finished && finished->next);
  EXPECT_EQ(finished->next->request, first.request);
  EXPECT_EQ(finished->next->number, 1U);
  EXPECT_EQ(provisions.join(provider, f, 5, b, kEditor).wait, Wait::forRunningRequest);
  finished = provisions.finish(first.request);
  ASSERT_TRUE(finished && finished->next);
  EXPECT_EQ(finished->waiting, (Numbers{1, 3, 5}));
  EXPECT_EQ(finished->next->request, second.request);
  EXPECT_FALSE(provisions.finish(second.request)->next);
}

TEST_F(ProvisionsTest, ThatAreGivenUpKeepTheirRoomWhileTheyAreUnderWayAndHaveNoneWhenTheyAreNot) {
  const auto requests = fill();
  for (std::size_t i = 0; i < kMost; ++i) provisions.leave(1000 + i);
  EXPECT_EQ(provisions.join(provider, f, 1, a, kEditor).wait, Wait::inLine);
  EXPECT_EQ(provisions.join(provider, g, 2, a, kEditor).wait, Wait::inLine);
  EXPECT_EQ(provisions.join(provider, g, 3, a, kEditor).wait, Wait::inLine);
  provisions.leave(1);
  provisions.leave(2);
  const auto finished = provisions.finish(requests[0]);
  ASSERT_TRUE(finished && finished->next);
  EXPECT_EQ(finished->next->number, 3U) << "somebody still waits for that";
  for (std::size_t i = 1; i < kMost; ++i) EXPECT_FALSE(provisions.finish(requests[i])->next);
  EXPECT_FALSE(provisions.finish(finished->next->request)->next);
  EXPECT_TRUE(provisions.isEmpty());
}

TEST_F(ProvisionsTest, OfOneApplicationHoldUpNoOtherAlsoOfTheSameFile) {
  const auto requests = fill();
  const auto first = provisions.join(provider, f, 1, a, kEditor);
  EXPECT_EQ(first.wait, Wait::inLine);
  const auto second = provisions.join(provider, f, 2, b, kOther);
  EXPECT_EQ(second.wait, Wait::forNewRequest);
  EXPECT_EQ(second.request, first.request);
  EXPECT_EQ(provisions.join(std::make_shared<RecordingProvider>(), f, 3, a, kEditor).wait, Wait::forNewRequest);
  EXPECT_FALSE(provisions.finish(requests[0])->next) << "it stands in no line any more";
  EXPECT_EQ(provisions.finish(second.request)->waiting, (Numbers{1, 2}));
}

TEST_F(ProvisionsTest, ARequestIsMadeInTheNameOfAReaderOfItsLineWhoHasNotLeft) {
  const auto editors = fill();
  const auto others = fill(kOther, 2000);
  (void)provisions.join(provider, f, 1, a, kEditor);
  (void)provisions.join(provider, f, 2, b, kOther);
  (void)provisions.join(provider, f, 3, b, kOther);
  provisions.leave(1);
  EXPECT_FALSE(provisions.finish(editors[0])->next) << "of that application nobody waits";
  provisions.leave(2);
  const auto finished = provisions.finish(others[0]);
  ASSERT_TRUE(finished && finished->next);
  EXPECT_EQ(finished->next->number, 3U);
}

TEST_F(ProvisionsTest, ARequestIsMadeInTheNameOfAReaderOfTheLineThatHasRoom) {
  (void)fill();
  const auto others = fill(kOther, 2000);
  EXPECT_EQ(provisions.join(provider, f, 1, a, kEditor).wait, Wait::inLine);
  EXPECT_EQ(provisions.join(provider, f, 2, b, kOther).wait, Wait::inLine);
  const auto finished = provisions.finish(others[0]);
  ASSERT_TRUE(finished && finished->next);
  EXPECT_EQ(finished->next->number, 2U) << "who came first is of another line";
}

TEST_F(ProvisionsTest, AllWhoStandInALineCanBeSentToAnotherObject) {
  const auto requests = fill();
  (void)provisions.join(provider, f, 1, a, kEditor);
  (void)provisions.join(provider, g, 2, a, kEditor);
  (void)provisions.join(provider, g, 3, a, kEditor);
  EXPECT_EQ(provisions.leaveLines(), (std::set<AccessNumber>{1, 2, 3}));
  EXPECT_TRUE(provisions.leaveLines().empty());
  EXPECT_EQ(provisions.join(std::make_shared<RecordingProvider>(), f, 1, a, kEditor).wait, Wait::forNewRequest);
  for (const ProvideRequest request : requests) EXPECT_FALSE(provisions.finish(request)->next);
}

TEST_F(ProvisionsTest, RememberForWhomContentsWereBrought) {
  provisions.noteProvided(f, a);
  EXPECT_TRUE(provisions.isProvided(f, a));
  EXPECT_FALSE(provisions.isProvided(f, b));
  EXPECT_FALSE(provisions.isProvided(g, a));
  provisions.noteTurnIsOver(g, a);
  provisions.noteTurnIsOver(f, b);
  EXPECT_TRUE(provisions.isProvided(f, a));
  EXPECT_FALSE(provisions.isEmpty());
  provisions.noteTurnIsOver(f, a);
  EXPECT_FALSE(provisions.isProvided(f, a));
  EXPECT_TRUE(provisions.isEmpty());
}

}  // namespace
}  // namespace docuvend::linux_platform
