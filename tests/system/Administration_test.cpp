// What whoever looks after a user's machine can ask of the real daemon, and who cannot.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <future>
#include <memory>
#include <thread>

#include "common/DVErrors.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/Administrator.h"
#include "tests/system/house/DaemonHouse.h"
#include "tests/system/knock.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using linux_platform::QXSandboxRedemption;
using linux_platform::SandboxErrorCode;
using ::testing::HasSubstr;
using ::testing::Not;

const ProviderID kCellarID{kCellar};
const ProviderID kTricksterID{kTrickster};
const ConsumerID kEditorID{kEditor};
const ConsumerID kPickerID{kPicker};

// Confined as that bundle: a program that asks the administration, and one that holds a document.
const std::string kKnocker = "com.orvane.knocker";
const std::string kTenant = "com.orvane.tenant";

const std::string kRefused = "QXRpcErrorDomain 9";

class Administration : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    house_.install(kKnocker, "docuvend-knocker", stringEntry("QXBundleIdentifier", kKnocker), {});
    house_.install(kTenant, "docuvend-tenant", stringEntry("QXBundleIdentifier", kTenant), trueEntry("com.orvane.docuvend.acl-read"));
    house_.putInCloud("letter.txt", "Dear all\n");
    ASSERT_EQ(::setenv("XDG_RUNTIME_DIR", house_.runtime().c_str(), /*replace=*/1), 0);
  }

  static QXURL url(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }
  static Grant grantOf(const ProviderID& provider, const std::string& item, const ConsumerID& consumer) {
    return {provider, consumer, ItemID{item}};
  }

  // The administrator's library, and a connection for what it would not ask.
  static std::unique_ptr<Administrator> administrator() {
    auto connected = Administrator::connect({});
    if (const auto* error = std::get_if<QXError>(&connected)) throw std::runtime_error(error->description());
    return std::get<std::unique_ptr<Administrator>>(std::move(connected));
  }
  [[nodiscard]] std::unique_ptr<Client> rawAdministrator(const std::optional<std::string>& actAs = std::nullopt) const {
    return std::make_unique<Client>(house_.administrationSocket(), actAs);
  }
  static std::vector<Grant> grants(const std::optional<ProviderID>& provider = std::nullopt,
                                   const std::optional<ConsumerID>& consumer = std::nullopt) {
    auto listed = administrator()->grants(provider, consumer);
    if (const auto* error = std::get_if<QXError>(&listed)) throw std::runtime_error(error->description());
    return std::get<std::vector<Grant>>(std::move(listed));
  }

  // As the picker: grants the letter, and its string.
  std::string grantLetter(const std::string& consumer) const {
    EXPECT_EQ(errorOf(house_.client(kPicker)->ask<&DVDaemon::extendSandboxForFileURL>(letter_, kCellarID, ConsumerID{consumer})),
              std::nullopt);
    const auto named = house_.client()->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(letter_);
    if (named.index() != 0) return {};
    return std::get<0>(std::get<0>(named)).value_or("");
  }
  static ItemID itemOf(const std::string& string) { return {string.substr(string.find('/') + 1)}; }
  // As the consumer: the document's token.
  std::optional<QXData> resolve(const std::string& consumer, const std::string& string) const {
    const auto resolved = house_.client(consumer)->ask<&DVDaemon::documentURLFromBookmarkableString>(string);
    if (resolved.index() != 0 || errorOf(resolved)) return std::nullopt;
    return std::get<1>(std::get<0>(resolved));
  }
  [[nodiscard]] std::optional<QXError> redemptionError(const std::optional<QXData>& token) const {
    return errorOf(house_.client(std::nullopt, linux_platform::kSandboxServiceName)->ask<&QXSandboxRedemption::redeemToken>(token, true));
  }

  // The administration's socket by another name, so that it can be seen there.
  void showSocketAt(const std::string& path) const { fs::create_hard_link(house_.administrationSocket(), path); }
  std::string knockConfined(const std::string& socket, std::vector<std::string> request) const {
    request.insert(request.begin(), socket);
    const Ending knocked = house_.confined(kKnocker, request);
    EXPECT_EQ(knocked.status, 0) << knocked.errors;
    return knocked.output.substr(0, knocked.output.find('\n'));
  }
  void writeList(const std::string& entries) const {
    fs::create_directories(fs::path(house_.accessControlFile()).parent_path());
    writeFile(house_.accessControlFile(), propertyList(entries));
  }

  const QXURL letter_ = QXURL::fileURL(house_.document("letter.txt"), QXURLKind::file);
};

