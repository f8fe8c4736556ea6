#include "tools/docuvendctl/CommandTable.h"
#include "tools/docuvendctl/Doctor.h"
#include "tools/docuvendctl/Help.h"
#include "tools/docuvendctl/Operands.h"

namespace docuvend::ctl {
namespace {

Result<Answer> wake(Consumer& consumer, const Call&) { return done(consumer.wakeUp()); }

Result<Answer> providers(Consumer& consumer, const Call&) {
  auto listed = consumer.providers();
  if (auto* error = std::get_if<QXError>(&listed)) return *error;
  List list{{"provider", "storage"}, {}};
  for (const auto& [identifier, value] : std::get<QXDictionary>(listed)) {
    const auto* entry = value.as<QXDictionary>();
    const auto* storage = entry == nullptr ? nullptr : qxFind<QXURL>(*entry, "documentStorageURL");
    list.rows.push_back({identifier, storage == nullptr ? QXValue() : QXValue(*storage)});
  }
  return Answer(std::move(list));
}

Result<Answer> version(const Call&) { return Answer(Line{"version", DOCUVEND_VERSION}); }

Result<Answer> help(const Call& call) {
  std::string name;
  for (const std::string& word : call.operands) name += name.empty() ? word : " " + word;
  auto text = helpText(CommandTable::all(), name);
  if (auto* error = std::get_if<QXError>(&text)) return *error;
  return Answer(Page{"help", std::get<std::string>(std::move(text))});
}

}  // namespace

CommandGroup generalCommands() {
  return {
      "The daemon and this program",
      {
          {"wake", "", {}, "make sure that the daemon answers", "Prints nothing.\n", wake},
          {"providers",
           "",
           {},
           "list the providers and where their documents lie",
           "Needs one of Docuvend's entitlements. Prints a list: provider, storage (a URL; unknown, null, where there is none).\n",
           providers},
          {"doctor",
           "",
           {},
           "examine which protections are in force here",
           "Tries what can be tried, starts a confined process among it, and asks the daemon when one runs. Not from inside a\n"
           "confinement. Prints a list: protection, state, finding. The state is in force, missing (the rest works without it) or fatal\n"
           "(nothing can be started). Exit status: 0 all in force, 11 something is missing, 12 something is fatal.\n",
           doctor},
          {"version", "", {}, "print this program's version", "Prints: version.\n", version},
          {"help", "[COMMAND...]", {}, "explain a command, or all", "Prints: help.\n", help},
      }};
}

}  // namespace docuvend::ctl
