// Placeholders, the start and the end of providing, as real clients ask for them and real providers answer.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <future>
#include <ostream>
#include <string>

#include "common/DVErrors.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::StartsWith;

using Error = std::optional<QXError>;

const ProviderID kCellarID{kCellar};
const ProviderID kTricksterID{kTrickster};
const ConsumerID kEditorID{kEditor};

inline constexpr const char* kReader = "com.example.reader";
inline constexpr const char* kWriter = "com.example.writer";
inline constexpr const char* kNobody = "com.example.nobody";

template <auto Operation>
Error askClient(Client& client, const std::optional<QXURL>& url, const std::optional<ProviderID>& provider,
                const std::optional<ConsumerID>& consumer) {
  return errorOf(client.ask<Operation>(url, provider, consumer));
}

struct Operation {
  const char* verb;
  const char* name;
  Error (*ask)(Client& client, const std::optional<QXURL>& url, const std::optional<ProviderID>& provider,
               const std::optional<ConsumerID>& consumer);
  Error success;
  const char* refusal;                       // what is logged of a request that never reaches its provider
  QXError (*refused)(const QXError& error);  // what the client is told of its error
  // What is logged of a provider that leaves in the middle and of one that answers with an error.
  const char* left;
  const char* failed;
  bool needsGrant;
  // What the client is told of the provider's failure.
  QXError (*failure)(const QXError& error);

  friend void PrintTo(const Operation& operation, std::ostream* out) { *out << operation.verb; }
};

const Operation kPlaceholder{
    "placeholder",
    "providePlaceholderForItemAtURL:fromProviderID:forConsumerID:completionHandler:",
    &askClient<&DVDaemon::providePlaceholderForItemAtURL>,
    /*success=*/std::nullopt,
    "[ERROR] Could not provide placeholder for URL ",
    [](const QXError& error) { return error; },
    "[ERROR] Cannot provide placeholder for item at URL ",
    "[ERROR] Proxy failed to provide placeholder at URL ",
    /*needsGrant=*/true,
    [](const QXError& error) { return DVPluginOperationFailedError(error); },
};
const Operation kStart{
    "start",
    "startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:",
    &askClient<&DVDaemon::startProvidingItemAtURL>,
    /*success=*/std::nullopt,
    "[ERROR] Cannot provide item at URL ",
    [](const QXError& error) { return DVNotFoundError(error); },
    "[ERROR] Cannot provide item at URL ",
    "[ERROR] Proxy failed to start providing item at URL ",
    /*needsGrant=*/true,
    [](const QXError& error) { return DVPluginOperationFailedError(error); },
};
const Operation kStop{
    "stop",
    "stopProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:",
    &askClient<&DVDaemon::stopProvidingItemAtURL>,
    /*success=*/DVPluginOperationFailedError(std::nullopt),
    "[ERROR] Could not stop providing item at URL ",
    [](const QXError& error) { return DVNotFoundError(error); },
    "[ERROR] Cannot stop providing item at URL ",
    "[ERROR] Proxy failed to stop providing item at URL ",
    /*needsGrant=*/false,
    [](const QXError& error) { return DVPluginOperationFailedError(DVPluginOperationFailedError(error)); },
};

