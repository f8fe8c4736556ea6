#include "tools/docuvendctl/CommandTable.h"
#include "tools/docuvendctl/Operands.h"

namespace docuvend::ctl {
namespace {

// An item as its provider is asked for it on a consumer's behalf.
struct Item {
  QXURL url;
  ProviderID provider;
  ConsumerID consumer;
};

Result<Item> itemOf(const Call& call) {
  auto url = parseURL(call.operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  return Item{std::get<QXURL>(std::move(url)), ProviderID{call.operands[1]}, ConsumerID{call.operands[2]}};
}

Result<Answer> placeholder(Consumer& consumer, const Call& call) {
  auto asked = itemOf(call);
  if (auto* error = std::get_if<QXError>(&asked)) return *error;
  const Item& item = std::get<Item>(asked);
  return done(consumer.providePlaceholder(item.url, item.provider, item.consumer));
}

Result<Answer> start(Consumer& consumer, const Call& call) {
  auto asked = itemOf(call);
  if (auto* error = std::get_if<QXError>(&asked)) return *error;
  const Item& item = std::get<Item>(asked);
  return done(consumer.startProviding(item.url, item.provider, item.consumer, call.progress));
}

Result<Answer> stop(Consumer& consumer, const Call& call) {
  auto asked = itemOf(call);
  if (auto* error = std::get_if<QXError>(&asked)) return *error;
  const Item& item = std::get<Item>(asked);
  return done(consumer.stopProviding(item.url, item.provider, item.consumer));
}

}  // namespace

CommandGroup itemCommands() {
  return {"Items",
          {
              {"placeholder",
               "URL PROVIDER CONSUMER",
               {},
               "have the provider make a file of the right size",
               "CONSUMER needs a grant. Prints nothing.\n",
               placeholder},
              {"start",
               "URL PROVIDER CONSUMER",
               {},
               "have the provider materialise an item",
               "CONSUMER needs a grant. Shows on a terminal how far it is. Prints nothing.\n",
               start},
              {"stop",
               "URL PROVIDER CONSUMER",
               {},
               "tell the provider that CONSUMER needs an item no longer",
               "Its contents may then be given up. Prints nothing.\n",
               stop},
          }};
}

}  // namespace docuvend::ctl
