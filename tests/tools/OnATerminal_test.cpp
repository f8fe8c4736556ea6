// The program itself on a terminal, with services that answer what a test says.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <memory>

#include "platform/linux/base/UniqueDescriptor.h"
#include "service/DVAdministration.h"
#include "tests/sdk/ScriptedDaemon.h"
#include "tests/system/house/Process.h"
#include "tests/tools/PseudoTerminal.h"

namespace docuvend::ctl {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;
using ::testing::Not;
using ::testing::StartsWith;
using tests::Ending;
using tests::PseudoTerminal;

class ScriptedAdministration : public DVAdministration {
 public:
  void statusCompletionHandler(StatusReply completionHandler) override { completionHandler({}, QXDictionary{}); }
  void grantsOfProviderID(std::optional<ProviderID>, std::optional<ConsumerID>, std::optional<std::int64_t>,
                          GrantsReply completionHandler) override {
    completionHandler({}, QXArray{grant("org.p", "\u6f22\u5b57"), grant("org.provider", "a\u202eb\tc")}, {});
  }
  void revokeItemID(std::optional<ItemID>, std::optional<ProviderID>, std::optional<ConsumerID>, ErrorReply completionHandler) override {
    completionHandler({});
  }
  void announceFirstUnlockCompletionHandler(ErrorReply completionHandler) override {
    completionHandler(QXError::make("DVErrorDomain", 2, "The operation is not permitted."));
  }

 private:
  static QXValue grant(const char* provider, const char* item) {
    return QXDictionary{{"providerIdentifier", provider}, {"consumerIdentifier", "org.c"}, {"itemIdentifier", item}};
  }
};

class OnATerminal : public tests::LibraryTest {
 protected:
  OnATerminal() {
    // As the daemon makes it.
    std::filesystem::permissions(root_ + "/docuvend", std::filesystem::perms::owner_all);
    std::filesystem::permissions(root_ + "/docuvend/public", std::filesystem::perms::owner_all);
    makeHalfAFile();
  }

  [[nodiscard]] tests::Command command(const std::vector<std::string>& arguments) const {
    tests::Command result;
    result.words = {std::string(DOCUVEND_BIN) + "/docuvendctl"};
    result.words.insert(result.words.end(), arguments.begin(), arguments.end());
    result.environment = {"XDG_RUNTIME_DIR=" + root_, "HOME=" + root_};
    return result;
  }
  // What the terminal shows of the standard output.
  std::string shown(const std::vector<std::string>& arguments, unsigned short columns) {
    PseudoTerminal terminal(columns);
    auto wanted = command(arguments);
    wanted.output = terminal.descriptor();
    const Ending ending = tests::Process(wanted).wait();
    EXPECT_EQ(ending.status, 0);
    EXPECT_EQ(ending.errors, "");
    return terminal.finished();
  }
  // What it shows of the standard error.
  std::pair<Ending, std::string> complained(const std::vector<std::string>& arguments) {
    PseudoTerminal terminal(80);
    auto wanted = command(arguments);
    wanted.errors = terminal.descriptor();
    const Ending ending = tests::Process(wanted).wait();
    return {ending, terminal.finished()};
  }

