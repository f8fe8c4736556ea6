// The five forwarded operations are one mechanism, ForwardedRequest, and a table of what differs: the operation's name, what it asks of the
// extension, and its texts.
//
// A forwarded request is a request, one message, one reply. The reply ends it, after the completion; a request that failed before there
// was a proxy is deliberately not ended, and neither is one whose message was not delivered.
#include <memory>
#include <utility>

#include "common/DVErrors.h"
#include "common/DVLog.h"
#include "providers/DVExtensionDocuvend.h"

namespace docuvend {
namespace {

using Vendor = _QXDocuvendVendor;
using VendorProxy = DVExtensionDocuvend::VendorProxy;
using FinishHandler = DVExtensionDocuvend::FinishHandler;
using Identifier = std::optional<ProviderID>;

template <class Argument, class... Results>
struct ForwardedOperation {
  using Completion = std::function<void(std::optional<QXError>, std::optional<Results>...)>;

  std::string_view name;
  void (*send)(const VendorProxy& proxy, const Argument& argument, Completion reply);
  QXLogFormat<3> requestFailed;
  QXLogFormat<3> proxyFailed;
  void (*logSuccess)(const Argument& argument, const std::optional<Results>&... results, const Identifier& provider);
};

constexpr ForwardedOperation<QXURL> kProvidePlaceholder{
    "-[DVExtensionDocuvend providePlaceholderForItemAtURL:completionHandler:]",
    [](const VendorProxy& proxy, const QXURL& url, DVExtensionDocuvend::ErrorCompletion reply) {
      proxy.call<&Vendor::_providePlaceholderAtURL>(
          url, [reply = std::move(reply)](std::optional<QXURL>, std::optional<QXError> error) { reply(std::move(error)); });
    },
    "[ERROR] Cannot provide placeholder for item at URL %@ for extension %@. Error: %@",
    "[ERROR] Proxy failed to provide placeholder at URL %@ for extension %@. Error: %@",
    [](const QXURL& url, const Identifier& provider) {
      dvLog("[DEBUG] Successfully provided placeholder at URL %@ for extension %@.", url, provider);
    },
};

constexpr ForwardedOperation<QXURL> kStartProviding{
    "-[DVExtensionDocuvend startProvidingItemAtURL:completionHandler:]",
    [](const VendorProxy& proxy, const QXURL& url, DVExtensionDocuvend::ErrorCompletion reply) {
      proxy.call<&Vendor::_startProvidingItemAtURL>(url, std::move(reply));
    },
    "[ERROR] Cannot provide item at URL %@ for extension %@. Error: %@",
    "[ERROR] Proxy failed to start providing item at URL %@ for extension %@. Error: %@",
    [](const QXURL& url, const Identifier& provider) {
      dvLog("[DEBUG] Successfully provided item at URL %@ for extension %@.", url, provider);
    },
};

constexpr ForwardedOperation<QXURL> kStopProviding{
    "-[DVExtensionDocuvend stopProvidingItemAtURL:completionHandler:]",
    [](const VendorProxy& proxy, const QXURL& url, DVExtensionDocuvend::ErrorCompletion reply) {
      proxy.call<&Vendor::_stopProvidingItemAtURL>(url, std::move(reply));
    },
    "[ERROR] Cannot stop providing item at URL %@ for extension %@. Error: %@",
    "[ERROR] Proxy failed to stop providing item at URL %@ for extension %@. Error: %@",
    [](const QXURL& url, const Identifier& provider) {
      dvLog("[DEBUG] Successfully stopped providing item at URL %@ for extension %@.", url, provider);
    },
};

constexpr ForwardedOperation<QXURL, ItemID> kItemIDForURL{
    "-[DVExtensionDocuvend itemIDForURL:completionHandler:]",
    [](const VendorProxy& proxy, const QXURL& url, DVExtensionDocuvend::ItemIDCompletion reply) {
      proxy.call<&Vendor::_identifierForItemAtURL>(url, std::move(reply));
    },
    "[ERROR] Cannot get item ID for URL %@ for extension %@. Error: %@",
    "[ERROR] Proxy failed to get item ID for URL %@ for extension %@. Error: %@",
    [](const QXURL& url, const std::optional<ItemID>& itemID, const Identifier& provider) {
      dvLog("[DEBUG] Successfully got item ID “%@” for URL %@ from extension %@", itemID, url, provider);
    },
};

constexpr ForwardedOperation<ItemID, QXURL> kURLForItemID{
    "-[DVExtensionDocuvend URLForItemID:completionHandler:]",
    [](const VendorProxy& proxy, const ItemID& itemID, DVExtensionDocuvend::URLCompletion reply) {
      proxy.call<&Vendor::_URLForItemIdentifier>(itemID, std::move(reply));
    },
    "[ERROR] Cannot get URL for item ID “%@” for extension %@. Error: %@",
    "[ERROR] Proxy failed to get URL for item ID “%@” for extension %@. Error: %@",
    [](const ItemID& itemID, const std::optional<QXURL>& url, const Identifier& provider) {
      dvLog("[DEBUG] Successfully retrieved URL %@ for item ID “%@” from extension %@", url, itemID, provider);
    },
};

// Kept alive by the handlers that wait for it.
template <class Argument, class... Results>
class ForwardedRequest : public std::enable_shared_from_this<ForwardedRequest<Argument, Results...>> {
 public:
  using Operation = ForwardedOperation<Argument, Results...>;
  using Completion = typename Operation::Completion;

