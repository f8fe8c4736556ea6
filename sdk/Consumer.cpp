#include "sdk/Consumer.h"

#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <utility>

#include "common/DVErrorCodes.h"
#include "platform/linux/base/confinement.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/ServiceConnections.h"
#include "service/DVDaemon.h"

namespace docuvend {

namespace {

// The name in the description that the launcher put at the root of a confined process's file system.
std::optional<ConsumerID> launchedAs() {
  std::ifstream description(linux_platform::kDescriptionPath);
  static constexpr std::string_view kName = "name=";
  for (std::string line; std::getline(description, line);) {
    if (line.starts_with(kName)) return ConsumerID{line.substr(kName.size())};
  }
  return std::nullopt;
}

// The daemon answers a stop that the provider carried out with an error that has nothing beneath it.
bool isSuccessOfStopping(const QXError& error) {
  return error.domain == kDVErrorDomain && error.code == static_cast<std::int64_t>(DVErrorCode::pluginOperationFailed) && !error.underlying;
}

// The values of an answer as a document, when it carries no error.
Result<Document> makeDocument(std::optional<QXError> error, std::optional<QXURL> url, std::optional<QXData> itemToken,
                              std::optional<QXURL> siblingURL, std::optional<QXData> siblingToken) {
  if (error) return *std::move(error);
  if (!url) return makeConsumerError(ConsumerErrorCode::noAnswer, "The answer carries neither a document nor an error.");
  return Document{*std::move(url), std::move(itemToken), std::move(siblingURL), std::move(siblingToken)};
}

}  // namespace

Result<std::unique_ptr<Consumer>> Consumer::connect(Options options) {
  auto runtime = sdk_detail::ServiceConnections::runtimeDirectory();
  if (auto* error = std::get_if<QXError>(&runtime)) return *error;
  auto services = std::make_shared<sdk_detail::ServiceConnections>(std::get<std::string>(runtime) + "/public", options.actAs);
  if (auto failure = services->reach(kDVServiceName)) return *std::move(failure);
  return std::unique_ptr<Consumer>(new Consumer(std::move(services), std::move(options)));
}

Consumer::Consumer(std::shared_ptr<sdk_detail::ServiceConnections> services, Options options)
    : services_(std::move(services)), options_(std::move(options)) {}
Consumer::~Consumer() = default;

std::optional<ConsumerID> Consumer::ownIdentifier() const {
  if (options_.actAs) return ConsumerID{*options_.actAs};
  return launchedAs();
}

Failure Consumer::wakeUp() {
  auto answer = services_->ask<DVDaemon, &DVDaemon::wakeUpCompletion>(kDVServiceName, options_.deadline);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  return std::nullopt;
}

Result<Document> Consumer::extendSandbox(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& toConsumer) {
  auto answer =
      services_->ask<DVDaemon, &DVDaemon::extendSandboxForFileURL>(kDVServiceName, options_.deadline, url, fromProvider, toConsumer);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [error, itemToken, siblingURL, siblingToken] = std::get<0>(answer);
  return makeDocument(std::move(error), url, std::move(itemToken), std::move(siblingURL), std::move(siblingToken));
}

Failure Consumer::providePlaceholder(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer) {
  auto answer = services_->ask<DVDaemon, &DVDaemon::providePlaceholderForItemAtURL>(kDVServiceName, options_.deadline, url, fromProvider,
                                                                                    forConsumer);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  return std::get<0>(std::get<0>(answer));
}

Failure Consumer::startProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer) {
  auto answer = services_->ask<DVDaemon, &DVDaemon::startProvidingItemAtURL>(kDVServiceName, options_.materialisingDeadline, url,
                                                                             fromProvider, forConsumer);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  return std::get<0>(std::get<0>(answer));
}

Failure Consumer::stopProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer) {
  auto answer =
      services_->ask<DVDaemon, &DVDaemon::stopProvidingItemAtURL>(kDVServiceName, options_.deadline, url, fromProvider, forConsumer);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& error = std::get<0>(std::get<0>(answer));
  if (error && isSuccessOfStopping(*error)) return std::nullopt;
  return error;
}

Result<QXDictionary> Consumer::providers() {
  auto answer = services_->ask<DVDaemon, &DVDaemon::providersCompletionHandler>(kDVServiceName, options_.deadline);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [error, providers] = std::get<0>(answer);
  if (error) return *error;
  if (!providers) return makeConsumerError(ConsumerErrorCode::noAnswer, "The answer carries neither providers nor an error.");
  return *std::move(providers);
}

