#include "platform/linux/coordination/FileCoordinationServicer.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "tests/coordination/CoordinationHouse.h"

namespace docuvend::linux_platform {
namespace {

using testing::accessID;
using testing::expectError;
using testing::expectSuccess;

using FileCoordinationServicerTest = testing::CoordinationHouse;

TEST_F(FileCoordinationServicerTest, AReadBeginsWhenTheProviderHasBroughtTheContents) {
  const auto reader = anybody();
  const auto answers = reader.read(item, accessID(1));
  EXPECT_TRUE(answers->empty());
  ASSERT_EQ(provider->asked.size(), 1U);
  EXPECT_EQ(provider->asked[0].url, item);
  provider->asked[0].completion(/*error=*/{});
  expectSuccess(*answers);
  expectSuccess(*reader.end(accessID(1)));
  EXPECT_TRUE(provider->told.empty());
}

TEST_F(FileCoordinationServicerTest, AReadInNobodysDirectoryBeginsAtOnce) {
  expectSuccess(*anybody().read(plain, accessID(1)));
  EXPECT_TRUE(provider->asked.empty());
}

TEST_F(FileCoordinationServicerTest, AProvidersErrorIsTheReadersAndItsIdentifierIsFreeAgain) {
  const auto reader = anybody();
  const auto answers = reader.read(item, accessID(1));
  ASSERT_EQ(provider->asked.size(), 1U);
  const QXError error = QXError::make("com.example", 12, "no network");
  provider->asked[0].completion(error);
  EXPECT_EQ(*answers, testing::Answers{error});
  expectError(*reader.end(accessID(1)), FileCoordinationErrorCode::invalidAccessID);
  expectSuccess(*reader.read(plain, accessID(1)));
}

TEST_F(FileCoordinationServicerTest, AWriteBeginsAtOnceAndItsEndTellsTheProviderOnce) {
  const auto writer = anybody();
  expectSuccess(*writer.write(item, accessID(1)));
  EXPECT_TRUE(provider->told.empty());
  provider->onTold = [this] { EXPECT_EQ(provider->told.size(), 1U); };
  expectSuccess(*writer.end(accessID(1)));
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told[0].second, item);
  EXPECT_TRUE(provider->asked.empty());
}

TEST_F(FileCoordinationServicerTest, WritersTakeTurns) {
  const auto first = anybody();
  const auto second = anybody();
  expectSuccess(*first.write(plain, accessID(1)));
  const auto answers = second.write(plain, accessID(1));
  EXPECT_TRUE(answers->empty()) << "the same identifier on another connection is another access";
  expectSuccess(*first.end(accessID(1)));
  expectSuccess(*answers);
}

TEST_F(FileCoordinationServicerTest, RefusesAMissingURL) {
  const auto caller = anybody();
  expectError(*caller.read(std::nullopt, accessID(1)), FileCoordinationErrorCode::missingURL);
  expectError(*caller.write(std::nullopt, accessID(1)), FileCoordinationErrorCode::missingURL);
  expectError(*caller.didFinishWriting(std::nullopt), FileCoordinationErrorCode::missingURL);
  expectError(caller.holders(std::nullopt).answers, FileCoordinationErrorCode::missingURL);
}

TEST_F(FileCoordinationServicerTest, RefusesAMissingIdentifierBeforeItLooksAtTheFile) {
  const auto caller = client(editor());
  expectError(*caller.read(item, std::nullopt), FileCoordinationErrorCode::invalidAccessID);
  expectError(*caller.write(item, std::nullopt), FileCoordinationErrorCode::invalidAccessID);
  expectError(*caller.end(std::nullopt), FileCoordinationErrorCode::invalidAccessID);
  expectError(caller.progress(std::nullopt).answers, FileCoordinationErrorCode::invalidAccessID);
}

// An application that may not reach a file is told the same of every such file, whatever is there.
TEST_F(FileCoordinationServicerTest, SaysNothingOfAFileThatTheCallerCannotReach) {
  const auto stranger = client(editor());
  const auto holder = anybody();
  expectSuccess(*holder.write(item, accessID(1)));
  for (const std::string& path : {document, storage + "/none.txt", storage + "/none/none.txt", outside + "/secret.txt", storage}) {
    const QXURL url = QXURL::fileURL(path, QXURLKind::file);
    std::vector<testing::Answers> all = {*stranger.read(url, accessID(1)), stranger.holders(url).answers, *stranger.write(url, accessID(1)),
                                         *stranger.didFinishWriting(url)};
    for (const auto& answers : all) {
      expectError(answers, FileCoordinationErrorCode::notPermitted);
      EXPECT_EQ(answers[0]->url, url);
      EXPECT_EQ(answers[0]->underlying, nullptr);
    }
    EXPECT_EQ(all[0][0]->texts.at("description"), "the caller may not read the file");
    EXPECT_EQ(all[1], all[0]);
    EXPECT_EQ(all[2][0]->texts.at("description"), "the caller may not write the file");
  }
  EXPECT_TRUE(provider->asked.empty());
  EXPECT_TRUE(provider->told.empty());
}

TEST_F(FileCoordinationServicerTest, AsksNobodyElseAboutAFileThatTheCallerCannotReach) {
  fake_platform::FakeFileSystem watched;
  watched.addDirectory(storage);
  LinuxFileCoordinator watching(watched);
  watching._addDocuvend(provider);
  FileAccesses watchedAccesses(watching);
  const FileCoordinationServicer::Surroundings around{watching, watchedAccesses, sandbox, peers};
  const testing::CoordinationClient stranger(around, editor());
  expectError(*stranger.read(item, accessID(1)), FileCoordinationErrorCode::notPermitted);
  expectError(*stranger.write(item, accessID(1)), FileCoordinationErrorCode::notPermitted);
  expectError(*stranger.didFinishWriting(item), FileCoordinationErrorCode::notPermitted);
  EXPECT_TRUE(watched.calls().empty());
  expectSuccess(*testing::CoordinationClient(around, unconfined()).didFinishWriting(item));
  EXPECT_FALSE(watched.calls().empty());
}

TEST_F(FileCoordinationServicerTest, TheProviderHearsTheFilesOwnURLWhateverLinkLedToIt) {
  const std::string way = plain.fileSystemPath() + ".way";
  std::filesystem::create_directory_symlink(storage, way);
  const QXURL byLink = QXURL::fileURL(way + item.fileSystemPath().substr(storage.size()), QXURLKind::file);
  const auto caller = anybody();
  const auto reading = caller.read(byLink, accessID(1));
  ASSERT_EQ(provider->asked.size(), 1U);
  EXPECT_EQ(provider->asked.front().url, item);
  expectSuccess(*caller.didFinishWriting(byLink));
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told.front().second, item);
}

