// What a process says about its accesses to files, at the named service "com.orvane.FileCoordination".
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
  notPermitted = 2,  // the caller may not write the file itself
  noProvider = 3,    // the file lies in no registered provider's directory
};

class QXFileCoordination {
 public:
  using ErrorReply = std::function<void(std::optional<QXError>)>;

  QXFileCoordination() = default;
  QXFileCoordination(const QXFileCoordination&) = delete;
  QXFileCoordination& operator=(const QXFileCoordination&) = delete;
  virtual ~QXFileCoordination() = default;

  // The caller has written the file and is done. Answered when the provider object that holds the file has been told; what comes of that
  // is not. Only a caller that may write the file, or has redeemed a token for writing it, may say so.
  virtual void writerDidFinishWritingForURL(std::optional<QXURL> url, ErrorReply completionHandler) = 0;
};

}  // namespace docuvend::linux_platform

namespace docuvend {

template <>
struct QXProtocolTable<linux_platform::QXFileCoordination> {
  using Protocol = linux_platform::QXFileCoordination;
  static constexpr std::string_view name = "QXFileCoordination";
  static constexpr auto operations = std::tuple{
      QXOperation<&Protocol::writerDidFinishWritingForURL>{"writerDidFinishWritingForURL:completionHandler:"},
  };
};

}  // namespace docuvend
