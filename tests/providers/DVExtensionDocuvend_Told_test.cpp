// How long a writer's identifier is held: as long as the extension is being told, whatever comes of that.
#include <memory>

#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

class ToldTest : public ProvidersTest {
 protected:
  ToldTest() {
    cellar = installReady(kCellar);
    discover({cellar});
    provider = DVExtensionDocuvend::providerWithIdentifier(ProviderID{kCellar});
    EXPECT_TRUE(provider);
  }

  void tell(const QXURL& url) {
    auto held = std::make_shared<int>();
    watched = held;
    provider->_writerWithID({"writer-3", std::move(held)}, url);
  }
  // The wire lets go of a message that was answered or lost; the fake one does so when it is told.
  void letGo() { cellar->vendor().forget(); }
  [[nodiscard]] bool isHeld() const { return !watched.expired(); }

  std::shared_ptr<TracingExtension> cellar;
  std::shared_ptr<DVExtensionDocuvend> provider;
  const QXURL url = FakePlatform::itemURL(kCellar, "report.txt");
  std::weak_ptr<const int> watched;
};

TEST_F(ToldTest, TheWriterIsHeldUntilTheExtensionHasAnswered) {
  tell(url);
  EXPECT_TRUE(isHeld());
  cellar->vendor().answerLast({QXValue()});
  letGo();
  EXPECT_FALSE(isHeld());
}

TEST_F(ToldTest, TheWriterIsHeldUntilTheExtensionHasRefused) {
  tell(url);
  EXPECT_TRUE(isHeld());
  cellar->vendor().answerLast({QXValue(QXError::make("TestDomain", 7, "broken"))});
  letGo();
  EXPECT_FALSE(isHeld());
}

TEST_F(ToldTest, TheWriterIsHeldUntilTheMessageIsLost) {
  tell(url);
  EXPECT_TRUE(isHeld());
  cellar->vendor().failLastDelivery(QXError::make("TestDomain", 8, "lost"));
  letGo();
  EXPECT_FALSE(isHeld());
}

TEST_F(ToldTest, TheWriterIsHeldUntilTheRequestCannotBegin) {
  cellar->holdBegins();
  tell(url);
  EXPECT_TRUE(isHeld());
  cellar->failHeldBegin(QXError::make("TestDomain", 7, "broken"));
  EXPECT_FALSE(isHeld());
}

TEST_F(ToldTest, TheWriterIsHeldUntilThereIsNoContext) {
  cellar->setHasContexts(false);
  tell(url);
  EXPECT_FALSE(isHeld());
}

TEST_F(ToldTest, TheWriterOfNobodysFileIsNotHeld) {
  tell(QXURL::fileURL("/nowhere/a", QXURLKind::file));
  EXPECT_FALSE(isHeld());
  tell(FakePlatform::storageURL(kCellar));
  EXPECT_FALSE(isHeld());
}

}  // namespace
}  // namespace docuvend
