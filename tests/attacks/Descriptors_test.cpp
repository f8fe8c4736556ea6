// What a confined application makes of an open file that it was given.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>

#include "tests/attacks/FileAttackTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::Not;

class Descriptors : public FileAttackTest {
 protected:
  void SetUp() override {
    FileAttackTest::SetUp();
    letter_ = put("letter.txt");
    ASSERT_EQ(grant(url(letter_)).outcome, "ok");
  }
  // What the attacker says for its acts with the open letter.
  [[nodiscard]] std::vector<std::string> attackOpened(const std::string& access, const std::vector<std::string>& acts) const {
    std::vector<std::string> words = {"resolve", stringFor("letter.txt"), "open", access};
    words.insert(words.end(), acts.begin(), acts.end());
    auto lines = attack(words);
    EXPECT_GE(lines.size(), 2U);
    EXPECT_EQ(lines.at(1), "ok");
    lines.erase(lines.begin(), lines.begin() + 2);
    return lines;
  }
  // The attacker, with a directory as its standard input.
  [[nodiscard]] std::string climb(const std::string& directory, const std::string& path) const {
    Command command{{"/bin/sh", "-c", "directory=$1; shift; exec \"$@\" < \"$directory\"", "sh", directory,
                     std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker, "climb", path},
                    house_.environment(),
                    {}};
    const Ending ending = Process(command).wait();
    EXPECT_EQ(ending.status, 0) << ending.errors;
    return ending.output.substr(0, ending.output.find('\n'));
  }

  std::string letter_;
};

TEST_F(Descriptors, AFileThatIsOpenForReadingIsNotWritten) {
  EXPECT_THAT(attackOpened("read", {"write", "Mine", "upgrade", "reopen", "write", "shrink", "contents"}),
              ElementsAre("EBADF", "EBADF", "EACCES", "EACCES", kLetterText));
  EXPECT_EQ(contentsOf(letter_), kLetterText);
  EXPECT_THAT(attackOpened("write", {"write", "Mine all", "contents"}), ElementsAre("ok", "Mine all"));
  EXPECT_EQ(contentsOf(letter_), "Mine all");
}

TEST_F(Descriptors, AnOpenFileIsNotOpenedASecondTimeByAnyPath) {
  EXPECT_THAT(attackOpened("write", {"reopen", "read", "reopen", "write", "shrink", "read", letter_, "contents"}),
              ElementsAre("EACCES", "EACCES", "EACCES", "ENOENT", kLetterText));
}

TEST_F(Descriptors, AnOpenFileGetsNoNameInTheApplicationsContainer) {
  // By the descriptor alone it takes a capability, which the kernel reports as if the file were not there.
  EXPECT_THAT(attackOpened("write", {"link", "stolen", "link-proc", "stolen", "read", "stolen", "make", "own", "read", "own"}),
              ElementsAre("ENOENT", "EXDEV", "ENOENT", "ok", "ok"));
  struct stat status {};
  ASSERT_EQ(::stat(letter_.c_str(), &status), 0);
  EXPECT_EQ(status.st_nlink, 1U);
}

TEST_F(Descriptors, NoDirectoryIsHandedOut) {
  fs::create_directory(place("folder"));
  const Tokens tokens = grant(QXURL::fileURL(place("folder"), QXURLKind::directory));
  EXPECT_EQ(tokens.outcome, "ok");
  EXPECT_FALSE(tokens.item);
  // A directory in the place of a file for which there was a token.
  const auto token = grant(url(letter_)).item;
  ASSERT_EQ(redeem(token).contents(), kLetterText);
  fs::remove(letter_);
  fs::create_directory(letter_);
  EXPECT_EQ(redeem(token).outcome, kNotRegularFile);
  EXPECT_THAT(attack({"redeem", token->text(), "read", "redeem", token->text(), "write"}), ElementsAre(kNotRegularFile, kNotRegularFile));
}

TEST_F(Descriptors, ADirectoryThatAnotherProcessHandedOverIsNoWayOut) {
  EXPECT_THAT(attack({"make", "own/file"}), ElementsAre("ok"));
  const std::string own = house_.container(kAttacker) + "/own";
  EXPECT_EQ(climb(own, "file"), "ok");
  EXPECT_EQ(climb(own, "../../../groups/" + kColluder + ".documents/Docuvend Storage/letter.txt"), "EACCES");
  // Neither is one that lies outside, for what it holds.
  EXPECT_EQ(climb(house_.storage(kColluder), "letter.txt"), "EACCES");
  EXPECT_EQ(climb(house_.storage(kColluder), ".."), "EACCES");
}

}  // namespace
}  // namespace docuvend::tests