TEST_F(FileCoordinationServicerTest, WhoMayReadOnlyDoesNotWrite) {
  ASSERT_EQ(::chmod(plain.fileSystemPath().c_str(), 0400), 0);
  const auto caller = anybody();
  expectSuccess(*caller.read(plain, accessID(1)));
  expectSuccess(*caller.end(accessID(1)));
  expectError(*caller.write(plain, accessID(1)), FileCoordinationErrorCode::notPermitted);
  ASSERT_EQ(::chmod(plain.fileSystemPath().c_str(), 0200), 0);
  expectError(*caller.read(plain, accessID(1)), FileCoordinationErrorCode::notPermitted);
  expectError(caller.holders(plain).answers, FileCoordinationErrorCode::notPermitted);
  expectSuccess(*caller.write(plain, accessID(1)));
}

TEST_F(FileCoordinationServicerTest, ATokenForTheFileIsEnough) {
  const auto caller = client(editor());
  const std::string token = issued(document);
  expectError(*caller.write(item, accessID(1)), FileCoordinationErrorCode::notPermitted);
  expectError(*caller.write(item, accessID(1), issued(sibling)), FileCoordinationErrorCode::notPermitted);
  expectSuccess(*caller.write(item, accessID(1), token));
  expectSuccess(*caller.end(accessID(1)));
  const auto reading = caller.read(item, accessID(1), token);
  ASSERT_EQ(provider->asked.size(), 1U);
  provider->asked[0].completion(/*error=*/{});
  expectSuccess(*reading);
  expectError(caller.holders(item).answers, FileCoordinationErrorCode::notPermitted);
  expectSuccess(caller.holders(item, token).answers);
  ASSERT_EQ(sandbox.invalidateReadWriteExtensions(std::nullopt), std::nullopt);
  expectError(*caller.read(item, accessID(2), token), FileCoordinationErrorCode::notPermitted);
}