class Items : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kEditor, kPicker}) house_.install(bundle);
    house_.installTrickster();
    installAsker(kReader, trueEntry("com.orvane.docuvend.acl-read"));
    installAsker(kWriter, trueEntry("com.orvane.docuvend.acl-write"));
    installAsker(kNobody, {});
    letter_ = url(house_.putInCloud("letter.txt", kText));
    house_.startDaemon();
    caller_ = house_.client(kPicker);
  }

  void installAsker(const std::string& identifier, const std::string& entitlements) const {
    house_.install(identifier, "docuvend-asker", stringEntry("QXBundleIdentifier", identifier), entitlements);
  }
  static QXURL url(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }
  QXURL trick(const std::string& name) const { return url(house_.storage(kTrickster) + "/" + name); }

  // A process acts for one bundle at a time: the client is there when the daemon has seen the others go.
  std::unique_ptr<Client> soleClient(const std::optional<std::string>& bundle) {
    caller_.reset();
    std::unique_ptr<Client> client;
    eventually("the client is served", [this, &bundle, &client] {
      client = house_.client(bundle);
      return client->ask<&DVDaemon::wakeUpCompletion>().index() == 0;
    });
    return client;
  }

  void grant(const QXURL& item, const ProviderID& provider, const ConsumerID& consumer) {
    ASSERT_EQ(errorOf(caller_->ask<&DVDaemon::extendSandboxForFileURL>(item, provider, consumer)), std::nullopt);
  }
  // What an asker, confined, is told, without the end of the line.
  std::string confined(const std::string& bundle, const Operation& operation, const QXURL& item, const ProviderID& provider,
                       const std::string& consumer) const {
    Ending ended = house_.confined(bundle, {operation.verb, item.absoluteString(), provider.value, consumer});
    EXPECT_EQ(ended.status, 0) << ended.errors;
    if (!ended.output.empty()) ended.output.pop_back();
    return ended.output;
  }
  static long blocksOf(const QXURL& item) {
    struct stat status {};
    return ::stat(item.fileSystemPath().c_str(), &status) == 0 ? status.st_blocks : -1;
  }

  static inline const std::string kText = std::string(60'000, 'x') + "\nDear all\n";
  QXURL letter_ = QXURL::fileURL("/", QXURLKind::directory);
  std::unique_ptr<Client> caller_;
};

class EachItemOperation : public Items, public ::testing::WithParamInterface<Operation> {
 protected:
  Error ask(const std::optional<QXURL>& url, const std::optional<ProviderID>& provider, const std::optional<ConsumerID>& consumer) {
    return GetParam().ask(*caller_, url, provider, consumer);
  }
  [[nodiscard]] std::string refusalLine(const std::string& request, const QXError& error) const {
    return GetParam().refusal + request + ". Error: " + error.description();
  }
};

INSTANTIATE_TEST_SUITE_P(Each, EachItemOperation, ::testing::Values(kPlaceholder, kStart, kStop),
                         [](const auto& row) { return std::string(row.param.verb); });

// --- Who may ask

TEST_P(EachItemOperation, ConfinedReadersAndWritersMayAskAndNobodyElse) {
  for (const char* bundle : {kReader, kWriter, kNobody}) grant(letter_, kCellarID, ConsumerID{bundle});
  EXPECT_EQ(confined(kReader, GetParam(), letter_, kCellarID, kReader), "ok");
  EXPECT_EQ(confined(kWriter, GetParam(), letter_, kCellarID, kWriter), "ok");
  EXPECT_EQ(house_.loggedContaining(" because it does not have any of these entitlements: "), 0);
  EXPECT_EQ(confined(kNobody, GetParam(), letter_, kCellarID, kNobody), "DVErrorDomain 1");
  EXPECT_EQ(house_.loggedContaining(" because it does not have any of these entitlements: (\"com.orvane.docuvend.acl-read\", "
                                    "\"com.orvane.docuvend.acl-write\")"),
            1);
  EXPECT_EQ(house_.logged(std::string("[DEBUG] Serving: ").append(GetParam().name)), 3);
}

TEST_P(EachItemOperation, DeclaredReadersAndWritersMayAskAndNobodyElse) {
  for (const char* bundle : {kReader, kWriter, kNobody}) grant(letter_, kCellarID, ConsumerID{bundle});
  const auto answer = [this](const std::optional<std::string>& bundle) {
    return GetParam().ask(*soleClient(bundle), letter_, kCellarID, ConsumerID{bundle.value_or(kNobody)});
  };
  EXPECT_EQ(answer(kReader), GetParam().success);
  EXPECT_EQ(answer(kWriter), GetParam().success);
  EXPECT_EQ(answer(kNobody), DVClientLacksEntitlement());
  EXPECT_EQ(answer(std::nullopt), DVClientLacksEntitlement());
}

