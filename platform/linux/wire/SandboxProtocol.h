// How a process turns sandbox tokens into files, at the named service "com.orvane.Sandbox".
//
// Header-only and made of platform values alone: client libraries include it too. A token is a bearer capability: whoever holds it may use
// it, any number of times, until the session's key is renewed. An absent error is success. docs/tokens.md says what a token allows.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>
#include <tuple>

#include "platform/QXValue.h"
#include "platform/rpc_protocol.h"

namespace docuvend::linux_platform {

inline constexpr const char* kSandboxServiceName = "com.orvane.Sandbox";

// Errors of the service; the code says what a client can do about it. What the system said, if anything, stands beneath.
inline constexpr const char* kQXSandboxErrorDomain = "QXSandboxErrorDomain";

enum class SandboxErrorCode : std::int64_t {
  badToken = 1,        // absent, malformed, changed, taken back, or issued under another key: ask for a new one
  notRegularFile = 2,  // no longer a regular file with one link, or the way to it leads through a symbolic link
  gone = 3,            // the file, its directory, or the container is not there
  busy = 4,            // somebody holds the file in a way that an open would wait for: try again
  notPermitted = 5,    // the caller is nobody, or the system refuses the access
  notSiblings = 6,     // the two tokens do not name an item and its hidden sibling
  failed = 7,          // the system failed otherwise; see beneath
};

class QXSandboxRedemption {
 public:
  using FileReply = std::function<void(std::optional<QXError>, std::optional<QXDescriptor> file)>;
  using ErrorReply = std::function<void(std::optional<QXError>)>;

  QXSandboxRedemption() = default;
  QXSandboxRedemption(const QXSandboxRedemption&) = delete;
  QXSandboxRedemption& operator=(const QXSandboxRedemption&) = delete;
  virtual ~QXSandboxRedemption() = default;

  // The open file that the token names: for reading, or for reading and writing. Nothing is truncated. For writing, a hidden sibling whose
  // item exists is made (empty, mode 600) when it is missing. An absent `forWriting` is no.
  virtual void redeemToken(std::optional<QXData> token, std::optional<bool> forWriting, FileReply completionHandler) = 0;

  // Renames the hidden sibling over its item. On success the item's new contents are on disk.
  virtual void replaceItemWithToken(std::optional<QXData> itemToken, std::optional<QXData> bySiblingWithToken,
                                    ErrorReply completionHandler) = 0;
};

}  // namespace docuvend::linux_platform

namespace docuvend {

template <>
struct QXProtocolTable<linux_platform::QXSandboxRedemption> {
  using Protocol = linux_platform::QXSandboxRedemption;
  static constexpr std::string_view name = "QXSandboxRedemption";
  static constexpr auto operations = std::tuple{
      QXOperation<&Protocol::redeemToken>{"redeemToken:forWriting:completionHandler:"},
      QXOperation<&Protocol::replaceItemWithToken>{"replaceItemWithToken:bySiblingWithToken:completionHandler:"},
  };
};

}  // namespace docuvend
