// The program itself, on a terminal and off it, with services that answer what a test says.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "common/DVErrors.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "service/DVAdministration.h"
#include "tests/sdk/ScriptedDaemon.h"
#include "tests/system/house/DaemonHouse.h"
#include "tests/system/house/Process.h"
#include "tests/tools/PseudoTerminal.h"

namespace docuvend::ctl {
namespace {

using linux_platform::FileCoordinationErrorCode;
using linux_platform::QXFileCoordination;
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
  void startCoordination() {
    const std::string directory = root_ + "/docuvend/public/";
    daemon_ = std::make_unique<tests::ScriptedService<DVDaemon>>(directory + kDVServiceName,
                                                                 std::make_shared<tests::ScriptedDaemon>(script_, calls_));
    coordination_ = std::make_unique<tests::ScriptedService<QXFileCoordination>>(
        directory + linux_platform::kFileCoordinationServiceName,
        std::make_shared<tests::ScriptedCoordination>(script_, calls_, accessNames_));
  }
  Ending ended(const std::vector<std::string>& arguments, const std::string& input = {}) {
    auto wanted = command(arguments);
    wanted.environment.push_back("TMPDIR=" + root_);
    wanted.input = input;
    return tests::Process(wanted).wait();
  }
  // The calls in which that file is named by this.
  [[nodiscard]] std::string fileURL() const { return QXURL::fileURL(path_, QXURLKind::file).absoluteString(); }
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

  static QXError coordinationError(FileCoordinationErrorCode code) {
    return QXError::make(linux_platform::kQXFileCoordinationErrorDomain, static_cast<std::int64_t>(code), "of a test");
  }

