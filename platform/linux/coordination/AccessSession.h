// One connection's accesses, under the identifiers that its peer chose. When it goes, it ends those that are left.
//
// An identifier is in use from `begin` until the access has ended or failed. Operations come one at a time, on the connection's serial
// context; answers come on any thread, also inside a call and after the session is gone, and keep nothing of it alive.
#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <variant>

#include "platform/QXError.h"
#include "platform/QXUUID.h"
#include "platform/linux/coordination/BytesPresent.h"
#include "platform/linux/coordination/FileAccesses.h"

namespace docuvend::linux_platform {

class AccessSession : public std::enable_shared_from_this<AccessSession> {
 public:
  static constexpr std::size_t kMaximumAccesses = 256;

  using Answer = FileAccesses::Answer;

  // The accesses outlive it.
  explicit AccessSession(FileAccesses& accesses) : accesses_(accesses) {}
  AccessSession(const AccessSession&) = delete;
  AccessSession& operator=(const AccessSession&) = delete;
  ~AccessSession();

  // Why no access can begin under that identifier; none when one can.
  [[nodiscard]] std::optional<QXError> refusalOf(const std::optional<QXUUID>& id) const;

  // For an identifier that was not refused. `answer` runs once.
  void begin(const QXUUID& id, FileAccess access, Answer answer);
  // An access that has begun, and that nobody else hears of.
  void beginExempt(const QXUUID& id);
  // `answer` runs once: when the access has ended, or with the reason why there is none to end.
  void end(const std::optional<QXUUID>& id, Answer answer);

  // None while the access does not wait for its file's provider, or when there is no file.
  [[nodiscard]] std::variant<std::optional<BytesPresent>, QXError> progressOf(const std::optional<QXUUID>& id) const;

 private:
  struct Shared {
    AccessNumber number;
    bool isEnding = false;
  };
  struct Exempt {};
  using Entry = std::variant<Shared, Exempt>;

  void forget(const QXUUID& id, AccessNumber number);

  FileAccesses& accesses_;
  mutable std::mutex mutex_;
  std::map<QXUUID, Entry> entries_;  // guarded by mutex_
};

}  // namespace docuvend::linux_platform
