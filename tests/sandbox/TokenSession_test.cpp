#include "platform/linux/sandbox/TokenSession.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {
namespace {

using testing::read;
using testing::TemporaryDirectory;
using testing::write;

class TokenSessionTest : public ::testing::Test {
 protected:
  [[nodiscard]] std::unique_ptr<TokenSession> loaded(std::chrono::milliseconds longestWaitForUses = TokenSession::kLongestWaitForUses) {
    auto session = TokenSession::load(paths, log.defaultLog(), longestWaitForUses);
    if (auto* found = std::get_if<std::unique_ptr<TokenSession>>(&session)) return std::move(*found);
    ADD_FAILURE() << std::get<QXError>(session).description();
    return std::make_unique<TokenSession>(paths.tokenFloors, TokenKey::random(), TokenFloors(), log.defaultLog());
  }
  [[nodiscard]] static std::string issued(TokenSession& session, const std::string& path) {
    auto token = session.issue(path);
    EXPECT_TRUE(token) << path;
    return token.value_or("");
  }
  [[nodiscard]] static bool isGood(const TokenSession& session, const std::string& token) {
    return std::holds_alternative<SandboxToken>(session.opened(token));
  }
  static void expectTakenBack(const TokenSession& session, const std::string& token) {
    const auto opened = session.opened(token);
    ASSERT_TRUE(std::holds_alternative<TokenRefusal>(opened));
    EXPECT_EQ(std::get<TokenRefusal>(opened), TokenRefusal::takenBack);
  }
  // The directory of the session's files takes no new ones.
  void lockDirectory() const { ASSERT_EQ(::chmod(directory.path().c_str(), 0500), 0); }
  void unlockDirectory() const { ASSERT_EQ(::chmod(directory.path().c_str(), 0700), 0); }

