#include "sdk/Administrator.h"

#include <cstdint>
#include <string>
#include <utility>

#include "sdk/ServiceConnections.h"
#include "service/DVAdministration.h"

namespace docuvend {

using sdk_detail::after;
using sdk_detail::errorOf;
using sdk_detail::Repeat;
using sdk_detail::ServiceConnections;
using sdk_detail::TimePoint;
using sdk_detail::valueOf;

namespace {

QXError noAnswer(const char* what) {
  return makeConsumerError(ConsumerErrorCode::noAnswer, std::string("The answer carries neither ") + what + " nor an error.");
}

std::optional<Grant> grantFrom(const QXValue& value) {
  const auto* entry = value.as<QXDictionary>();
  if (entry == nullptr) return std::nullopt;
  const auto* provider = qxFind<std::string>(*entry, "providerIdentifier");
  const auto* consumer = qxFind<std::string>(*entry, "consumerIdentifier");
  const auto* item = qxFind<std::string>(*entry, "itemIdentifier");
  if (provider == nullptr || consumer == nullptr || item == nullptr) return std::nullopt;
  return Grant{ProviderID{*provider}, ConsumerID{*consumer}, ItemID{*item}};
}

// All pages. Those of one walk come over one connection: they are pages of one list then.
Result<std::vector<Grant>> walk(const sdk_detail::Connection& connection, TimePoint until, const std::optional<ProviderID>& provider,
                                const std::optional<ConsumerID>& consumer) {
  std::vector<Grant> grants;
  for (std::int64_t from = 0;;) {
    auto answer =
        ServiceConnections::askOver<&DVAdministration::grantsOfProviderID>(connection, {until}, provider, consumer, std::optional(from));
    if (auto error = errorOf(answer)) return *std::move(error);
    const auto& [error, page, next] = std::get<0>(answer);
    if (!page) return noAnswer("grants");
    for (const QXValue& entry : *page) {
      auto grant = grantFrom(entry);
      if (!grant) return noAnswer("grants");
      grants.push_back(*std::move(grant));
    }
    if (!next) return grants;
    if (*next <= from) return noAnswer("a next page");
    from = *next;
  }
}

bool isLost(const Result<std::vector<Grant>>& grants) {
  const auto* error = std::get_if<QXError>(&grants);
  return error != nullptr && error->domain == kConsumerErrorDomain &&
         error->code == static_cast<std::int64_t>(ConsumerErrorCode::connectionLost);
}

}  // namespace

Result<std::unique_ptr<Administrator>> Administrator::connect(Options options) {
  auto runtime = ServiceConnections::runtimeDirectory();
  if (auto* error = std::get_if<QXError>(&runtime)) return std::move(*error);
  auto services = std::make_shared<ServiceConnections>(std::get<std::string>(std::move(runtime)), std::nullopt, options.restartPatience);
  if (auto failure = services->connect(kDVAdministrationServiceName, after(options.deadline))) return *std::move(failure);
  return std::unique_ptr<Administrator>(new Administrator(std::move(services), options));
}

Administrator::Administrator(std::shared_ptr<ServiceConnections> services, Options options)
    : services_(std::move(services)), options_(options) {}
Administrator::~Administrator() = default;

Administrator Administrator::within(std::chrono::milliseconds deadline) const {
  Options options = options_;
  options.deadline = deadline;
  return Administrator(services_, options);
}

Result<QXDictionary> Administrator::status() {
  return valueOf<QXDictionary>(services_->ask<&DVAdministration::statusCompletionHandler>(kDVAdministrationServiceName,
                                                                                          {after(options_.deadline)}, Repeat::harmless),
                               "a status");
}

Result<std::vector<Grant>> Administrator::grants(const std::optional<ProviderID>& provider, const std::optional<ConsumerID>& consumer) {
  const TimePoint until = after(options_.deadline);
  for (bool isRepeated = false;; isRepeated = true) {
    auto connection = services_->connectAnew(kDVAdministrationServiceName, until);
    if (auto* error = std::get_if<QXError>(&connection)) return std::move(*error);
    auto grants = walk(*std::get<0>(connection), until, provider, consumer);
    if (isRepeated || !isLost(grants)) return grants;
  }
}

Failure Administrator::revoke(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) {
  return errorOf(services_->ask<&DVAdministration::revokeItemID>(kDVAdministrationServiceName, {after(options_.deadline)}, Repeat::never,
                                                                 item, provider, consumer));
}

Failure Administrator::announceFirstUnlock() {
  return errorOf(services_->ask<&DVAdministration::announceFirstUnlockCompletionHandler>(kDVAdministrationServiceName,
                                                                                         {after(options_.deadline)}, Repeat::harmless));
}

}  // namespace docuvend
