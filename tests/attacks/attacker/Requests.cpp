// ask STRING                        for the document of a bookmarkable string
// ask-as BUNDLE STRING              the same, declared to be that bundle
// providers
// grant PATH PROVIDER CONSUMER
// provide PATH PROVIDER CONSUMER
// pass-on PATH CONSUMER             the bookmark grant
// redeem-for reading|writing STRING   asks for the document, and redeems its token
// knock SOCKET REQUEST              asks the administration at that socket for its status, or announces the unlock ("first-unlock")
#include "tests/attacks/attacker/Requests.h"

#include <cstdlib>
#include <utility>
#include <variant>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "tests/system/house/Client.h"
#include "tests/system/knock.h"

namespace docuvend::attacker {
namespace {

using linux_platform::UniqueDescriptor;
using tests::Client;

UniqueDescriptor asideForTheNext;

QXURL fileURL(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }

std::unique_ptr<Client> client(const char* service, std::optional<std::string> bundle = std::nullopt) {
  if (auto connection = takeSetAside()) return std::make_unique<Client>(std::move(connection), std::move(bundle));
  return std::make_unique<Client>(publicSocket(service), std::move(bundle));
}

std::string ask(const std::string& string, std::optional<std::string> bundle) {
  const auto caller = client(kDVServiceName, std::move(bundle));
  return told(tests::errorOf(caller->ask<&DVDaemon::documentURLFromBookmarkableString>(string)));
}

std::string grant(Words& words) {
  const QXURL url = fileURL(words.next());
  const ProviderID provider{words.next()};
  const ConsumerID consumer{words.next()};
  return told(tests::errorOf(client(kDVServiceName)->ask<&DVDaemon::extendSandboxForFileURL>(url, provider, consumer)));
}

std::string provide(Words& words) {
  const QXURL url = fileURL(words.next());
  const ProviderID provider{words.next()};
  const ConsumerID consumer{words.next()};
  return told(tests::errorOf(client(kDVServiceName)->ask<&DVDaemon::startProvidingItemAtURL>(url, provider, consumer)));
}

std::string passOn(Words& words) {
  const QXURL url = fileURL(words.next());
  const ConsumerID consumer{words.next()};
  return told(tests::errorOf(client(kDVServiceName)->ask<&DVDaemon::extendBookmarkForFileURL>(url, consumer)));
}

std::string redeem(Words& words) {
  const bool forWriting = words.next() == "writing";
  const std::string string = words.next();
  const auto resolved = client(kDVServiceName)->ask<&DVDaemon::documentURLFromBookmarkableString>(string);
  if (const auto error = tests::errorOf(resolved)) return told(error);
  const auto& token = std::get<1>(std::get<0>(resolved));
  const auto sandbox = client(linux_platform::kSandboxServiceName);
  return told(tests::errorOf(sandbox->ask<&linux_platform::QXSandboxRedemption::redeemToken>(token, forWriting)));
}

}  // namespace

std::string publicSocket(const std::string& service) {
  const char* runtime = std::getenv("XDG_RUNTIME_DIR");
  return (runtime == nullptr ? std::string() : std::string(runtime)) + "/docuvend/public/" + service;
}

void setAside(UniqueDescriptor connection) { asideForTheNext = std::move(connection); }
UniqueDescriptor takeSetAside() { return std::move(asideForTheNext); }

Acts requestActs() {
  return {
      {"ask", [](Words& words) { return ask(words.next(), std::nullopt); }},
      {"ask-as",
       [](Words& words) {
         const std::string bundle = words.next();
         return ask(words.next(), bundle);
       }},
      {"providers", [](Words&) { return told(tests::errorOf(client(kDVServiceName)->ask<&DVDaemon::providersCompletionHandler>())); }},
      {"grant", grant},
      {"provide", provide},
      {"pass-on", passOn},
      {"redeem-for", redeem},
      {"knock",
       [](Words& words) {
         const std::string socket = words.next();
         return tests::knock(socket, {words.next()});
       }},
  };
}

}  // namespace docuvend::attacker
