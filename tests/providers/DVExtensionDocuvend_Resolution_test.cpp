#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

const char* const kIgnoring = "debug: [DEBUG] Ignoring URLs that exactly match the document container folder";
const char* const kResolvedCellar = "info: [INFO] Resolved URL to provider com.orvane.cellar.";
const char* const kCellarHasNone =
    "debug: [DEBUG] Docuvend com.orvane.cellar doesn't have a provided items directory; it may not have run so far.";

class ResolutionTest : public ProvidersTest {
 protected:
  // Discovers them and forgets what was said and asked so far.
  void have(Extensions extensions) {
    discover(std::move(extensions));
    written();
    platform.fileSystem.forgetCalls();
  }
  // The identifier of the owner, or "none"; with the excluded flag, which starts as its opposite would.
  std::string resolve(const QXURL& url) {
    bool whenTrue = true;
    bool whenFalse = false;
    const auto first = DVExtensionDocuvend::providerForURL(url, &whenTrue);
    EXPECT_EQ(DVExtensionDocuvend::providerForURL(url, &whenFalse), first);
    EXPECT_EQ(whenTrue, whenFalse) << "the flag is always written";
    return (first ? first->identifier()->value : std::string("none")) + (whenTrue ? " excluded" : "");
  }
  // As above, once, with what was logged.
  std::string resolveOnce(const QXURL& url) {
    bool excluded = false;
    const auto found = DVExtensionDocuvend::providerForURL(url, &excluded);
    return (found ? found->identifier()->value : std::string("none")) + (excluded ? " excluded" : "");
  }
};

TEST_F(ResolutionTest, AFileBelowAProvidersDirectoryBelongsToIt) {
  have({installReady(kCellar)});
  EXPECT_EQ(resolveOnce(FakePlatform::itemURL(kCellar, "report.txt")), kCellar);
  EXPECT_EQ(written(), Lines{kResolvedCellar});
  EXPECT_EQ(resolve(QXURL::fileURL(FakePlatform::storagePath(kCellar) + "/deep/down/a", QXURLKind::file)), kCellar);
}

TEST_F(ResolutionTest, TheDirectoryItselfIsExcludedAndBelongsToNobody) {
  have({installReady(kCellar)});
  EXPECT_EQ(resolveOnce(FakePlatform::storageURL(kCellar)), "none excluded");
  EXPECT_EQ(written(), Lines{kIgnoring});
  EXPECT_EQ(resolve(FakePlatform::storageURL(kCellar)), "none excluded");
}

TEST_F(ResolutionTest, AURLOutsideOfEveryDirectoryBelongsToNobodyWithoutAMessage) {
  have({installReady(kCellar), installReady(kAttic)});
  EXPECT_EQ(resolveOnce(file("/elsewhere/a")), "none");
  EXPECT_EQ(written(), Lines{});
  EXPECT_EQ(platform.fileSystem.calls().size(), 2U) << "each provider is asked once";
  EXPECT_EQ(resolve(file("/elsewhere/a")), "none");
}

TEST_F(ResolutionTest, AnEmptyRegistryOwnsNothingAndSaysNothing) {
  bool excluded = true;
  EXPECT_EQ(DVExtensionDocuvend::providerForURL(file("/a"), &excluded), nullptr);
  EXPECT_FALSE(excluded);
  EXPECT_EQ(written(), Lines{});
}

TEST_F(ResolutionTest, WithoutAFlagOnlyTheProviderIsReturned) {
  have({installReady(kCellar)});
  EXPECT_NE(DVExtensionDocuvend::providerForURL(FakePlatform::itemURL(kCellar, "a")), nullptr);
  EXPECT_EQ(written(), Lines{kResolvedCellar});
  EXPECT_EQ(DVExtensionDocuvend::providerForURL(FakePlatform::storageURL(kCellar)), nullptr);
  EXPECT_EQ(written(), Lines{kIgnoring});
}

TEST_F(ResolutionTest, EachProviderOwnsItsOwnItems) {
  have({installReady(kCellar), installReady(kAttic), installReady(kShed)});
  EXPECT_EQ(resolve(FakePlatform::itemURL(kCellar, "a")), kCellar);
  EXPECT_EQ(resolve(FakePlatform::itemURL(kAttic, "a")), kAttic);
  EXPECT_EQ(resolve(FakePlatform::itemURL(kShed, "a")), kShed);
}

