// The administration, as plain calls: what whoever looks after a user's machine asks of the daemon. For unconfined programs of that user.
//
//   auto connected = docuvend::Administrator::connect({});
//   auto& administrator = *std::get<std::unique_ptr<docuvend::Administrator>>(connected);
//   auto granted = administrator.grants(ProviderID{"com.example.cloud"}, std::nullopt);
//   for (const auto& grant : std::get<std::vector<docuvend::Grant>>(granted)) {
//     if (auto failure = administrator.revoke(grant.provider, grant.item, grant.consumer)) std::cerr << failure->description() << "\n";
//   }
//
// Threads, deadlines, restarts and errors are as Consumer.h says. Everything but `revoke` is asked again when the daemon ends before it has
// answered. A caller who is confined, or another user, finds no daemon: `unreachable`, or QXRpcErrorDomain's refused (9).
#pragma once

#include <chrono>
#include <memory>
#include <optional>
#include <vector>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "sdk/ConsumerErrors.h"
#include "sdk/Result.h"

namespace docuvend {

namespace sdk_detail {
class ServiceConnections;
}

// What the access control list says of one item: this consumer may have it from this provider.
struct Grant {
  ProviderID provider;
  ConsumerID consumer;
  ItemID item;

  friend bool operator==(const Grant&, const Grant&) = default;
};

class Administrator {
 public:
  struct Options {
    std::chrono::milliseconds deadline{30'000};
    // How long a call waits for a daemon that is not there.
    std::chrono::milliseconds restartPatience{5'000};
  };

  // `unreachable` at once when XDG_RUNTIME_DIR is not set or no daemon is there.
  [[nodiscard]] static Result<std::unique_ptr<Administrator>> connect(Options options);
  ~Administrator();
  Administrator(const Administrator&) = delete;
  Administrator& operator=(const Administrator&) = delete;

  // The same connections with another deadline, which holds for each call as a whole.
  [[nodiscard]] Administrator within(std::chrono::milliseconds deadline) const;

  // Strings, numbers, arrays and dictionaries, for a person to read: keys may come and go.
  [[nodiscard]] Result<QXDictionary> status();
  // The access control list at one moment, of one provider or one consumer where these are given; by provider and consumer, items in the
  // order in which they were granted.
  [[nodiscard]] Result<std::vector<Grant>> grants(const std::optional<ProviderID>& provider, const std::optional<ConsumerID>& consumer);
  // Takes a grant from the list; it is gone from the disk when this returns. The tokens issued for files of that provider become worthless:
  // who still has a grant gets new ones. DVErrorDomain's "not found" (5) when there is no such grant.
  [[nodiscard]] Failure revoke(const ProviderID& provider, const ItemID& item, const ConsumerID& consumer);
  // The device has been unlocked for the first time since it started. Harmless when that is known.
  [[nodiscard]] Failure announceFirstUnlock();

 private:
  Administrator(std::shared_ptr<sdk_detail::ServiceConnections> services, Options options);

  const std::shared_ptr<sdk_detail::ServiceConnections> services_;
  const Options options_;
};

}  // namespace docuvend
