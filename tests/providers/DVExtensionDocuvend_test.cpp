#include "providers/DVExtensionDocuvend.h"

#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

class DVExtensionDocuvendTest : public ProvidersTest {
 protected:
  // A provider of an extension whose bundle is what the test made it.
  std::shared_ptr<DVExtensionDocuvend> make(std::optional<std::string> identifier = kCellar) {
    extension = std::make_shared<TracingExtension>(platform, std::move(identifier), 1);
    return DVExtensionDocuvend::initWithExtension(extension);
  }

  std::shared_ptr<TracingExtension> extension;
  const std::string memberQueueLabel = "DVExtensionDocuvend concurrent member queue for " + kCellar;
  const std::vector<FakeCreatedQueue> memberQueueAlone = {{FakeQueueKind::concurrent, memberQueueLabel}};
};

TEST_F(DVExtensionDocuvendTest, QueuesAreNamedAfterTheExtension) {
  platform.installProviderBundle(kCellar);
  const auto provider = make();
  EXPECT_EQ(platform.queues.createdQueues(), memberQueueAlone);
  EXPECT_EQ(provider->_providedItemsOperationQueue()->name(), "Operation queue for com.orvane.cellar");
}

TEST_F(DVExtensionDocuvendTest, QueuesOfAnExtensionWithoutIdentifierSayThatItIsAbsent) {
  const auto provider = make(std::nullopt);
  EXPECT_EQ(platform.queues.createdQueues(),
            (std::vector{FakeCreatedQueue{FakeQueueKind::concurrent, "DVExtensionDocuvend concurrent member queue for (null)"}}));
  EXPECT_EQ(provider->_providedItemsOperationQueue()->name(), "Operation queue for (null)");
}

TEST_F(DVExtensionDocuvendTest, TheOperationQueueIsTheSameAtEveryCall) {
  const auto provider = make();
  EXPECT_EQ(provider->_providedItemsOperationQueue(), provider->_providedItemsOperationQueue());
}

TEST_F(DVExtensionDocuvendTest, AnExtensionWithoutRecordKeepsItsIdentifierAndHasNoDirectory) {
  const auto provider = make();
  EXPECT_EQ(provider->identifier(), ProviderID{kCellar});
  EXPECT_EQ(provider->extension(), extension);
  EXPECT_EQ(provider->providedItemsURL(), std::nullopt);
  EXPECT_EQ(written(), Lines{"fault: [ERROR] Cannot instantiate a Bundlery proxy for <FakeExtension com.orvane.cellar 1>"});
}

TEST_F(DVExtensionDocuvendTest, AnExtensionWithoutIdentifierHasNoRecord) {
  const auto provider = make(std::nullopt);
  EXPECT_EQ(provider->identifier(), std::nullopt);
  EXPECT_EQ(provider->_fileReactorID(), std::nullopt);
  EXPECT_EQ(provider->providedItemsURL(), std::nullopt);
  EXPECT_EQ(written(), Lines{"fault: [ERROR] Cannot instantiate a Bundlery proxy for <FakeExtension (null) 1>"});
  EXPECT_EQ(platform.applicationRegistry.recordQueryCount(), 0);
}

const char* const kNoDictionary =
    "fault: [ERROR] Cannot read QXExtension dictionary from the Info.plist of <FakeExtension com.orvane.cellar 1>";
const char* const kNoKey =
    "fault: [ERROR] Cannot read QXExtensionDocuvendDocumentGroup key from the Info.plist of <FakeExtension com.orvane.cellar 1>";
const char* const kNoContainer = "fault: [ERROR] Cannot deduce the provided items URL for <FakeExtension com.orvane.cellar 1>";

TEST_F(DVExtensionDocuvendTest, AnInfoPlistWithoutExtensionDictionaryYieldsNoDirectory) {
  platform.applicationRegistry.setRecord(kCellar, {}, {});
  EXPECT_EQ(make()->providedItemsURL(), std::nullopt);
  EXPECT_EQ(written(), Lines{kNoDictionary});
}

TEST_F(DVExtensionDocuvendTest, AStringInPlaceOfTheExtensionDictionaryIsNoDictionary) {
  platform.applicationRegistry.setRecord(kCellar, {{"QXExtension", "group.one"}}, {{"group.one", directory("/c/one")}});
  EXPECT_EQ(make()->providedItemsURL(), std::nullopt);
  EXPECT_EQ(written(), Lines{kNoDictionary});
}

