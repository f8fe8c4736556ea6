// What the operations of DVDaemon share: their names, the check that their arguments are there, and the reply to a request that failed.
#pragma once

#include <optional>
#include <string_view>
#include <utility>

#include "common/DVErrors.h"
#include "platform/QXPlatform.h"
#include "service/DVDaemon.h"

namespace docuvend {

// The operation's full keyword name, from the protocol's table.
template <auto Operation>
[[nodiscard]] constexpr std::string_view dvOperationName() {
  return rpc_detail::nameOf<Operation, DVDaemon>();
}

// DVInvalidParameterError for the first of the three that is absent: what the request is about, under the name that it has there, the
// provider and the consumer.
template <class Subject>
[[nodiscard]] std::optional<QXError> dvMissingParameter(std::string_view name, const std::optional<Subject>& subject,
                                                        const std::optional<ProviderID>& providerID,
                                                        const std::optional<ConsumerID>& consumerID) {
  if (!subject) return DVInvalidParameterError(name, /*value=*/std::nullopt);
  if (!providerID) return DVInvalidParameterError("providerID", /*value=*/std::nullopt);
  if (!consumerID) return DVInvalidParameterError("consumerID", /*value=*/std::nullopt);
  return std::nullopt;
}

// Calls the handler, if there is one, with the error and no other value.
inline void dvReplyWithError(const DVDaemon::ErrorReply& reply, const QXError& error) {
  if (reply) reply(error);
}
inline void dvReplyWithError(const DVDaemon::SandboxReply& reply, const QXError& error) {
  if (reply) reply(error, /*itemToken=*/std::nullopt, /*siblingURL=*/std::nullopt, /*siblingToken=*/std::nullopt);
}
inline void dvReplyWithError(const DVDaemon::ProvidersReply& reply, const QXError& error) {
  if (reply) reply(error, /*providers=*/std::nullopt);
}
inline void dvReplyWithError(const DVDaemon::StringReply& reply, const QXError& error) {
  if (reply) reply(/*bookmarkableString=*/std::nullopt, error);
}
inline void dvReplyWithError(const DVDaemon::DocumentReply& reply, const QXError& error) {
  if (reply) reply(/*url=*/std::nullopt, /*itemToken=*/std::nullopt, /*siblingURL=*/std::nullopt, /*siblingToken=*/std::nullopt, error);
}

// The same as a task of the global queue: how a request is answered that failed before it reached a provider.
template <class Reply>
void dvSubmitError(Reply reply, QXError error) {
  QXPlatform::current().queues.globalQueue().async(
      [reply = std::move(reply), error = std::move(error)] { dvReplyWithError(reply, error); });
}

}  // namespace docuvend