TEST_F(FileCoordinationServicerTest, TellsUnconfinedProcessesThatThereIsNoDirectory) {
  const QXURL nowhere = QXURL::fileURL(outside + "/none/x.txt", QXURLKind::file);
  const auto caller = anybody();
  expectError(*caller.read(nowhere, accessID(1)), FileCoordinationErrorCode::noDirectory);
  const auto answers = caller.write(nowhere, accessID(1));
  expectError(*answers, FileCoordinationErrorCode::noDirectory);
  EXPECT_EQ((*answers)[0]->url, nowhere);
  ASSERT_TRUE((*answers)[0]->underlying);
  EXPECT_EQ((*answers)[0]->underlying->code, ENOENT);
  expectError(caller.holders(nowhere).answers, FileCoordinationErrorCode::noDirectory);
  expectError(*caller.read(QXURL::fileURL("/", QXURLKind::directory), accessID(1)), FileCoordinationErrorCode::noDirectory);
  expectSuccess(*caller.write(QXURL::fileURL(outside + "/new.txt", QXURLKind::file), accessID(1)));
}

TEST_F(FileCoordinationServicerTest, LooksForCyclesBetweenTheParties) {
  for (const bool sameParty : {true, false}) {
    const auto a = anybody();
    const auto b = anybody();
    expectSuccess(*a.write(plain, accessID(1), /*token=*/{}, /*party=*/7));
    expectSuccess(*b.write(otherPlain, accessID(1)));
    const auto waiting = a.write(otherPlain, accessID(2), /*token=*/{}, /*party=*/sameParty ? 7 : 8);
    EXPECT_TRUE(waiting->empty());
    const auto last = b.write(plain, accessID(2), /*token=*/{}, /*party=*/0);
    if (sameParty) {
      expectError(*last, FileCoordinationErrorCode::wouldDeadlock);
    } else {
      EXPECT_TRUE(last->empty());
    }
    a.connection->close();
    b.connection->close();
  }
}

TEST_F(FileCoordinationServicerTest, AnswersNobodyWhoWantsNoAnswer) {
  const auto caller = anybody();
  caller.remote().call<&QXFileCoordination::coordinateWritingItemAtURL>(item, std::nullopt, accessID(1), std::nullopt, nullptr);
  caller.remote().call<&QXFileCoordination::coordinateReadingItemAtURL>(std::nullopt, std::nullopt, accessID(1), std::nullopt, nullptr);
  caller.remote().call<&QXFileCoordination::progressOfAccess>(accessID(1), nullptr);
  caller.remote().call<&QXFileCoordination::holdersOfItemAtURL>(item, std::nullopt, nullptr);
  caller.remote().call<&QXFileCoordination::endAccess>(accessID(1), nullptr);
  EXPECT_EQ(provider->told.size(), 1U);
  caller.remote().call<&QXFileCoordination::writerDidFinishWritingForURL>(item, nullptr);
  EXPECT_EQ(provider->told.size(), 2U);
}

TEST_F(FileCoordinationServicerTest, IsNobodyOnceItsConnectionIsGone) {
  FileCoordinationServicer servicer(surroundings, /*connection=*/{});
  testing::Answers heard;
  const auto hear = [&heard](std::optional<QXError> error) { heard.push_back(std::move(error)); };
  servicer.writerDidFinishWritingForURL(plain, hear);
  expectError(heard, FileCoordinationErrorCode::notPermitted);
  heard.clear();
  servicer.coordinateReadingItemAtURL(plain, /*token=*/{}, accessID(1), /*party=*/{}, hear);
  expectError(heard, FileCoordinationErrorCode::notPermitted);
}

}  // namespace
}  // namespace docuvend::linux_platform
