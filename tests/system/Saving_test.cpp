// Documents opened and saved through the consumer library.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <future>
#include <set>
#include <vector>

#include "sdk/Administrator.h"
#include "sdk/Consumer.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

const ProviderID kCellarID{kCellar};
const ConsumerID kPickerID{kPicker};

Failure writeAll(const QXDescriptor& file, std::string_view text) {
  while (!text.empty()) {
    const ssize_t count = ::write(file.number, text.data(), text.size());
    if (count < 0) return QXError::system(errno, "cannot write");
    text.remove_prefix(static_cast<std::size_t>(count));
  }
  return std::nullopt;
}

class Saving : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kPicker, kEditor}) house_.install(bundle);
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    house_.startDaemon();
    ::setenv("XDG_RUNTIME_DIR", house_.runtime().c_str(), 1);
    consumer_ = connected();
    ASSERT_TRUE(consumer_);
    auto granted = consumer_->extendSandbox(QXURL::fileURL(letter_, QXURLKind::file), kCellarID, kPickerID);
    ASSERT_EQ(granted.index(), 0U);
    document_ = std::get<Document>(granted);
    ASSERT_EQ(consumer_->open(*document_, kCellarID, Access::read).index(), 0U);
  }
  static std::unique_ptr<Consumer> connected() {
    Consumer::Options options;
    options.actAs = kPicker;
    options.deadline = kPatience;
    auto connected = Consumer::connect(options);
    auto* consumer = std::get_if<std::unique_ptr<Consumer>>(&connected);
    return consumer == nullptr ? nullptr : std::move(*consumer);
  }
  [[nodiscard]] Failure save(Consumer& consumer, const std::string& text) const {
    return consumer.replace(*document_, [&text](const QXDescriptor& file) { return writeAll(file, text); });
  }

  std::string letter_;
  std::unique_ptr<Consumer> consumer_;
  std::optional<Document> document_;
};

TEST_F(Saving, GivingUpLeavesTheItemUntouchedAndALaterSaveIsWhole) {
  const QXError givenUp = QXError::make("Test", 1, "given up");
  EXPECT_EQ(consumer_->replace(*document_,
                               [&givenUp](const QXDescriptor& file) -> Failure {
                                 EXPECT_EQ(writeAll(file, "half of something long"), std::nullopt);
                                 return givenUp;
                               }),
            givenUp);
  EXPECT_EQ(contentsOf(letter_), "Dear all\n");
  EXPECT_EQ(contentsOf(house_.cloudFile("letter.txt")), "Dear all\n");
  EXPECT_EQ(save(*consumer_, "new"), std::nullopt);
  EXPECT_EQ(contentsOf(letter_), "new");
  eventually("the cloud has it", [this] { return contentsOf(house_.cloudFile("letter.txt")) == "new"; });
}

TEST_F(Saving, AWriteInPlaceIsToldToTheProvider) {
  const auto opened = consumer_->open(*document_, kCellarID, Access::readWrite);
  ASSERT_EQ(opened.index(), 0U);
  ASSERT_EQ(::pwrite(std::get<QXDescriptor>(opened).number, "DEAR", 4, 0), 4);
  EXPECT_EQ(consumer_->finishedWriting(document_->url), std::nullopt);
  eventually("the cloud has it", [this] { return contentsOf(house_.cloudFile("letter.txt")) == "DEAR all\n"; });
}

TEST_F(Saving, TokensThatARevocationMadeWorthlessAreAskedForAnewWhereTheDocumentHasItsString) {
  const auto string = consumer_->bookmarkableString(document_->url);
  ASSERT_EQ(string.index(), 0U);
  const auto resolved = consumer_->documentURL(std::get<0>(string));
  ASSERT_EQ(resolved.index(), 0U);
  const Document named = std::get<Document>(resolved);

  (void)house_.granted(house_.putInCloud("other.txt", ""), kEditor);
  auto connected = Administrator::connect({});
  ASSERT_EQ(connected.index(), 0U);
  const auto grants = std::get<0>(connected)->grants(kCellarID, ConsumerID{kEditor});
  ASSERT_EQ(grants.index(), 0U);
  ASSERT_EQ(std::get<0>(grants).size(), 1U);
  const Grant& other = std::get<0>(grants).front();
  ASSERT_EQ(std::get<0>(connected)->revoke(other.provider, other.item, other.consumer), std::nullopt);

  EXPECT_EQ(consumer_->redeem(*named.itemToken, Access::read).index(), 1U) << "the tokens are worthless";
  EXPECT_EQ(consumer_->open(named, kCellarID, Access::read).index(), 0U);
  EXPECT_EQ(consumer_->replace(named, [](const QXDescriptor& file) { return writeAll(file, "new"); }), std::nullopt);
  EXPECT_EQ(contentsOf(letter_), "new");
  EXPECT_EQ(consumer_->open(*document_, kCellarID, Access::read).index(), 1U) << "a document without its string stays closed";
}

// Two savers in this process, each over its own connections, and another process that saves now and then.
TEST_F(Saving, OfManyWhoSaveAtOnceTheItemAlwaysHasTheWholeContentsOfOne) {
  constexpr int kSavesOfEach = 100;
  constexpr int kSavesOfTheOtherProcess = 10;
  constexpr std::size_t kLength = 150'000;
  // Each contents has its own length, and is of one character.
  constexpr std::size_t kStep = 97;
  const auto textOf = [](char mark, int round) { return std::string(kLength - static_cast<std::size_t>(round) * kStep, mark); };
  const auto isWhole = [](const std::string& text) {
    if (text == "Dear all\n") return true;
    return !text.empty() && (kLength - text.size()) % kStep == 0 && text.find_first_not_of(text.front()) == std::string::npos;
  };
  const auto string = consumer_->bookmarkableString(document_->url);
  ASSERT_EQ(string.index(), 0U);

  std::vector<std::future<void>> savers;
  for (const char mark : {'a', 'b'}) {
    savers.push_back(std::async(std::launch::async, [&, mark] {
      const auto own = connected();
      EXPECT_TRUE(own);
      for (int round = 0; own && round < kSavesOfEach; ++round) {
        const Failure failure = save(*own, textOf(mark, round));
        EXPECT_EQ(failure, std::nullopt) << mark << round << ": " << failure->description();
      }
    }));
  }
  savers.push_back(std::async(std::launch::async, [&] {
    for (int round = 0; round < kSavesOfTheOtherProcess; ++round) {
      const Ending ending = house_.ctl({"--as", kPicker, "put", std::get<0>(string)}, textOf('c', round));
      EXPECT_EQ(ending.status, 0) << ending.errors;
    }
  }));
  std::set<std::string> seen;
  int looks = 0;
  const auto areSaving = [&savers] {
    return std::any_of(savers.begin(), savers.end(),
                       [](const auto& saver) { return saver.wait_for(std::chrono::seconds(0)) != std::future_status::ready; });
  };
  while (areSaving()) {
    const std::string text = contentsOf(letter_);
    if (!isWhole(text)) ADD_FAILURE() << "the item holds " << text.size() << " bytes of several savers";
    seen.insert(text);
    ++looks;
  }
  for (auto& saver : savers) saver.get();
  EXPECT_TRUE(isWhole(contentsOf(letter_)));
  EXPECT_NE(contentsOf(letter_), "Dear all\n");
  RecordProperty("looks", looks);
  RecordProperty("differentContentsSeen", static_cast<int>(seen.size()));
}

}  // namespace
}  // namespace docuvend::tests
