// What the daemon refuses a real caller, with which error and which line in the log.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "common/DVErrors.h"
#include "platform/rpc_errors.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::AnyOf;
using ::testing::HasSubstr;

const ProviderID kCellarID{kCellar};
const ConsumerID kEditorID{kEditor};

constexpr int kNotPermitted = 3;  // of docuvendctl
constexpr int kInvalidInput = 6;
constexpr int kDeadlinePassed = 8;

class Refusals : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kEditor, kPicker, kStranger}) house_.install(bundle);
    house_.installTrickster();
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    house_.startDaemon();
  }

  static QXURL url(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }
  QXURL letter() const { return url(letter_); }
  QXURL trick(const std::string& name) const { return url(house_.storage(kTrickster) + "/" + name); }
  static std::string self() { return std::to_string(::getpid()); }

  std::string letter_;
};

// Entitlements.

TEST_F(Refusals, AConfinedApplicationWithoutTheWriteEntitlementMayNotGrant) {
  const Ending refused = house_.confined(kStranger, {"grant", letter_, kCellar, kStranger});
  EXPECT_EQ(refused.status, kNotPermitted);
  EXPECT_THAT(refused.errors, HasSubstr(DVClientLacksEntitlement().description()));
  EXPECT_EQ(house_.loggedContaining(" because it does not have any of these entitlements: (\"com.orvane.docuvend.acl-write\")"), 1);
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(Refusals, ACallerWithoutAnyEntitlementIsRefusedWithItsNumberInTheLog) {
  const auto caller = house_.client();
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(letter(), kCellarID, kEditorID)), DVClientLacksEntitlement());
  EXPECT_EQ(house_.logged("[ERROR] Rejecting request from PID " + self() +
                          " because it does not have any of these entitlements: (\"com.orvane.docuvend.acl-write\")"),
            1);
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::startProvidingItemAtURL>(letter(), kCellarID, kEditorID)), DVClientLacksEntitlement());
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::providersCompletionHandler>()), DVClientLacksEntitlement());
  EXPECT_EQ(house_.logged("[ERROR] Rejecting request from PID " + self() +
                          " because it does not have any of these entitlements: (\"com.orvane.docuvend.acl-read\", "
                          "\"com.orvane.docuvend.acl-write\")"),
            2);
  EXPECT_EQ(house_.logged("[DEBUG] providersCompletionHandler:: Client is missing entitlement"), 1);
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(Refusals, AnEntitlementThatIsAStringDoesNotCount) {
  house_.install("com.example.boast", "docuvendctl", stringEntry("QXBundleIdentifier", "com.example.boast"),
                 stringEntry("com.orvane.docuvend.acl-write", "true") + stringEntry("com.orvane.docuvend.acl-read", "1"));
  ASSERT_TRUE(eventually("the bundle is known", [this] { return house_.confined("com.example.boast", {"wake"}).status == 0; }));
  EXPECT_EQ(house_.confined("com.example.boast", {"grant", letter_, kCellar, "com.example.boast"}).status, kNotPermitted);
  EXPECT_EQ(house_.confined("com.example.boast", {"providers"}).status, kNotPermitted);
}

// Identity.

TEST_F(Refusals, AnUndeclaredCallerMayNotResolveAString) {
  const std::string string = house_.granted(letter_, kEditor);
  EXPECT_EQ(errorOf(house_.client()->ask<&DVDaemon::documentURLFromBookmarkableString>(string)), DVNotPermittedError());
}

TEST_F(Refusals, AnUnconfinedCallerMayDeclareAnInstalledBundleWhichIsLogged) {
  const auto caller = house_.client(kPicker);
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(letter(), kCellarID, kEditorID)), std::nullopt);
  EXPECT_EQ(house_.logged("[NOTICE] PID " + self() + " declares itself to be com.orvane.picker."), 1);
}