  const std::string path_ = root_ + "/letter.txt";
  tests::Script script_;
  tests::Calls calls_;
  tests::AccessNames accessNames_;
  tests::Mailbox<DVDaemon::ErrorReply> starting_;
  tests::Mailbox<QXFileCoordination::ErrorReply> begun_;
  tests::Mailbox<DVAdministration::GrantsReply> listing_;
  const std::shared_ptr<ScriptedAdministration> administrator_ = std::make_shared<ScriptedAdministration>();
  std::unique_ptr<tests::ScriptedService<DVAdministration>> administration_;
  std::unique_ptr<tests::ScriptedService<DVDaemon>> daemon_;
  std::unique_ptr<tests::ScriptedService<linux_platform::QXSandboxRedemption>> sandbox_;
  std::unique_ptr<tests::ScriptedService<QXFileCoordination>> coordination_;
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
  administrator_->listing = [this](DVAdministration::GrantsReply reply) { listing_.put(std::move(reply)); };
  startAdministration();
  EXPECT_EQ(tests::Process(command({"--timeout", "1", "uninstall", "--remove-grants", "org.b"})).wait().status, 8);
  EXPECT_TRUE(std::filesystem::exists(bundleDirectory("org.b"))) << "the list could not be had, so nothing is removed";
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

// Files by turns.

TEST_F(OverScriptedServices, AFileIsPrintedWhileTheTurnAtItLasts) {
  const linux_platform::UniqueDescriptor output(::memfd_create("output", MFD_CLOEXEC));
  off_t printed = -1;
  script_.ending = [&output, &printed](const QXFileCoordination::ErrorReply& reply) {
    printed = ::lseek(output.get(), 0, SEEK_END);
    reply(std::nullopt);
  };
  startCoordination();
  auto wanted = command({"read", path_});
  wanted.output = output.get();
  EXPECT_EQ(tests::Process(wanted).wait().status, 0);
  stop(coordination_);
  EXPECT_EQ(printed, static_cast<off_t>(std::filesystem::file_size(path_)));
  EXPECT_THAT(calls_.all(), ElementsAre("read " + fileURL(), "end"));
  stop(daemon_);
}

TEST_F(OverScriptedServices, AFileIsPrintedAsItIsOrInJSON) {
  tests::writeFile(path_, std::string("a\0b\n", 4));
  startCoordination();
  EXPECT_EQ(ended({"read", path_}).output, std::string("a\0b\n", 4));
  EXPECT_EQ(ended({"read", "--json", path_}).output, "{\"url\":\"" + fileURL() + "\",\"base64\":\"YQBiCg==\"}\n");
}

TEST_F(OverScriptedServices, TheContentsProgressIsGoneBeforeTheyArePrinted) {
  script_.bytesPresent = 1'000'000;
  script_.size = 2'000'000;
  script_.accessing = [this](QXFileCoordination::ErrorReply reply) { begun_.put(std::move(reply)); };
  startCoordination();
  PseudoTerminal terminal(80);
  auto wanted = command({"read", path_});
  wanted.errors = terminal.descriptor();
  tests::Process process(wanted);
  ASSERT_TRUE(terminal.await("\r 50 %  1.0 MB of 2.0 MB"));
  const auto reply = begun_.take();
  ASSERT_TRUE(reply);
  (*reply)(std::nullopt);
  const Ending ending = process.wait();
  EXPECT_EQ(ending.status, 0);
  EXPECT_EQ(ending.output, tests::contentsOf(path_));
  EXPECT_THAT(terminal.finished(), EndsWith(" \r"));
}

TEST_F(OverScriptedServices, AFileThatCannotBeHadIsAFailureThatSaysWhy) {
  for (const auto& [code, status] : std::map<FileCoordinationErrorCode, int>{{FileCoordinationErrorCode::notPermitted, 3},
                                                                             {FileCoordinationErrorCode::noDirectory, 4},
                                                                             {FileCoordinationErrorCode::wouldDeadlock, 8}}) {
    script_.accessError = script_.error = coordinationError(code);
    startCoordination();
    for (const char* name : {"read", "write", "holders"}) {
      const Ending ending = ended({name, path_}, "new");
      EXPECT_EQ(ending.status, status) << name;
      EXPECT_THAT(ending.errors, HasSubstr("of a test"));
      EXPECT_EQ(ending.output, "");
    }
    // Each service makes its socket anew; the next one's script is set while nobody reads it.
    coordination_.reset();
    daemon_.reset();
  }
  startCoordination();
  EXPECT_EQ(tests::contentsOf(path_).size(), std::filesystem::file_size(path_));
  EXPECT_EQ(ended({"read", "relative"}).status, 6);
  EXPECT_EQ(ended({"write", "relative"}).status, 6);
  EXPECT_EQ(ended({"holders", "relative"}).status, 6);
}

TEST_F(OverScriptedServices, ATurnThatDoesNotComeInTimeIsGivenUp) {
  script_.accessing = [](const QXFileCoordination::ErrorReply&) {};
  startCoordination();
  EXPECT_EQ(ended({"--timeout", "1", "read", path_}).status, 8);
  EXPECT_TRUE(accessNames_.ended.take());
}

TEST_F(OverScriptedServices, AFileThatCannotBeOpenedIsGivenBack) {
  std::filesystem::remove(path_);
  startCoordination();
  EXPECT_EQ(ended({"read", path_}).status, 9);
  std::filesystem::create_symlink("elsewhere", path_);
  EXPECT_EQ(ended({"read", path_}).status, 9);
  EXPECT_EQ(ended({"write", path_}, "new").status, 9);
  EXPECT_THAT(calls_.all(), ElementsAre("read " + fileURL(), "end", "read " + fileURL(), "end", "write " + fileURL(), "end"));
  EXPECT_TRUE(std::filesystem::is_symlink(path_));
  EXPECT_FALSE(std::filesystem::exists(root_ + "/elsewhere"));
}

TEST_F(OverScriptedServices, AReaderWhoseTurnIsLostWhileItPrintsSaysSo) {
  startCoordination();
  script_.ending = [this](const QXFileCoordination::ErrorReply&) { coordination_->endConnections(); };
  const Ending ending = ended({"read", path_});
  EXPECT_EQ(ending.status, 7);
  EXPECT_EQ(ending.output, tests::contentsOf(path_));
  EXPECT_THAT(ending.errors, HasSubstr("ended with its connection"));
  stop(coordination_);
}

TEST_F(OverScriptedServices, AFileIsReplacedWithinTheTurnAtIt) {
  tests::writeFile(path_, "old");
  std::filesystem::permissions(path_, std::filesystem::perms(0640));
  std::string atTheBeginning;
  std::string atTheEnd;
  script_.accessing = [this, &atTheBeginning](const QXFileCoordination::ErrorReply& reply) {
    atTheBeginning = tests::contentsOf(path_);
    reply(std::nullopt);
  };
  script_.ending = [this, &atTheEnd](const QXFileCoordination::ErrorReply& reply) {
    atTheEnd = tests::contentsOf(path_);
    reply(std::nullopt);
  };
  startCoordination();
  const Ending ending = ended({"write", path_}, "new");
  EXPECT_EQ(ending.status, 0) << ending.errors;
  EXPECT_EQ(ending.output, "");
  stop(coordination_);
  EXPECT_EQ(atTheBeginning, "old");
  EXPECT_EQ(atTheEnd, "new");
  EXPECT_EQ(std::filesystem::status(path_).permissions(), std::filesystem::perms(0640));
  EXPECT_THAT(calls_.all(), ElementsAre("write " + fileURL(), "end"));
}

TEST_F(OverScriptedServices, AFileThatIsWrittenAndWhoseProviderCannotBeToldIsAFailureOfItsOwn) {
  script_.endError = QXError::make("Test", 1, "nobody hears it");
  startCoordination();
  const Ending ending = ended({"write", path_}, "new");
  EXPECT_EQ(ending.status, 5);
  EXPECT_THAT(ending.errors, HasSubstr("The file is written, but"));
  EXPECT_EQ(tests::contentsOf(path_), "new");
}

TEST_F(OverScriptedServices, AWriterWhoseInputCannotBeReadAsksForNoTurn) {
  tests::writeFile(path_, "old");
  startCoordination();
  auto wanted = command({});
  const std::string program = wanted.words.front();
  wanted.words = {"/bin/sh", "-c", "exec \"$0\" write \"$1\" <&-", program, path_};
  EXPECT_EQ(tests::Process(wanted).wait().status, 9);
  EXPECT_THAT(calls_.all(), ElementsAre());
  EXPECT_EQ(tests::contentsOf(path_), "old");
}

// The file is larger than a pipe, so that the reader cannot end before the writer reads; and the writer gets its turn when the reader ends.
TEST_F(OverScriptedServices, AFilesReaderMayFeedItsWriter) {
  const std::string contents(500'000, 'x');
  tests::writeFile(path_, contents);
  // Both on the service's thread.
  bool isReading = true;
  std::optional<QXFileCoordination::ErrorReply> writer;
  script_.accessing = [this, &isReading, &writer](QXFileCoordination::ErrorReply reply) {
    if (!isReading || calls_.all().back().starts_with("read ")) return reply(std::nullopt);
    writer = std::move(reply);
  };
  script_.ending = [&isReading, &writer](const QXFileCoordination::ErrorReply& reply) {
    isReading = false;
    reply(std::nullopt);
    if (writer) (*std::exchange(writer, std::nullopt))(std::nullopt);
  };
  startCoordination();
  auto wanted = command({});
  const std::string program = wanted.words.front();
  wanted.environment.push_back("TMPDIR=" + root_);
  wanted.environment.push_back("PATH=/usr/bin:/bin");
  wanted.words = {"/bin/sh", "-c", "\"$0\" --timeout 30 read \"$1\" | tr x y | \"$0\" --timeout 30 write \"$1\"", program, path_};
  const Ending ending = tests::Process(wanted).wait();
  EXPECT_EQ(ending.status, 0) << ending.errors;
  EXPECT_TRUE(tests::contentsOf(path_) == std::string(contents.size(), 'y')) << tests::contentsOf(path_).substr(0, 10);
  stop(coordination_);
}

TEST_F(OverScriptedServices, HoldersAreATableOrLines) {
  script_.holders = QXArray{
      QXDictionary{{"kind", "writing"}, {"state", "holding"}, {"own", false}, {"processIdentifier", 17}, {"bundleIdentifier", "org.c"}},
      QXDictionary{{"kind", "reading"}, {"state", "waiting"}, {"own", false}, {"processIdentifier", 1800}},
      QXDictionary{{"kind", "reading"}, {"state", "providing"}, {"own", true}}};
  startCoordination();
  EXPECT_EQ(shown({"holders", path_}, 80),
            "KIND     STATE      PID      BUNDLE   OWN\n"
            "writing  holding    17       org.c    false\n"
            "reading  waiting    1800              false\n"
            "reading  providing  unknown  unknown  true\n");
  EXPECT_EQ(ended({"holders", path_}).output,
            "writing\tholding\t17\torg.c\tfalse\n"
            "reading\twaiting\t1800\t\tfalse\n"
            "reading\tproviding\tunknown\tunknown\ttrue\n");
  EXPECT_EQ(ended({"holders", "--json", path_}).output,
            "[{\"kind\":\"writing\",\"state\":\"holding\",\"pid\":17,\"bundle\":\"org.c\",\"own\":false},"
            "{\"kind\":\"reading\",\"state\":\"waiting\",\"pid\":1800,\"bundle\":\"\",\"own\":false},"
            "{\"kind\":\"reading\",\"state\":\"providing\",\"pid\":null,\"bundle\":null,\"own\":true}]\n");
}

}  // namespace
}  // namespace docuvend::ctl
