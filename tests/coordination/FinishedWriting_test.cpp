// Who tells the provider of a write, and who need not wait for the provider: its own processes.
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/coordination/FileCoordinationServicer.h"
#include "tests/coordination/CoordinationHouse.h"

namespace docuvend::linux_platform {
namespace {

using testing::accessID;
using testing::expectError;
using testing::expectSuccess;

using FinishedWriting = testing::CoordinationHouse;
using ExemptAccess = testing::CoordinationHouse;

TEST_F(FinishedWriting, IsToldToTheProviderUnderTheWritersProcessIdentifier) {
  expectSuccess(*anybody().didFinishWriting(item));
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told[0].first, "writer " + std::to_string(::getpid()) + "-1");
  EXPECT_EQ(provider->told[0].second, item);
}

TEST_F(FinishedWriting, IsAnsweredWhenTheProviderHasBeenTold) {
  const auto slow = slowProvider();
  const auto writer = anybody();
  const auto answers = writer.didFinishWriting(item);
  EXPECT_TRUE(answers->empty());
  queues.runAll();
  expectSuccess(*answers);
  EXPECT_EQ(slow->told.size(), 1U);
}

TEST_F(FinishedWriting, IsNobodysWhereThereIsNoProvider) {
  expectError(*anybody().didFinishWriting(plain), FileCoordinationErrorCode::noProvider);
  coordinator._removeDocuvend(provider);
  expectError(*anybody().didFinishWriting(item), FileCoordinationErrorCode::noProvider);
  EXPECT_TRUE(provider->told.empty());
}

TEST_F(FinishedWriting, LeavesTheDirectoryItselfToTheProvider) {
  expectSuccess(*anybody().didFinishWriting(QXURL::fileURL(storage, QXURLKind::directory)));
  EXPECT_EQ(provider->told.size(), 1U);
}

TEST_F(FinishedWriting, IsToldByTheAccessWithinOne) {
  const QXAuditToken process = unconfined();
  const auto writer = client(process);
  expectSuccess(*writer.write(item, accessID(1)));
  expectSuccess(*writer.didFinishWriting(item));
  expectSuccess(*client(process).didFinishWriting(item));  // another connection of the process
  EXPECT_TRUE(provider->told.empty());
  expectSuccess(*writer.end(accessID(1)));
  EXPECT_EQ(provider->told.size(), 1U);
  expectSuccess(*writer.didFinishWriting(item));
  EXPECT_EQ(provider->told.size(), 2U) << "there is no access any more";
}

// Names need not be files: without a limit an application could have the daemon keep any number of them.
TEST_F(FinishedWriting, IsRefusedLikeANewWriteWhileTheProviderHasNotHeardOfTooMuchOfTheSameApplication) {
  provider->isSlow = true;
  const auto numbered = [this](std::size_t number) { return QXURL::fileURL(storage + "/none" + std::to_string(number), QXURLKind::file); };
  const auto writer = client(unconfinedAs("com.example.editor"));
  const QXURL begun = numbered(100000);
  expectSuccess(*writer.write(begun, accessID(1)));
  constexpr std::size_t kMost = ChangeNotices::kMaximumNoticesUnderWay + ChangeNotices::kMaximumUntoldFiles;
  for (std::size_t i = 0; i < kMost; ++i) expectSuccess(*writer.didFinishWriting(numbered(i)));
  const auto refused = writer.didFinishWriting(numbered(kMost));
  expectError(*refused, FileCoordinationErrorCode::tooManyChanges);
  EXPECT_EQ((*refused)[0]->url, numbered(kMost));
  const auto again = client(unconfinedAs("com.example.editor"));
  expectError(*again.write(numbered(kMost), accessID(1)), FileCoordinationErrorCode::tooManyChanges);
  expectSuccess(*again.didFinishWriting(numbered(kMost - 1)));
  EXPECT_TRUE(again.read(numbered(kMost), accessID(1))->empty()) << "it may read";
  expectSuccess(*again.write(plain, accessID(2)));
  expectSuccess(*client(unconfinedAs("com.example.other")).didFinishWriting(numbered(kMost + 1)));
  EXPECT_EQ(provider->told.back().second, numbered(kMost + 1)) << "others are told of at once";
  expectSuccess(*writer.end(accessID(1)));

  provider->answer();
  expectError(*writer.didFinishWriting(numbered(kMost)), FileCoordinationErrorCode::tooManyChanges);
  provider->answer();
  expectSuccess(*writer.didFinishWriting(numbered(kMost)));
  expectError(*writer.didFinishWriting(numbered(kMost + 2)), FileCoordinationErrorCode::tooManyChanges);
  while (!provider->unanswered.empty()) provider->answer();
  EXPECT_EQ(provider->told.size(), kMost + 3) << "what had begun is told, and nothing is lost";
  EXPECT_EQ(provider->told[provider->told.size() - 2].second, begun);
}

TEST_F(FinishedWriting, IsRefusedOnceTooMuchIsKeptForAProviderThatIsNotRegistered) {
  const auto numbered = [this](std::size_t number) { return QXURL::fileURL(storage + "/none" + std::to_string(number), QXURLKind::file); };
  LinuxFileCoordinator waiting(fileSystem, {.installedStorages = [this] {
                                 return std::vector<InstalledStorage>{{kProvider, QXURL::fileURL(storage, QXURLKind::directory)}};
                               }});
  FileAccesses waitingAccesses(waiting);
  const FileCoordinationServicer::Surroundings around{waiting, waitingAccesses, sandbox, peers};
  const testing::CoordinationClient writer(around, unconfinedAs("com.example.editor"));
  for (std::size_t i = 0; i < ChangeNotices::kMaximumUntoldFiles; ++i) expectSuccess(*writer.didFinishWriting(numbered(i)));
  expectError(*writer.didFinishWriting(item), FileCoordinationErrorCode::tooManyChanges);
  expectError(*writer.write(item, accessID(1)), FileCoordinationErrorCode::tooManyChanges);
  expectSuccess(*testing::CoordinationClient(around, unconfinedAs("com.example.other")).didFinishWriting(item));
  waiting.installedStoragesChanged();
  expectError(*writer.didFinishWriting(item), FileCoordinationErrorCode::tooManyChanges);
  waiting._addDocuvend(provider);
  EXPECT_EQ(provider->told.size(), ChangeNotices::kMaximumUntoldFiles + 1);
  expectSuccess(*writer.didFinishWriting(item));
}

TEST_F(FinishedWriting, IsNotToldByAnAccessToAnotherFileOrOfAnotherProcessOrForReading) {
  const auto writer = anybody();
  expectSuccess(*writer.write(plain, accessID(1)));
  expectSuccess(*writer.didFinishWriting(item));
  EXPECT_EQ(provider->told.size(), 1U);
  expectSuccess(*writer.write(item, accessID(2)));
  expectSuccess(*anybody().didFinishWriting(item));
  EXPECT_EQ(provider->told.size(), 2U);
  expectSuccess(*writer.end(accessID(2)));
  EXPECT_EQ(provider->told.size(), 3U);

  const auto reading = writer.read(item, accessID(3));
  ASSERT_EQ(provider->asked.size(), 1U);
  provider->asked[0].completion(/*error=*/{});
  expectSuccess(*reading);
  expectSuccess(*writer.didFinishWriting(item));
  EXPECT_EQ(provider->told.size(), 4U);
}

// The way of a confined editor's save.
TEST_F(FinishedWriting, IsAnnouncedByTheOneWhoReplacedTheItemAndByNoOther) {
  const QXAuditToken saving = editor("1");
  const auto saver = client(saving);
  const auto stranger = client(editor("2"));
  expectError(*saver.didFinishWriting(item), FileCoordinationErrorCode::notPermitted);
  ASSERT_TRUE(std::holds_alternative<UniqueDescriptor>(testing::redeem(sandbox, saving, issued(sibling), TokenUse::writing)));
  ASSERT_EQ(testing::replaceItem(sandbox, saving, issued(document), issued(sibling)), std::nullopt);
  expectError(*stranger.didFinishWriting(item), FileCoordinationErrorCode::notPermitted);
  expectSuccess(*saver.didFinishWriting(item));
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told[0].second, item);
}

