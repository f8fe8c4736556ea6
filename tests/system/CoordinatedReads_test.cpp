// Coordinated reads and writes in the directories of real providers: what they are asked and told, and whom one that fails holds up.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <iterator>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "tests/system/house/TurnTest.h"

namespace docuvend::tests {
namespace {

using linux_platform::kFileCoordinationServiceName;
using linux_platform::QXFileCoordination;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::StartsWith;

constexpr const char* kProviderFailed = "DVErrorDomain 7";
const std::string kTricksterProgram = "docuvend-trickster";

class CoordinatedReads : public TurnTest {
 protected:
  [[nodiscard]] static long blocksOf(const QXURL& file) {
    struct stat status {};
    return ::stat(file.fileSystemPath().c_str(), &status) == 0 ? static_cast<long>(status.st_blocks) : -1;
  }
  // Askers that read the item on which the trickster is stuck, all of them waiting for it.
  [[nodiscard]] std::vector<std::unique_ptr<Process>> readersInVain(std::size_t count) const {
    std::vector<std::unique_ptr<Process>> readers;
    for (std::size_t i = 0; i < count; ++i) readers.push_back(ask({"reading", stuck().absoluteString(), "end"}));
    awaitHolders(stuck(), std::vector<std::string>(count, "reading providing"));
    house_.awaitLog("is stuck");
    return readers;
  }
  [[nodiscard]] QXURL stuck() const { return trick("stuck"); }
  void free() const { writeFile(house_.container(kTrickster) + "/free", ""); }
  // Lines that begin so, in this order, and nothing of coordination or of the provider beside them.
  void expectInOrder(const std::vector<std::string>& beginnings) const {
    const auto log = house_.log();
    auto from = log.begin();
    for (const std::string& beginning : beginnings) {
      const auto found = std::find_if(from, log.end(), [&beginning](const std::string& line) { return line.starts_with(beginning); });
      ASSERT_NE(found, log.end()) << "not in its place: " << beginning;
      from = std::next(found);
    }
  }
};

TEST_F(CoordinatedReads, AReadOfAPlaceholderHasTheTrueBytes) {
  ASSERT_EQ(blocksOf(letter_), 0) << "a placeholder";
  const auto reader = holder("reading", letter_, "reader");
  EXPECT_EQ(contentsOf(letter_.fileSystemPath()), kLetterText);
  letGo(place("reader"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok", "ok"));
  EXPECT_EQ(timesAsked(letter_), 1);
}

TEST_F(CoordinatedReads, TheLinesOfAReadAreInTheirOrder) {
  const auto reader = ask({"reading", letter_.absoluteString(), "end"});
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok"));
  const std::string item = house_.bookmark(letter_.fileSystemPath());
  const std::string file = letter_.absoluteString();
  expectInOrder(
      {"[INFO] QXFileCoordinator requested us to provide item at URL " + file + " for consumer reader " + std::to_string(reader->pid()) +
           "-",
       "[DEBUG] -[DVExtensionDocuvend itemIDForURL:completionHandler:]",
       "[DEBUG] Successfully got item ID “" + item.substr(item.find('/') + 1) + "” for URL " + file + " from extension " + kCellar,
       "[DEBUG] -[DVExtensionDocuvend startProvidingItemAtURL:completionHandler:]",
       "[DEBUG] Successfully provided item at URL " + file + " for extension " + kCellar + "."});
  EXPECT_EQ(house_.loggedBeginning("[ERROR] "), 0);
}

TEST_F(CoordinatedReads, TheLinesOfAWriteAreInTheirOrderAndTheCloudHasIt) {
  const auto writer = ask({"writing", letter_.absoluteString(), "hold", place("writer"), "end"});
  awaitHolding(place("writer"));
  EXPECT_EQ(timesAsked(letter_), 0) << "who writes asks for nothing";
  writeFile(letter_.fileSystemPath(), "new");
  letGo(place("writer"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok", "ok"));
  const std::string file = letter_.absoluteString();
  expectInOrder({"[INFO] QXFileCoordinator is telling us the item at URL " + file + " was changed by writer ID writer " +
                     std::to_string(writer->pid()) + "-",
                 "[DEBUG] The item at URL " + file + " is provided by the etxension " + kCellar,
                 "[DEBUG] -[DVExtensionDocuvend itemChangedAtURL:]"});
  EXPECT_EQ(timesTold(letter_), 1);
  eventually("the cloud has it", [this] { return contentsOf(house_.cloudFile("letter.txt")) == "new"; });
}

TEST_F(CoordinatedReads, ManyWhoWaitForOneItemShareOneRequest) {
  constexpr std::size_t kReaders = 20;
  const auto readers = readersInVain(kReaders);
  EXPECT_EQ(timesAsked(stuck()), 1);
  free();
  for (const auto& reader : readers) EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok"));
  EXPECT_EQ(timesAsked(stuck()), 1);
}

TEST_F(CoordinatedReads, AProvidersErrorIsTheReadersAndTheNextReaderAsksAnew) {
  const QXURL sour = trick("sour");
  const auto lines = answers({"reading", sour.absoluteString(), "reading", sour.absoluteString()});
  EXPECT_THAT(lines, Each(std::string(kProviderFailed) + " < TricksterErrorDomain 1"));
  EXPECT_EQ(lines.size(), 2U);
  EXPECT_EQ(timesAsked(sour), 2);
  EXPECT_TRUE(holders(sour).empty());
  EXPECT_THAT(answers({"writing", sour.absoluteString(), "end"}), ElementsAre("ok", "ok")) << "nobody is left in front of it";
}

TEST_F(CoordinatedReads, AnItemThatTheProviderCannotNameIsNotAskedFor) {
  const QXURL refused = trick("refused");
  EXPECT_THAT(answers({"reading", refused.absoluteString()}), ElementsAre(std::string(kProviderFailed) + " < TricksterErrorDomain 1"));
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Could not provide item at URL " + refused.absoluteString() + " from extension " + kTrickster +
                                   " to reader reader "),
            1);
  EXPECT_EQ(house_.loggedContaining("startProvidingItemAtURL"), 0);
}

TEST_F(CoordinatedReads, AProviderThatDiesInTheMiddleIsTheErrorOfAllWhoWaitAndTheNextReaderIsServed) {
  constexpr std::size_t kReaders = 3;
  const auto readers = readersInVain(kReaders);
  const auto extension = house_.processesOf(kTricksterProgram);
  ASSERT_EQ(extension.size(), 1U);
  ::kill(extension.front(), SIGKILL);
  for (const auto& reader : readers) EXPECT_THAT(linesOf(*reader), ElementsAre(StartsWith(kProviderFailed), "no turn"));
  EXPECT_EQ(timesAsked(stuck()), 1);
  free();
  EXPECT_THAT(answers({"reading", stuck().absoluteString(), "end"}), ElementsAre("ok", "ok"));
  EXPECT_EQ(timesAsked(stuck()), 2);
}

TEST_F(CoordinatedReads, AProviderThatAbortsIsTheReadersErrorAndServesTheNextItem) {
  EXPECT_THAT(answers({"reading", trick("bomb").absoluteString()}), ElementsAre(StartsWith(kProviderFailed)));
  EXPECT_THAT(answers({"reading", trick("other").absoluteString(), "end"}), ElementsAre("ok", "ok"));
}

TEST_F(CoordinatedReads, AReaderThatWaitsForAProviderHoldsUpNobodyElse) {
  const auto readers = readersInVain(1);
  EXPECT_THAT(answers({"reading", trick("other").absoluteString(), "end", "writing", trick("other").absoluteString(), "end"}),
              ElementsAre("ok", "ok", "ok", "ok"))
      << "another item of the same provider";
  EXPECT_THAT(answers({"reading", letter_.absoluteString(), "end", "writing", letter_.absoluteString(), "end"}),
              ElementsAre("ok", "ok", "ok", "ok"))
      << "an item of another provider";
  EXPECT_THAT(holders(stuck()), ElementsAre("reading providing"));
  free();
  EXPECT_THAT(linesOf(*readers.front()), ElementsAre("ok", "ok"));
}

TEST_F(CoordinatedReads, TheLastWaitersDeadlineEndsItsWaitAndNotTheProvidersWork) {
  const std::string file = stuck().absoluteString();
  EXPECT_THAT(answers({"within", "2000", "reading", file}), ElementsAre("ok", "DVConsumerErrorDomain 2"));
  house_.awaitLog("is stuck");
  EXPECT_TRUE(holders(stuck()).empty());
  EXPECT_THAT(answers({"writing", file, "end"}), ElementsAre("ok", "ok")) << "a writer waits for no provider";
  const auto readers = readersInVain(1);
  EXPECT_EQ(timesAsked(stuck()), 1) << "the work goes on, and whoever comes now waits for it";
  free();
  EXPECT_THAT(linesOf(*readers.front()), ElementsAre("ok", "ok"));
}

TEST_F(CoordinatedReads, AReaderThatIsKilledWhileItWaitsForTheProviderIsForgotten) {
  const auto readers = readersInVain(2);
  killNow(*readers.front());
  awaitHolders(stuck(), {"reading providing"});
  free();
  EXPECT_THAT(linesOf(*readers.back()), ElementsAre("ok", "ok"));
  EXPECT_TRUE(holders(stuck()).empty());
}

TEST_F(CoordinatedReads, TheProvidersOwnProcessWaitsForNobodyBelowItsDirectoryAndIsNotToldOf) {
  const QXURL file = trick("file");
  const auto writer = holder("writing", file, "writer");
  const auto own = house_.client(kTrickster, kFileCoordinationServiceName);
  const QXUUID reading{{1}};
  const QXUUID writing{{2}};
  EXPECT_EQ(errorOf(own->ask<&QXFileCoordination::coordinateReadingItemAtURL>(file, std::nullopt, reading, std::nullopt)), std::nullopt);
  EXPECT_EQ(errorOf(own->ask<&QXFileCoordination::coordinateWritingItemAtURL>(file, std::nullopt, writing, std::nullopt)), std::nullopt);
  EXPECT_THAT(holders(file), ElementsAre("writing holding"));
  EXPECT_EQ(errorOf(own->ask<&QXFileCoordination::endAccess>(writing)), std::nullopt);
  EXPECT_EQ(errorOf(own->ask<&QXFileCoordination::endAccess>(reading)), std::nullopt);
  EXPECT_EQ(timesAsked(file), 0);
  EXPECT_EQ(timesTold(file), 0);
  letGo(place("writer"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok", "ok"));

  // Elsewhere it is like everybody.
  EXPECT_EQ(errorOf(own->ask<&QXFileCoordination::coordinateReadingItemAtURL>(letter_, std::nullopt, reading, std::nullopt)), std::nullopt);
  EXPECT_THAT(holders(letter_), ElementsAre("reading holding"));
}

TEST_F(CoordinatedReads, AWriteOfTheProvidersDirectoryItselfIsTheInfoLineAlone) {
  const QXURL storage = QXURL::fileURL(house_.storage(kTrickster), QXURLKind::directory);
  EXPECT_THAT(answers({"writing", storage.absoluteString(), "end"}), ElementsAre("ok", "ok"));
  EXPECT_EQ(timesTold(storage), 1);
  EXPECT_EQ(house_.loggedContaining("etxension"), 0);
  EXPECT_EQ(house_.loggedContaining("itemChangedAtURL"), 0);
  EXPECT_EQ(house_.loggedBeginning("[ERROR] "), 0);
}

TEST_F(CoordinatedReads, OfAFileOfNoProviderTurnsAreTakenAndNobodyIsAsked) {
  const QXURL own = url(house_.home() + "/own.txt");
  const auto writer = holder("writing", own, "writer");
  const auto reader = waiter("reading", own);
  letGo(place("writer"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok", "ok"));
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok"));
  EXPECT_EQ(house_.loggedContaining("QXFileCoordinator "), 0);
}

TEST_F(CoordinatedReads, WhereThereIsNoDirectoryThereIsNoTurn) {
  EXPECT_THAT(answers({"writing", url(house_.home() + "/none/file").absoluteString()}),
              ElementsAre(StartsWith("QXFileCoordinationErrorDomain 8")));
}

}  // namespace
}  // namespace docuvend::tests
