#include <unistd.h>

#include "common/DVErrors.h"
#include "service/DVBookmarkableString.h"
#include "tools/docuvendctl/CommandTable.h"
#include "tools/docuvendctl/Copy.h"
#include "tools/docuvendctl/Operands.h"

namespace docuvend::ctl {
namespace {

// A document that this application may use, and whose provider has it.
struct Resolved {
  Document document;
  ProviderID provider;
};

Result<Resolved> resolveString(Consumer& consumer, const std::string& string) {
  const auto parsed = DVBookmarkableString::parse(string);
  if (!parsed) return DVInvalidBookmarkableStringError();
  auto document = consumer.documentURL(string);
  if (auto* error = std::get_if<QXError>(&document)) return *error;
  return Resolved{std::get<Document>(std::move(document)), parsed->providerID};
}

Result<Answer> lineOf(Result<std::string> string) {
  if (auto* error = std::get_if<QXError>(&string)) return *error;
  return Answer(Line{"string", std::get<std::string>(std::move(string))});
}

Result<Answer> bookmark(Consumer& consumer, const Call& call) {
  auto url = parseURL(call.operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  return lineOf(consumer.bookmarkableString(std::get<QXURL>(url)));
}

Result<Answer> extendBookmark(Consumer& consumer, const Call& call) {
  auto url = parseURL(call.operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  return lineOf(consumer.extendBookmark(std::get<QXURL>(url), ConsumerID{call.operands[1]}));
}

Result<Answer> resolve(Consumer& consumer, const Call& call) {
  auto resolved = resolveString(consumer, call.operands[0]);
  if (auto* error = std::get_if<QXError>(&resolved)) return *error;
  return Answer(recordOf(std::get<Resolved>(resolved).document));
}

Result<Answer> cat(Consumer& consumer, const Call& call) {
  auto resolved = resolveString(consumer, call.operands[0]);
  if (auto* error = std::get_if<QXError>(&resolved)) return *error;
  const auto& [document, provider] = std::get<Resolved>(resolved);
  auto file = consumer.open(document, provider, Access::read, call.progress);
  if (auto* error = std::get_if<QXError>(&file)) return *error;
  return Answer(Contents{document.url, std::get<QXDescriptor>(std::move(file))});
}

Result<Answer> put(Consumer& consumer, const Call& call) {
  auto resolved = resolveString(consumer, call.operands[0]);
  if (auto* error = std::get_if<QXError>(&resolved)) return *error;
  return done(consumer.replace(std::get<Resolved>(resolved).document,
                               [](const QXDescriptor& sibling) { return copyAll(STDIN_FILENO, sibling.number); }));
}

}  // namespace

CommandGroup documentCommands() {
  return {"Documents",
          {
              {"bookmark", "URL", {}, "print the string that names an item for good", "Prints: string.\n", bookmark},
              {"extend-bookmark",
               "URL CONSUMER",
               {},
               "grant CONSUMER a document that this application may write",
               "No entitlement is needed, but to be able to write the document already.\n"
               "Prints: string, by which CONSUMER finds the document.\n",
               extendBookmark},
              {"resolve",
               "STRING",
               {},
               "turn such a string back into a URL and tokens",
               "Prints: url, token, siblingURL, siblingToken; without tokens where the platform issued none.\n",
               resolve},
              {"cat",
               "STRING",
               {},
               "print a document",
               "Has its provider materialise it first. With --json prints: url, base64 (the document's bytes).\n",
               cat},
              {"put",
               "STRING",
               {},
               "save the standard input as the document's new contents",
               "All or nothing: a reader sees the old contents or the new. Prints nothing.\n",
               put},
          }};
}

}  // namespace docuvend::ctl
