// A turn at a file, among all processes that take turns: many read it at once, or one writes it.
//
//   auto reading = docuvend.coordinateReading(url);                   // its turn has come, and its provider has brought the contents
//   if (auto* error = std::get_if<QXError>(&reading)) return fail(*error);
//   std::string text = readAll(url.fileSystemPath());
//   if (auto failure = std::get<CoordinatedAccess>(reading).end()) return fail(*failure);
//
// Nesting. What a thread asks of a file while its process has an access of that file is not kept waiting by those who wait: a read begins
// at once within a read or a write, a write at once within a write, whichever thread of the process has the outer one. A write within a
// read waits until nobody else reads. Each access is ended for itself.
//
// Deadlocks. An access is its thread's that asked for it, wherever the object is moved. When the wait for one would never end, for the
// threads that are waited for wait themselves for this thread's accesses, in this process or in others, the last one to ask is told
// (wouldDeadlock). Threads that wait for each other in other ways, such as for a lock, are not seen: take turns in one order.
#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "sdk/Progress.h"
#include "sdk/Result.h"

namespace docuvend {

namespace sdk_detail {
class ServiceConnections;
struct Connection;
}  // namespace sdk_detail

enum class CoordinationKind { reading, writing };

struct CoordinationOptions {
  // What opens the file, for a program that cannot reach it by its path. Of a Document its own token is taken instead.
  std::optional<QXData> token = std::nullopt;
  // Told while the access waits for the file's provider. May be empty.
  ProgressHandler progress = {};
};

// Who has a file or waits for it.
struct FileHolder {
  enum class State { holding, providing, waiting };  // providing: it waits for the file's provider

  CoordinationKind kind;
  State state;
  bool isOwnProcess;
  // For unconfined programs alone.
  std::optional<std::int64_t> processIdentifier;
  std::optional<ConsumerID> bundleIdentifier;

  friend bool operator==(const FileHolder&, const FileHolder&) = default;
};

// As they are called on the wire.
[[nodiscard]] constexpr const char* nameOf(CoordinationKind kind) { return kind == CoordinationKind::reading ? "reading" : "writing"; }
[[nodiscard]] constexpr const char* nameOf(FileHolder::State state) {
  switch (state) {
    case FileHolder::State::holding:
      return "holding";
    case FileHolder::State::providing:
      return "providing";
    case FileHolder::State::waiting:
      break;
  }
  return "waiting";
}

// Made by Consumer::coordinateReading and coordinateWriting; may outlive the Consumer. For one thread at a time. The access ends with this
// object, which then waits for the end like `end`; one that was moved from, or has ended, holds nothing.
class CoordinatedAccess {
 public:
  // For the library.
  CoordinatedAccess(std::shared_ptr<sdk_detail::ServiceConnections> services, std::shared_ptr<sdk_detail::Connection> connection,
                    const QXUUID& accessID, QXURL url, std::chrono::milliseconds deadline);
  CoordinatedAccess(CoordinatedAccess&& other) noexcept;
  // Ends first what it held.
  CoordinatedAccess& operator=(CoordinatedAccess&& other) noexcept;
  CoordinatedAccess(const CoordinatedAccess&) = delete;
  CoordinatedAccess& operator=(const CoordinatedAccess&) = delete;
  ~CoordinatedAccess();

  // Where the file is: as it was asked for, or where it has moved, of a document that needed new tokens.
  [[nodiscard]] const QXURL& url() const { return url_; }

  // False when it has ended, also by the end of the daemon, soon after which this is known: others may have the file then. Asks nobody.
  [[nodiscard]] bool isHeld() const;

  // Gives the turn to others. Of a write, its provider is being told of the change when this returns, or sure to be. Waits no longer than
  // the deadline of the Consumer for ordinary calls. Not the first time: does nothing and succeeds.
  //
  // Failures. `connectionLost`: the daemon ended meanwhile and took the access with it; others may have had the file before this one was
  // done, and of a write the provider may not have been told: finishedWriting tells it. `deadlinePassed`: the access still ends.
  // An error of the wire, when this process's other requests leave no room for this one for a second: then the connection ends, and
  // with it this access and all others over it.
  [[nodiscard]] Failure end();

 private:
  // Outlives the connection.
  std::shared_ptr<sdk_detail::ServiceConnections> services_;
  // None: nothing is held. The access lasts no longer than the connection does.
  std::shared_ptr<sdk_detail::Connection> connection_;
  QXUUID accessID_;
  QXURL url_;
  std::chrono::milliseconds deadline_;
};

}  // namespace docuvend
