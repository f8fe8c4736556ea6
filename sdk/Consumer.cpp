#include "sdk/Consumer.h"

#include <sys/stat.h>

#include <fstream>
#include <utility>

#include "common/DVErrorCodes.h"
#include "platform/linux/base/confinement.h"
#include "sdk/FileProgress.h"
#include "sdk/ServiceConnections.h"
#include "service/DVDaemon.h"

namespace docuvend {

using sdk_detail::after;
using sdk_detail::errorOf;
using sdk_detail::Repeat;
using sdk_detail::ServiceConnections;
using sdk_detail::valueOf;

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

}  // namespace

Result<std::unique_ptr<Consumer>> Consumer::connect(Options options) {
  auto runtime = ServiceConnections::runtimeDirectory();
  if (auto* error = std::get_if<QXError>(&runtime)) return *error;
  auto services = std::make_shared<ServiceConnections>(std::get<std::string>(runtime) + "/public", options.actAs, options.restartPatience);
  if (auto failure = services->connect(kDVServiceName, after(options.deadline))) return *std::move(failure);
  return std::unique_ptr<Consumer>(new Consumer(std::move(services), std::move(options)));
}

Consumer::Consumer(std::shared_ptr<ServiceConnections> services, Options options)
    : services_(std::move(services)), options_(std::move(options)) {}
Consumer::~Consumer() = default;

Consumer Consumer::within(std::chrono::milliseconds deadline) const {
  Options options = options_;
  options.deadline = options.materialisingDeadline = deadline;
  return Consumer(services_, std::move(options));
}

std::optional<ConsumerID> Consumer::ownIdentifier() const {
  if (options_.actAs) return ConsumerID{*options_.actAs};
  return launchedAs();
}

Failure Consumer::wakeUp() {
  return errorOf(services_->ask<&DVDaemon::wakeUpCompletion>(kDVServiceName, {after(options_.deadline)}, Repeat::harmless));
}

Result<Document> Consumer::extendSandbox(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& toConsumer) {
  auto answer = services_->ask<&DVDaemon::extendSandboxForFileURL>(kDVServiceName, {after(options_.deadline)}, Repeat::harmless, url,
                                                                   fromProvider, toConsumer);
  if (auto error = errorOf(answer)) return *std::move(error);
  auto& [error, itemToken, siblingURL, siblingToken] = std::get<0>(answer);
  return Document{url, std::move(itemToken), std::move(siblingURL), std::move(siblingToken)};
}

Failure Consumer::providePlaceholder(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer) {
  return errorOf(services_->ask<&DVDaemon::providePlaceholderForItemAtURL>(kDVServiceName, {after(options_.deadline)}, Repeat::harmless,
                                                                           url, fromProvider, forConsumer));
}

Failure Consumer::startProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer,
                                 const ProgressHandler& progress) {
  std::function<void()> watch;
  if (progress) {
    watch = [path = url.fileSystemPath(), &progress] {
      struct stat status {};
      if (::stat(path.c_str(), &status) == 0) sdk_detail::report(status, progress);
    };
  }
  return start(url, fromProvider, forConsumer, watch);
}

Failure Consumer::start(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer,
                        const std::function<void()>& watch) {
  return errorOf(services_->ask<&DVDaemon::startProvidingItemAtURL>(
      kDVServiceName, {.until = after(options_.materialisingDeadline), .meanwhile = watch, .interval = sdk_detail::kProgressInterval},
      Repeat::harmless, url, fromProvider, forConsumer));
}

Failure Consumer::stopProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer) {
  auto error = errorOf(services_->ask<&DVDaemon::stopProvidingItemAtURL>(kDVServiceName, {after(options_.deadline)}, Repeat::never, url,
                                                                         fromProvider, forConsumer));
  if (error && isSuccessOfStopping(*error)) return std::nullopt;
  return error;
}

Result<QXDictionary> Consumer::providers() {
  return valueOf<QXDictionary>(
      services_->ask<&DVDaemon::providersCompletionHandler>(kDVServiceName, {after(options_.deadline)}, Repeat::harmless), "providers");
}

Result<std::string> Consumer::extendBookmark(const QXURL& url, const ConsumerID& toConsumer) {
  return valueOf<std::string>(
      services_->ask<&DVDaemon::extendBookmarkForFileURL>(kDVServiceName, {after(options_.deadline)}, Repeat::harmless, url, toConsumer),
      "a string");
}

Result<std::string> Consumer::bookmarkableString(const QXURL& url) {
  return valueOf<std::string>(
      services_->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(kDVServiceName, {after(options_.deadline)}, Repeat::harmless, url),
      "a string (no provider owns the document)");
}

Result<Document> Consumer::documentURL(const std::string& bookmarkableString) {
  auto answer = services_->ask<&DVDaemon::documentURLFromBookmarkableString>(kDVServiceName, {after(options_.deadline)}, Repeat::harmless,
                                                                             bookmarkableString);
  if (auto error = errorOf(answer)) return *std::move(error);
  auto& [url, itemToken, siblingURL, siblingToken, error] = std::get<0>(answer);
  if (!url) return makeConsumerError(ConsumerErrorCode::noAnswer, "The answer carries neither a document nor an error.");
  return Document{*std::move(url), std::move(itemToken), std::move(siblingURL), std::move(siblingToken), bookmarkableString};
}

}  // namespace docuvend
