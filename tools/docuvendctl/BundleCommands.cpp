#include <memory>

#include "common/DVErrorCodes.h"
#include "platform/linux/bundles/BundleErrors.h"
#include "platform/linux/bundles/BundleInstaller.h"
#include "platform/linux/files/LinuxPropertyLists.h"
#include "tools/docuvendctl/CommandTable.h"
#include "tools/docuvendctl/ConnectionOptions.h"
#include "tools/docuvendctl/GrantList.h"
#include "tools/docuvendctl/Place.h"

namespace docuvend::ctl {
namespace {

using linux_platform::InstalledBundle;
using linux_platform::LinuxPropertyLists;
using linux_platform::Paths;

Result<Answer> install(const Call& call) {
  auto paths = unconfinedPaths();
  if (auto* error = std::get_if<QXError>(&paths)) return *error;
  LinuxPropertyLists propertyLists;
  auto installed = linux_platform::installBundle(call.operands[0], std::get<Paths>(paths), propertyLists);
  if (auto* error = std::get_if<QXError>(&installed)) return *error;
  const auto& bundle = std::get<InstalledBundle>(installed);
  return Answer(Record{{{"bundle", QXValue(bundle.identifier)},
                        {"directory", QXValue(bundle.directory)},
                        {"outcome", QXValue(bundle.outcome == InstalledBundle::Outcome::updated ? "updated" : "installed")}}});
}

// The grants that name the identifier, as provider or as consumer, each once.
Result<std::vector<Grant>> grantsNaming(Administrator& administrator, const std::string& identifier) {
  auto given = administrator.grants(ProviderID{identifier}, std::nullopt);
  if (auto* error = std::get_if<QXError>(&given)) return *error;
  auto received = administrator.grants(std::nullopt, ConsumerID{identifier});
  if (auto* error = std::get_if<QXError>(&received)) return *error;
  auto grants = std::get<std::vector<Grant>>(std::move(given));
  for (Grant& grant : std::get<std::vector<Grant>>(received)) {
    if (grant.provider.value != identifier) grants.push_back(std::move(grant));
  }
  return grants;
}

// What is gone already needs no revoking.
Failure revokeAll(Administrator& administrator, const std::vector<Grant>& grants) {
  for (const Grant& grant : grants) {
    auto failure = administrator.revoke(grant.provider, grant.item, grant.consumer);
    if (!failure) continue;
    const bool isGone = failure->domain == kDVErrorDomain && failure->code == static_cast<std::int64_t>(DVErrorCode::notFound);
    if (!isGone) return failure;
  }
  return std::nullopt;
}

bool isNotInstalled(const QXError& error) {
  return error.domain == linux_platform::kBundleErrorDomain &&
         error.code == static_cast<std::int64_t>(linux_platform::BundleErrorCode::notFound);
}

Result<Answer> uninstallAndRevoke(const Call& call, const Paths& paths) {
  const std::string& identifier = call.operands[0];
  auto connected = Administrator::connect(administratorOptions(call.deadline));
  if (auto* error = std::get_if<QXError>(&connected)) return *error;
  auto& administrator = *std::get<std::unique_ptr<Administrator>>(connected);
  // Connecting succeeds also where nobody answers.
  auto before = grantsNaming(administrator, identifier);
  if (auto* error = std::get_if<QXError>(&before)) return *error;
  LinuxPropertyLists propertyLists;
  if (auto failure = linux_platform::uninstallBundle(identifier, paths, propertyLists)) {
    // The bundle may have gone some time ago, and its grants be what is left of it.
    if (!isNotInstalled(*failure) || std::get<std::vector<Grant>>(before).empty()) return *failure;
  }
  // Again, now that nobody of that name can be given anything more on its own behalf.
  auto grants = grantsNaming(administrator, identifier);
  if (auto* error = std::get_if<QXError>(&grants)) return *error;
  if (auto failure = revokeAll(administrator, std::get<std::vector<Grant>>(grants))) return *failure;
  return Answer(Record{{{"bundle", QXValue(identifier)}, {"removedGrants", listOf(std::get<std::vector<Grant>>(grants))}}});
}

Result<Answer> uninstallAlone(const Call& call, const Paths& paths) {
  const std::string& identifier = call.operands[0];
  LinuxPropertyLists propertyLists;
  if (auto failure = linux_platform::uninstallBundle(identifier, paths, propertyLists)) return *failure;
  Record record{{{"bundle", QXValue(identifier)}}};
  Record::Value remaining = QXValue();
  auto connected = Administrator::connect(administratorOptions(call.deadline));
  if (auto* administrator = std::get_if<std::unique_ptr<Administrator>>(&connected)) {
    auto grants = grantsNaming(**administrator, identifier);
    if (auto* listed = std::get_if<std::vector<Grant>>(&grants)) remaining = listOf(*listed);
  }
  record.fields.emplace_back("remainingGrants", std::move(remaining));
  return Answer(std::move(record));
}

Result<Answer> uninstall(const Call& call) {
  auto paths = unconfinedPaths();
  if (auto* error = std::get_if<QXError>(&paths)) return *error;
  if (call.has("--remove-grants")) return uninstallAndRevoke(call, std::get<Paths>(paths));
  return uninstallAlone(call, std::get<Paths>(paths));
}

}  // namespace

CommandGroup bundleCommands() {
  return {"Bundles (not from inside a confinement)",
          {
              {"install",
               "DIRECTORY",
               {},
               "install or update the bundle that DIRECTORY holds",
               "It is copied for this user and takes its place in one step, also while the daemon runs. Its containers stay as they are.\n"
               "The daemon refuses processes of the older version from then on: start them again.\n"
               "Prints: bundle, directory, outcome (installed or updated).\n",
               install},
              {"uninstall",
               "BUNDLE",
               {{"--remove-grants", "", "take back all grants that name BUNDLE, also when it is gone already; needs the running daemon"}},
               "remove an installed bundle of this user",
               "The daemon refuses its processes from then on. Its containers stay. So do grants that name it, and a later bundle of\n"
               "that name inherits them, unless they are removed.\n"
               "Prints: bundle, and remainingGrants or removedGrants, a list: provider, item, consumer. Which grants remain is unknown\n"
               "(null) when the daemon cannot be asked.\n",
               uninstall},
          }};
}

}  // namespace docuvend::ctl