TEST_F(ExemptAccess, BeginsAtOnceAndHoldsUpNobodyAndIsNotShownAndTellsNobody) {
  const auto own = client(unconfinedAs(kProvider));
  const auto writer = anybody();
  expectSuccess(*writer.write(item, accessID(1)));
  expectSuccess(*own.read(item, accessID(1)));
  expectSuccess(*own.write(item, accessID(2)));
  EXPECT_TRUE(provider->asked.empty());
  ASSERT_TRUE(anybody().holders(item).list);
  EXPECT_EQ(anybody().holders(item).list->size(), 1U) << "the writer alone";
  expectSuccess(*writer.end(accessID(1)));
  expectSuccess(*writer.write(item, accessID(1)));
  expectSuccess(*writer.end(accessID(1)));
  EXPECT_EQ(provider->told.size(), 2U) << "the writer's two";

  expectSuccess(*own.didFinishWriting(item));
  expectSuccess(*own.end(accessID(2)));
  expectSuccess(*own.end(accessID(1)));
  expectError(*own.end(accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  expectSuccess(*own.write(item, accessID(1)));
  own.connection->close();
  EXPECT_EQ(provider->told.size(), 2U);
}

TEST_F(ExemptAccess, IsNamedLikeTheOthers) {
  const auto own = client(unconfinedAs(kProvider));
  expectSuccess(*own.write(item, accessID(1)));
  expectError(*own.read(item, accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  const auto progress = own.progress(accessID(1));
  expectSuccess(progress.answers);
  EXPECT_EQ(progress.size, std::nullopt);
}

TEST_F(ExemptAccess, IsTheConfinedProvidersToo) {
  const auto own = client(peers.add(confined(kProvider, "1")));
  expectSuccess(*own.read(item, accessID(1)));
  EXPECT_TRUE(provider->asked.empty());
}

TEST_F(ExemptAccess, IsNeitherAnothersNorOutsideTheDirectory) {
  const auto own = client(unconfinedAs(kProvider));
  expectSuccess(*own.write(plain, accessID(1)));
  EXPECT_TRUE(anybody().read(plain, accessID(1))->empty()) << "there it is like everybody";
  const auto other = client(unconfinedAs("com.example.other"));
  EXPECT_TRUE(other.read(item, accessID(1))->empty());
  EXPECT_EQ(provider->asked.size(), 1U);
  expectSuccess(*other.didFinishWriting(item));
  EXPECT_EQ(provider->told.size(), 1U);
}

TEST_F(ExemptAccess, IsNobodysWithAProviderThatHasNoIdentity) {
  coordinator._removeDocuvend(provider);
  const auto nameless = std::make_shared<testing::RecordingProvider>(QXURL::fileURL(storage, QXURLKind::directory));
  coordinator._addDocuvend(nameless);
  EXPECT_TRUE(anybody().read(item, accessID(1))->empty());
  EXPECT_EQ(nameless->asked.size(), 1U);
}

TEST_F(ExemptAccess, NeedsThePermissionAllTheSame) {
  const auto own = client(unconfinedAs(kProvider));
  expectError(*own.write(QXURL::fileURL(storage + "/none/x.txt", QXURLKind::file), accessID(1)), FileCoordinationErrorCode::noDirectory);
  expectError(*client(peers.add(confined("com.example.unknown", "1"))).read(item, accessID(1)), FileCoordinationErrorCode::notPermitted);
}

}  // namespace
}  // namespace docuvend::linux_platform
