#include "sdk/Consumer.h"

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <map>
#include <mutex>
#include <utility>

#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/BlockingCall.h"
#include "service/DVDaemon.h"

namespace docuvend {

using linux_platform::Endpoint;
using sdk_detail::callAndWait;

namespace {

constexpr unsigned kReactorThreads = 1;
constexpr const char* kDescriptionPath = "/.docuvend-info";

QXError makeError(ConsumerErrorCode code, std::string description) {
  return QXError::make(kConsumerErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

// The name in the description that the launcher put at the root of a confined process's file system.
std::optional<ConsumerID> launchedAs() {
  std::ifstream description(kDescriptionPath);
  static constexpr std::string_view kName = "name=";
  for (std::string line; std::getline(description, line);) {
    if (line.starts_with(kName)) return ConsumerID{line.substr(kName.size())};
  }
  return std::nullopt;
}

// The values of an answer as a document, when it carries no error.
Result<Document> makeDocument(std::optional<QXError> error, std::optional<QXURL> url, std::optional<QXData> itemToken,
                              std::optional<QXURL> siblingURL, std::optional<QXData> siblingToken) {
  if (error) return *std::move(error);
  if (!url) return makeError(ConsumerErrorCode::noAnswer, "The answer carries neither a document nor an error.");
  return Document{*std::move(url), std::move(itemToken), std::move(siblingURL), std::move(siblingToken)};
}

}  // namespace

struct Consumer::State {
  // Constant after construction.
  Options options;
  std::string publicSockets;

  struct Open {
    std::uint64_t serial;
    std::shared_ptr<Endpoint> endpoint;
  };

  std::mutex mutex;
  // Guarded by `mutex`: the connections that are open now, by service.
  std::map<std::string, Open> endpoints;
  std::uint64_t lastSerial = 0;

  // Last, so that its threads have ended before anything that their handlers touch goes.
  linux_platform::Reactor reactor{kReactorThreads};

  Result<std::shared_ptr<Endpoint>> endpoint(const std::string& service) {
    const std::lock_guard lock(mutex);
    if (const auto found = endpoints.find(service); found != endpoints.end()) return found->second.endpoint;
    auto socket = linux_platform::connectToSocket(publicSockets + "/" + service);
    if (auto* error = std::get_if<QXError>(&socket)) {
      QXError unreachable = makeError(ConsumerErrorCode::unreachable, "The Docuvend daemon cannot be reached.");
      unreachable.underlying = std::make_shared<const QXError>(*error);
      return unreachable;
    }
    Endpoint::Handlers handlers;
    // `this` is safe: the reactor has run its last handler before anything else of the state goes.
    handlers.onClose = [this, service, serial = ++lastSerial](const QXError&) { drop(service, serial); };
    auto made = Endpoint::create(reactor, std::get<linux_platform::UniqueDescriptor>(std::move(socket)),
                                 {linux_platform::kProtocolVersion, options.actAs}, std::move(handlers));
    made->resume();
    endpoints.emplace(service, Open{lastSerial, made});
    return made;
  }

  // A connection that is over is made anew by the next call.
  void drop(const std::string& service, std::uint64_t serial) {
    const std::lock_guard lock(mutex);
    const auto found = endpoints.find(service);
    if (found != endpoints.end() && found->second.serial == serial) endpoints.erase(found);
  }

  template <class Protocol, auto Method, class... Arguments>
  auto ask(const char* service, std::chrono::milliseconds deadline, Arguments&&... arguments)
      -> decltype(callAndWait<Protocol, Method>(std::declval<Endpoint&>(), deadline, std::forward<Arguments>(arguments)...)) {
    auto reached = endpoint(service);
    if (auto* error = std::get_if<QXError>(&reached)) return *error;
    return callAndWait<Protocol, Method>(*std::get<std::shared_ptr<Endpoint>>(reached), deadline, std::forward<Arguments>(arguments)...);
  }
};

Result<std::unique_ptr<Consumer>> Consumer::connect(Options options) {
  const char* runtime = std::getenv("XDG_RUNTIME_DIR");
  if (runtime == nullptr || runtime[0] != '/') {
    return makeError(ConsumerErrorCode::unreachable, "XDG_RUNTIME_DIR is not set to an absolute path.");
  }
  auto state = std::make_unique<State>();
  state->options = std::move(options);
  state->publicSockets = std::string(runtime) + "/docuvend/public";
  auto reached = state->endpoint(kDVServiceName);
  if (auto* error = std::get_if<QXError>(&reached)) return *error;
  return std::unique_ptr<Consumer>(new Consumer(std::move(state)));
}

Consumer::Consumer(std::unique_ptr<State> state) : state_(std::move(state)) {}
Consumer::~Consumer() = default;

std::optional<ConsumerID> Consumer::ownIdentifier() const {
  if (state_->options.actAs) return ConsumerID{*state_->options.actAs};
  return launchedAs();
}

Failure Consumer::wakeUp() {
  auto answer = state_->ask<DVDaemon, &DVDaemon::wakeUpCompletion>(kDVServiceName, state_->options.deadline);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  return std::nullopt;
}

Result<Document> Consumer::extendSandbox(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& toConsumer) {
  auto answer =
      state_->ask<DVDaemon, &DVDaemon::extendSandboxForFileURL>(kDVServiceName, state_->options.deadline, url, fromProvider, toConsumer);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [error, itemToken, siblingURL, siblingToken] = std::get<0>(answer);
  return makeDocument(std::move(error), url, std::move(itemToken), std::move(siblingURL), std::move(siblingToken));
}

Failure Consumer::startProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer) {
  auto answer = state_->ask<DVDaemon, &DVDaemon::startProvidingItemAtURL>(kDVServiceName, state_->options.materialisingDeadline, url,
                                                                          fromProvider, forConsumer);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  return std::get<0>(std::get<0>(answer));
}

Result<QXDictionary> Consumer::providers() {
  auto answer = state_->ask<DVDaemon, &DVDaemon::providersCompletionHandler>(kDVServiceName, state_->options.deadline);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [error, providers] = std::get<0>(answer);
  if (error) return *error;
  if (!providers) return makeError(ConsumerErrorCode::noAnswer, "The answer carries neither providers nor an error.");
  return *std::move(providers);
}

Result<std::string> Consumer::bookmarkableString(const QXURL& url) {
  auto answer = state_->ask<DVDaemon, &DVDaemon::bookmarkableStringFromDocumentURL>(kDVServiceName, state_->options.deadline, url);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [string, error] = std::get<0>(answer);
  if (error) return *error;
  if (!string) return makeError(ConsumerErrorCode::noAnswer, "No provider owns " + url.absoluteString() + ".");
  return *std::move(string);
}

Result<Document> Consumer::documentURL(const std::string& bookmarkableString) {
  auto answer =
      state_->ask<DVDaemon, &DVDaemon::documentURLFromBookmarkableString>(kDVServiceName, state_->options.deadline, bookmarkableString);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [url, itemToken, siblingURL, siblingToken, error] = std::get<0>(answer);
  return makeDocument(std::move(error), std::move(url), std::move(itemToken), std::move(siblingURL), std::move(siblingToken));
}

Result<QXDescriptor> Consumer::redeem(const QXData& token, Access access) {
  using linux_platform::QXSandboxRedemption;
  auto answer = state_->ask<QXSandboxRedemption, &QXSandboxRedemption::redeemToken>(
      linux_platform::kSandboxServiceName, state_->options.deadline, token, access == Access::readWrite);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [error, file] = std::get<0>(answer);
  if (error) return *error;
  if (!file) return makeError(ConsumerErrorCode::noAnswer, "The answer carries neither a file nor an error.");
  return *std::move(file);
}

Result<QXDescriptor> Consumer::open(const Document& document, const ProviderID& provider, Access access) {
  if (!document.itemToken) return makeError(ConsumerErrorCode::noToken, "There is no token for " + document.url.absoluteString() + ".");
  const auto self = ownIdentifier();
  if (!self) return makeError(ConsumerErrorCode::noToken, "This process acts for no installed bundle.");
  if (auto failure = startProviding(document.url, provider, *self)) return *failure;
  return redeem(*document.itemToken, access);
}

Failure Consumer::replace(const Document& document, const std::function<Failure(const QXDescriptor&)>& write) {
  if (!document.itemToken || !document.siblingToken) {
    return makeError(ConsumerErrorCode::noToken, "There are no tokens to replace " + document.url.absoluteString() + " with.");
  }
  auto sibling = redeem(*document.siblingToken, Access::readWrite);
  if (auto* error = std::get_if<QXError>(&sibling)) return *error;
  const QXDescriptor& file = std::get<QXDescriptor>(sibling);
  // It may hold what an earlier attempt left.
  if (::ftruncate(file.number, 0) != 0) return QXError::system(errno, "cannot empty the hidden sibling");
  if (auto failure = write(file)) return failure;

  using linux_platform::QXSandboxRedemption;
  auto replaced = state_->ask<QXSandboxRedemption, &QXSandboxRedemption::replaceItemWithToken>(
      linux_platform::kSandboxServiceName, state_->options.deadline, *document.itemToken, *document.siblingToken);
  if (auto* error = std::get_if<QXError>(&replaced)) return *error;
  if (auto& error = std::get<0>(std::get<0>(replaced))) return *error;
  return finishedWriting(document.url);
}

Failure Consumer::finishedWriting(const QXURL& url) {
  using linux_platform::QXFileCoordination;
  auto told = state_->ask<QXFileCoordination, &QXFileCoordination::writerDidFinishWritingForURL>(
      linux_platform::kFileCoordinationServiceName, state_->options.deadline, url);
  if (auto* error = std::get_if<QXError>(&told)) return *error;
  return std::get<0>(std::get<0>(told));
}

}  // namespace docuvend