  // `operation` is an entry of the table above.
  ForwardedRequest(const Operation& operation, std::shared_ptr<DVExtensionDocuvend> provider, Argument argument, Completion completion)
      : operation_(operation), provider_(std::move(provider)), argument_(std::move(argument)), completion_(std::move(completion)) {}

  void start() {
    dvLog("[DEBUG] %s", operation_.name);
    provider_->performExtensionRequest(
        [strongSelf = this->shared_from_this()](std::optional<QXError> error, std::optional<VendorProxy> proxy, FinishHandler finish) {
          strongSelf->requestAnswered(error, proxy, std::move(finish));
        });
  }

 private:
  void requestAnswered(const std::optional<QXError>& error, const std::optional<VendorProxy>& proxy, FinishHandler finish) {
    if (error) {
      dvLog(operation_.requestFailed, argument_, provider_->identifier(), *error);
      fail(*error);
      return;
    }
    operation_.send(*proxy, argument_,
                    [strongSelf = this->shared_from_this(), finish = std::move(finish)](std::optional<QXError> replyError,
                                                                                        std::optional<Results>... results) {
                      strongSelf->replied(replyError, std::move(results)..., finish);
                    });
  }

  void replied(const std::optional<QXError>& error, std::optional<Results>... results, const FinishHandler& finish) {
    if (error) {
      dvLog(operation_.proxyFailed, argument_, provider_->identifier(), *error);
      fail(*error);
    } else {
      operation_.logSuccess(argument_, results..., provider_->identifier());
      if (completion_) completion_(/*error=*/std::nullopt, std::move(results)...);
    }
    finish();
  }

  void fail(const QXError& error) {
    if (completion_) completion_(DVPluginOperationFailedError(error), std::optional<Results>()...);
  }

  const Operation& operation_;
  const std::shared_ptr<DVExtensionDocuvend> provider_;
  const Argument argument_;
  const Completion completion_;
};

template <class Argument, class... Results>
void forward(const ForwardedOperation<Argument, Results...>& operation, std::shared_ptr<DVExtensionDocuvend> provider,
             const Argument& argument, typename ForwardedOperation<Argument, Results...>::Completion completion) {
  std::make_shared<ForwardedRequest<Argument, Results...>>(operation, std::move(provider), argument, std::move(completion))->start();
}

}  // namespace

void DVExtensionDocuvend::providePlaceholderForItemAtURL(const QXURL& url, ErrorCompletion completionHandler) {
  forward(kProvidePlaceholder, shared_from_this(), url, std::move(completionHandler));
}

void DVExtensionDocuvend::startProvidingItemAtURL(const QXURL& url, ErrorCompletion completionHandler) {
  forward(kStartProviding, shared_from_this(), url, std::move(completionHandler));
}

void DVExtensionDocuvend::stopProvidingItemAtURL(const QXURL& url, ErrorCompletion completionHandler) {
  forward(kStopProviding, shared_from_this(), url, std::move(completionHandler));
}

void DVExtensionDocuvend::itemIDForURL(const QXURL& url, ItemIDCompletion completionHandler) {
  forward(kItemIDForURL, shared_from_this(), url, std::move(completionHandler));
}

void DVExtensionDocuvend::URLForItemID(const ItemID& itemID, URLCompletion completionHandler) {
  forward(kURLForItemID, shared_from_this(), itemID, std::move(completionHandler));
}

}  // namespace docuvend
