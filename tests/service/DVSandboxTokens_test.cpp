#include "service/DVSandboxTokens.h"

#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

using fake_platform::FakePlatform;

class DVSandboxTokensTest : public ServicerFixture {
 protected:
  using Issued = std::variant<DVSandboxTokens, QXError>;

  void SetUp() override { registerProviders(); }

  // The file system says that the cellar's directory contains it, whatever its path looks like.
  QXURL ownedByCellar(const std::string& text) {
    const auto url = QXURL::fromString(text);
    platform_.fileSystem.setRelationship(FakePlatform::storageURL(kCellar.value), *url, QXRelationship::contains);
    return *url;
  }
  static std::shared_ptr<DVExtensionDocuvend> provider(const ProviderID& identifier) {
    return DVExtensionDocuvend::providerWithIdentifier(identifier);
  }
  void expectNotPermitted(const Issued& issued) {
    ASSERT_TRUE(std::holds_alternative<QXError>(issued));
    EXPECT_EQ(std::get<QXError>(issued), DVNotPermittedError());
    EXPECT_TRUE(platform_.sandbox.issueCalls().empty());
  }
};

TEST_F(DVSandboxTokensTest, NoTokensForAnAbsentURL) { expectNotPermitted(dvIssueTokens(*provider(kCellar), std::nullopt)); }

TEST_F(DVSandboxTokensTest, NoTokensForAURLOfAnotherProviderOrOfNobody) {
  for (const QXURL& url : {kReport, kElsewhere}) expectNotPermitted(dvIssueTokens(*provider(kAttic), url));
}

TEST_F(DVSandboxTokensTest, ProvidersAreComparedByIdentifierNotByObject) {
  // As when the extension is updated while a request is under way: the same identifier, another object.
  const auto twin = DVExtensionDocuvend::initWithExtension(cellar_);
  ASSERT_NE(provider(kCellar), twin);
  EXPECT_TRUE(std::holds_alternative<DVSandboxTokens>(dvIssueTokens(*twin, kReport)));
}

TEST_F(DVSandboxTokensTest, ProvidersWithoutIdentifierAreNotTakenForEachOther) {
  const auto nameless = loseIdentifier(kCellar);
  expectNotPermitted(dvIssueTokens(*DVExtensionDocuvend::initWithExtension(nameless), kReport));
}

TEST_F(DVSandboxTokensTest, TheItemsTokenIsForItsPathAndTheSiblingsForTheHiddenOne) {
  const auto issued = dvIssueTokens(*provider(kCellar), kReport);
  const auto& tokens = std::get<DVSandboxTokens>(issued);
  EXPECT_EQ(tokens.item, QXData::fromText("token:" + kReportPath));
  EXPECT_EQ(tokens.siblingURL, kSibling);
  EXPECT_EQ(tokens.sibling, QXData::fromText("token:" + kSiblingPath));
}

// A dot before a way up or before an escaped slash makes the name of a file that nobody has asked for.
TEST_F(DVSandboxTokensTest, ASiblingThatIsNotTheItemsHiddenNameGetsNoToken) {
  for (const char* last : {"%2E", "%2E%2E", "a%2Fb"}) {
    const QXURL url = ownedByCellar(FakePlatform::storageURL(kCellar.value).absoluteString() + last);
    const auto issued = dvIssueTokens(*provider(kCellar), url);
    const auto& tokens = std::get<DVSandboxTokens>(issued);
    EXPECT_EQ(tokens.item, QXData::fromText("token:" + url.fileSystemPath())) << last;
    EXPECT_TRUE(tokens.siblingURL) << last;
    EXPECT_EQ(tokens.sibling, std::nullopt) << last;
  }
}

TEST_F(DVSandboxTokensTest, WhatHasNoHiddenSiblingGetsTheItemsTokenAlone) {
  const auto issued = dvIssueTokens(*provider(kCellar), ownedByCellar("file:///"));
  const auto& tokens = std::get<DVSandboxTokens>(issued);
  EXPECT_EQ(tokens.item, QXData::fromText("token:/"));
  EXPECT_EQ(tokens.siblingURL, std::nullopt);
  EXPECT_EQ(tokens.sibling, std::nullopt);
}

}  // namespace
}  // namespace docuvend
