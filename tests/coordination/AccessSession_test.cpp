#include "platform/linux/coordination/AccessSession.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <utility>
#include <variant>

#include "tests/coordination/CoordinationHouse.h"

namespace docuvend::linux_platform {
namespace {

using testing::accessID;
using testing::expectError;
using testing::expectSuccess;

using AccessSessionTest = testing::CoordinationHouse;

TEST_F(AccessSessionTest, AnIdentifierIsInUseUntilTheAccessHasEnded) {
  const auto holder = anybody();
  expectSuccess(*holder.write(plain, accessID(1)));
  expectError(*holder.write(otherPlain, accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  expectError(*holder.read(plain, accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  const auto waiter = anybody();
  const auto waiting = waiter.write(plain, accessID(1));
  expectError(*waiter.read(otherPlain, accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  expectSuccess(*holder.end(accessID(1)));
  expectSuccess(*waiting);
  expectSuccess(*holder.write(otherPlain, accessID(1)));
}

TEST_F(AccessSessionTest, WhatIsBeingEndedIsNeitherEndedAgainNorNamedAnew) {
  const auto slow = slowProvider();
  const auto writer = anybody();
  expectSuccess(*writer.write(item, accessID(1)));
  const auto ended = writer.end(accessID(1));
  EXPECT_TRUE(ended->empty()) << "the provider has not been told";
  expectError(*writer.end(accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  expectError(*writer.write(plain, accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  queues.runAll();
  expectSuccess(*ended);
  EXPECT_EQ(slow->told.size(), 1U);
  expectError(*writer.end(accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  expectSuccess(*writer.write(plain, accessID(1)));
}

TEST_F(AccessSessionTest, NamesNoAccessOfAnotherConnection) {
  const QXAuditToken process = unconfined();
  const auto holder = client(process);
  const auto other = client(process);
  expectSuccess(*holder.write(plain, accessID(1)));
  expectError(*other.end(accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  expectError(other.progress(accessID(1)).answers, FileCoordinationErrorCode::invalidAccessID);
  expectSuccess(*other.write(plain, accessID(1)));
  expectSuccess(*holder.end(accessID(1)));
}

TEST_F(AccessSessionTest, EndsAnAccessThatHasNotBegunAndAnswersItsRequest) {
  const auto holder = anybody();
  expectSuccess(*holder.write(plain, accessID(1)));
  const auto waiter = anybody();
  const auto waiting = waiter.write(plain, accessID(1));
  expectSuccess(*waiter.end(accessID(1)));
  expectError(*waiting, FileCoordinationErrorCode::ended);
  expectSuccess(*waiter.write(otherPlain, accessID(1)));

  const auto reading = waiter.read(item, accessID(2));
  expectSuccess(*waiter.end(accessID(2)));
  expectError(*reading, FileCoordinationErrorCode::ended);
  ASSERT_EQ(provider->asked.size(), 1U);
  provider->asked[0].completion(/*error=*/{});
  EXPECT_EQ(reading->size(), 1U);
}

// Waiting accesses, exempt ones and such as are being ended count like the others.
TEST_F(AccessSessionTest, HoldsNoMoreAccessesThanItMay) {
  const auto slow = slowProvider();
  const auto caller = client(unconfinedAs(kProvider));
  const auto holder = anybody();
  expectSuccess(*holder.write(plain, accessID(1)));
  const auto id = [](std::size_t number) {
    QXUUID made;
    made.bytes = {static_cast<std::uint8_t>(number), static_cast<std::uint8_t>(number >> 8U), 1};
    return made;
  };
  const auto waiting = caller.read(plain, id(0));
  expectSuccess(*caller.read(item, id(1)));
  for (std::size_t i = 2; i < AccessSession::kMaximumAccesses; ++i) expectSuccess(*caller.read(otherPlain, id(i)));
  const auto refused = caller.read(item, id(1000));
  expectError(*refused, FileCoordinationErrorCode::tooManyAccesses);
  expectError(*caller.write(otherPlain, id(1000)), FileCoordinationErrorCode::tooManyAccesses);
  expectError(*caller.read(otherPlain, id(2)), FileCoordinationErrorCode::invalidAccessID);
  EXPECT_TRUE(waiting->empty());
  expectSuccess(*caller.end(id(1)));
  expectSuccess(*caller.read(otherPlain, id(1000)));
  expectError(*caller.read(otherPlain, id(1001)), FileCoordinationErrorCode::tooManyAccesses);
  expectSuccess(*client(unconfinedAs(kProvider)).read(otherPlain, id(1001)));
  expectSuccess(*caller.end(id(2)));

  coordinator._removeDocuvend(slow);
  coordinator._addDocuvend(std::make_shared<testing::RecordingProvider>(QXURL::fileURL(storage, QXURLKind::directory),
                                                                        queues.operationQueue(), "com.example.another"));
  expectSuccess(*caller.write(item, id(2)));
  const auto ended = caller.end(id(2));
  EXPECT_TRUE(ended->empty());
  expectError(*caller.read(otherPlain, id(1001)), FileCoordinationErrorCode::tooManyAccesses);
  queues.runAll();
  expectSuccess(*ended);
  expectSuccess(*caller.read(otherPlain, id(1001)));
}

TEST_F(AccessSessionTest, TheEndOfTheConnectionEndsItsAccesses) {
  const auto leaving = anybody();
  expectSuccess(*leaving.write(item, accessID(1)));
  expectSuccess(*leaving.write(plain, accessID(2)));
  const auto holder = anybody();
  expectSuccess(*holder.write(otherPlain, accessID(1)));
  const auto neverBegun = leaving.write(otherPlain, accessID(3));
  const auto next = anybody();
  const auto nextOnPlain = next.write(plain, accessID(1));
  const auto nextOnItem = next.write(item, accessID(2));
  EXPECT_TRUE(nextOnPlain->empty());

  leaving.connection->close();
  ASSERT_EQ(provider->told.size(), 1U) << "of the write that had begun there";
  EXPECT_EQ(provider->told[0].second, item);
  expectSuccess(*nextOnPlain);
  expectSuccess(*nextOnItem);
  EXPECT_TRUE(neverBegun->empty()) << "there is nobody left to hear it";
  expectSuccess(*holder.end(accessID(1)));
  const auto holders = anybody().holders(otherPlain);
  EXPECT_EQ(holders.list, QXArray{});
}

TEST_F(AccessSessionTest, AnEndThatIsUnderWayWhenTheConnectionGoesTellsOnce) {
  const auto slow = slowProvider();
  const auto leaving = anybody();
  expectSuccess(*leaving.write(item, accessID(1)));
  EXPECT_TRUE(leaving.end(accessID(1))->empty());
  leaving.connection->close();
  queues.runAll();
  EXPECT_EQ(slow->told.size(), 1U);
}

TEST_F(AccessSessionTest, IsNotKeptAliveByAnswersThatAreDue) {
  const auto leaving = anybody();
  const auto waiting = leaving.read(item, accessID(1));
  const std::weak_ptr<QXRpcExportedObject> servicer = leaving.connection->exportedObject();
  leaving.connection->close();
  EXPECT_TRUE(servicer.expired());
  ASSERT_EQ(provider->asked.size(), 1U) << "it brings the item all the same";
  EXPECT_EQ(anybody().holders(item).list, QXArray{});
  provider->asked[0].completion(/*error=*/{});
  EXPECT_TRUE(waiting->empty());
}

TEST_F(AccessSessionTest, KeepsWhatIsBegunUnderAnIdentifierAsSoonAsItIsFree) {
  const auto holder = anybody();
  expectSuccess(*holder.write(plain, accessID(1)));
  const auto accessTo = [process = unconfined()](const QXURL& url) {
    return FileAccess{std::get<KeyedFile>(KeyedFile::of(url)).key, url, AccessKind::writing, {process, 0}, {}};
  };
  const auto session = std::make_shared<AccessSession>(accesses);
  testing::Answers second;
  session->begin(accessID(1), accessTo(plain), [&](const std::optional<QXError>& error) {
    ASSERT_TRUE(error);
    EXPECT_EQ(session->refusalOf(accessID(1)), std::nullopt);
    session->begin(accessID(1), accessTo(otherPlain), [&second](std::optional<QXError> heard) { second.push_back(std::move(heard)); });
  });
  testing::Answers firstEnd;
  session->end(accessID(1), [&firstEnd](std::optional<QXError> heard) { firstEnd.push_back(std::move(heard)); });
  expectSuccess(firstEnd);
  expectSuccess(second);
  EXPECT_NE(session->refusalOf(accessID(1)), std::nullopt);
  testing::Answers secondEnd;
  session->end(accessID(1), [&secondEnd](std::optional<QXError> heard) { secondEnd.push_back(std::move(heard)); });
  expectSuccess(secondEnd);
}

TEST_F(AccessSessionTest, GoesAlthoughItsAnswersAreDue) {
  const QXAuditToken process = unconfined();
  const FileAccess access{std::get<KeyedFile>(KeyedFile::of(item)).key, item, AccessKind::reading, {process, 0}, {}};
  auto session = std::make_shared<AccessSession>(accesses);
  testing::Answers answers;
  session->begin(accessID(1), access, [&answers](std::optional<QXError> error) { answers.push_back(std::move(error)); });
  const std::weak_ptr<AccessSession> known = session;
  session.reset();
  EXPECT_TRUE(known.expired());
  expectError(answers, FileCoordinationErrorCode::ended);
}

}  // namespace
}  // namespace docuvend::linux_platform
