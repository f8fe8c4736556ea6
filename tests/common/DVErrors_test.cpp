#include "common/DVErrors.h"

#include <gtest/gtest.h>

#include <map>
#include <optional>
#include <string>

namespace docuvend {
namespace {

using Texts = std::map<std::string, std::string>;

const QXURL kURL = QXURL::fileURL("/storage/item", QXURLKind::file);
const QXError kCause = QXError::make("CauseDomain", 17, "The cause.");

struct Row {
  const char* name;
  QXError error;
  std::int64_t code;
  Texts texts;  // but for the description
  std::optional<QXURL> url;
  std::optional<QXError> underlying;
};

TEST(DVErrors, EachConstructorMakesItsOneError) {
  const Row rows[] = {
      {"lacks entitlement", DVClientLacksEntitlement(), 1, {}, {}, {}},
      {"not permitted", DVNotPermittedError(), 2, {}, {}, {}},
      {"invalid bookmarkable string", DVInvalidBookmarkableStringError(), 3, {}, {}, {}},
      {"invalid parameter with a value",
       DVInvalidParameterError("url", "http://x"),
       4,
       {{"parameter", "url"}, {"value", "http://x"}},
       {},
       {}},
      {"invalid parameter with an empty value", DVInvalidParameterError("url", ""), 4, {{"parameter", "url"}, {"value", ""}}, {}, {}},
      {"invalid parameter without a value", DVInvalidParameterError("url", std::nullopt), 4, {{"parameter", "url"}}, {}, {}},
      {"not found", DVNotFoundError(ProviderID{"com.example"}), 5, {{"identifier", "com.example"}}, {}, {}},
      {"item not found", DVNotFoundError(ItemID{"item 7"}), 5, {{"identifier", "item 7"}}, {}, {}},
      {"not found because", DVNotFoundError(kCause), 5, {}, {}, kCause},
      {"not found URL", DVNotFoundErrorURL(kURL), 6, {}, kURL, {}},
      {"plug-in failed", DVPluginOperationFailedError(std::nullopt), 7, {}, {}, {}},
      {"plug-in failed because", DVPluginOperationFailedError(kCause), 7, {}, {}, kCause},
      {"proxy not found", DVProxyNotFoundError(ProviderID{"com.example"}), 8, {{"identifier", "com.example"}}, {}, {}},
      {"proxy of nobody not found", DVProxyNotFoundError(std::nullopt), 8, {}, {}, {}},
      {"sandbox extension failed", DVSandboxExtensionFailedError(kURL), 9, {}, kURL, {}},
      {"sandbox extension for nothing failed", DVSandboxExtensionFailedError(std::nullopt), 9, {}, {}, {}},
  };
  for (const Row& row : rows) {
    EXPECT_EQ(row.error.domain, "DVErrorDomain") << row.name;
    EXPECT_EQ(row.error.code, row.code) << row.name;
    EXPECT_EQ(row.error.url, row.url) << row.name;
    ASSERT_EQ(row.error.underlying != nullptr, row.underlying.has_value()) << row.name;
    if (row.underlying) {
      EXPECT_EQ(*row.error.underlying, *row.underlying) << row.name;
    }
    Texts texts = row.error.texts;
    texts.erase("description");
    EXPECT_EQ(texts, row.texts) << row.name;
  }
}

TEST(DVErrors, EachSaysWhatItIs) {
  const auto said = [](const QXError& error) { return error.texts.at("description"); };
  EXPECT_EQ(said(DVClientLacksEntitlement()), "The caller does not hold an entitlement that this operation needs.");
  EXPECT_EQ(said(DVNotPermittedError()), "The operation is not permitted.");
  EXPECT_EQ(said(DVInvalidBookmarkableStringError()), "The string is not a bookmarkable string.");
  EXPECT_EQ(said(DVInvalidParameterError("url", "http://x")), "The parameter url is invalid: http://x");
  EXPECT_EQ(said(DVInvalidParameterError("url", std::nullopt)), "The parameter url is invalid.");
  EXPECT_EQ(said(DVNotFoundError(ProviderID{"com.example"})), "There is nothing with the identifier com.example.");
  EXPECT_EQ(said(DVNotFoundError(ItemID{"item 7"})), "There is nothing with the identifier item 7.");
  EXPECT_EQ(said(DVNotFoundError(kCause)), "The item could not be found.");
  EXPECT_EQ(said(DVNotFoundErrorURL(kURL)), "No provider owns the URL.");
  EXPECT_EQ(said(DVPluginOperationFailedError(kCause)), "The provider could not do what was asked.");
  EXPECT_EQ(said(DVProxyNotFoundError(std::nullopt)), "The provider's extension could not be reached.");
  EXPECT_EQ(said(DVSandboxExtensionFailedError(kURL)), "No sandbox extension could be made.");
}

TEST(DVErrors, InALineAnErrorNamesWhatItIsAboutAndItsCause) {
  EXPECT_NE(DVNotFoundErrorURL(kURL).description().find("file:///storage/item"), std::string::npos);
  EXPECT_NE(DVPluginOperationFailedError(kCause).description().find("(CauseDomain 17: The cause.)"), std::string::npos);
}

}  // namespace
}  // namespace docuvend
