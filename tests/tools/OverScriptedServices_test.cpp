// The program itself, on a terminal and off it, with services that answer what a test says.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "common/DVErrors.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "service/DVAdministration.h"
#include "tests/sdk/ScriptedDaemon.h"
#include "tests/system/house/DaemonHouse.h"
#include "tests/system/house/Process.h"
#include "tests/tools/PseudoTerminal.h"

namespace docuvend::ctl {
namespace {

using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;
using ::testing::Not;
using ::testing::StartsWith;
using tests::Ending;
using tests::PseudoTerminal;

// The status is never answered.
class ScriptedAdministration : public DVAdministration {
 public:
  // Takes the reply to a question for the list instead of giving it.
  std::function<void(GrantsReply)> listing;
  // What revoking an item answers, if not that it is done.
  std::map<std::string, QXError> revokeErrors;
  std::vector<std::string> revoked;

  void statusCompletionHandler(StatusReply) override {}
  void grantsOfProviderID(std::optional<ProviderID>, std::optional<ConsumerID> toConsumerID, std::optional<std::int64_t>,
                          GrantsReply completionHandler) override {
    if (listing) return listing(std::move(completionHandler));
    if (toConsumerID) return completionHandler({}, QXArray{}, {});
    completionHandler({}, QXArray{grant("org.p", "\u6f22\u5b57"), grant("org.provider", "a\u202eb\tc")}, {});
  }
  void revokeItemID(std::optional<ItemID> itemID, std::optional<ProviderID>, std::optional<ConsumerID>,
                    ErrorReply completionHandler) override {
    revoked.push_back(itemID->value);
    const auto error = revokeErrors.find(itemID->value);
    completionHandler(error == revokeErrors.end() ? std::nullopt : std::optional(error->second));
  }
  void announceFirstUnlockCompletionHandler(ErrorReply completionHandler) override { completionHandler(DVNotPermittedError()); }

