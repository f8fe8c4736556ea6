// Reads one property list from XML text that is given piece by piece.
//
// Text in any of the encodings UTF-8, UTF-16, ISO-8859-1 and US-ASCII. Only the five predefined entities and character references are
// known; a document type is passed over when it only names things, and refused when it declares any. Size, depth and number of elements
// are bounded. An error says in which line the list goes wrong. One object reads one list, on one thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <variant>

#include "platform/QXError.h"
#include "platform/QXValue.h"

namespace docuvend::linux_platform {

// The code of the general error for a file that is no property list.
inline constexpr std::int64_t kNoPropertyListError = 300;

[[nodiscard]] QXError noPropertyListError(std::string description);

class PropertyListParser {
 public:
  PropertyListParser();
  PropertyListParser(const PropertyListParser&) = delete;
  PropertyListParser& operator=(const PropertyListParser&) = delete;
  ~PropertyListParser();

  // False: the list is refused already, and `finish` says why.
  [[nodiscard]] bool feed(std::string_view text);
  // The list's value, or why there is none. Once, after all text.
  [[nodiscard]] std::variant<QXValue, QXError> finish();

 private:
  class Reader;

  std::unique_ptr<Reader> reader_;
};

}  // namespace docuvend::linux_platform