MATCHER_P(IsSandboxError, code, "") {
  return arg && arg->domain == linux_platform::kQXSandboxErrorDomain && arg->code == static_cast<std::int64_t>(code);
}

// --- The list

TEST_F(Administration, ListsWhatHasBeenGranted) {
  house_.startDaemon();
  EXPECT_EQ(grants(), std::vector<Grant>());
  const std::string item = itemOf(grantLetter(kPicker)).value;
  (void)grantLetter(kEditor);
  EXPECT_EQ(grants(), (std::vector<Grant>{grantOf(kCellarID, item, kEditorID), grantOf(kCellarID, item, kPickerID)}));
}

TEST_F(Administration, ListsWhatIsOfOneProviderOrOneConsumer) {
  writeList(
      "<key>com.example.attic</key><dict><key>com.orvane.editor</key><dict><key>AllowedItemIDs</key><array>"
      "<string>z</string><string>a</string></array></dict></dict>"
      "<key>com.orvane.cellar</key><dict><key>com.orvane.picker</key><dict><key>AllowedItemIDs</key><array>"
      "<string>i</string></array></dict></dict>");
  house_.startDaemon();
  const ProviderID attic{"com.example.attic"};
  const std::vector<Grant> ofAttic = {grantOf(attic, "z", kEditorID), grantOf(attic, "a", kEditorID)};
  const std::vector<Grant> ofPicker = {grantOf(kCellarID, "i", kPickerID)};
  EXPECT_EQ(grants(attic), ofAttic);
  EXPECT_EQ(grants(std::nullopt, kPickerID), ofPicker);
  EXPECT_EQ(grants(kCellarID, kPickerID), ofPicker);
  EXPECT_EQ(grants(attic, kPickerID), std::vector<Grant>());
  EXPECT_EQ(grants().size(), 3U);
}

std::string listOf(int count, const std::string& padding = {}) {
  std::string items;
  for (int i = 0; i < count; ++i) items += "<string>" + std::to_string(i) + padding + "</string>";
  return "<key>com.orvane.cellar</key><dict><key>com.orvane.editor</key><dict><key>AllowedItemIDs</key><array>" + items +
         "</array></dict></dict>";
}

TEST_F(Administration, AListOfManyPagesComesWholeAndInItsOrder) {
  constexpr int kCount = 2500;
  writeList(listOf(kCount));
  house_.startDaemon();
  const auto listed = grants();
  ASSERT_EQ(listed.size(), static_cast<std::size_t>(kCount));
  for (int i = 0; i < kCount; ++i) {
    EXPECT_EQ(listed[static_cast<std::size_t>(i)], grantOf(kCellarID, std::to_string(i), kEditorID));
  }
}

