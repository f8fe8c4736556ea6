// What confined processes may open.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/QXError.h"
#include "platform/rpc.h"

namespace docuvend {

inline constexpr std::string_view kQXSandboxFileReadData = "file-read-data";
inline constexpr std::string_view kQXSandboxFileWriteData = "file-write-data";

class QXSandbox {
 public:
  QXSandbox() = default;
  QXSandbox(const QXSandbox&) = delete;
  QXSandbox& operator=(const QXSandbox&) = delete;
  virtual ~QXSandbox() = default;

  // Issues a read-write extension for the file at that path: printable text that whoever holds it can redeem for an open file.
  // None when the platform refuses one for this path.
  [[nodiscard]] virtual std::optional<std::string> issueReadWriteExtension(const std::string& path) = 0;

  // Takes back what was issued until now: every extension for a file below that directory, or for any file when none is given, is refused
  // from when this returns, also after a restart of the daemon in the same login session. Open files stay open, and what is issued
  // afterwards is good. After an error the extensions are refused by this process; a restart may make them good again.
  //
  // When a bundle leaves a group, by an update or by being removed, that happens by itself for the group's container. So an extension that
  // was issued for a bundle's file and is still good lies in the container of a group to which the bundle belongs now.
  [[nodiscard]] virtual std::optional<QXError> invalidateReadWriteExtensions(const std::optional<std::string>& directory) = 0;

  // 0: the process that the token identifies may perform the operation on the path. Any other number: it may not, or the question
  // could not be answered. Leaves no trace.
  [[nodiscard]] virtual int checkWithoutReport(const QXAuditToken& token, std::string_view operation, const std::string& path) = 0;
};

}  // namespace docuvend