TEST_P(EachItemOperation, TheConsumerIsTheOneThatIsNamedWhoeverAsks) {
  grant(letter_, kCellarID, kEditorID);
  EXPECT_EQ(confined(kReader, GetParam(), letter_, kCellarID, kEditor), "ok");
}

TEST_P(EachItemOperation, WithoutAGrantOnlyStoppingReachesTheProvider) {
  const std::string answer = confined(kReader, GetParam(), letter_, kCellarID, kReader);
  EXPECT_EQ(answer, GetParam().needsGrant ? "DVErrorDomain 2" : "ok");
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Consumer ID com.example.reader is not allowed to access item ID “"),
            GetParam().needsGrant ? 1 : 0);
  EXPECT_EQ(house_.loggedBeginning("[DEBUG] Successfully stopped providing item at URL " + letter_.absoluteString() + " for extension "),
            GetParam().needsGrant ? 0 : 1);
  EXPECT_EQ(house_.accessControl(), "");
}

// --- Arguments and providers

TEST_P(EachItemOperation, TheFirstMissingArgumentIsNamed) {
  const auto missing = [](const char* name) { return DVInvalidParameterError(name, std::nullopt); };
  EXPECT_EQ(ask(std::nullopt, std::nullopt, std::nullopt), GetParam().refused(missing("URL")));
  EXPECT_EQ(ask(letter_, std::nullopt, std::nullopt), GetParam().refused(missing("providerID")));
  EXPECT_EQ(ask(letter_, kCellarID, std::nullopt), GetParam().refused(missing("consumerID")));
  EXPECT_EQ(house_.logged(refusalLine("(null) from provider ID (null) to consumer ID (null)", missing("URL"))), 1);
  EXPECT_EQ(house_.logged(
                refusalLine(letter_.absoluteString() + " from provider ID com.orvane.cellar to consumer ID (null)", missing("consumerID"))),
            1);
}

TEST_P(EachItemOperation, AProviderAndAURLOfNobodyAreNotFound) {
  const ProviderID none{"com.example.none"};
  const QXError error = DVNotFoundError(none);
  EXPECT_EQ(ask(url("/etc/passwd"), none, kEditorID), GetParam().refused(error));
  EXPECT_EQ(house_.logged(refusalLine("file:///etc/passwd from provider ID com.example.none to consumer ID com.orvane.editor", error)), 1);
}

TEST_F(Items, APlaceholderForAForeignURLGoesOnToTheNamedProvider) {
  const QXURL foreign = url("/etc/passwd");
  EXPECT_EQ(kPlaceholder.ask(*caller_, foreign, kTricksterID, kEditorID), DVNotPermittedError());
  EXPECT_EQ(house_.logged("[DEBUG] Successfully got item ID “passwd” for URL file:///etc/passwd from extension com.orvane.trickster"), 1);
  const Error refused = kPlaceholder.ask(*caller_, foreign, kCellarID, kEditorID);
  ASSERT_TRUE(refused && refused->underlying && refused->underlying->underlying);
  EXPECT_EQ(refused->underlying->underlying->domain, "CellarErrorDomain") << "it is the provider's to refuse";
  grant(trick("passwd"), kTricksterID, kEditorID);
  EXPECT_EQ(kPlaceholder.ask(*caller_, foreign, kTricksterID, kEditorID), std::nullopt);
}

TEST_F(Items, APlaceholderForAnotherProvidersURLGoesToTheNamedProvider) {
  grant(trick("letter.txt"), kTricksterID, kEditorID);
  EXPECT_EQ(kPlaceholder.ask(*caller_, letter_, kTricksterID, kEditorID), std::nullopt);
  EXPECT_EQ(house_.logged("[DEBUG] Successfully provided placeholder at URL " + letter_.absoluteString() +
                          " for extension com.orvane.trickster."),
            1);
}

