#include "tools/docuvendctl/Commands.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <iostream>
#include <memory>
#include <nlohmann/json.hpp>
#include <utility>
#include <vector>

#include "common/DVErrors.h"
#include "platform/linux/log/LogText.h"
#include "sdk/Consumer.h"
#include "service/DVBookmarkableString.h"

namespace docuvend::ctl {
namespace {

using linux_platform::visibleLogText;

constexpr std::size_t kCopyBufferSize = std::size_t{64} * 1024;

using Operands = std::vector<std::string>;
// What a command gives back: names and texts, in the order in which people read them.
using Fields = std::vector<std::pair<std::string, std::string>>;

struct Command {
  const char* name;
  const char* operands;
  std::size_t operandCount;
  const char* help;
  Result<Fields> (*run)(Consumer& consumer, const Operands& operands);
};

// A URL, or the absolute path of a file.
Result<QXURL> parseURL(const std::string& text) {
  if (text.starts_with('/') && qxIsValidUTF8(text)) return QXURL::fileURL(text, QXURLKind::file);
  if (auto url = QXURL::fromString(text)) return *url;
  return DVInvalidParameterError("URL", text);
}

Result<Fields> done(const Failure& failure) {
  if (failure) return *failure;
  return Fields{};
}

Fields fieldsOf(const Document& document) {
  Fields fields = {{"url", document.url.absoluteString()}};
  if (document.itemToken) fields.emplace_back("token", document.itemToken->text());
  if (document.siblingURL) fields.emplace_back("siblingURL", document.siblingURL->absoluteString());
  if (document.siblingToken) fields.emplace_back("siblingToken", document.siblingToken->text());
  return fields;
}

// Copies all of one file to another.
Failure copy(int from, int to) {
  std::array<char, kCopyBufferSize> buffer;
  for (;;) {
    const ssize_t count = ::read(from, buffer.data(), buffer.size());
    if (count == 0) return std::nullopt;
    if (count < 0) {
      if (errno == EINTR) continue;
      return QXError::system(errno, "cannot read");
    }
    for (ssize_t written = 0; written < count;) {
      const ssize_t step = ::write(to, buffer.data() + written, static_cast<std::size_t>(count - written));
      if (step < 0 && errno == EINTR) continue;
      if (step < 0) return QXError::system(errno, "cannot write");
      written += step;
    }
  }
}

// A document that this application may use, and whose provider has it.
struct Resolved {
  Document document;
  ProviderID provider;
};

Result<Resolved> resolve(Consumer& consumer, const std::string& string) {
  const auto parsed = DVBookmarkableString::parse(string);
  if (!parsed) return DVInvalidBookmarkableStringError();
  auto document = consumer.documentURL(string);
  if (auto* error = std::get_if<QXError>(&document)) return *error;
  return Resolved{std::get<Document>(std::move(document)), parsed->providerID};
}

Result<Fields> wake(Consumer& consumer, const Operands&) { return done(consumer.wakeUp()); }

Result<Fields> grant(Consumer& consumer, const Operands& operands) {
  auto url = parseURL(operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  auto document = consumer.extendSandbox(std::get<QXURL>(url), ProviderID{operands[1]}, ConsumerID{operands[2]});
  if (auto* error = std::get_if<QXError>(&document)) return *error;
  return fieldsOf(std::get<Document>(document));
}

Result<Fields> start(Consumer& consumer, const Operands& operands) {
  auto url = parseURL(operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  return done(consumer.startProviding(std::get<QXURL>(url), ProviderID{operands[1]}, ConsumerID{operands[2]}));
}

Result<Fields> providers(Consumer& consumer, const Operands&) {
  auto listed = consumer.providers();
  if (auto* error = std::get_if<QXError>(&listed)) return *error;
  Fields fields;
  for (const auto& [identifier, value] : std::get<QXDictionary>(listed)) {
    const auto* entry = value.as<QXDictionary>();
    const auto* storage = entry == nullptr ? nullptr : qxFind<QXURL>(*entry, "documentStorageURL");
    fields.emplace_back(identifier, storage == nullptr ? std::string() : storage->absoluteString());
  }
  return fields;
}

Result<Fields> bookmark(Consumer& consumer, const Operands& operands) {
  auto url = parseURL(operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  auto string = consumer.bookmarkableString(std::get<QXURL>(url));
  if (auto* error = std::get_if<QXError>(&string)) return *error;
  return Fields{{"string", std::get<std::string>(string)}};
}

Result<Fields> resolveString(Consumer& consumer, const Operands& operands) {
  auto resolved = resolve(consumer, operands[0]);
  if (auto* error = std::get_if<QXError>(&resolved)) return *error;
  return fieldsOf(std::get<Resolved>(resolved).document);
}

Result<Fields> cat(Consumer& consumer, const Operands& operands) {
  auto resolved = resolve(consumer, operands[0]);
  if (auto* error = std::get_if<QXError>(&resolved)) return *error;
  const auto& [document, provider] = std::get<Resolved>(resolved);
  auto file = consumer.open(document, provider, Access::read);
  if (auto* error = std::get_if<QXError>(&file)) return *error;
  return done(copy(std::get<QXDescriptor>(file).number, STDOUT_FILENO));
}

Result<Fields> put(Consumer& consumer, const Operands& operands) {
  auto resolved = resolve(consumer, operands[0]);
  if (auto* error = std::get_if<QXError>(&resolved)) return *error;
  return done(consumer.replace(std::get<Resolved>(resolved).document,
                               [](const QXDescriptor& sibling) { return copy(STDIN_FILENO, sibling.number); }));
}

constexpr std::array kCommands = {
    Command{"wake", "", 0, "make sure that the daemon answers", wake},
    Command{"providers", "", 0, "list the providers and where their documents lie", providers},
    Command{"grant", "URL PROVIDER CONSUMER", 3, "give CONSUMER a provider's item; prints tokens for it", grant},
    Command{"start", "URL PROVIDER CONSUMER", 3, "have the provider materialise an item", start},
    Command{"bookmark", "URL", 1, "print the string that names an item for good", bookmark},
    Command{"resolve", "STRING", 1, "turn such a string back into a URL and tokens", resolveString},
    Command{"cat", "STRING", 1, "print a document", cat},
    Command{"put", "STRING", 1, "save the standard input as the document's new contents, all or nothing", put},
};

// Bytes that are no UTF-8 become the replacement character.
std::string oneLine(const nlohmann::ordered_json& object) {
  return object.dump(/*indent=*/-1, ' ', /*ensure_ascii=*/false, nlohmann::ordered_json::error_handler_t::replace);
}

void print(const Fields& fields, OutputForm form) {
  if (form == OutputForm::json) {
    nlohmann::ordered_json object = nlohmann::ordered_json::object();
    for (const auto& [name, text] : fields) object[name] = text;
    std::cout << oneLine(object) << "\n";
    return;
  }
  // A script gets the exact text; a person's terminal is not to be steered by it.
  const bool isTerminal = ::isatty(STDOUT_FILENO) == 1;
  for (const auto& [name, text] : fields) {
    std::cout << (fields.size() == 1 ? std::string() : name + " ") << (isTerminal ? visibleLogText(text) : text) << "\n";
  }
}

ExitStatus fail(const QXError& error, OutputForm form) {
  const ExitStatus status = statusOf(error);
  if (form == OutputForm::json) {
    std::cerr << oneLine({{"error", {{"domain", error.domain}, {"code", error.code}, {"description", error.description()}}}}) << "\n";
  } else {
    std::cerr << "docuvendctl: " << visibleLogText(error.description()) << "\n";
  }
  return status;
}

}  // namespace

std::string helpText() {
  std::string text =
      "docuvendctl [--as BUNDLE] [--json] [--timeout SECONDS] COMMAND [OPERAND...]\n"
      "\n"
      "Asks the Docuvend daemon of this user. URL is a file URL or an absolute path.\n"
      "\n";
  for (const Command& command : kCommands) {
    std::string usage = std::string("  ") + command.name + " " + command.operands;
    usage.resize(std::max<std::size_t>(usage.size() + 1, 32), ' ');
    text += usage + command.help + "\n";
  }
  text +=
      "\n"
      "  --as BUNDLE         act for an installed bundle (not from inside a confinement)\n"
      "  --json              print one JSON object\n"
      "  --timeout SECONDS   give up after that long\n"
      "  --help              print this\n"
      "\n"
      "Exit status: 0 done, 2 usage, 3 not permitted, 4 not found, 5 the provider failed, 6 invalid input, 7 the daemon cannot be "
      "reached,\n"
      "8 no answer in time, 9 a file could not be used, 10 anything else.\n";
  return text;
}

ExitStatus runCommand(const CommandLine& line) {
  for (const Command& command : kCommands) {
    if (line.command != command.name) continue;
    if (line.operands.size() != command.operandCount) {
      std::cerr << "docuvendctl: usage: docuvendctl " << command.name << " " << command.operands << "\n";
      return ExitStatus::usage;
    }
    Consumer::Options options;
    options.actAs = line.actAs;
    if (line.deadline) options.deadline = options.materialisingDeadline = *line.deadline;
    auto connected = Consumer::connect(std::move(options));
    if (auto* error = std::get_if<QXError>(&connected)) return fail(*error, line.form);
    auto answer = command.run(*std::get<std::unique_ptr<Consumer>>(connected), line.operands);
    if (auto* error = std::get_if<QXError>(&answer)) return fail(*error, line.form);
    // A document goes out as its bytes alone.
    if (line.command != "cat") print(std::get<Fields>(answer), line.form);
    return ExitStatus::done;
  }
  std::cerr << "docuvendctl: unknown command " << visibleLogText(line.command) << "; --help lists them\n";
  return ExitStatus::usage;
}

}  // namespace docuvend::ctl
