// Every error of the file-coordination service is made here.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>

#include "platform/QXError.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"

namespace docuvend::linux_platform {

[[nodiscard]] inline QXError makeCoordinationError(FileCoordinationErrorCode code, std::string description, std::optional<QXURL> url) {
  QXError error = QXError::make(kQXFileCoordinationErrorDomain, static_cast<std::int64_t>(code), std::move(description));
  error.url = std::move(url);
  return error;
}

}  // namespace docuvend::linux_platform