TEST_F(Items, StartingAndStoppingRefuseAnotherProvidersURLAndOnlyStartSaysWhose) {
  const QXError named = DVInvalidParameterError("providerID", kTrickster);
  const QXError unnamed = DVInvalidParameterError("providerID", std::nullopt);
  EXPECT_EQ(kStart.ask(*caller_, letter_, kTricksterID, kEditorID), DVNotFoundError(named));
  EXPECT_EQ(kStop.ask(*caller_, letter_, kTricksterID, kEditorID), DVNotFoundError(unnamed));
  const std::string request = letter_.absoluteString() + " from provider ID com.orvane.trickster to consumer ID com.orvane.editor. Error: ";
  EXPECT_EQ(house_.logged(kStart.refusal + request + named.description()), 1);
  EXPECT_EQ(house_.logged(kStop.refusal + request + unnamed.description()), 1);
}

// --- Providers that fail

TEST_P(EachItemOperation, AProvidersErrorIsTold) {
  grant(trick("sour"), kTricksterID, kEditorID);
  const QXError no = QXError::make("TricksterErrorDomain", 1, "No.");
  EXPECT_EQ(ask(trick("sour"), kTricksterID, kEditorID), GetParam().failure(no));
  EXPECT_EQ(
      house_.logged(GetParam().failed + trick("sour").absoluteString() + " for extension com.orvane.trickster. Error: " + no.description()),
      1);
  EXPECT_EQ(house_.logged("[ERROR] Could not ask provider ID com.orvane.trickster to stop providing item at URL " +
                          trick("sour").absoluteString() + ". Error: " + DVPluginOperationFailedError(no).description()),
            GetParam().needsGrant ? 0 : 1);
}

TEST_P(EachItemOperation, AProviderThatCannotNameTheItemIsAskedNothingMore) {
  const QXError no = QXError::make("TricksterErrorDomain", 1, "No.");
  const Error expected = GetParam().needsGrant ? DVPluginOperationFailedError(DVPluginOperationFailedError(no)) : GetParam().success;
  EXPECT_EQ(ask(trick("refused"), kTricksterID, kEditorID), expected);
}

TEST_P(EachItemOperation, AProviderThatAbortsIsAnErrorAndWorksAtTheNextTry) {
  grant(trick("bomb"), kTricksterID, kEditorID);
  grant(trick("other"), kTricksterID, kEditorID);
  const Error error = ask(trick("bomb"), kTricksterID, kEditorID);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, kDVErrorDomain);
  EXPECT_EQ(error->code, static_cast<std::int64_t>(DVErrorCode::pluginOperationFailed));
  EXPECT_TRUE(error->underlying) << "success of stopping has nothing beneath it";
  EXPECT_EQ(house_.loggedBeginning(GetParam().left + trick("bomb").absoluteString() + " for extension com.orvane.trickster. Error: "), 1);
  EXPECT_EQ(ask(trick("other"), kTricksterID, kEditorID), GetParam().success);
}

TEST_F(Items, AStartThatIsNeverAnsweredHoldsUpNeitherTheProvidersOtherItemsNorOtherProviders) {
  grant(trick("stuck"), kTricksterID, kEditorID);
  grant(trick("other"), kTricksterID, kEditorID);
  grant(letter_, kCellarID, kEditorID);
  const auto starter = house_.client(kPicker);
  auto stuck = std::async(std::launch::async, [&] { return kStart.ask(*starter, trick("stuck"), kTricksterID, kEditorID); });
  ASSERT_TRUE(house_.awaitLog("is stuck"));
  for (const Operation* operation : {&kPlaceholder, &kStart, &kStop}) {
    EXPECT_EQ(operation->ask(*caller_, trick("other"), kTricksterID, kEditorID), operation->success) << operation->verb;
    EXPECT_EQ(operation->ask(*caller_, letter_, kCellarID, kEditorID), operation->success) << operation->verb;
    // On the connection of the request that waits, too.
    EXPECT_EQ(operation->ask(*starter, trick("other"), kTricksterID, kEditorID), operation->success) << operation->verb;
  }
  EXPECT_EQ(stuck.wait_for(std::chrono::seconds(0)), std::future_status::timeout);
  writeFile(house_.container(kTrickster) + "/free", "");
  ASSERT_EQ(stuck.wait_for(kPatience), std::future_status::ready);
  EXPECT_EQ(stuck.get(), std::nullopt);
}

