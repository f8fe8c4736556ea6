#include "platform/linux/coordination/Provisions.h"

#include <gtest/gtest.h>

#include <memory>
#include <set>
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

struct ProvisionsTest : ::testing::Test {
  const FileKey f = fileNamed("f");
  const FileKey g = fileNamed("g");
  const QXAuditToken a = processNumber(1);
  const QXAuditToken b = processNumber(2);
  const std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>();
  Provisions provisions;
};

TEST_F(ProvisionsTest, MakeOneRequestOfAnObjectForAFile) {
  const auto first = provisions.join(provider, f, 1, a);
  EXPECT_EQ(first.wait, Wait::forNewRequest);
  const auto second = provisions.join(provider, f, 2, b);
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
  const auto first = provisions.join(provider, f, 1, a);
  const auto otherFile = provisions.join(provider, g, 2, a);
  const auto otherObject = provisions.join(std::make_shared<RecordingProvider>(), f, 3, a);
  EXPECT_EQ(otherFile.wait, Wait::forNewRequest);
  EXPECT_EQ(otherObject.wait, Wait::forNewRequest);
  EXPECT_EQ(provisions.finish(otherFile.request)->waiting, Numbers{2});
  EXPECT_EQ(provisions.finish(otherObject.request)->waiting, Numbers{3});
  EXPECT_EQ(provisions.finish(first.request)->waiting, Numbers{1});
}

TEST_F(ProvisionsTest, FinishARequestOnce) {
  const auto first = provisions.join(provider, f, 1, a);
  EXPECT_TRUE(provisions.finish(first.request));
  EXPECT_FALSE(provisions.finish(first.request));
  const auto second = provisions.join(provider, f, 2, a);
  EXPECT_EQ(second.wait, Wait::forNewRequest);
  EXPECT_FALSE(provisions.finish(first.request));
  EXPECT_EQ(provisions.finish(second.request)->waiting, Numbers{2});
}

TEST_F(ProvisionsTest, GoOnWithARequestForWhichNobodyWaits) {
  const auto first = provisions.join(provider, f, 1, a);
  provisions.leave(1);
  EXPECT_FALSE(provisions.isEmpty());
  const auto second = provisions.join(provider, f, 2, b);
  EXPECT_EQ(second.request, first.request);
  provisions.leave(2);
  const auto finished = provisions.finish(first.request);
  ASSERT_TRUE(finished);
  EXPECT_EQ(finished->waiting, Numbers{});
  EXPECT_EQ(finished->processes, (std::set<QXAuditToken>{a, b})) << "those too that left";
}

TEST_F(ProvisionsTest, LetThoseGoOnWaitingWhoHaveNotLeft) {
  const auto request = provisions.join(provider, f, 1, a).request;
  (void)provisions.join(provider, f, 2, b);
  (void)provisions.join(provider, f, 3, b);
  provisions.leave(2);
  provisions.leave(2);
  provisions.leave(77);
  EXPECT_EQ(provisions.finish(request)->waiting, (Numbers{1, 3}));
  EXPECT_TRUE(provisions.isEmpty());
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
