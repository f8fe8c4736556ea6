// Extensions that answer a begin request with less than a conversation takes.
#include "common/DVErrors.h"
#include "tests/providers/ProvidersTest.h"

namespace docuvend {
namespace {

// Answers a begin request with neither a request nor an error.
class SilentExtension : public FakeExtension {
 public:
  using FakeExtension::FakeExtension;

  void beginExtensionRequest(BeginCompletion completion) override { completion(/*request=*/std::nullopt, /*error=*/std::nullopt); }
};

class Disconnected : public QXExtensionContext {
 public:
  [[nodiscard]] std::shared_ptr<QXRpcConnection> auxiliaryConnection() override { return nullptr; }
};

// Has a context for every request, and no connection in it.
class DisconnectedExtension : public FakeExtension {
 public:
  using FakeExtension::FakeExtension;

  [[nodiscard]] std::shared_ptr<QXExtensionContext> extensionContextForRequest(const QXUUID& /*request*/) override {
    return std::make_shared<Disconnected>();
  }
};

class ProxiesTest : public ProvidersTest {
 protected:
  // The handler's one call: no proxy, the error that there is none, and what is logged.
  template <class Extension>
  void expectNoProxy() {
    platform.installProviderBundle(kCellar);
    const auto extension = std::make_shared<Extension>(kCellar);
    platform.adopt(*extension);
    const auto provider = DVExtensionDocuvend::initWithExtension(extension);
    int calls = 0;
    provider->performExtensionRequest([&](const std::optional<QXError>& error, const std::optional<DVExtensionDocuvend::VendorProxy>& proxy,
                                          const DVExtensionDocuvend::FinishHandler& finish) {
      ++calls;
      EXPECT_EQ(error, DVProxyNotFoundError(ProviderID{kCellar}));
      EXPECT_FALSE(proxy);
      finish();
    });
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(extension->cancelled(), extension->requests()) << "what was begun can be ended, and nothing else is";
    EXPECT_EQ(written(),
              (Lines{"debug: [DEBUG] Beginning extension request.", "fault: [ERROR] Could not get proxy object for a request."}));
  }
};

TEST_F(ProxiesTest, AnAnswerWithNeitherRequestNorErrorIsNoProxy) { expectNoProxy<SilentExtension>(); }

TEST_F(ProxiesTest, AContextWithoutConnectionIsNoProxy) { expectNoProxy<DisconnectedExtension>(); }

}  // namespace
}  // namespace docuvend
