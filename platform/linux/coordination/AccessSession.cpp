// An access that was asked to end stays in the list until it has ended: it still keeps others waiting, so it counts, and its identifier
// does not name a second one meanwhile. Who asks again for its end is told at once that there is nothing to end, whether or not it is over.

#include "platform/linux/coordination/AccessSession.h"

#include <cassert>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/coordination/CoordinationErrors.h"

namespace docuvend::linux_platform {
namespace {

QXError invalidID(std::string description) {
  return makeCoordinationError(FileCoordinationErrorCode::invalidAccessID, std::move(description), /*url=*/{});
}

QXError noSuchAccess() { return invalidID("this connection has no access of that identifier"); }

}  // namespace

AccessSession::~AccessSession() {
  for (const auto& [id, entry] : entries_) {
    if (const auto* shared = std::get_if<Shared>(&entry)) accesses_.end(shared->number, [] {});
  }
}

std::optional<QXError> AccessSession::refusalOf(const std::optional<QXUUID>& id) const {
  if (!id) return invalidID("the access identifier is missing");
  const std::lock_guard lock(mutex_);
  if (entries_.contains(*id)) return invalidID("the access identifier is in use");
  if (entries_.size() < kMaximumAccesses) return std::nullopt;
  return makeCoordinationError(FileCoordinationErrorCode::tooManyAccesses,
                               "a connection may not have more than " + std::to_string(kMaximumAccesses) + " accesses", /*url=*/{});
}

void AccessSession::begin(const QXUUID& id, FileAccess access, Answer answer) {
  const AccessNumber number = accesses_.newNumber();
  {
    const std::lock_guard lock(mutex_);
    [[maybe_unused]] const bool isNew = entries_.emplace(id, Shared{number}).second;
    assert(isNew);
  }
  accesses_.begin(number, std::move(access),
                  [weak = weak_from_this(), id, number, answer = std::move(answer)](std::optional<QXError> error) {
                    const auto session = weak.lock();
                    if (error && session) session->forget(id, number);
                    answer(std::move(error));
                  });
}

void AccessSession::beginExempt(const QXUUID& id) {
  const std::lock_guard lock(mutex_);
  [[maybe_unused]] const bool isNew = entries_.emplace(id, Exempt{}).second;
  assert(isNew);
}

void AccessSession::end(const std::optional<QXUUID>& id, Answer answer) {
  std::optional<AccessNumber> number;
  std::optional<QXError> error;
  {
    const std::lock_guard lock(mutex_);
    const auto found = id ? entries_.find(*id) : entries_.end();
    auto* shared = found == entries_.end() ? nullptr : std::get_if<Shared>(&found->second);
    if (found == entries_.end() || (shared != nullptr && shared->isEnding)) {
      error = noSuchAccess();
    } else if (shared == nullptr) {
      entries_.erase(found);
    } else {
      shared->isEnding = true;
      number = shared->number;
    }
  }
  if (!number) {
    answer(std::move(error));
    return;
  }
  accesses_.end(*number, [weak = weak_from_this(), id = *id, number = *number, answer = std::move(answer)] {
    if (const auto session = weak.lock()) session->forget(id, number);
    answer(/*error=*/{});
  });
}

std::variant<std::optional<BytesPresent>, QXError> AccessSession::progressOf(const std::optional<QXUUID>& id) const {
  std::optional<AccessNumber> number;
  {
    const std::lock_guard lock(mutex_);
    const auto found = id ? entries_.find(*id) : entries_.end();
    if (found == entries_.end()) return noSuchAccess();
    if (const auto* shared = std::get_if<Shared>(&found->second)) number = shared->number;
  }
  const auto file = number ? accesses_.beingProvided(*number) : std::nullopt;
  if (!file) return std::nullopt;
  return BytesPresent::of(file->key, file->url);
}

// An access that is ended before it has begun is forgotten with its request's answer, upon which the peer may use its identifier anew, and
// again when it has ended.
void AccessSession::forget(const QXUUID& id, AccessNumber number) {
  const std::lock_guard lock(mutex_);
  const auto found = entries_.find(id);
  if (found == entries_.end()) return;
  const auto* shared = std::get_if<Shared>(&found->second);
  if (shared != nullptr && shared->number == number) entries_.erase(found);
}

}  // namespace docuvend::linux_platform