TEST_F(DVExtensionDocuvendTest, AnExtensionDictionaryWithoutDocumentGroupYieldsNoDirectory) {
  platform.applicationRegistry.setRecord(kCellar, {{"QXExtension", QXDictionary{}}}, {{"group.one", directory("/c/one")}});
  EXPECT_EQ(make()->providedItemsURL(), std::nullopt);
  EXPECT_EQ(written(), Lines{kNoKey});
}

TEST_F(DVExtensionDocuvendTest, ADocumentGroupThatIsNoStringYieldsNoDirectory) {
  platform.applicationRegistry.setRecord(kCellar, {{"QXExtension", QXDictionary{{"QXExtensionDocuvendDocumentGroup", 3}}}},
                                         {{"group.one", directory("/c/one")}});
  EXPECT_EQ(make()->providedItemsURL(), std::nullopt);
  EXPECT_EQ(written(), Lines{kNoKey});
}

TEST_F(DVExtensionDocuvendTest, ADocumentGroupWithoutContainerYieldsNoDirectory) {
  platform.applicationRegistry.setRecord(kCellar, {{"QXExtension", QXDictionary{{"QXExtensionDocuvendDocumentGroup", "group.two"}}}},
                                         {{"group.one", directory("/c/one")}});
  EXPECT_EQ(make()->providedItemsURL(), std::nullopt);
  EXPECT_EQ(written(), Lines{kNoContainer});
}

TEST_F(DVExtensionDocuvendTest, TheDirectoryIsDocuvendStorageInTheDocumentGroupsContainer) {
  platform.applicationRegistry.setRecord(kCellar, {{"QXExtension", QXDictionary{{"QXExtensionDocuvendDocumentGroup", "group.two"}}}},
                                         {{"group.one", directory("/c/one")}, {"group.two", directory("/c/two")}});
  const auto provider = make();
  EXPECT_EQ(provider->providedItemsURL(), QXURL::fromString("file:///c/two/Docuvend%20Storage/"));
  EXPECT_EQ(provider->_providedItemsURL(), provider->providedItemsURL());
  EXPECT_EQ(written(), Lines{});
}

TEST_F(DVExtensionDocuvendTest, TheDirectoryIsNeitherLookedAtNorCreated) {
  platform.installProviderBundle(kCellar);
  platform.fileSystem.forgetCalls();
  const auto provider = make();
  EXPECT_TRUE(provider->providedItemsURL());
  EXPECT_EQ(platform.fileSystem.calls(), Texts{});
}

TEST_F(DVExtensionDocuvendTest, AnIdentifierThatWasSetTakesTheExtensionsPlace) {
  const auto provider = make();
  provider->setIdentifier(ProviderID{kAttic});
  EXPECT_EQ(provider->identifier(), ProviderID{kAttic});
  EXPECT_EQ(provider->_fileReactorID(), kAttic);
}

TEST_F(DVExtensionDocuvendTest, WithoutAnIdentifierTheExtensionsOwnIsReadAfresh) {
  const auto provider = make();
  provider->setIdentifier(ProviderID{kAttic});
  provider->setIdentifier(std::nullopt);
  EXPECT_EQ(provider->identifier(), ProviderID{kCellar});
  EXPECT_EQ(provider->_fileReactorID(), kCellar);
  provider->setExtension(std::make_shared<FakeExtension>(kShed));
  EXPECT_EQ(provider->identifier(), ProviderID{kShed});
  EXPECT_EQ(provider->_fileReactorID(), kShed);
}

TEST_F(DVExtensionDocuvendTest, AnEmptyIdentifierIsReturnedAsItIs) {
  const auto provider = make();
  provider->setIdentifier(ProviderID{""});
  EXPECT_EQ(provider->identifier(), ProviderID{""});
  EXPECT_EQ(provider->_fileReactorID(), "");
}

TEST_F(DVExtensionDocuvendTest, ANewExtensionDoesNotChangeTheIdentifierThatWasStored) {
  const auto provider = make();
  const auto other = std::make_shared<FakeExtension>(kShed);
  provider->setExtension(other);
  EXPECT_EQ(provider->extension(), other);
  EXPECT_EQ(provider->identifier(), ProviderID{kCellar});
}

TEST_F(DVExtensionDocuvendTest, QueuesAreNotRenamedByANewIdentifier) {
  const auto provider = make();
  provider->setIdentifier(ProviderID{kAttic});
  EXPECT_EQ(provider->identifier(), ProviderID{kAttic});
  EXPECT_EQ(platform.queues.createdQueues(), memberQueueAlone);
  EXPECT_EQ(provider->_providedItemsOperationQueue()->name(), "Operation queue for com.orvane.cellar");
}