// --- What a provider does

TEST_F(Items, APlaceholderIsMadeThenFilledThenEmptied) {
  grant(letter_, kCellarID, kEditorID);
  std::filesystem::remove(letter_.fileSystemPath());
  ASSERT_EQ(kPlaceholder.ask(*caller_, letter_, kCellarID, kEditorID), std::nullopt);
  EXPECT_EQ(std::filesystem::file_size(letter_.fileSystemPath()), kText.size());
  EXPECT_EQ(blocksOf(letter_), 0);
  ASSERT_EQ(kStart.ask(*caller_, letter_, kCellarID, kEditorID), std::nullopt);
  EXPECT_EQ(contentsOf(letter_.fileSystemPath()), kText);
  ASSERT_EQ(kStop.ask(*caller_, letter_, kCellarID, kEditorID), DVPluginOperationFailedError(std::nullopt));
  EXPECT_EQ(std::filesystem::file_size(letter_.fileSystemPath()), kText.size());
  EXPECT_EQ(blocksOf(letter_), 0);
  ASSERT_EQ(kStart.ask(*caller_, letter_, kCellarID, kEditorID), std::nullopt);
  EXPECT_EQ(contentsOf(letter_.fileSystemPath()), kText);
}

// --- Contents are taken from nobody

// What stopping answers when the cellar keeps the contents: CellarErrorDomain and that code.
MATCHER_P(KeepsContents, code, "") {
  const auto* underlying = arg && arg->underlying ? arg->underlying->underlying.get() : nullptr;
  return underlying != nullptr && underlying->domain == "CellarErrorDomain" && underlying->code == code;
}
constexpr int kNotSaved = 3;
constexpr int kInUse = 4;

class ItemsInUse : public Items, public ::testing::WithParamInterface<const char*> {};

INSTANTIATE_TEST_SUITE_P(Each, ItemsInUse, ::testing::Values("read", "write", "map"),
                         [](const auto& row) { return std::string(row.param); });

TEST_P(ItemsInUse, StoppingLeavesTheContentsToWhoHasThem) {
  const std::string string = house_.granted(letter_.fileSystemPath(), kReader);
  ASSERT_EQ(kStart.ask(*caller_, letter_, kCellarID, ConsumerID{kReader}), std::nullopt);
  auto holder = std::async(std::launch::async, [&] { return house_.confined(kReader, {GetParam(), string, "hold", "it"}); });
  const std::string holding = house_.container(kReader) + "/it.holding";
  EXPECT_TRUE(eventually("the document is held", [&holding] { return std::filesystem::exists(holding); }));
  EXPECT_THAT(kStop.ask(*caller_, letter_, kCellarID, kEditorID), KeepsContents(kInUse));
  EXPECT_EQ(contentsOf(letter_.fileSystemPath()), kText);
  writeFile(house_.container(kReader) + "/it.go", "");
  const Ending ended = holder.get();
  EXPECT_EQ(ended.output, "ok\nok\n") << ended.errors;
  EXPECT_EQ(kStop.ask(*caller_, letter_, kCellarID, kEditorID), DVPluginOperationFailedError(std::nullopt));
  EXPECT_EQ(blocksOf(letter_), 0);
}

TEST_F(Items, StoppingKeepsWhatIsNotSent) {
  grant(letter_, kCellarID, kEditorID);
  ASSERT_EQ(kStart.ask(*caller_, letter_, kCellarID, kEditorID), std::nullopt);
  const std::string mine(kText.size(), 'y');
  writeFile(letter_.fileSystemPath(), mine);
  EXPECT_THAT(kStop.ask(*caller_, letter_, kCellarID, kEditorID), KeepsContents(kNotSaved));
  EXPECT_EQ(contentsOf(letter_.fileSystemPath()), mine);
}

}  // namespace
}  // namespace docuvend::tests
