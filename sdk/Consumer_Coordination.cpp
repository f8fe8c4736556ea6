// Accesses from the request to their beginning.
//
// An access belongs to the connection over which it was asked for, and the service takes one connection's requests in their order. So who
// gives up waiting says "end" over the same connection, and need not wait for the answer: either the access has not begun and never will,
// or it has begun meanwhile and ends; both requests are answered soon, and nothing stays in the connection's books. When the connection
// ends before the answer, the access has ended with it, and may be asked for again.
#include <sys/random.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <initializer_list>
#include <utility>

#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "sdk/Consumer.h"
#include "sdk/FileProgress.h"
#include "sdk/LiveTokens.h"
#include "sdk/ServiceConnections.h"

namespace docuvend {

using linux_platform::kFileCoordinationServiceName;
using linux_platform::QXFileCoordination;
using sdk_detail::after;
using sdk_detail::Connection;
using sdk_detail::errorOf;
using sdk_detail::NotInTime;
using sdk_detail::Repeat;
using sdk_detail::ServiceConnections;
using sdk_detail::timeLeft;
using sdk_detail::TimePoint;
using sdk_detail::valueOf;
using sdk_detail::Waiting;

namespace {

// The number of the calling thread, which no other thread of this process ever has.
std::int64_t ownParty() {
  static std::atomic<std::int64_t> last = 0;
  thread_local const std::int64_t own = ++last;
  return own;
}

Result<QXUUID> randomUUID() {
  QXUUID result;
  if (::getrandom(result.bytes.data(), result.bytes.size(), 0) != static_cast<ssize_t>(result.bytes.size())) {
    return QXError::system(errno, "no random bytes for an access");
  }
  // Version 4, variant 1.
  result.bytes[6] = static_cast<std::uint8_t>((result.bytes[6] & 0x0FU) | 0x40U);
  result.bytes[8] = static_cast<std::uint8_t>((result.bytes[8] & 0x3FU) | 0x80U);
  return result;
}

void tellProgress(const Connection& connection, const QXUUID& accessID, TimePoint until, const ProgressHandler& progress) {
  const auto answer = ServiceConnections::askOver<&QXFileCoordination::progressOfAccess>(
      connection, {std::min(until, after(sdk_detail::kProgressInterval))}, accessID);
  if (errorOf(answer)) return;
  const auto& [error, present, size] = std::get<0>(answer);
  if (!present || !size || *present < 0 || *size < 0) return;
  progress({static_cast<std::uint64_t>(*present), static_cast<std::uint64_t>(*size)});
}

// The value that is called so.
template <class T>
std::optional<T> named(const std::string& text, std::initializer_list<T> values) {
  for (const T value : values) {
    if (text == nameOf(value)) return value;
  }
  return std::nullopt;
}

std::optional<FileHolder> holderFrom(const QXValue& value) {
  const auto* entry = value.as<QXDictionary>();
  if (entry == nullptr) return std::nullopt;
  const auto* kindText = qxFind<std::string>(*entry, "kind");
  const auto* stateText = qxFind<std::string>(*entry, "state");
  const auto* own = qxFind<bool>(*entry, "own");
  if (kindText == nullptr || stateText == nullptr || own == nullptr) return std::nullopt;
  using State = FileHolder::State;
  const auto kind = named(*kindText, {CoordinationKind::reading, CoordinationKind::writing});
  const auto state = named(*stateText, {State::holding, State::providing, State::waiting});
  if (!kind || !state) return std::nullopt;
  FileHolder holder{*kind, *state, *own, std::nullopt, std::nullopt};
  if (const auto* process = qxFind<std::int64_t>(*entry, "processIdentifier")) holder.processIdentifier = *process;
  if (const auto* bundle = qxFind<std::string>(*entry, "bundleIdentifier")) holder.bundleIdentifier = ConsumerID{*bundle};
  return holder;
}

}  // namespace

Result<CoordinatedAccess> Consumer::coordinateReading(const QXURL& url, const CoordinationOptions& options) {
  return coordinate(CoordinationKind::reading, url, options, options_.materialisingDeadline);
}

Result<CoordinatedAccess> Consumer::coordinateReading(const Document& document, const CoordinationOptions& options) {
  return coordinate(CoordinationKind::reading, document, options);
}

Result<CoordinatedAccess> Consumer::coordinateWriting(const QXURL& url, const CoordinationOptions& options) {
  return coordinate(CoordinationKind::writing, url, options, options_.materialisingDeadline);
}

Result<CoordinatedAccess> Consumer::coordinateWriting(const Document& document, const CoordinationOptions& options) {
  return coordinate(CoordinationKind::writing, document, options);
}

Result<CoordinatedAccess> Consumer::coordinate(CoordinationKind kind, const Document& document, const CoordinationOptions& options) {
  const TimePoint until = after(options_.materialisingDeadline);
  return sdk_detail::withLiveTokens(*this, document, until, options_.deadline, [&](const Document& live) {
    CoordinationOptions ofDocument = options;
    ofDocument.token = live.itemToken;
    return coordinate(kind, live.url, ofDocument, timeLeft(until));
  });
}

Result<CoordinatedAccess> Consumer::coordinate(CoordinationKind kind, const QXURL& url, const CoordinationOptions& options,
                                               std::chrono::milliseconds deadline) {
  const TimePoint until = after(deadline);
  const auto made = randomUUID();
  if (const auto* error = std::get_if<QXError>(&made)) return *error;
  const QXUUID& accessID = std::get<QXUUID>(made);
  std::shared_ptr<Connection> over;
  const auto begin = [&](const std::shared_ptr<Connection>& connection) {
    over = connection;
    Waiting waiting{.until = until};
    if (options.progress) {
      waiting.meanwhile = [&] { tellProgress(*over, accessID, until, options.progress); };
      waiting.interval = sdk_detail::kProgressInterval;
    }
    auto outcome = kind == CoordinationKind::reading ? ServiceConnections::callOver<&QXFileCoordination::coordinateReadingItemAtURL>(
                                                           *over, waiting, url, options.token, accessID, ownParty())
                                                     : ServiceConnections::callOver<&QXFileCoordination::coordinateWritingItemAtURL>(
                                                           *over, waiting, url, options.token, accessID, ownParty());
    if (std::holds_alternative<NotInTime>(outcome)) {
      (void)ServiceConnections::callOver<&QXFileCoordination::endAccess>(*over, {.until = until}, accessID);
    }
    return outcome;
  };
  const auto answer = services_->askBy(kFileCoordinationServiceName, until, Repeat::harmless, begin);
  if (auto error = errorOf(answer)) return *std::move(error);
  return CoordinatedAccess(services_, std::move(over), accessID, url, options_.deadline);
}

Result<std::vector<FileHolder>> Consumer::holders(const QXURL& url, const std::optional<QXData>& token) {
  auto answer = valueOf<QXArray>(services_->ask<&QXFileCoordination::holdersOfItemAtURL>(
                                     kFileCoordinationServiceName, {after(options_.deadline)}, Repeat::harmless, url, token),
                                 "holders");
  if (auto* error = std::get_if<QXError>(&answer)) return std::move(*error);
  std::vector<FileHolder> holders;
  for (const QXValue& entry : std::get<QXArray>(answer)) {
    auto holder = holderFrom(entry);
    if (!holder) return makeConsumerError(ConsumerErrorCode::noAnswer, "The answer does not tell of the file's holders.");
    holders.push_back(*std::move(holder));
  }
  return holders;
}

}  // namespace docuvend
