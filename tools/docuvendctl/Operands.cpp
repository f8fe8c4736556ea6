#include "tools/docuvendctl/Operands.h"

#include "common/DVErrors.h"

namespace docuvend::ctl {

Result<QXURL> parseURL(const std::string& text) {
  if (text.starts_with('/') && qxIsValidUTF8(text)) return QXURL::fileURL(text, QXURLKind::file);
  if (auto url = QXURL::fromString(text)) return *url;
  return DVInvalidParameterError("URL", text);
}

Result<Answer> done(const Failure& failure) {
  if (failure) return *failure;
  return Answer(Nothing{});
}

Record recordOf(const Document& document) {
  Record record{{{"url", QXValue(document.url)}}};
  if (document.itemToken) record.fields.emplace_back("token", QXValue(document.itemToken->text()));
  if (document.siblingURL) record.fields.emplace_back("siblingURL", QXValue(*document.siblingURL));
  if (document.siblingToken) record.fields.emplace_back("siblingToken", QXValue(document.siblingToken->text()));
  return record;
}

}  // namespace docuvend::ctl
