// Documents outlive their tokens: who has a document's string gets new ones.
#pragma once

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <utility>
#include <variant>

#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/BlockingCall.h"
#include "sdk/Consumer.h"

namespace docuvend::sdk_detail {

[[nodiscard]] inline bool isSandboxError(const QXError& error, linux_platform::SandboxErrorCode code) {
  return error.domain == linux_platform::kQXSandboxErrorDomain && error.code == static_cast<std::int64_t>(code);
}

// A token may have been worthless. File coordination says no more than that the file is out of the caller's reach.
[[nodiscard]] inline bool mayBeOfWorthlessToken(const QXError& error) {
  using linux_platform::FileCoordinationErrorCode;
  if (isSandboxError(error, linux_platform::SandboxErrorCode::badToken)) return true;
  return error.domain == linux_platform::kQXFileCoordinationErrorDomain &&
         error.code == static_cast<std::int64_t>(FileCoordinationErrorCode::notPermitted);
}

// Does `act` with the document; once more with new tokens when these have become worthless and the library can ask for others. Asking for
// them is an ordinary call, which is never answered when the document's provider is gone: `ordinary` is its deadline.
template <class Act>
auto withLiveTokens(Consumer& consumer, const Document& document, TimePoint until, std::chrono::milliseconds ordinary, const Act& act)
    -> decltype(act(document)) {
  auto result = act(document);
  const auto* error = std::get_if<QXError>(&result);
  if (error == nullptr || !mayBeOfWorthlessToken(*error) || !document.bookmarkableString) return result;
  auto renewed = consumer.within(std::min(timeLeft(until), ordinary)).documentURL(*document.bookmarkableString);
  if (auto* refusal = std::get_if<QXError>(&renewed)) return std::move(*refusal);
  return act(std::get<Document>(renewed));
}

}  // namespace docuvend::sdk_detail
