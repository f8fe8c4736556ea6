// What is told of a file's accesses: who has them, and how far the provider has come.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/coordination/BytesPresent.h"
#include "platform/linux/coordination/FileCoordinationServicer.h"
#include "tests/coordination/CoordinationHouse.h"

namespace docuvend::linux_platform {
namespace {

using testing::accessID;
using testing::expectError;
using testing::expectSuccess;

using Holders = testing::CoordinationHouse;
using AccessProgress = testing::CoordinationHouse;

QXDictionary shown(const char* kind, const char* state, bool own) { return QXDictionary{{"kind", kind}, {"state", state}, {"own", own}}; }
QXDictionary shownWhole(const char* kind, const char* state, bool own, std::optional<std::string> bundle = {}) {
  QXDictionary holder = shown(kind, state, own);
  holder["processIdentifier"] = ::getpid();
  if (bundle) holder["bundleIdentifier"] = *bundle;
  return holder;
}

TEST_F(Holders, AreShownInTheirOrderWithTheirNamesToUnconfinedCallers) {
  EXPECT_EQ(anybody().holders(plain).list, QXArray{});
  const auto first = client(unconfinedAs("com.example.editor"));
  const auto second = anybody();
  const auto third = anybody();
  expectSuccess(*first.read(plain, accessID(1)));
  EXPECT_TRUE(second.write(plain, accessID(1))->empty());
  EXPECT_TRUE(third.read(plain, accessID(1))->empty());
  expectSuccess(*third.read(otherPlain, accessID(2)));
  const auto heard = second.holders(plain);
  expectSuccess(heard.answers);
  EXPECT_EQ(heard.list, (QXArray{shownWhole("reading", "holding", /*own=*/false, "com.example.editor"),
                                 shownWhole("writing", "waiting", /*own=*/true), shownWhole("reading", "waiting", /*own=*/false)}));
}

TEST_F(Holders, AreShownToConfinedCallersWithoutTheirNames) {
  const QXURL draft = QXURL::fileURL(editorContainer + "/draft.txt", QXURLKind::file);
  const QXAuditToken process = editor();
  const auto own = client(process);
  const auto other = client(unconfinedAs("com.example.other"));
  expectSuccess(*own.read(draft, accessID(1)));
  expectSuccess(*other.read(draft, accessID(1)));
  const QXArray expected{shown("reading", "holding", /*own=*/true), shown("reading", "holding", /*own=*/false)};
  EXPECT_EQ(own.holders(draft).list, expected);
  EXPECT_EQ(client(process).holders(draft).list, expected) << "the process is meant, not the connection";
}

TEST_F(Holders, AreShownWhileTheirProviderBringsTheFile) {
  const auto reader = anybody();
  EXPECT_TRUE(reader.read(item, accessID(1))->empty());
  EXPECT_EQ(reader.holders(item).list, QXArray{shownWhole("reading", "providing", /*own=*/true)});
  ASSERT_EQ(provider->asked.size(), 1U);
  provider->asked[0].completion(/*error=*/{});
  EXPECT_EQ(reader.holders(item).list, QXArray{shownWhole("reading", "holding", /*own=*/true)});
}

TEST_F(Holders, AreFoundByAnySpellingOfTheFilesDirectory) {
  ASSERT_EQ(::symlink(outside.c_str(), (home + "/link").c_str()), 0);
  const QXURL linked = QXURL::fileURL(home + "/link/plain.txt", QXURLKind::file);
  const auto reader = anybody();
  expectSuccess(*reader.read(plain, accessID(1)));
  EXPECT_TRUE(anybody().write(linked, accessID(1))->empty());
  EXPECT_EQ(reader.holders(linked).list, QXArray{shownWhole("reading", "holding", /*own=*/true)});
}

TEST_F(Holders, AreNoMoreThanAnAnswerMayName) {
  std::vector<std::unique_ptr<testing::CoordinationClient>> clients;
  for (std::size_t i = 0; i <= FileCoordinationServicer::kMaximumHoldersNamed; ++i) {
    if (i % AccessSession::kMaximumAccesses == 0)
      clients.push_back(std::make_unique<testing::CoordinationClient>(surroundings, unconfined()));
    expectSuccess(*clients.back()->read(plain, accessID(static_cast<std::uint8_t>(i % AccessSession::kMaximumAccesses))));
  }
  ASSERT_TRUE(anybody().holders(plain).list);
  EXPECT_EQ(anybody().holders(plain).list->size(), FileCoordinationServicer::kMaximumHoldersNamed);
}

TEST_F(AccessProgress, IsTheFilesWhileTheProviderBringsIt) {
  const auto reader = anybody();
  EXPECT_TRUE(reader.read(item, accessID(1))->empty());
  ASSERT_EQ(::truncate(document.c_str(), 0), 0);
  ASSERT_EQ(::truncate(document.c_str(), 1 << 20), 0);
  auto heard = reader.progress(accessID(1));
  expectSuccess(heard.answers);
  EXPECT_EQ(heard.present, 0);
  EXPECT_EQ(heard.size, 1 << 20);
  testing::write(document, std::string(100, 'x'));
  heard = reader.progress(accessID(1));
  EXPECT_EQ(heard.present, 100) << "what is allocated is more, what is present is not";
  EXPECT_EQ(heard.size, 100);
  ASSERT_EQ(provider->asked.size(), 1U);
  provider->asked[0].completion(/*error=*/{});
  heard = reader.progress(accessID(1));
  expectSuccess(heard.answers);
  EXPECT_EQ(heard.present, std::nullopt);
  EXPECT_EQ(heard.size, std::nullopt);
}

TEST_F(AccessProgress, IsAbsentWhileTheAccessWaitsForItsTurnAndAfterItsEndThereIsNone) {
  const auto writer = anybody();
  expectSuccess(*writer.write(item, accessID(1)));
  const auto reader = anybody();
  EXPECT_TRUE(reader.read(item, accessID(1))->empty());
  for (const auto* caller : {&writer, &reader}) {
    const auto heard = caller->progress(accessID(1));
    expectSuccess(heard.answers);
    EXPECT_EQ(heard.present, std::nullopt);
    EXPECT_EQ(heard.size, std::nullopt);
  }
  expectSuccess(*reader.end(accessID(1)));
  expectError(reader.progress(accessID(1)).answers, FileCoordinationErrorCode::invalidAccessID);
  expectError(reader.progress(accessID(9)).answers, FileCoordinationErrorCode::invalidAccessID);
}

TEST_F(AccessProgress, IsOfARegularFileThatIsStillWhereTheURLLed) {
  const auto known = [](const QXURL& url) {
    const auto placed = KeyedFile::of(url);
    EXPECT_TRUE(std::holds_alternative<KeyedFile>(placed));
    return std::get<KeyedFile>(placed).key;
  };
  const FileKey key = known(item);
  EXPECT_EQ(BytesPresent::of(key, item), (BytesPresent{8, 8}));
  std::filesystem::remove(document);
  EXPECT_EQ(BytesPresent::of(key, item), std::nullopt);
  ASSERT_EQ(::symlink(otherPlain.fileSystemPath().c_str(), document.c_str()), 0);
  EXPECT_EQ(BytesPresent::of(key, item), std::nullopt) << "another file's size";
  std::filesystem::remove(document);
  std::filesystem::create_directory(document);
  EXPECT_EQ(BytesPresent::of(key, item), std::nullopt);

  // The directory of the URL comes to be another, where there is a file of that name.
  const std::string link = home + "/link";
  ASSERT_EQ(::symlink(outside.c_str(), link.c_str()), 0);
  const QXURL linked = QXURL::fileURL(link + "/plain.txt", QXURLKind::file);
  const FileKey linkedKey = known(linked);
  EXPECT_TRUE(BytesPresent::of(linkedKey, linked));
  std::filesystem::remove(link);
  ASSERT_EQ(::symlink(otherGroup.c_str(), link.c_str()), 0);
  testing::write(otherGroup + "/plain.txt", "another");
  EXPECT_EQ(BytesPresent::of(linkedKey, linked), std::nullopt);
}

}  // namespace
}  // namespace docuvend::linux_platform
