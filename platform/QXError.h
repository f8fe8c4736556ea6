// A failure as a value.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "platform/QXURL.h"

namespace docuvend {

// Errors of the platform's general services (files, property lists).
inline constexpr const char* kQXGeneralErrorDomain = "QXGeneralErrorDomain";
inline constexpr std::int64_t kQXFileReadNoSuchFileError = 260;  // names the missing file in `url`

// Errors of the system's calls; the code is the errno value.
inline constexpr const char* kQXSystemErrorDomain = "QXSystemErrorDomain";

struct QXError {
  std::string domain;
  std::int64_t code = 0;
  std::map<std::string, std::string> texts;  // "description" is what a person reads; other keys as the maker says
  std::optional<QXURL> url;                  // the file that the error is about
  std::shared_ptr<const QXError> underlying;

  [[nodiscard]] static QXError make(std::string domain, std::int64_t code, std::string description);
  [[nodiscard]] static QXError system(int errnoValue, std::string description);

  // One line: domain, code, description, URL, and the underlying error in parentheses.
  [[nodiscard]] std::string description() const;

  friend bool operator==(const QXError& a, const QXError& b);
};

}  // namespace docuvend