  const TemporaryDirectory directory;
  const Paths paths = testing::pathsIn(directory.path());
  fake_platform::FakeLog log;
};

TEST_F(TokenSessionTest, BeginsWithTwoPrivateFilesAndNothingInTheLog) {
  static_cast<void>(loaded());
  for (const std::string& path : {paths.tokenKey, paths.tokenFloors}) {
    struct stat status {};
    ASSERT_EQ(::lstat(path.c_str(), &status), 0) << path;
    EXPECT_TRUE(S_ISREG(status.st_mode)) << path;
    EXPECT_EQ(status.st_mode & 07777U, 0600U) << path;
  }
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(TokenSessionTest, GoesOnAfterARestart) {
  const auto first = loaded();
  const std::string token = issued(*first, "/a/b");
  const std::string key = read(paths.tokenKey);
  const auto second = loaded();
  EXPECT_TRUE(isGood(*second, token));
  EXPECT_EQ(read(paths.tokenKey), key);
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(TokenSessionTest, RefusesWhatWasTakenBackAndNothingElse) {
  const auto session = loaded();
  const std::string below = issued(*session, "/a/b/c");
  const std::string beside = issued(*session, "/a/c");
  EXPECT_EQ(session->takeBack({"/a/b/"}), std::nullopt);
  expectTakenBack(*session, below);
  EXPECT_TRUE(isGood(*session, beside));
  const std::string after = issued(*session, "/a/b/c");
  EXPECT_TRUE(isGood(*session, after));

  EXPECT_EQ(session->takeBack({"/x/", "/a/"}), std::nullopt);
  for (const std::string& token : {below, beside, after}) expectTakenBack(*session, token);
  EXPECT_TRUE(isGood(*session, issued(*session, "/a/c")));
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(TokenSessionTest, RemembersCutsOverRestarts) {
  const std::string token = issued(*loaded(), "/a/b");
  const std::string beside = issued(*loaded(), "/b/b");
  EXPECT_EQ(loaded()->takeBack({"/a/"}), std::nullopt);
  const std::string second = issued(*loaded(), "/a/b");
  expectTakenBack(*loaded(), token);
  EXPECT_TRUE(isGood(*loaded(), beside));
  EXPECT_TRUE(isGood(*loaded(), second));
  EXPECT_EQ(loaded()->takeBack({"/a/"}), std::nullopt);
  expectTakenBack(*loaded(), second);
  EXPECT_TRUE(isGood(*loaded(), beside));
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(TokenSessionTest, KnowsAfterARestartWhetherThePlacesAreTheSame) {
  EXPECT_FALSE(loaded()->hadOtherPlaces("a")) << "nobody has said";
  const auto session = loaded();
  EXPECT_EQ(session->changePlaces("a", {}), std::nullopt);
  const std::string token = issued(*session, "/a/b");
  const auto next = loaded();
  EXPECT_FALSE(next->hadOtherPlaces("a"));
  EXPECT_TRUE(next->hadOtherPlaces("b"));
  EXPECT_TRUE(isGood(*next, token));
  EXPECT_EQ(next->changePlaces("b", {"/a/"}), std::nullopt);
  expectTakenBack(*next, token);
  EXPECT_TRUE(loaded()->hadOtherPlaces("a"));
  EXPECT_FALSE(loaded()->hadOtherPlaces("b"));
  expectTakenBack(*loaded(), token);
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(TokenSessionTest, IssuesNothingUntilItsPlacesAreWrittenDown) {
  const auto session = loaded();
  lockDirectory();
  EXPECT_TRUE(session->changePlaces("a", {}));
  EXPECT_EQ(session->issue("/a/b"), std::nullopt);
  unlockDirectory();
  EXPECT_TRUE(session->issue("/a/b"));
  EXPECT_FALSE(loaded()->hadOtherPlaces("a"));
}

TEST_F(TokenSessionTest, RefusesAnothersToken) {
  const auto session = loaded();
  const std::string token = SandboxToken{TokenKind::readWrite, 1, "/a/b", {}}.sealed(TokenKey::random());
  EXPECT_EQ(std::get<TokenRefusal>(session->opened(token)), TokenRefusal::notAuthentic);
  EXPECT_EQ(std::get<TokenRefusal>(session->opened("")), TokenRefusal::malformed);
}

TEST_F(TokenSessionTest, BeginsAnewWithoutItsKeyWhateverTheFloorsAre) {
  const std::string token = issued(*loaded(), "/a/b");
  EXPECT_EQ(loaded()->takeBack({"/a/"}), std::nullopt);
  std::filesystem::remove(paths.tokenKey);
  EXPECT_FALSE(isGood(*loaded(), token));
  EXPECT_TRUE(isGood(*loaded(), issued(*loaded(), "/a/b")));
  EXPECT_TRUE(log.entries().empty()) << "somebody wanted it so";
}

TEST_F(TokenSessionTest, ForgetsEveryTokenWhenItsFloorsAreNotWhatTheyShouldBe) {
  const auto cut = [this](std::size_t from, std::size_t count, const std::string& by) {
    std::string text = read(paths.tokenFloors);
    write(paths.tokenFloors, text.replace(from, count, by));
  };
  const auto keepingTag = [this](const std::string& body) {
    const std::string text = read(paths.tokenFloors);
    write(paths.tokenFloors, body + text.substr(text.rfind("tag:")));
  };
  const auto otherSession = [this](const std::function<void(const Paths&)>& use) {
    const std::string other = directory.path() + "/other";
    std::filesystem::create_directory(other);
    const Paths there = testing::pathsIn(other);
    static_cast<void>(TokenSession::load(there, log.defaultLog()));
    use(there);
  };
  const auto size = [this] { return static_cast<std::size_t>(std::filesystem::file_size(paths.tokenFloors)); };
  struct Row {
    const char* name;
    std::function<void()> damage;
    QXError why;
  };
  const std::string& file = paths.tokenFloors;
  const QXError isDamaged = QXError::system(EINVAL, file + " is damaged, of another key or of another version");
  const std::vector<Row> table = {
      {"missing", [&] { std::filesystem::remove(paths.tokenFloors); }, QXError::system(ENOENT, "cannot open " + file)},
      {"empty", [&] { write(paths.tokenFloors, ""); }, isDamaged},
      {"cut short by a byte", [&] { std::filesystem::resize_file(paths.tokenFloors, size() - 1); }, isDamaged},
      {"cut short by its tag", [&] { cut(read(paths.tokenFloors).rfind("tag:"), std::string::npos, ""); }, isDamaged},
      {"cut short to its number", [&] { cut(read(paths.tokenFloors).find("floor:"), std::string::npos, ""); }, isDamaged},
      {"without its floor", [&] { keepingTag("docuvend-token-floors:2\nnumber:2\n"); }, isDamaged},
      {"with a lower floor", [&] { keepingTag("docuvend-token-floors:2\nnumber:2\nfloor:1:/a/\n"); }, isDamaged},
      {"of another version", [&] { keepingTag("docuvend-token-floors:1\nnumber:2\nfloor:2:/a/\n"); }, isDamaged},
      {"with a byte more", [&] { cut(size(), 0, "\n"); }, isDamaged},
      {"with a changed tag", [&] { cut(size() - 2, 1, read(paths.tokenFloors)[size() - 2] == '0' ? "1" : "0"); }, isDamaged},
      {"in capitals", [&] { cut(read(paths.tokenFloors).rfind("tag:"), 3, "TAG"); }, isDamaged},
      {"too long", [&] { std::filesystem::resize_file(paths.tokenFloors, TokenFloors::kMaximumTextLength + 1); },
       QXError::system(EFBIG, file + " is too long")},
      {"of another session",
       [&] {
         otherSession([this](const Paths& there) {
           std::filesystem::copy_file(there.tokenFloors, paths.tokenFloors, std::filesystem::copy_options::overwrite_existing);
         });
       },
       isDamaged},
      {"readable by others", [&] { ASSERT_EQ(::chmod(paths.tokenFloors.c_str(), 0604), 0); },
       QXError::system(EPERM, file + " must have mode 600")},
      {"not readable", [&] { ASSERT_EQ(::chmod(paths.tokenFloors.c_str(), 0200), 0); }, QXError::system(EACCES, "cannot open " + file)},
      {"two links", [&] { ASSERT_EQ(::link(paths.tokenFloors.c_str(), (paths.tokenFloors + "2").c_str()), 0); },
       QXError::system(EPERM, file + " must have one link")},
      {"a link",
       [&] {
         std::filesystem::rename(paths.tokenFloors, paths.tokenFloors + "2");
         ASSERT_EQ(::symlink((paths.tokenFloors + "2").c_str(), paths.tokenFloors.c_str()), 0);
       },
       QXError::system(ELOOP, "cannot open " + file)},
      {"a pipe",
       [&] {
         std::filesystem::remove(paths.tokenFloors);
         ASSERT_EQ(::mkfifo(paths.tokenFloors.c_str(), 0600), 0);
       },
       QXError::system(EINVAL, file + " is not a regular file")},
  };
  for (const auto& [name, damage, why] : table) {
    const std::string taken = issued(*loaded(), "/a/b");
    const std::string beside = issued(*loaded(), "/b/b");
    ASSERT_EQ(loaded()->takeBack({"/a/"}), std::nullopt) << name;
    const std::string key = read(paths.tokenKey);
    log.clear();
    damage();
    const auto session = loaded();
    EXPECT_FALSE(isGood(*session, taken)) << name;
    EXPECT_FALSE(isGood(*session, beside)) << name;
    EXPECT_NE(read(paths.tokenKey), key) << name;
    EXPECT_EQ(log.entries(),
              (std::vector<fake_platform::FakeLogEntry>{
                  {QXLogType::defaultType, "[NOTICE] No sandbox token issued until now is good any more: " + why.description()}}))
        << name;

    const std::string fresh = issued(*session, "/a/b");
    EXPECT_TRUE(isGood(*loaded(), fresh)) << name << ": the file begins anew";
    EXPECT_EQ(log.writes(), 1U) << name;
    for (const auto& entry : std::filesystem::directory_iterator(directory.path())) std::filesystem::remove_all(entry.path());
  }
}

TEST_F(TokenSessionTest, IsAnErrorWithoutAKeyThatCanBeUsedOrFilesThatCanBeMade) {
  static_cast<void>(loaded());
  ASSERT_EQ(::chmod(paths.tokenKey.c_str(), 0640), 0);
  EXPECT_TRUE(std::holds_alternative<QXError>(TokenSession::load(paths, log.defaultLog()))) << "a key that others may have read";
  EXPECT_EQ(read(paths.tokenKey).size(), TokenKey::kLength) << "it is left alone";
  std::filesystem::remove(paths.tokenKey);
  std::filesystem::remove(paths.tokenFloors);
  lockDirectory();
  EXPECT_TRUE(std::holds_alternative<QXError>(TokenSession::load(paths, log.defaultLog()))) << "no key";
  unlockDirectory();
  ASSERT_EQ(::mkdir(paths.tokenFloors.c_str(), 0700), 0);
  EXPECT_TRUE(std::holds_alternative<QXError>(TokenSession::load(paths, log.defaultLog()))) << "no floors";
}

// A session that cannot get rid of an old key has none.
TEST_F(TokenSessionTest, IsAnErrorWhenItsKeyCannotBeRenewed) {
  const std::string elsewhere = directory.path() + "/elsewhere";
  std::filesystem::create_directory(elsewhere);
  Paths apart = paths;
  apart.tokenFloors = elsewhere + "/token-floors";
  static_cast<void>(TokenSession::load(apart, log.defaultLog()));
  std::filesystem::remove(apart.tokenFloors);
  lockDirectory();
  EXPECT_TRUE(std::holds_alternative<QXError>(TokenSession::load(apart, log.defaultLog())));
  unlockDirectory();
  EXPECT_FALSE(std::filesystem::exists(apart.tokenFloors)) << "the next start would trust the old key again";
}

TEST_F(TokenSessionTest, HoldsACutThatCannotBeWrittenAndSaysSo) {
  const auto session = loaded();
  const std::string token = issued(*session, "/a/b");
  const std::string before = read(paths.tokenFloors);
  lockDirectory();
  EXPECT_TRUE(session->takeBack({"/a/"}));
  expectTakenBack(*session, token);
  EXPECT_EQ(read(paths.tokenFloors), before);
  unlockDirectory();
  EXPECT_TRUE(isGood(*loaded(), token)) << "a restart does not know of it, which the error said";
}

TEST_F(TokenSessionTest, IssuesNothingBelowACutThatIsNotOnDiskUntilItCanBeWritten) {
  const auto session = loaded();
  lockDirectory();
  EXPECT_TRUE(session->takeBack({"/a/"}));
  EXPECT_EQ(session->issue("/a/b"), std::nullopt);
  const std::string beside = issued(*session, "/b/b");
  EXPECT_TRUE(isGood(*session, beside));
  EXPECT_TRUE(session->takeBack({"/a/"}));
  EXPECT_EQ(session->issue("/a/b"), std::nullopt);
  unlockDirectory();
  const std::string token = issued(*session, "/a/b");
  EXPECT_TRUE(isGood(*session, token));
  EXPECT_TRUE(isGood(*session, beside));
  EXPECT_TRUE(isGood(*loaded(), token)) << "the cut is written";
}

// Whatever number a lost cut would have given to new tokens, none has it: a later cut gives it out again.
TEST_F(TokenSessionTest, GivesNoTokenANumberThatARestartWouldGiveOutAgain) {
  const auto session = loaded();
  lockDirectory();
  EXPECT_TRUE(session->takeBack({"/a/"}));
  EXPECT_TRUE(session->takeBack({"/a/"}));
  const std::string beside = issued(*session, "/b/b");
  unlockDirectory();
  const auto restarted = loaded();
  EXPECT_TRUE(isGood(*restarted, beside));
  EXPECT_EQ(restarted->takeBack({"/b/"}), std::nullopt);
  expectTakenBack(*restarted, beside);
}

TEST_F(TokenSessionTest, WritesEarlierCutsWithTheNextThatCanBeWritten) {
  const auto session = loaded();
  const std::string token = issued(*session, "/a/b");
  lockDirectory();
  EXPECT_TRUE(session->takeBack({"/a/"}));
  unlockDirectory();
  EXPECT_EQ(session->takeBack({"/b/"}), std::nullopt);
  expectTakenBack(*loaded(), token);
}

TEST_F(TokenSessionTest, WaitsForWhoeverActsOnAnOldToken) {
  constexpr int kRounds = 50;
  const auto session = loaded();
  std::string token = issued(*session, "/a/b");
  for (int round = 0; round < kRounds; ++round) {
    std::atomic<bool> begun{false};
    std::atomic<int> acting{0};
    std::thread user([&session, &token, &begun, &acting] {
      for (;;) {
        const auto use = session->use(token);
        begun.store(true);
        if (!std::holds_alternative<TokenInUse>(use)) return;
        ++acting;
        std::this_thread::yield();
        --acting;
      }
    });
    while (!begun.load()) std::this_thread::yield();
    EXPECT_EQ(session->takeBack({"/a/"}), std::nullopt);
    EXPECT_EQ(acting.load(), 0);
    expectTakenBack(*session, token);
    user.join();
    token = issued(*session, "/a/b");
  }
}

TEST_F(TokenSessionTest, WaitsForNobodyWhoActsOnATokenForAnotherDirectory) {
  const auto session = loaded();
  const auto acting = session->use(issued(*session, "/a/b"));
  ASSERT_TRUE(std::holds_alternative<TokenInUse>(acting));
  EXPECT_EQ(session->takeBack({"/b/", "/a/b/"}), std::nullopt);
  EXPECT_EQ(session->changePlaces("places", {"/a/"}), std::nullopt) << "that waits for nobody at all";
  EXPECT_FALSE(session->isGood(std::get<TokenInUse>(acting).token));
  EXPECT_TRUE(log.entries().empty());
}

// The kernel may hold him up for as long as somebody likes.
TEST_F(TokenSessionTest, WaitsForWhoeverActsOnAnOldTokenButNotForEverAndSaysSo) {
  auto session = loaded(testing::kNotLong);
  const std::string token = issued(*session, "/a/b");
  const auto first = session->use(token);
  const auto second = session->use(issued(*session, "/a/c"));
  ASSERT_TRUE(std::holds_alternative<TokenInUse>(first));
  const auto error = session->takeBack({"/a/"});
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, kQXSystemErrorDomain);
  EXPECT_EQ(error->code, EBUSY);
  EXPECT_EQ(log.entries(),
            (std::vector<fake_platform::FakeLogEntry>{
                {QXLogType::fault,
                 "[ERROR] Tokens were taken back, and what 2 of them had begun before is still under way, the first of them for /a/b."}}));
  expectTakenBack(*session, token);
  expectTakenBack(*loaded(), token);
  EXPECT_FALSE(session->isGood(std::get<TokenInUse>(first).token));
}

TEST_F(TokenSessionTest, SaysOfACutThatItCouldNotBeWrittenRatherThanWhatIsUnderWay) {
  const auto session = loaded(testing::kNotLong);
  const auto acting = session->use(issued(*session, "/a/b"));
  lockDirectory();
  const auto error = session->takeBack({"/a/"});
  unlockDirectory();
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, EACCES);
  EXPECT_EQ(log.writes(), 1U) << "the log says the other";
}

TEST_F(TokenSessionTest, IssuesGoodTokensWhileOthersCut) {
  constexpr int kRounds = 30;
  const auto session = loaded();
  std::atomic<bool> stop{false};
  std::vector<std::thread> cutters;
  for (const char* below : {"/b/", "/c/"}) {
    cutters.emplace_back([&session, &stop, below] {
      while (!stop.load()) EXPECT_EQ(session->takeBack({below}), std::nullopt);
    });
  }
  for (int round = 0; round < kRounds; ++round) {
    const std::string token = issued(*session, "/a/b");
    EXPECT_TRUE(isGood(*session, token)) << round;
    EXPECT_EQ(session->takeBack({"/a/"}), std::nullopt);
    expectTakenBack(*session, token);
  }
  stop.store(true);
  for (auto& cutter : cutters) cutter.join();
  const std::string last = issued(*session, "/a/b");
  EXPECT_TRUE(isGood(*loaded(), last)) << "the file is that of the last cut";
  EXPECT_TRUE(log.entries().empty());
}

}  // namespace
}  // namespace docuvend::linux_platform
