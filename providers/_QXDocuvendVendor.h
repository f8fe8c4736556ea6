// What a provider extension offers the daemon, over the connection of one extension request.
//
// Header-only and made of platform values alone: provider libraries include it too. An absent error is success.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "platform/rpc_protocol.h"

namespace docuvend {

class _QXDocuvendVendor {
 public:
  using SetupReply = std::function<void(std::optional<std::string>, std::optional<QXURL>, std::optional<QXError>)>;
  using PlaceholderReply = std::function<void(std::optional<QXURL>, std::optional<QXError>)>;
  using ErrorReply = std::function<void(std::optional<QXError>)>;
  using IdentifierReply = std::function<void(std::optional<QXError>, std::optional<ItemID>)>;
  using URLReply = std::function<void(std::optional<QXError>, std::optional<QXURL>)>;

  _QXDocuvendVendor() = default;
  _QXDocuvendVendor(const _QXDocuvendVendor&) = delete;
  _QXDocuvendVendor& operator=(const _QXDocuvendVendor&) = delete;
  virtual ~_QXDocuvendVendor() = default;

  // Sent before the provider is registered with file coordination; the reply's string and URL are not used.
  virtual void _performInitialSetupWithCompletion(SetupReply completion) = 0;
  // Makes a placeholder: a file of the right size without the contents. The reply's URL is not used.
  virtual void _providePlaceholderAtURL(std::optional<QXURL> url, PlaceholderReply completion) = 0;
  // Materialises the item; the reply says that its contents are there.
  virtual void _startProvidingItemAtURL(std::optional<QXURL> url, ErrorReply completion) = 0;
  // Somebody has written the item.
  virtual void _itemChangedAtURL(std::optional<QXURL> url, ErrorReply completion) = 0;
  // Nobody needs the item's contents for now.
  virtual void _stopProvidingItemAtURL(std::optional<QXURL> url, ErrorReply completion) = 0;
  virtual void _identifierForItemAtURL(std::optional<QXURL> url, IdentifierReply completion) = 0;
  virtual void _URLForItemIdentifier(std::optional<ItemID> identifier, URLReply completion) = 0;
};

template <>
struct QXProtocolTable<_QXDocuvendVendor> {
  using V = _QXDocuvendVendor;
  static constexpr std::string_view name = "_QXDocuvendVendor";
  static constexpr auto operations = std::tuple{
      QXOperation<&V::_performInitialSetupWithCompletion>{"_performInitialSetupWithCompletion:"},
      QXOperation<&V::_providePlaceholderAtURL>{"_providePlaceholderAtURL:completion:"},
      QXOperation<&V::_startProvidingItemAtURL>{"_startProvidingItemAtURL:completion:"},
      QXOperation<&V::_itemChangedAtURL>{"_itemChangedAtURL:completion:"},
      QXOperation<&V::_stopProvidingItemAtURL>{"_stopProvidingItemAtURL:completion:"},
      QXOperation<&V::_identifierForItemAtURL>{"_identifierForItemAtURL:completion:"},
      QXOperation<&V::_URLForItemIdentifier>{"_URLForItemIdentifier:completion:"},
  };
};

}  // namespace docuvend