TEST_F(Refusals, ACallerThatDeclaresAnUnknownBundleIsNotServed) {
  const Ending refused = house_.ctl({"--as", "com.example.unknown", "wake"});
  EXPECT_NE(refused.status, 0);
  EXPECT_THAT(refused.errors, HasSubstr("this process cannot act for the bundle com.example.unknown"));
  EXPECT_TRUE(house_.answers());
}

TEST_F(Refusals, AConfinedProcessCannotDeclareAnotherBundle) {
  const Ending refused = house_.confined(kStranger, {"--as", kPicker, "grant", letter_, kCellar, kStranger});
  EXPECT_NE(refused.status, 0);
  EXPECT_THAT(refused.errors, HasSubstr("this process cannot act for the bundle com.orvane.picker"));
  EXPECT_EQ(house_.loggedContaining(" declares itself to be "), 0);
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(Refusals, AConfinedProcessCannotDeclareItsOwnBundleEither) {
  EXPECT_NE(house_.confined(kStranger, {"--as", kStranger, "wake"}).status, 0);
  EXPECT_EQ(house_.confined(kStranger, {"wake"}).status, 0);
}

// Grants.

TEST_F(Refusals, AStringFromAnotherApplicationIsOfNoUse) {
  const std::string string = house_.granted(letter_, kEditor);
  const Ending refused = house_.confined(kStranger, {"resolve", string});
  EXPECT_EQ(refused.status, kNotPermitted);
  EXPECT_THAT(refused.errors, HasSubstr(DVNotPermittedError().description()));
  EXPECT_EQ(house_.logged("[ERROR] Provider ID com.orvane.cellar is not allowed to provide item ID “" +
                          string.substr(string.find('/') + 1) + "” to consumer ID com.orvane.stranger"),
            1);
}

TEST_F(Refusals, StartingToProvideNeedsAGrant) {
  const std::string string = house_.bookmark(letter_);
  const auto caller = house_.client(kPicker);
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::startProvidingItemAtURL>(letter(), kCellarID, kEditorID)), DVNotPermittedError());
  EXPECT_EQ(house_.logged("[ERROR] Consumer ID com.orvane.editor is not allowed to access item ID “" + string.substr(string.find('/') + 1) +
                          "” from provider ID com.orvane.cellar."),
            1);
}

// Arguments.

TEST_F(Refusals, TheFirstMissingArgumentOfAGrantIsNamed) {
  const auto caller = house_.client(kPicker);
  const auto parameter = [](const char* name) { return DVInvalidParameterError(name, std::nullopt); };
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(std::nullopt, std::nullopt, std::nullopt)), parameter("URL"));
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(letter(), std::nullopt, std::nullopt)), parameter("providerID"));
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(letter(), kCellarID, std::nullopt)), parameter("consumerID"));
  EXPECT_EQ(house_.logged("[ERROR] Could not extend sandbox for URL (null) from provider ID (null) to consumer ID (null), error: " +
                          parameter("URL").description()),
            1);
  EXPECT_EQ(house_.logged("[ERROR] Could not extend sandbox for URL " + letter().absoluteString() +
                          " from provider ID com.orvane.cellar to consumer ID (null), error: " + parameter("consumerID").description()),
            1);
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(Refusals, AMissingArgumentOfStartingToProvideIsWrapped) {
  const auto caller = house_.client(kPicker);
  const auto wrapped = [](const char* name) { return DVNotFoundError(DVInvalidParameterError(name, std::nullopt)); };
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::startProvidingItemAtURL>(std::nullopt, std::nullopt, kEditorID)), wrapped("URL"));
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::startProvidingItemAtURL>(letter(), std::nullopt, std::nullopt)), wrapped("providerID"));
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::startProvidingItemAtURL>(letter(), kCellarID, std::nullopt)), wrapped("consumerID"));
  EXPECT_EQ(house_.logged("[ERROR] Cannot provide item at URL " + letter().absoluteString() +
                          " from provider ID com.orvane.cellar to consumer ID (null). Error: " +
                          DVInvalidParameterError("consumerID", std::nullopt).description()),
            1);
}