  void startAdministration() {
    administration_ = std::make_unique<tests::ScriptedService<DVAdministration>>(root_ + "/docuvend/" + kDVAdministrationServiceName,
                                                                                 std::make_shared<ScriptedAdministration>());
  }
  // Providing begins and is not answered before the test does it.
  void startDaemon() {
    script_.starting = [this](DVDaemon::ErrorReply reply) { starting_.put(std::move(reply)); };
    daemon_ = std::make_unique<tests::ScriptedService<DVDaemon>>(root_ + "/docuvend/public/" + kDVServiceName,
                                                                 std::make_shared<tests::ScriptedDaemon>(script_, calls_));
  }
  // A document of 2 MiB, one of which is there.
  void makeHalfAFile() const {
    constexpr off_t kHalf = 1 << 20;
    const linux_platform::UniqueDescriptor file(::open(path_.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    ASSERT_EQ(::ftruncate(file.get(), 2 * kHalf), 0);
    ASSERT_EQ(::posix_fallocate(file.get(), 0, kHalf), 0);
  }

  const std::string path_ = root_ + "/letter.txt";
  tests::Script script_;
  tests::Calls calls_;
  tests::Mailbox<DVDaemon::ErrorReply> starting_;
  std::unique_ptr<tests::ScriptedService<DVAdministration>> administration_;
  std::unique_ptr<tests::ScriptedService<DVDaemon>> daemon_;
};

TEST_F(OnATerminal, AListIsATableAsWideAsTheTerminal) {
  startAdministration();
  EXPECT_EQ(shown({"grants"}, 80),
            "PROVIDER      ITEM           CONSUMER\n"
            "org.p         \u6f22\u5b57           org.c\n"
            "org.provider  a\\u{202e}b\\tc  org.c\n");
  EXPECT_EQ(shown({"grants"}, 30),
            "PROVIDER   ITEM       CONSUMER\n"
            "org.p      \u6f22\u5b57       org.c\n"
            "org.prov\u2026  a\\u{202e\u2026  org.c\n");
}

TEST_F(OnATerminal, JSONIsJSONThereToo) {
  startAdministration();
  EXPECT_THAT(shown({"grants", "--json"}, 30), StartsWith("[{\"provider\":\"org.p\",\"item\":"));
}

TEST_F(OnATerminal, InAPipeAListIsPlainAndWhole) {
  startAdministration();
  EXPECT_EQ(tests::Process(command({"grants"})).wait().output, "org.p\t\u6f22\u5b57\torg.c\norg.provider\ta\u202eb\\tc\torg.c\n");
}

TEST_F(OnATerminal, AFailureThereIsHarmlessText) {
  const auto [ending, text] = complained({"\x1b[31m"});
  EXPECT_EQ(ending.status, 2);
  EXPECT_EQ(text, "docuvendctl: unknown command \\x1b[31m; --help lists them\n");
}

TEST_F(OnATerminal, ProgressIsShownOnStandardErrorAndGoneInTheEnd) {
  startDaemon();
  PseudoTerminal terminal(80);
  auto wanted = command({"start", path_, "org.p", "org.c"});
  wanted.errors = terminal.descriptor();
  tests::Process process(wanted);
  ASSERT_TRUE(terminal.await("\r 50 %  1.0 MB of 2.1 MB"));
  auto reply = starting_.take();
  ASSERT_TRUE(reply);
  (*reply)(std::nullopt);
  const Ending ending = process.wait();
  EXPECT_EQ(ending.status, 0);
  EXPECT_EQ(ending.output, "");
  EXPECT_THAT(terminal.finished(), MatchesRegex("(\r 50 %  1\\.0 MB of 2\\.1 MB *)+\r +\r"));
}

// The service never answers; the caller's time limit is several times the interval of progress.
std::vector<std::string> withoutEnd(const std::string& path) { return {"--timeout", "1", "start", path, "org.p", "org.c"}; }

TEST_F(OnATerminal, AFailureStandsOnACleanLineBehindTheProgress) {
  startDaemon();
  const auto [ending, text] = complained(withoutEnd(path_));
  EXPECT_EQ(ending.status, 8);
  EXPECT_THAT(text, HasSubstr("\r 50 %"));
  EXPECT_THAT(text, MatchesRegex("(\r[^\r\n]*)*\r +\rdocuvendctl: [^\r\n]*\n"));
}

TEST_F(OnATerminal, InJSONThereIsNoProgress) {
  startDaemon();
  auto arguments = withoutEnd(path_);
  arguments.insert(arguments.begin(), "--json");
  const auto [ending, text] = complained(arguments);
  EXPECT_EQ(ending.status, 8);
  EXPECT_THAT(text, MatchesRegex("\\{\"error\":[^\r\n]*\\}\n"));
}

TEST_F(OnATerminal, WhereStandardErrorIsNoTerminalThereIsNoProgress) {
  startDaemon();
  const Ending ending = tests::Process(command(withoutEnd(path_))).wait();
  EXPECT_EQ(ending.status, 8);
  EXPECT_THAT(ending.errors, StartsWith("docuvendctl: "));
  EXPECT_THAT(ending.errors, Not(HasSubstr("%")));
}

TEST_F(OnATerminal, ARunningDaemonThatRefusesTheFirstUnlockIsAnError) {
  startAdministration();
  const Ending ending = tests::Process(command({"platform", "first-unlock"})).wait();
  EXPECT_EQ(ending.status, 3);
  EXPECT_THAT(ending.errors, EndsWith("not permitted.\n"));
  EXPECT_EQ(tests::contentsOf(root_ + "/docuvend/lock-state"), "3\n1\n");
}

}  // namespace
}  // namespace docuvend::ctl