TEST_F(DVExtensionDocuvendTest, ASetterReturnsBeforeTheValueIsStoredAndTheNextReadSeesIt) {
  const auto provider = make();
  provider->setProvidedItemsURL(directory("/elsewhere"));
  EXPECT_EQ(platform.queues.pending(memberQueueLabel), 1U);
  EXPECT_EQ(provider->providedItemsURL(), directory("/elsewhere"));
  EXPECT_EQ(platform.queues.pending(memberQueueLabel), 0U);
  provider->setProvidedItemsURL(std::nullopt);
  EXPECT_EQ(platform.queues.pending(memberQueueLabel), 1U);
  EXPECT_EQ(provider->_providedItemsURL(), std::nullopt);
}

TEST_F(DVExtensionDocuvendTest, EachSetterSubmitsToTheMemberQueue) {
  const auto provider = make();
  provider->setIdentifier(ProviderID{kAttic});
  EXPECT_EQ(platform.queues.pending(memberQueueLabel), 1U);
  provider->setExtension(extension);
  EXPECT_EQ(platform.queues.pending(memberQueueLabel), 2U);
  provider->setProvidedItemsURL(std::nullopt);
  EXPECT_EQ(platform.queues.pending(memberQueueLabel), 3U);
}

TEST_F(DVExtensionDocuvendTest, TheFallBackIdentifierIsReadOnTheMemberQueue) {
  const auto provider = make();
  provider->setIdentifier(std::nullopt);
  Texts labels;
  extension->onIdentifier = [this, &labels] { labels.push_back(platform.queues.currentLabel()); };
  EXPECT_EQ(provider->identifier(), ProviderID{kCellar});
  EXPECT_EQ(labels, Texts{memberQueueLabel});
}

TEST_F(DVExtensionDocuvendTest, WritesWaitForTheReadThatIsRunning) {
  const auto provider = make();
  provider->setIdentifier(std::nullopt);
  int reads = 0;
  const auto tryToTurn = [this, &reads] {
    ++reads;
    EXPECT_FALSE(platform.queues.runOne(memberQueueLabel));
  };
  extension->onIdentifier = [&provider, &tryToTurn] {
    provider->setProvidedItemsURL(std::nullopt);
    tryToTurn();
  };
  EXPECT_EQ(provider->identifier(), ProviderID{kCellar});
  EXPECT_TRUE(platform.queues.runOne(memberQueueLabel));
  extension->onIdentifier = [&provider, &tryToTurn] {
    provider->setIdentifier(std::nullopt);
    tryToTurn();
  };
  EXPECT_EQ(provider->identifier(), ProviderID{kCellar});
  EXPECT_TRUE(platform.queues.runOne(memberQueueLabel));
  extension->onIdentifier = [this, &provider, &tryToTurn] {
    provider->setExtension(extension);
    tryToTurn();
  };
  EXPECT_EQ(provider->identifier(), ProviderID{kCellar});
  EXPECT_TRUE(platform.queues.runOne(memberQueueLabel));
  EXPECT_EQ(reads, 3);
  extension->onIdentifier = {};
}

// Tells what is left of a queue when it is destroyed.
class FarewellExtension : public FakeExtension {
 public:
  FarewellExtension(const std::string& identifier, std::optional<bool>& queueWasGone)
      : FakeExtension(identifier), queueWasGone_(queueWasGone) {}
  ~FarewellExtension() override { queueWasGone_ = queue.expired(); }

  std::weak_ptr<QXOperationQueue> queue;

 private:
  std::optional<bool>& queueWasGone_;
};

TEST_F(DVExtensionDocuvendTest, AProviderLetsGoOfItsExtensionBeforeItsOperationQueue) {
  std::optional<bool> queueWasGone;
  auto farewell = std::make_shared<FarewellExtension>(kCellar, queueWasGone);
  auto provider = DVExtensionDocuvend::initWithExtension(farewell);
  farewell->queue = provider->_providedItemsOperationQueue();
  farewell.reset();
  provider.reset();
  EXPECT_EQ(queueWasGone, false);
}

TEST_F(DVExtensionDocuvendTest, AProviderThatIsLetGoIsDestroyed) {
  std::weak_ptr<DVExtensionDocuvend> gone;
  {
    const auto provider = make();
    provider->setProvidedItemsURL(directory("/elsewhere"));
    gone = provider;
  }
  EXPECT_FALSE(gone.expired()) << "the write that waits still holds it";
  platform.queues.runAll();
  EXPECT_TRUE(gone.expired());
}

}  // namespace
}  // namespace docuvend