Result<std::string> Consumer::extendBookmark(const QXURL& url, const ConsumerID& toConsumer) {
  auto answer = services_->ask<DVDaemon, &DVDaemon::extendBookmarkForFileURL>(kDVServiceName, options_.deadline, url, toConsumer);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [string, error] = std::get<0>(answer);
  if (error) return *error;
  if (!string) return makeConsumerError(ConsumerErrorCode::noAnswer, "The answer carries neither a string nor an error.");
  return *std::move(string);
}

Result<std::string> Consumer::bookmarkableString(const QXURL& url) {
  auto answer = services_->ask<DVDaemon, &DVDaemon::bookmarkableStringFromDocumentURL>(kDVServiceName, options_.deadline, url);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [string, error] = std::get<0>(answer);
  if (error) return *error;
  if (!string) return makeConsumerError(ConsumerErrorCode::noAnswer, "No provider owns " + url.absoluteString() + ".");
  return *std::move(string);
}

Result<Document> Consumer::documentURL(const std::string& bookmarkableString) {
  auto answer =
      services_->ask<DVDaemon, &DVDaemon::documentURLFromBookmarkableString>(kDVServiceName, options_.deadline, bookmarkableString);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [url, itemToken, siblingURL, siblingToken, error] = std::get<0>(answer);
  return makeDocument(std::move(error), std::move(url), std::move(itemToken), std::move(siblingURL), std::move(siblingToken));
}

Result<QXDescriptor> Consumer::redeem(const QXData& token, Access access) {
  using linux_platform::QXSandboxRedemption;
  auto answer = services_->ask<QXSandboxRedemption, &QXSandboxRedemption::redeemToken>(
      linux_platform::kSandboxServiceName, options_.deadline, token, access == Access::readWrite);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [error, file] = std::get<0>(answer);
  if (error) return *error;
  if (!file) return makeConsumerError(ConsumerErrorCode::noAnswer, "The answer carries neither a file nor an error.");
  return *std::move(file);
}

Result<QXDescriptor> Consumer::open(const Document& document, const ProviderID& provider, Access access) {
  if (!document.itemToken)
    return makeConsumerError(ConsumerErrorCode::noToken, "There is no token for " + document.url.absoluteString() + ".");
  const auto self = ownIdentifier();
  if (!self) return makeConsumerError(ConsumerErrorCode::noToken, "This process acts for no installed bundle.");
  if (auto failure = startProviding(document.url, provider, *self)) return *failure;
  return redeem(*document.itemToken, access);
}

Failure Consumer::replace(const Document& document, const std::function<Failure(const QXDescriptor&)>& write) {
  if (!document.itemToken || !document.siblingToken) {
    return makeConsumerError(ConsumerErrorCode::noToken, "There are no tokens to replace " + document.url.absoluteString() + " with.");
  }
  auto sibling = redeem(*document.siblingToken, Access::readWrite);
  if (auto* error = std::get_if<QXError>(&sibling)) return *error;
  const QXDescriptor& file = std::get<QXDescriptor>(sibling);
  // It may hold what an earlier attempt left.
  if (::ftruncate(file.number, 0) != 0) return QXError::system(errno, "cannot empty the hidden sibling");
  if (auto failure = write(file)) return failure;

  using linux_platform::QXSandboxRedemption;
  auto replaced = services_->ask<QXSandboxRedemption, &QXSandboxRedemption::replaceItemWithToken>(
      linux_platform::kSandboxServiceName, options_.deadline, *document.itemToken, *document.siblingToken);
  if (auto* error = std::get_if<QXError>(&replaced)) return *error;
  if (auto& error = std::get<0>(std::get<0>(replaced))) return *error;
  return finishedWriting(document.url);
}

Failure Consumer::finishedWriting(const QXURL& url) {
  using linux_platform::QXFileCoordination;
  auto told = services_->ask<QXFileCoordination, &QXFileCoordination::writerDidFinishWritingForURL>(
      linux_platform::kFileCoordinationServiceName, options_.deadline, url);
  if (auto* error = std::get_if<QXError>(&told)) return *error;
  return std::get<0>(std::get<0>(told));
}

}  // namespace docuvend
