// How processes take turns at files, at the named service "com.orvane.FileCoordination".
//
// Many may read a file at once or one write it, first come, first served. A file is a directory and a name in it: what stands under that
// name may be exchanged. Before a read begins in a provider's directory, the provider has brought the file's contents; when a write has
// ended there, the provider is told, also when the writer's connection ended with its write under way.
//
// An access belongs to the connection that asked for it and ends with it. What a process asks of a file of which it has an access is not
// kept waiting by those who wait: reading within its own access begins at once, and so does writing within its own write; writing within
// its own read waits for the other readers. A provider's own accesses below its directory never wait, hold up nobody and are not told of.
// Who can do no more than wait for each other hear of it: the last one to ask gets an error.
//
// Header-only and made of platform values alone: client libraries include it too. An absent error is success.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>
#include <tuple>

#include "platform/QXValue.h"
#include "platform/rpc_protocol.h"

namespace docuvend::linux_platform {

inline constexpr const char* kFileCoordinationServiceName = "com.orvane.FileCoordination";

inline constexpr const char* kQXFileCoordinationErrorDomain = "QXFileCoordinationErrorDomain";

enum class FileCoordinationErrorCode : std::int64_t {
  missingURL = 1,
  notPermitted = 2,     // the caller cannot reach the file itself in that way
  noProvider = 3,       // the file lies in no registered provider's directory
  invalidAccessID = 4,  // absent, in use by this connection already, or not of an access of this connection
  wouldDeadlock = 5,    // the wait would have no end: those who are waited for wait for the caller
  ended = 6,            // the access was ended before it had begun
  tooManyAccesses = 7,  // this connection or application has as many as it may have
  noDirectory = 8,      // there is no directory where the file would be
  tooManyChanges = 9,   // too much of what this application has written its provider has not been told yet; later it may write again
};

class QXFileCoordination {
 public:
  using ErrorReply = std::function<void(std::optional<QXError>)>;
  using ProgressReply =
      std::function<void(std::optional<QXError>, std::optional<std::int64_t> bytesPresent, std::optional<std::int64_t> size)>;
  using HoldersReply = std::function<void(std::optional<QXError>, std::optional<QXArray> holders)>;

  QXFileCoordination() = default;
  QXFileCoordination(const QXFileCoordination&) = delete;
  QXFileCoordination& operator=(const QXFileCoordination&) = delete;
  virtual ~QXFileCoordination() = default;

  // Answered when the access has begun, or with the reason why it cannot; an error of the provider that cannot bring the contents is
  // passed on. The caller must be able to read (write) the file, or bring a token for it. It chooses the identifier, by which it names
  // the access afterwards; one whose access has ended or failed may be used again. `party` is a number for what the calling process does
  // one thing after another, such as a thread: a cycle is looked for between parties, not between processes. Absent: 0.
  virtual void coordinateReadingItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, std::optional<QXUUID> accessID,
                                          std::optional<std::int64_t> party, ErrorReply completionHandler) = 0;
  virtual void coordinateWritingItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, std::optional<QXUUID> accessID,
                                          std::optional<std::int64_t> party, ErrorReply completionHandler) = 0;
  // Answered when the access has ended: of a write, when the provider is being told, or sure to be. An access that has not begun yet ends
  // at once, and the request for it is answered with `ended`.
  virtual void endAccess(std::optional<QXUUID> accessID, ErrorReply completionHandler) = 0;
  // How much of the file is present while an access waits for the file's provider, in bytes; both absent at any other time.
  virtual void progressOfAccess(std::optional<QXUUID> accessID, ProgressReply completionHandler) = 0;
  // Who accesses the file: those who have the file, then those who wait for it, in their order, 1024 at most. Each a dictionary with the
  // strings "kind"
  // ("reading" or "writing") and "state" ("holding", "providing" or "waiting") and the boolean "own" (the caller's process); for an
  // unconfined caller also the integer "processIdentifier" and, where there is one, the string "bundleIdentifier". For callers that can
  // read the file, or bring a token for it.
  virtual void holdersOfItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, HoldersReply completionHandler) = 0;
  // The caller has written the file, in an access or without one, and is done. Answered when the provider object that holds the file has
  // been told; what comes of that is not. Within a write access of the caller's process the access's end tells. Only a caller that may
  // write the file, or has redeemed a token for writing it, may say so.
  virtual void writerDidFinishWritingForURL(std::optional<QXURL> url, ErrorReply completionHandler) = 0;
};

}  // namespace docuvend::linux_platform

namespace docuvend {

template <>
struct QXProtocolTable<linux_platform::QXFileCoordination> {
  using Protocol = linux_platform::QXFileCoordination;
  static constexpr std::string_view name = "QXFileCoordination";
  static constexpr auto operations = std::tuple{
      QXOperation<&Protocol::coordinateReadingItemAtURL>{"coordinateReadingItemAtURL:token:accessID:party:completionHandler:"},
      QXOperation<&Protocol::coordinateWritingItemAtURL>{"coordinateWritingItemAtURL:token:accessID:party:completionHandler:"},
      QXOperation<&Protocol::endAccess>{"endAccess:completionHandler:"},
      QXOperation<&Protocol::progressOfAccess>{"progressOfAccess:completionHandler:"},
      QXOperation<&Protocol::holdersOfItemAtURL>{"holdersOfItemAtURL:token:completionHandler:"},
      QXOperation<&Protocol::writerDidFinishWritingForURL>{"writerDidFinishWritingForURL:completionHandler:"},
  };
};

}  // namespace docuvend