 private:
  static QXValue grant(const char* provider, const char* item) {
    return QXDictionary{{"providerIdentifier", provider}, {"consumerIdentifier", "org.c"}, {"itemIdentifier", item}};
  }
};

// The program with such services.
class OverScriptedServices : public tests::LibraryTest {
 protected:
  OverScriptedServices() {
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

  [[nodiscard]] std::string administrationSocket() const { return root_ + "/docuvend/" + kDVAdministrationServiceName; }
  void startAdministration() {
    administration_ = std::make_unique<tests::ScriptedService<DVAdministration>>(administrationSocket(), administrator_);
  }
  // Providing begins and is not answered before the test does it.
  void startDaemon() {
    script_.starting = [this](DVDaemon::ErrorReply reply) { starting_.put(std::move(reply)); };
    daemon_ = std::make_unique<tests::ScriptedService<DVDaemon>>(root_ + "/docuvend/public/" + kDVServiceName,
                                                                 std::make_shared<tests::ScriptedDaemon>(script_, calls_));
    script_.redeem = [this](const std::string&) {
      return linux_platform::toValue(linux_platform::UniqueDescriptor(::open(path_.c_str(), O_RDONLY | O_CLOEXEC)));
    };
    sandbox_ = std::make_unique<tests::ScriptedService<linux_platform::QXSandboxRedemption>>(
        root_ + "/docuvend/public/" + linux_platform::kSandboxServiceName, std::make_shared<tests::ScriptedSandbox>(script_, calls_));
  }
  // The least that is a bundle.
  void installBundle(const std::string& identifier) const {
    const std::string directory = bundleDirectory(identifier);
    std::filesystem::create_directories(directory);
    tests::writeFile(directory + "/program", "");
    std::filesystem::permissions(directory + "/program", std::filesystem::perms::owner_all);
    tests::writeFile(directory + "/Info.plist", tests::propertyList(tests::stringEntry("QXBundleIdentifier", identifier) +
                                                                    tests::stringEntry("QXBundleExecutable", "program")));
    tests::writeFile(directory + "/Entitlements.plist", tests::propertyList(""));
  }
  [[nodiscard]] std::string bundleDirectory(const std::string& identifier) const {
    return root_ + "/.local/share/docuvend/bundles/" + identifier;
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
  const std::shared_ptr<ScriptedAdministration> administrator_ = std::make_shared<ScriptedAdministration>();
  std::unique_ptr<tests::ScriptedService<DVAdministration>> administration_;
  std::unique_ptr<tests::ScriptedService<DVDaemon>> daemon_;
  std::unique_ptr<tests::ScriptedService<linux_platform::QXSandboxRedemption>> sandbox_;
};

TEST_F(OverScriptedServices, AListIsATableAsWideAsTheTerminal) {
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

TEST_F(OverScriptedServices, JSONIsJSONThereToo) {
  startAdministration();
  EXPECT_THAT(shown({"grants", "--json"}, 30), StartsWith("[{\"provider\":\"org.p\",\"item\":"));
}

TEST_F(OverScriptedServices, InAPipeAListIsPlainAndWhole) {
  startAdministration();
  EXPECT_EQ(tests::Process(command({"grants"})).wait().output, "org.p\t\u6f22\u5b57\torg.c\norg.provider\ta\u202eb\\tc\torg.c\n");
}

TEST_F(OverScriptedServices, AFailureThereIsHarmlessText) {
  const auto [ending, text] = complained({"\x1b[31m"});
  EXPECT_EQ(ending.status, 2);
  EXPECT_EQ(text, "docuvendctl: unknown command \\x1b[31m; --help lists them\n");
}

TEST_F(OverScriptedServices, ProgressIsShownOnStandardErrorAndGoneInTheEnd) {
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

TEST_F(OverScriptedServices, ADocumentsProgressIsGoneBeforeItIsPrinted) {
  startDaemon();
  PseudoTerminal terminal(80);
  auto wanted = command({"--as", "org.c", "cat", "docuvend:org.p/i"});
  wanted.errors = terminal.descriptor();
  tests::Process process(wanted);
  ASSERT_TRUE(terminal.await("\r 50 %  1.0 MB of 2.1 MB"));
  auto reply = starting_.take();
  ASSERT_TRUE(reply);
  (*reply)(std::nullopt);
  const Ending ending = process.wait();
  EXPECT_EQ(ending.status, 0);
  EXPECT_EQ(ending.output, tests::contentsOf(path_));
  EXPECT_THAT(terminal.finished(), EndsWith(" \r"));
}

// The service never answers; the caller's time limit is several times the interval of progress.
std::vector<std::string> withoutEnd(const std::string& path) { return {"--timeout", "1", "start", path, "org.p", "org.c"}; }

TEST_F(OverScriptedServices, AFailureStandsOnACleanLineBehindTheProgress) {
  startDaemon();
  const auto [ending, text] = complained(withoutEnd(path_));
  EXPECT_EQ(ending.status, 8);
  EXPECT_THAT(text, HasSubstr("\r 50 %"));
  EXPECT_THAT(text, MatchesRegex("(\r[^\r\n]*)*\r +\rdocuvendctl: [^\r\n]*\n"));
}

TEST_F(OverScriptedServices, InJSONThereIsNoProgress) {
  startDaemon();
  auto arguments = withoutEnd(path_);
  arguments.insert(arguments.begin(), "--json");
  const auto [ending, text] = complained(arguments);
  EXPECT_EQ(ending.status, 8);
  EXPECT_THAT(text, MatchesRegex("\\{\"error\":[^\r\n]*\\}\n"));
}

TEST_F(OverScriptedServices, WhereStandardErrorIsNoTerminalThereIsNoProgress) {
  startDaemon();
  const Ending ending = tests::Process(command(withoutEnd(path_))).wait();
  EXPECT_EQ(ending.status, 8);
  EXPECT_THAT(ending.errors, StartsWith("docuvendctl: "));
  EXPECT_THAT(ending.errors, Not(HasSubstr("%")));
}

TEST_F(OverScriptedServices, ACommandOfTheAdministrationEndsAtTheCallersTimeoutToo) {
  startAdministration();
  EXPECT_EQ(tests::Process(command({"--timeout", "1", "status"})).wait().status, 8);
}

TEST_F(OverScriptedServices, ABundleStaysWhenItsGrantsCannotBeHad) {
  installBundle("org.b");
  tests::Mailbox<DVAdministration::GrantsReply> listing;
  administrator_->listing = [&listing](DVAdministration::GrantsReply reply) { listing.put(std::move(reply)); };
  startAdministration();
  EXPECT_EQ(tests::Process(command({"--timeout", "1", "uninstall", "--remove-grants", "org.b"})).wait().status, 8);
  EXPECT_TRUE(std::filesystem::exists(bundleDirectory("org.b"))) << "the list could not be had, so nothing is removed";
  stop(administration_);
}

TEST_F(OverScriptedServices, AGrantThatIsGoneMeanwhileIsRemovedEnough) {
  installBundle("org.b");
  administrator_->revokeErrors.emplace("\u6f22\u5b57", DVNotFoundError(ProviderID{"org.p"}));
  startAdministration();
  EXPECT_EQ(tests::Process(command({"uninstall", "--remove-grants", "org.b"})).wait().status, 0);
  stop(administration_);
  EXPECT_THAT(administrator_->revoked, ElementsAre("\u6f22\u5b57", "a\u202eb\tc"));
  EXPECT_FALSE(std::filesystem::exists(bundleDirectory("org.b")));
}

TEST_F(OverScriptedServices, AGrantThatCannotBeRemovedIsAnError) {
  installBundle("org.b");
  administrator_->revokeErrors.emplace("\u6f22\u5b57", QXError::system(EIO, "the list could not be written"));
  startAdministration();
  const Ending ending = tests::Process(command({"uninstall", "--remove-grants", "org.b"})).wait();
  EXPECT_EQ(ending.status, 9);
  EXPECT_THAT(ending.errors, HasSubstr("the list could not be written"));
}

TEST_F(OverScriptedServices, ADaemonThatCannotBeToldOfTheFirstUnlockIsAnError) {
  startAdministration();
  std::filesystem::permissions(administrationSocket(), std::filesystem::perms::none);
  const Ending ending = tests::Process(command({"platform", "first-unlock"})).wait();
  EXPECT_EQ(ending.status, 7);
  EXPECT_THAT(ending.errors, HasSubstr("cannot be reached"));
}

TEST_F(OverScriptedServices, ARunningDaemonThatRefusesTheFirstUnlockIsAnError) {
  startAdministration();
  const Ending ending = tests::Process(command({"platform", "first-unlock"})).wait();
  EXPECT_EQ(ending.status, 3);
  EXPECT_THAT(ending.errors, EndsWith("not permitted.\n"));
  EXPECT_EQ(tests::contentsOf(root_ + "/docuvend/lock-state"), "3\n1\n");
}

}  // namespace
}  // namespace docuvend::ctl
