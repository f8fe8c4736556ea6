#include "providers/_QXDocuvendExtensionHostContext.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace docuvend {
namespace {

using Context = _QXDocuvendExtensionHostContext;
using Kinds = std::vector<QXValueKind>;

TEST(ExtensionHostContextTest, EachInterfaceIsTheSameObjectAtEveryCall) {
  EXPECT_EQ(&Context::_extensionAuxiliaryHostProtocol(), &Context::_extensionAuxiliaryHostProtocol());
  EXPECT_EQ(&Context::_extensionAuxiliaryVendorProtocol(), &Context::_extensionAuxiliaryVendorProtocol());
  EXPECT_NE(&Context::_extensionAuxiliaryHostProtocol(), &Context::_extensionAuxiliaryVendorProtocol());
}

TEST(ExtensionHostContextTest, TheHostOffersNothing) {
  EXPECT_EQ(Context::_extensionAuxiliaryHostProtocol().protocolName(), "_QXDocuvendHostProtocol");
  EXPECT_TRUE(Context::_extensionAuxiliaryHostProtocol().operations().empty());
}

TEST(ExtensionHostContextTest, TheVendorOffersSevenOperations) {
  struct Row {
    std::string name;
    Kinds arguments;
    Kinds replies;
  };
  const QXValueKind url = QXValueKind::url;
  const QXValueKind string = QXValueKind::string;
  const QXValueKind error = QXValueKind::error;
  const std::vector<Row> rows = {
      {"_performInitialSetupWithCompletion:", {}, {string, url, error}}, {"_providePlaceholderAtURL:completion:", {url}, {url, error}},
      {"_startProvidingItemAtURL:completion:", {url}, {error}},          {"_itemChangedAtURL:completion:", {url}, {error}},
      {"_stopProvidingItemAtURL:completion:", {url}, {error}},           {"_identifierForItemAtURL:completion:", {url}, {error, string}},
      {"_URLForItemIdentifier:completion:", {string}, {error, url}},
  };
  const QXRpcInterface& vendor = Context::_extensionAuxiliaryVendorProtocol();
  EXPECT_EQ(vendor.protocolName(), "_QXDocuvendVendor");
  ASSERT_EQ(vendor.operations().size(), rows.size());
  for (std::size_t i = 0; i < rows.size(); ++i) {
    EXPECT_EQ(vendor.operations()[i].name, rows[i].name);
    EXPECT_EQ(vendor.operations()[i].arguments, rows[i].arguments) << rows[i].name;
    EXPECT_EQ(vendor.operations()[i].replies, rows[i].replies) << rows[i].name;
  }
}

TEST(ExtensionHostContextTest, NothingIsRestrictedBeyondTheProtocols) {
  EXPECT_EQ(Context::_extensionAuxiliaryHostProtocol().restrictionCount(), 0U);
  EXPECT_EQ(Context::_extensionAuxiliaryVendorProtocol().restrictionCount(), 0U);
}

}  // namespace
}  // namespace docuvend