TEST_F(Refusals, AnAbsentStringIsNoBookmarkableString) {
  EXPECT_EQ(errorOf(house_.client(kEditor)->ask<&DVDaemon::documentURLFromBookmarkableString>(std::nullopt)),
            DVInvalidBookmarkableStringError());
}

TEST_F(Refusals, AnAbsentURLHasNoStringAndNoError) {
  const auto answer = house_.client()->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(std::nullopt);
  ASSERT_EQ(answer.index(), 0U);
  EXPECT_EQ(std::get<0>(answer), std::make_tuple(std::optional<std::string>(), std::optional<QXError>()));
}

TEST_F(Refusals, MalformedStringsAreTold) {
  const auto caller = house_.client(kEditor);
  for (const char* string : {"", "docuvend", "docuvend:", "docuvend:p", "docuvend:p/", "docuvend:/i", "docuvend:p//a", "Docuvend:p/i",
                             " docuvend:p/i", "docuvend://i", "file:///p/i"}) {
    EXPECT_EQ(errorOf(caller->ask<&DVDaemon::documentURLFromBookmarkableString>(std::string(string))), DVInvalidBookmarkableStringError())
        << string;
  }
  EXPECT_EQ(house_.ctl({"--as", kEditor, "resolve", "docuvend:p/"}).status, kInvalidInput);
}

// Providers and places.

TEST_F(Refusals, AGrantOfAnUnknownProviderIsNotFound) {
  const auto caller = house_.client(kPicker);
  const QXError notFound = DVNotFoundError(ProviderID{"com.example.none"});
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(letter(), ProviderID{"com.example.none"}, kEditorID)), notFound);
  EXPECT_EQ(house_.logged("[ERROR] Could not extend sandbox for URL " + letter().absoluteString() +
                          " from provider ID com.example.none to consumer ID com.orvane.editor, error: " + notFound.description()),
            1);
}

TEST_F(Refusals, AGrantThatNamesAnotherProviderIsRecordedForThatOneAndFails) {
  const auto caller = house_.client(kPicker);
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(letter(), ProviderID{kTrickster}, kEditorID)),
            DVSandboxExtensionFailedError(letter()));
  EXPECT_EQ(house_.logged("[ERROR] Failed to extend sandbox for URL " + letter().absoluteString() +
                          " from provider ID com.orvane.trickster to consumer ID com.orvane.editor."),
            1);
  EXPECT_THAT(house_.accessControl(), HasSubstr("<key>com.orvane.trickster</key>"));
}

TEST_F(Refusals, StartingToProvideNamesAnotherProvider) {
  const auto caller = house_.client(kPicker);
  const QXError mismatch = DVInvalidParameterError("providerID", kTrickster);
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::startProvidingItemAtURL>(letter(), ProviderID{kTrickster}, kEditorID)),
            DVNotFoundError(mismatch));
  EXPECT_EQ(house_.logged("[ERROR] Cannot provide item at URL " + letter().absoluteString() +
                          " from provider ID com.orvane.trickster to consumer ID com.orvane.editor. Error: " + mismatch.description()),
            1);
}

TEST_F(Refusals, AURLOutsideEveryDirectoryBelongsToNobody) {
  const QXURL outside = url("/etc/passwd");
  const auto caller = house_.client(kPicker);
  const auto string = caller->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(outside);
  ASSERT_EQ(string.index(), 0U);
  EXPECT_EQ(std::get<0>(string), std::make_tuple(std::optional<std::string>(), std::optional<QXError>()));
  EXPECT_EQ(house_.logged("[INFO] Could not find the provider for URL file:///etc/passwd"), 1);
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::startProvidingItemAtURL>(outside, kCellarID, kEditorID)),
            DVNotFoundError(DVNotFoundError(kCellarID)));
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(outside, ProviderID{kTrickster}, kEditorID)),
            DVSandboxExtensionFailedError(outside));
}