TEST_F(Administration, APageIsAsShortAsItsIdentifiersAreLong) {
  constexpr int kCount = 50;
  writeList(listOf(kCount, std::string(60'000, 'x')));
  house_.startDaemon();
  EXPECT_EQ(grants().size(), static_cast<std::size_t>(kCount));
}

TEST_F(Administration, TheFurtherPagesAreOfTheListThatTheFirstOneIsOf) {
  writeList(listOf(2500));
  house_.startDaemon();
  const auto caller = rawAdministrator();
  std::optional<std::int64_t> start;
  std::vector<QXValue> all;
  int pages = 0;
  do {
    const auto page = caller->ask<&DVAdministration::grantsOfProviderID>(std::nullopt, std::nullopt, start);
    ASSERT_EQ(errorOf(page), std::nullopt);
    const auto& [error, entries, next] = std::get<0>(page);
    all.insert(all.end(), entries.value().begin(), entries.value().end());
    start = next;
    ++pages;
    const std::string revoked = std::to_string(2500 - pages);
    ASSERT_EQ(administrator()->revoke(kCellarID, ItemID{revoked}, kEditorID), std::nullopt);
  } while (start && pages < 10);
  EXPECT_EQ(pages, 3);
  EXPECT_EQ(all.size(), 2500U);
  EXPECT_EQ(grants().size(), 2497U);
}

TEST_F(Administration, APageOfNoListIsAnError) {
  house_.startDaemon();
  EXPECT_EQ(errorOf(rawAdministrator()->ask<&DVAdministration::grantsOfProviderID>(std::nullopt, std::nullopt, std::int64_t{1})),
            DVInvalidParameterError("startingAt", "1"));
}

// --- Revoking

// The daemon is killed inside the handler of its answer: what it has not written by then it never writes.
TEST_F(Administration, ARevocationIsInTheFileBeforeItsAnswerIsSent) {
  constexpr int kRounds = 5;
  writeList(listOf(kRounds));
  for (int i = 0; i < kRounds; ++i) {
    house_.startDaemon();
    const auto caller = rawAdministrator();
    const auto answered = std::make_shared<std::promise<std::optional<QXError>>>();
    const QXRemote<DVAdministration> remote(
        caller->endpoint().remoteObjectProxy([answered](const QXError& error) { answered->set_value(error); }));
    remote.call<&DVAdministration::revokeItemID>(ItemID{std::to_string(i)}, kCellarID, kEditorID,
                                                 [answered, &daemon = house_.daemon()](std::optional<QXError> error) {
                                                   daemon.signal(SIGKILL);
                                                   answered->set_value(std::move(error));
                                                 });
    auto answer = answered->get_future();
    ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
    ASSERT_EQ(answer.get(), std::nullopt);
    house_.killDaemon();
    for (int other = 0; other < kRounds; ++other) {
      const bool listed = house_.accessControl().find("<string>" + std::to_string(other) + "</string>") != std::string::npos;
      EXPECT_EQ(listed, other > i) << other << " after " << i;
    }
  }
}

TEST_F(Administration, ARevocationOfTheUnknownIsAnErrorAndTouchesNothing) {
  writeList(listOf(1));
  const std::string before = house_.accessControl();
  house_.startDaemon();
  const auto caller = administrator();
  EXPECT_EQ(caller->revoke(kCellarID, ItemID{"none"}, kEditorID), DVNotFoundError(ItemID{"none"}));
  EXPECT_EQ(caller->revoke(kCellarID, ItemID{"0"}, kPickerID), DVNotFoundError(ItemID{"0"}));
  EXPECT_EQ(caller->revoke(ProviderID{"com.example.none"}, ItemID{"0"}, kEditorID), DVNotFoundError(ItemID{"0"}));
  EXPECT_EQ(house_.accessControl(), before);
  EXPECT_EQ(house_.loggedBeginning("[INFO] No longer allowing "), 0);
}

TEST_F(Administration, AMissingArgumentOfARevocationIsNamed) {
  house_.startDaemon();
  const auto caller = rawAdministrator();
  EXPECT_EQ(errorOf(caller->ask<&DVAdministration::revokeItemID>(std::nullopt, std::nullopt, std::nullopt)),
            DVInvalidParameterError("itemID", std::nullopt));
  EXPECT_EQ(errorOf(caller->ask<&DVAdministration::revokeItemID>(ItemID{"i"}, std::nullopt, std::nullopt)),
            DVInvalidParameterError("providerID", std::nullopt));
  EXPECT_EQ(errorOf(caller->ask<&DVAdministration::revokeItemID>(ItemID{"i"}, kCellarID, std::nullopt)),
            DVInvalidParameterError("consumerID", std::nullopt));
}

TEST_F(Administration, ARevocationIsLoggedByTheStore) {
  house_.startDaemon();
  const ItemID item = itemOf(grantLetter(kEditor));
  ASSERT_EQ(administrator()->revoke(kCellarID, item, kEditorID), std::nullopt);
  EXPECT_EQ(house_.logged("[INFO] No longer allowing provider ID com.orvane.cellar to provide item ID “" + item.value +
                          "” to consumer ID com.orvane.editor"),
            1);
  EXPECT_THAT(house_.accessControl(), Not(HasSubstr("<string>")));
}

TEST_F(Administration, ARevocationThatCannotBeWrittenIsAnErrorAndTheGrantIsBackAfterARestart) {
  house_.startDaemon();
  const std::string string = grantLetter(kEditor);
  const auto token = resolve(kEditor, string);
  const auto directory = fs::path(house_.accessControlFile()).parent_path();
  fs::permissions(directory, fs::perms::owner_read | fs::perms::owner_exec);
  const auto error = administrator()->revoke(kCellarID, itemOf(string), kEditorID);
  fs::permissions(directory, fs::perms::owner_all);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, kQXSystemErrorDomain);
  EXPECT_EQ(error->code, EIO);
  EXPECT_EQ(resolve(kEditor, string), std::nullopt);
  EXPECT_THAT(redemptionError(token), IsSandboxError(SandboxErrorCode::badToken));
  house_.killDaemon();
  house_.startDaemon();
  EXPECT_NE(resolve(kEditor, string), std::nullopt);
}

// --- What a revocation cuts

TEST_F(Administration, ATokenThatWasIssuedBeforeTheRevocationIsRefusedAlsoAfterARestart) {
  house_.startDaemon();
  const std::string string = grantLetter(kEditor);
  const auto token = resolve(kEditor, string);
  ASSERT_EQ(redemptionError(token), std::nullopt);
  ASSERT_EQ(administrator()->revoke(kCellarID, itemOf(string), kEditorID), std::nullopt);
  EXPECT_THAT(redemptionError(token), IsSandboxError(SandboxErrorCode::badToken));
  house_.killDaemon();
  house_.startDaemon();
  EXPECT_THAT(redemptionError(token), IsSandboxError(SandboxErrorCode::badToken));
}

TEST_F(Administration, TheRevokedConsumerCanNeitherResolveNorStart) {
  house_.startDaemon();
  const std::string string = grantLetter(kEditor);
  ASSERT_NE(resolve(kEditor, string), std::nullopt);
  ASSERT_EQ(errorOf(house_.client(kEditor)->ask<&DVDaemon::startProvidingItemAtURL>(letter_, kCellarID, kEditorID)), std::nullopt);
  ASSERT_EQ(administrator()->revoke(kCellarID, itemOf(string), kEditorID), std::nullopt);
  EXPECT_EQ(errorOf(house_.client(kEditor)->ask<&DVDaemon::documentURLFromBookmarkableString>(string)), DVNotPermittedError());
  EXPECT_EQ(errorOf(house_.client(kEditor)->ask<&DVDaemon::startProvidingItemAtURL>(letter_, kCellarID, kEditorID)), DVNotPermittedError());
}

TEST_F(Administration, AnotherConsumerOfTheItemAsksForANewTokenAndGoesOn) {
  house_.startDaemon();
  const std::string string = grantLetter(kEditor);
  (void)grantLetter(kTenant);
  const auto old = resolve(kEditor, string);
  ASSERT_EQ(administrator()->revoke(kCellarID, itemOf(string), ConsumerID{kTenant}), std::nullopt);
  EXPECT_THAT(redemptionError(old), IsSandboxError(SandboxErrorCode::badToken));
  const auto fresh = resolve(kEditor, string);
  ASSERT_NE(fresh, std::nullopt);
  EXPECT_EQ(redemptionError(fresh), std::nullopt);
  EXPECT_EQ(house_.confined(kEditor, {"show", string}).output, "Dear all\n");
}

TEST_F(Administration, TokensOfOtherProvidersStayGood) {
  house_.installTrickster();
  house_.startDaemon();
  const QXURL trick = url(house_.storage(kTrickster) + "/trick");
  writeFile(trick.fileSystemPath(), "");
  const auto granted = house_.client(kPicker)->ask<&DVDaemon::extendSandboxForFileURL>(trick, kTricksterID, kEditorID);
  ASSERT_EQ(errorOf(granted), std::nullopt);
  const ItemID item = itemOf(grantLetter(kEditor));
  ASSERT_EQ(administrator()->revoke(kCellarID, item, kEditorID), std::nullopt);
  EXPECT_EQ(redemptionError(std::get<1>(std::get<0>(granted))), std::nullopt);
}

TEST_F(Administration, AGrantOfAProviderThatIsGoneTakesAllTokensWithIt) {
  writeList(
      "<key>com.example.gone</key><dict><key>com.orvane.editor</key><dict><key>AllowedItemIDs</key><array>"
      "<string>i</string></array></dict></dict>");
  house_.startDaemon();
  const auto token = resolve(kEditor, grantLetter(kEditor));
  ASSERT_EQ(redemptionError(token), std::nullopt);
  ASSERT_EQ(administrator()->revoke(ProviderID{"com.example.gone"}, ItemID{"i"}, kEditorID), std::nullopt);
  EXPECT_THAT(redemptionError(token), IsSandboxError(SandboxErrorCode::badToken));
}

// The application holds the document open and may write it by what it redeemed; then the grant goes.
TEST_F(Administration, AConfinedHolderKeepsItsOpenFileAndNothingElse) {
  house_.startDaemon();
  const std::string string = grantLetter(kTenant);
  auto holder = std::async(std::launch::async, [this, string] { return house_.confined(kTenant, {string, kCellar}); });
  const std::string container = house_.container(kTenant);
  eventually("the tenant holds the document",
             [&] { return fs::exists(container + "/holding") || holder.wait_for(std::chrono::seconds(0)) == std::future_status::ready; });
  EXPECT_EQ(administrator()->revoke(kCellarID, itemOf(string), ConsumerID{kTenant}), std::nullopt);
  writeFile(container + "/go", "");
  const Ending held = holder.get();
  EXPECT_EQ(held.output,
            "before redeem: ok\n"
            "before start: ok\n"
            "before extend: ok\n"
            "before resolve: ok\n"
            "holding: ok\n"
            "after write: ok\n"
            "after redeem: QXSandboxErrorDomain 1\n"
            "after start: DVErrorDomain 2\n"
            "after extend: DVErrorDomain 2\n"
            "after resolve: DVErrorDomain 2\n")
      << held.errors;
  EXPECT_EQ(contentsOf(letter_.fileSystemPath()).substr(0, 10), "still here");
  EXPECT_EQ(grants(), std::vector<Grant>()) << "it has its grant again";
}

// --- Who may ask

TEST_F(Administration, TheSocketLiesBesideThePublicOnesAndIsTheOwnersAlone) {
  house_.startDaemon();
  struct stat status {};
  ASSERT_EQ(::lstat((house_.runtime() + "/docuvend/com.orvane.Administration").c_str(), &status), 0);
  EXPECT_TRUE(S_ISSOCK(status.st_mode));
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
  EXPECT_FALSE(fs::exists(house_.publicSocket("com.orvane.Administration")));
}

TEST_F(Administration, AnUnconfinedProcessMayAskAlsoWhenItActsForABundle) {
  house_.startDaemon();
  EXPECT_EQ(errorOf(rawAdministrator()->ask<&DVAdministration::statusCompletionHandler>()), std::nullopt);
  EXPECT_EQ(errorOf(rawAdministrator(kEditor)->ask<&DVAdministration::statusCompletionHandler>()), std::nullopt);
  EXPECT_EQ(knock(house_.administrationSocket(), {"status"}), "answered");
}

TEST_F(Administration, AConfinedProcessDoesNotSeeTheSocket) {
  house_.startDaemon();
  EXPECT_EQ(knockConfined(house_.administrationSocket(), {"status"}), "not reached: QXSystemErrorDomain " + std::to_string(ENOENT));
}

TEST_F(Administration, AConfinedProcessThatSeesTheSocketIsRefusedAllTheSame) {
  writeList(listOf(1));
  house_.startDaemon();
  const std::string door = house_.publicSocket("door");
  showSocketAt(door);
  ASSERT_EQ(knock(door, {"status"}), "answered") << "the door leads to the administration";
  EXPECT_EQ(knockConfined(door, {"status"}), kRefused);
  EXPECT_EQ(knockConfined(door, {"first-unlock"}), kRefused);
  EXPECT_EQ(knockConfined(door, {"revoke", kCellar, "0", kEditor}), kRefused);
  EXPECT_EQ(grants().size(), 1U);
  EXPECT_EQ(house_.loggedContaining("announces the first unlock"), 0);
  EXPECT_EQ(house_.loggedBeginning("[NOTICE] Refusing a connection of PID "), 1) << "one line for all three";
  EXPECT_EQ(house_.loggedContaining(": com.orvane.Administration is not for com.orvane.knocker."), 1);
}

TEST_F(Administration, AnExtensionThatSeesTheSocketIsRefused) {
  house_.installTrickster();
  house_.startDaemon();
  const auto answer = [this] {
    const auto named = house_.client()->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(url(house_.storage(kTrickster) + "/knock"));
    return named.index() == 0 ? std::get<0>(std::get<0>(named)).value_or("") : "undelivered";
  };
  EXPECT_EQ(answer(), "docuvend:com.orvane.trickster/not reached: QXSystemErrorDomain " + std::to_string(ENOENT));
  showSocketAt(fs::path(house_.storage(kTrickster)).parent_path() / "door");
  EXPECT_EQ(answer(), "docuvend:com.orvane.trickster/" + kRefused);
  EXPECT_EQ(house_.loggedContaining(": com.orvane.Administration is not for com.orvane.trickster."), 1);
  EXPECT_EQ(house_.loggedContaining("announces the first unlock"), 0);
}

// --- When it answers, and the status

TEST_F(Administration, AnAdministratorGetsThroughWhileAProviderHangsInItsSetup) {
  house_.installTrickster();
  const std::string container = house_.container(kTrickster);
  fs::create_directories(container);
  fs::permissions(container, fs::perms::owner_all);
  writeFile(container + "/hang", "");
  writeList(listOf(1));
  house_.startDaemonWithoutWaiting();
  eventually("the provider is in its setup", [this] { return !house_.processesOf("docuvend-trickster").empty(); });
  EXPECT_EQ(grants().size(), 1U);
  EXPECT_EQ(administrator()->revoke(kTricksterID, ItemID{"none"}, kEditorID), DVNotFoundError(ItemID{"none"}));
  EXPECT_EQ(administrator()->revoke(kCellarID, ItemID{"0"}, kEditorID), std::nullopt);
  EXPECT_EQ(house_.loggedContaining("Registered docuvend extension com.orvane.trickster"), 0) << "it does not hang";
  EXPECT_EQ(house_.logged("[INFO] New connection accepted."), 0) << "clients do not wait";
  fs::remove(container + "/hang");
  EXPECT_TRUE(house_.answers());
}

TEST_F(Administration, TheStatusSaysHowTheDaemonIs) {
  house_.startDaemon();
  (void)grantLetter(kEditor);
  const auto asked = administrator()->status();
  ASSERT_EQ(asked.index(), 0U) << std::get<QXError>(asked).description();
  const auto& status = std::get<QXDictionary>(asked);
  const auto integer = [&status](const char* key) {
    const auto* found = qxFind<std::int64_t>(status, key);
    return found == nullptr ? -1 : *found;
  };
  EXPECT_EQ(integer("processIdentifier"), house_.daemon().pid());
  EXPECT_EQ(integer("lockState"), 3);
  EXPECT_EQ(integer("grants"), 1);
  EXPECT_GE(integer("connections"), 2) << "the test's own and the administrator's";
  ASSERT_NE(qxFind<bool>(status, "unlockedSinceBoot"), nullptr);
  ASSERT_NE(qxFind<std::string>(status, "version"), nullptr);
  EXPECT_THAT(*qxFind<std::string>(status, "version"), ::testing::MatchesRegex("[0-9]+\\.[0-9]+\\.[0-9]+"));

  const auto* protections = qxFind<QXArray>(status, "protections");
  ASSERT_NE(protections, nullptr);
  EXPECT_EQ(protections->size(), 5U);
  for (const QXValue& sentence : *protections) EXPECT_EQ(house_.logged("[NOTICE] " + *sentence.as<std::string>()), 1);

  const auto* providers = qxFind<QXDictionary>(status, "providers");
  ASSERT_NE(providers, nullptr);
  const auto* cellar = qxFind<QXDictionary>(*providers, kCellar);
  ASSERT_NE(cellar, nullptr);
  EXPECT_EQ(*qxFind<QXURL>(*cellar, "documentStorageURL"), QXURL::fileURL(house_.storage(kCellar), QXURLKind::directory));
  const auto* extensions = qxFind<QXDictionary>(status, "extensions");
  ASSERT_NE(extensions, nullptr);
  ASSERT_NE(qxFind<QXDictionary>(*extensions, kCellar), nullptr);
}

}  // namespace
}  // namespace docuvend::tests
