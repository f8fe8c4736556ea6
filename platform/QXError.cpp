#include "platform/QXError.h"

#include <system_error>

namespace docuvend {

QXError QXError::make(std::string domain, std::int64_t code, std::string description) {
  QXError error;
  error.domain = std::move(domain);
  error.code = code;
  error.texts.emplace("description", std::move(description));
  return error;
}

QXError QXError::system(int errnoValue, std::string description) {
  return make(kQXSystemErrorDomain, errnoValue, std::move(description) + ": " + std::generic_category().message(errnoValue));
}

std::string QXError::description() const {
  std::string text = domain + " " + std::to_string(code);
  if (const auto found = texts.find("description"); found != texts.end()) text += ": " + found->second;
  if (url) text += " [" + url->absoluteString() + "]";
  if (underlying) text += " (" + underlying->description() + ")";
  return text;
}

bool operator==(const QXError& a, const QXError& b) {
  if (a.domain != b.domain || a.code != b.code || a.texts != b.texts || a.url != b.url) return false;
  if (!a.underlying || !b.underlying) return a.underlying == b.underlying;
  return *a.underlying == *b.underlying;
}

}  // namespace docuvend
