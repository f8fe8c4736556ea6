// An extension that leaves one question unanswered, to live on when its bundle is gone: with the container that is the next bundle's, the
// network, and an answer that the daemon would take for the next one's.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>

#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::StartsWith;

constexpr const char* kSecret = "hunter2";
const std::string kProgram = "docuvend-colluder";

class OutlivedExtensions : public FileAttackTest {
 protected:
  // The attacker reads, and the colluder does not answer.
  void SetUp() override {
    FileAttackTest::SetUp();
    ASSERT_EQ(grant(url(put("never"))).outcome, "ok");
    ASSERT_EQ(grant(url(put("letter.txt"))).outcome, "ok");
    reader_ = std::make_unique<Process>(Command{{std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker, "resolve", stringFor("never"),
                                                 "turn-with", "item", "reading", url(place("never")).absoluteString()},
                                                house_.environment(),
                                                {}});
    eventually("the colluder has been asked", [this] { return fs::exists(seen()) || !reader_->isRunning(); });
    const auto processes = house_.processesOf(kProgram);
    ASSERT_EQ(processes.size(), 1U);
    process_ = processes.front();
    next_ = house_.home() + "/next";
    fs::copy(house_.bundles() + "/" + kColluder, next_, fs::copy_options::recursive);
  }
  [[nodiscard]] std::string seen() const { return house_.container(kColluder) + "/seen"; }
  void ctl(const std::vector<std::string>& words) const {
    const Ending ending = house_.ctl(words);
    EXPECT_EQ(ending.status, 0) << ending.errors;
  }
  [[nodiscard]] bool isThere() const {
    const auto processes = house_.processesOf(kProgram);
    return std::find(processes.begin(), processes.end(), process_) != processes.end();
  }
  // What the attacker's read came to.
  [[nodiscard]] std::string outcomeOfRead() {
    const Ending& ending = reader_->wait();
    EXPECT_EQ(ending.status, 0) << ending.errors;
    const auto lines = linesOf(ending.output);
    return lines.size() == 2 ? lines.back() : "said something else: " + ending.output;
  }
  void expectItEnded() {
    EXPECT_THAT(outcomeOfRead(), StartsWith("DVErrorDomain ")) << "the read waits no longer, and has nobody's answer";
    eventually("the first one's process is gone", [this] { return !isThere(); });
    EXPECT_EQ(house_.logged("[NOTICE] The bundle of " + kColluder + " was removed or replaced: its process is ended."), 1);
  }
  // The next one may keep a secret, and is who is asked.
  void expectTheNextOneIsAlone() {
    eventually("the next one answers", [this] { return grant(url(place("letter.txt"))).outcome == "ok"; });
    whisper("secret", kSecret);
    EXPECT_THAT(attack({"resolve", stringFor("letter.txt"), "open", "read", "contents"}),
                ElementsAre(url(place("letter.txt")).absoluteString(), "ok", kLetterText));
    EXPECT_NE(contentsOf(seen()), kSecret);
    const auto processes = house_.processesOf(kProgram);
    EXPECT_EQ(std::count(processes.begin(), processes.end(), process_), 0);
  }

  std::unique_ptr<Process> reader_;
  pid_t process_ = 0;
  std::string next_;
};

TEST_F(OutlivedExtensions, OneWhoseBundleIsRemovedEndsWithTheQuestionThatItLeftOpen) {
  ctl({"uninstall", kColluder});
  expectItEnded();
  EXPECT_TRUE(house_.processesOf(kProgram).empty());
}

TEST_F(OutlivedExtensions, OneWhoseBundleIsRemovedAndInstalledAgainIsNotTheNextOne) {
  ctl({"uninstall", kColluder});
  ctl({"install", next_});
  expectItEnded();
  expectTheNextOneIsAlone();
}

TEST_F(OutlivedExtensions, OneWhoseBundleIsInstalledOverIsNotTheNextOne) {
  ctl({"install", next_});
  expectItEnded();
  expectTheNextOneIsAlone();
}

TEST_F(OutlivedExtensions, OneWhoseBundleIsExchangedByHandIsNotTheNextOne) {
  fs::rename(house_.bundles() + "/" + kColluder, house_.home() + "/old");
  fs::rename(next_, house_.bundles() + "/" + kColluder);
  expectItEnded();
  expectTheNextOneIsAlone();
}

// The honest half: it takes as long as it takes, whatever is installed beside it.
TEST_F(OutlivedExtensions, OneWhoseBundleStaysMayAnswerLate) {
  const std::string beside = "com.orvane.beside";
  installColluder(beside);
  EXPECT_TRUE(house_.awaitLog("[INFO] Registered docuvend extension " + beside + " for path "));
  ctl({"uninstall", beside});
  eventually("the other one is gone", [this] { return house_.processesOf(kProgram).size() == 1; });
  EXPECT_TRUE(isThere());
  whisper("enough", "");
  EXPECT_EQ(outcomeOfRead(), "ok");
  EXPECT_TRUE(isThere());
}

}  // namespace
}  // namespace docuvend::tests
