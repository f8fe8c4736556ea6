#include "tools/docuvendctl/CommandTable.h"
#include "tools/docuvendctl/GrantList.h"
#include "tools/docuvendctl/Operands.h"

namespace docuvend::ctl {
namespace {

Result<Answer> grant(Consumer& consumer, const Call& call) {
  auto url = parseURL(call.operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  auto document = consumer.extendSandbox(std::get<QXURL>(url), ProviderID{call.operands[1]}, ConsumerID{call.operands[2]});
  if (auto* error = std::get_if<QXError>(&document)) return *error;
  return Answer(recordOf(std::get<Document>(document)));
}

Result<Answer> grants(Administrator& administrator, const Call& call) {
  std::optional<ProviderID> provider;
  std::optional<ConsumerID> consumer;
  if (auto text = call.option("--provider")) provider = ProviderID{*std::move(text)};
  if (auto text = call.option("--consumer")) consumer = ConsumerID{*std::move(text)};
  auto listed = administrator.grants(provider, consumer);
  if (auto* error = std::get_if<QXError>(&listed)) return *error;
  return Answer(listOf(std::get<std::vector<Grant>>(listed)));
}

Result<Answer> revoke(Administrator& administrator, const Call& call) {
  return done(administrator.revoke(ProviderID{call.operands[0]}, ItemID{call.operands[1]}, ConsumerID{call.operands[2]}));
}

Result<Answer> status(Administrator& administrator, const Call&) {
  auto told = administrator.status();
  if (auto* error = std::get_if<QXError>(&told)) return *error;
  Record record;
  for (auto& [name, value] : std::get<QXDictionary>(told)) record.fields.emplace_back(name, std::move(value));
  return Answer(std::move(record));
}

}  // namespace

CommandGroup administrationCommands() {
  return {"Grants and administration",
          {
              {"grant",
               "URL PROVIDER CONSUMER",
               {},
               "give CONSUMER a provider's item",
               "Needs the entitlement \"com.orvane.docuvend.acl-write\".\n"
               "Prints: url, token, siblingURL, siblingToken; without tokens where the platform issued none.\n",
               grant},
              {"grants",
               "",
               {{"--provider", "PROVIDER", "only those of its items"}, {"--consumer", "CONSUMER", "only those that it was given"}},
               "list who may have what",
               "Not from inside a confinement. Prints a list: provider, item, consumer.\n",
               grants},
              {"revoke",
               "PROVIDER ITEM CONSUMER",
               {},
               "take a grant back",
               "Not from inside a confinement. The tokens issued for files of that provider become worthless, whoever holds them;\n"
               "who still has a grant gets new ones. A file that is open stays open. Prints nothing.\n",
               revoke},
              {"status",
               "",
               {},
               "show how the daemon is",
               "Not from inside a confinement. What is shown may change from version to version.\n",
               status},
          }};
}

}  // namespace docuvend::ctl