TEST_F(Refusals, TheStorageItselfIsNoItem) {
  const QXURL storage = QXURL::fileURL(house_.storage(kTrickster), QXURLKind::directory);
  const auto caller = house_.client(kPicker);
  const auto string = caller->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(storage);
  ASSERT_EQ(string.index(), 0U);
  EXPECT_EQ(std::get<0>(string), std::make_tuple(std::optional<std::string>(), std::optional<QXError>()));
  EXPECT_GE(house_.logged("[DEBUG] Ignoring URLs that exactly match the document container folder"), 1);
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::startProvidingItemAtURL>(storage, ProviderID{kTrickster}, kEditorID)),
            DVNotFoundError(DVNotFoundError(ProviderID{kTrickster})));
  EXPECT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(storage, ProviderID{kTrickster}, kEditorID)),
            DVSandboxExtensionFailedError(storage));
}

TEST_F(Refusals, ADocumentThatTheProviderDoesNotKnowIsItsError) {
  const auto caller = house_.client(kPicker);
  const auto error = errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(url(house_.document("none")), kCellarID, kEditorID));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, kDVErrorDomain);
  EXPECT_EQ(error->code, static_cast<std::int64_t>(DVErrorCode::pluginOperationFailed));
  ASSERT_TRUE(error->underlying && error->underlying->underlying);
  EXPECT_EQ(error->underlying->underlying->domain, "CellarErrorDomain");
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Proxy failed to get item ID for URL "), 1);
  EXPECT_EQ(house_.accessControl(), "");
}

TEST_F(Refusals, AStringWhoseURLLiesOutsideItsProviderIsNotPermitted) {
  writeFile(house_.storage(kTrickster) + "/outside", "");
  writeFile(house_.storage(kTrickster) + "/cellar", "");
  writeFile(house_.storage(kTrickster) + "/storage", "");
  const auto caller = house_.client(kPicker);
  for (const char* name : {"outside", "cellar", "storage"}) {
    ASSERT_EQ(errorOf(caller->ask<&DVDaemon::extendSandboxForFileURL>(trick(name), ProviderID{kTrickster}, ConsumerID{kPicker})),
              std::nullopt);
    EXPECT_EQ(errorOf(caller->ask<&DVDaemon::documentURLFromBookmarkableString>("docuvend:" + kTrickster + "/" + name)),
              DVNotPermittedError())
        << name;
  }
  EXPECT_EQ(house_.logged("[ERROR] Failed to extend sandbox of URL file:///etc/passwd from provider ID com.orvane.trickster to consumer ID "
                          "com.orvane.picker. Error: " +
                          DVNotPermittedError().description()),
            1);
}

TEST_F(Refusals, AStringThatItsProviderCannotResolveFailsWithoutTheProvidersOwnError) {
  house_.killDaemon();
  writeFile(house_.accessControlFile(),
            propertyList("<key>com.orvane.trickster</key><dict><key>com.orvane.picker</key><dict><key>AllowedItemIDs</key><array>"
                         "<string>refused</string></array></dict></dict>"));
  house_.startDaemon();
  EXPECT_EQ(errorOf(house_.client(kPicker)->ask<&DVDaemon::documentURLFromBookmarkableString>("docuvend:com.orvane.trickster/refused")),
            DVSandboxExtensionFailedError(std::nullopt));
}

TEST_F(Refusals, AStringOfAProviderThatIsNotRegisteredIsNeverAnsweredAndTheCallersDeadlineEndsIt) {
  house_.killDaemon();
  writeFile(house_.accessControlFile(),
            propertyList("<key>com.example.gone</key><dict><key>com.orvane.editor</key><dict><key>AllowedItemIDs</key><array>"
                         "<string>i</string></array></dict></dict>"));
  house_.startDaemon();
  const Ending given = house_.ctl({"--as", kEditor, "--timeout", "1", "resolve", "docuvend:com.example.gone/i"});
  EXPECT_EQ(given.status, kDeadlinePassed) << given.errors;
  EXPECT_EQ(house_.logged("[DEBUG] Getting URL from bookmarkable string: “docuvend:com.example.gone/i”."), 1);
  EXPECT_TRUE(house_.answers());
}

}  // namespace
}  // namespace docuvend::tests