TEST_F(ResolutionTest, TheFileSystemDecidesAndNotTheTextOfTheURL) {
  have({installReady(kCellar)});
  const QXURL outside = file("/a/link/to/the/cellar");
  const QXURL inside = FakePlatform::itemURL(kCellar, "a");
  platform.fileSystem.setRelationship(FakePlatform::storageURL(kCellar), outside, QXRelationship::contains);
  platform.fileSystem.setRelationship(FakePlatform::storageURL(kCellar), inside, QXRelationship::other);
  EXPECT_EQ(resolve(outside), kCellar);
  EXPECT_EQ(resolve(inside), "none");
}

TEST_F(ResolutionTest, ADirectoryThatIsNotThereYetIsSkippedWithADebugLine) {
  have({installReady(kCellar), installReady(kAttic)});
  platform.fileSystem.remove(FakePlatform::storagePath(kCellar));
  EXPECT_EQ(resolveOnce(FakePlatform::itemURL(kCellar, "a")), "none");
  EXPECT_EQ(written(), Lines{kCellarHasNone});
}

// Whatever the order of the search: a provider in front of it and one behind it.
TEST_F(ResolutionTest, TheSearchGoesOnAfterAProviderThatWasSkipped) {
  have({installReady("com.orvane.a"), installReady("com.orvane.b"), installReady("com.orvane.c")});
  platform.fileSystem.remove(FakePlatform::storagePath("com.orvane.b"));
  EXPECT_EQ(resolve(FakePlatform::itemURL("com.orvane.a", "x")), "com.orvane.a");
  EXPECT_EQ(resolve(FakePlatform::itemURL("com.orvane.c", "x")), "com.orvane.c");
  platform.fileSystem.setRelationshipError(FakePlatform::storageURL("com.orvane.b"), broken);
  EXPECT_EQ(resolve(FakePlatform::itemURL("com.orvane.a", "x")), "com.orvane.a");
  EXPECT_EQ(resolve(FakePlatform::itemURL("com.orvane.c", "x")), "com.orvane.c");
  DVExtensionDocuvend::providerWithIdentifier(ProviderID{"com.orvane.b"})->setProvidedItemsURL(std::nullopt);
  EXPECT_EQ(resolve(FakePlatform::itemURL("com.orvane.a", "x")), "com.orvane.a");
  EXPECT_EQ(resolve(FakePlatform::itemURL("com.orvane.c", "x")), "com.orvane.c");
}

TEST_F(ResolutionTest, AProviderForWhichNoDirectoryCouldBeDerivedIsSkippedWithTheSameDebugLine) {
  have({std::make_shared<TracingExtension>(platform, kCellar, 1)});
  EXPECT_EQ(resolveOnce(FakePlatform::itemURL(kCellar, "a")), "none");
  EXPECT_EQ(written(), Lines{kCellarHasNone});
  EXPECT_EQ(platform.fileSystem.calls(), Texts{}) << "there is nothing to ask about";
}

TEST_F(ResolutionTest, AnyOtherFailureOfTheQueryIsLoggedAndTheProviderSkipped) {
  have({installReady(kCellar)});
  const std::string storage = FakePlatform::storageURL(kCellar).absoluteString();
  platform.fileSystem.setRelationshipError(FakePlatform::storageURL(kCellar), broken);
  EXPECT_EQ(resolveOnce(FakePlatform::itemURL(kCellar, "a")), "none");
  EXPECT_EQ(written(), Lines{"fault: [ERROR] Cannot get the relationship between URL " + storage + " and " + storage +
                             "a. Error: TestDomain 7: broken"});
}

TEST_F(ResolutionTest, OnlyTheMissingDirectoryItselfCountsAsNotThereYet) {
  have({installReady(kCellar)});
  const QXURL storage = FakePlatform::storageURL(kCellar);
  const QXURL item = FakePlatform::itemURL(kCellar, "a");
  const QXError missing = fake_platform::FakeFileSystem::noSuchDirectory(storage);

  QXError otherDomain = missing;
  otherDomain.domain = kQXSystemErrorDomain;
  QXError otherCode = missing;
  otherCode.code = 257;
  QXError otherURL = missing;
  otherURL.url = item;
  QXError noURL = missing;
  noURL.url = std::nullopt;
  for (const QXError& error : {otherDomain, otherCode, otherURL, noURL}) {
    platform.fileSystem.setRelationshipError(storage, error);
    EXPECT_EQ(resolveOnce(item), "none");
    EXPECT_EQ(written(), Lines{"fault: [ERROR] Cannot get the relationship between URL " + storage.absoluteString() + " and " +
                               item.absoluteString() + ". Error: " + error.description()});
  }
  platform.fileSystem.setRelationshipError(storage, missing);
  EXPECT_EQ(resolveOnce(item), "none");
  EXPECT_EQ(written(), Lines{kCellarHasNone});
}

