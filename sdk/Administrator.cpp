#include "sdk/Administrator.h"

#include <cstdint>
#include <string>
#include <utility>

#include "sdk/ServiceConnections.h"
#include "service/DVAdministration.h"

namespace docuvend {
namespace {

QXError notUnderstood(const char* what) {
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

}  // namespace

Result<std::unique_ptr<Administrator>> Administrator::connect(Options options) {
  auto runtime = sdk_detail::ServiceConnections::runtimeDirectory();
  if (auto* error = std::get_if<QXError>(&runtime)) return *error;
  auto services = std::make_shared<sdk_detail::ServiceConnections>(std::get<std::string>(std::move(runtime)), std::nullopt);
  if (auto failure = services->reach(kDVAdministrationServiceName)) return *std::move(failure);
  return std::unique_ptr<Administrator>(new Administrator(std::move(services), options));
}

Administrator::Administrator(std::shared_ptr<sdk_detail::ServiceConnections> services, Options options)
    : services_(std::move(services)), options_(options) {}
Administrator::~Administrator() = default;

Result<QXDictionary> Administrator::status() {
  auto answer =
      services_->ask<DVAdministration, &DVAdministration::statusCompletionHandler>(kDVAdministrationServiceName, options_.deadline);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  auto& [error, status] = std::get<0>(answer);
  if (error) return *error;
  if (!status) return notUnderstood("a status");
  return *std::move(status);
}

Result<std::vector<Grant>> Administrator::grants(const std::optional<ProviderID>& provider, const std::optional<ConsumerID>& consumer) {
  std::vector<Grant> grants;
  std::optional<std::int64_t> from;
  for (;;) {
    auto answer = services_->ask<DVAdministration, &DVAdministration::grantsOfProviderID>(kDVAdministrationServiceName, options_.deadline,
                                                                                          provider, consumer, from);
    if (auto* error = std::get_if<QXError>(&answer)) return *error;
    auto& [error, page, next] = std::get<0>(answer);
    if (error) return *error;
    if (!page) return notUnderstood("grants");
    for (const QXValue& entry : *page) {
      auto grant = grantFrom(entry);
      if (!grant) return notUnderstood("grants");
      grants.push_back(*std::move(grant));
    }
    if (!next) return grants;
    if (*next <= from.value_or(0)) return notUnderstood("a next page");
    from = next;
  }
}

Failure Administrator::revoke(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer) {
  auto answer = services_->ask<DVAdministration, &DVAdministration::revokeItemID>(kDVAdministrationServiceName, options_.deadline, item,
                                                                                  provider, consumer);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  return std::get<0>(std::get<0>(answer));
}

Failure Administrator::announceFirstUnlock() {
  auto answer = services_->ask<DVAdministration, &DVAdministration::announceFirstUnlockCompletionHandler>(kDVAdministrationServiceName,
                                                                                                          options_.deadline);
  if (auto* error = std::get_if<QXError>(&answer)) return *error;
  return std::get<0>(std::get<0>(answer));
}

}  // namespace docuvend