TEST_F(ResolutionTest, WhenEveryProviderFailsNobodyOwnsTheURLAndItIsNotExcluded) {
  have({installReady(kCellar), installReady(kAttic)});
  platform.fileSystem.setRelationshipError(FakePlatform::storageURL(kCellar), broken);
  platform.fileSystem.setRelationshipError(FakePlatform::storageURL(kAttic), broken);
  EXPECT_EQ(resolve(FakePlatform::itemURL(kCellar, "a")), "none");
}

TEST_F(ResolutionTest, TheFirstAnswerDecidesAndNobodyIsAskedAfterIt) {
  have({installReady(kCellar), installReady(kAttic), installReady(kShed)});
  const QXURL url = file("/elsewhere/a");
  for (const std::string& identifier : {kCellar, kAttic, kShed}) {
    platform.fileSystem.setRelationship(FakePlatform::storageURL(identifier), url, QXRelationship::contains);
  }
  EXPECT_NE(resolveOnce(url), "none");
  EXPECT_EQ(platform.fileSystem.calls().size(), 1U);
  platform.fileSystem.forgetCalls();
  for (const std::string& identifier : {kCellar, kAttic, kShed}) {
    platform.fileSystem.setRelationship(FakePlatform::storageURL(identifier), url, QXRelationship::same);
  }
  EXPECT_EQ(resolveOnce(url), "none excluded");
  EXPECT_EQ(platform.fileSystem.calls().size(), 1U);
}

TEST_F(ResolutionTest, OfNestedDirectoriesTheFirstInTheSearchDecides) {
  have({installReady(kCellar), installReady(kAttic)});
  const QXURL url = FakePlatform::storageURL(kCellar);
  platform.fileSystem.setRelationship(FakePlatform::storageURL(kAttic), url, QXRelationship::contains);
  const std::string answer = resolve(url);
  EXPECT_TRUE(answer == "none excluded" || answer == kAttic) << answer;
}

TEST_F(ResolutionTest, EverySearchLooksAfresh) {
  platform.applicationRegistry.setProviderRecord(kCellar, "group." + kCellar, FakePlatform::containerPath(kCellar));
  const auto cellar = std::make_shared<TracingExtension>(platform, kCellar, 1);
  FakePlatform::succeedSetup(*cellar);
  have({cellar});
  const QXURL url = FakePlatform::itemURL(kCellar, "a");
  EXPECT_EQ(resolve(url), "none");
  platform.fileSystem.addDirectory(FakePlatform::storagePath(kCellar));
  EXPECT_EQ(resolve(url), kCellar);
}

TEST_F(ResolutionTest, TheURLMayNameNothingThatExists) {
  have({installReady(kCellar)});
  EXPECT_EQ(resolve(FakePlatform::itemURL(kCellar, "not yet written")), kCellar);
}

TEST_F(ResolutionTest, TheSearchRunsAsAReadOfTheRegistrysQueue) {
  const auto cellar = installReady(kCellar);
  have({cellar});
  // So that the message about the owner, inside the search, asks the extension.
  DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar})->setIdentifier(std::nullopt);
  int asked = 0;
  cellar->onIdentifier = [this, &asked] {
    if (asked++ > 0) return;
    platform.extensionHost.setExtensions({});
    EXPECT_TRUE(platform.queues.runOne("DVExtensionDocuvend refresh operations queue"));
    EXPECT_FALSE(platform.queues.runOne("DVExtensionDocuvend concurrent queue")) << "a rebuild waits for the search";
  };
  bool excluded = true;
  EXPECT_NE(DVExtensionDocuvend::providerForURL(FakePlatform::itemURL(kCellar, "a"), &excluded), nullptr);
  EXPECT_EQ(asked, 1);
  cellar->onIdentifier = {};
  EXPECT_EQ(DVExtensionDocuvend::providerForURL(FakePlatform::itemURL(kCellar, "a"), &excluded), nullptr)
      << "a search asked for after the rebuild was submitted waits for it";
}

}  // namespace
}  // namespace docuvend
