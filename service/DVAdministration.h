// What whoever looks after this user's machine may ask of the daemon, at the named service "com.orvane.Administration". Only unconfined
// processes of the daemon's own user are connected there.
//
// Header-only and made of platform values alone: client libraries include it too. An absent error is success; on failure every value
// beside the error is absent.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>
#include <tuple>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "platform/rpc_protocol.h"

namespace docuvend {

inline constexpr const char* kDVAdministrationServiceName = "com.orvane.Administration";

class DVAdministration {
 public:
  using ErrorReply = std::function<void(std::optional<QXError>)>;
  // How the daemon is, for a person to read: booleans, numbers, strings, URLs, arrays and dictionaries. Keys may come and go.
  using StatusReply = std::function<void(std::optional<QXError>, std::optional<QXDictionary> status)>;
  // Dictionaries with the strings "providerIdentifier", "consumerIdentifier" and "itemIdentifier"; `next` is absent on the last page.
  using GrantsReply = std::function<void(std::optional<QXError>, std::optional<QXArray> grants, std::optional<std::int64_t> next)>;

  DVAdministration() = default;
  DVAdministration(const DVAdministration&) = delete;
  DVAdministration& operator=(const DVAdministration&) = delete;
  virtual ~DVAdministration() = default;

  virtual void statusCompletionHandler(StatusReply completionHandler) = 0;

  // A page of the access control list, of one provider or one consumer where these are given: ordered by provider and consumer, items in
  // the order in which they were granted. The first page (absent or 0) is of the list as it is then; the pages that follow on the same
  // connection are of that same list. DVInvalidParameterError for a start that is no position in it. A page is as long as a message allows.
  virtual void grantsOfProviderID(std::optional<ProviderID> providerID, std::optional<ConsumerID> toConsumerID,
                                  std::optional<std::int64_t> startingAt, GrantsReply completionHandler) = 0;

  // Takes the grant from the list, which is on disk before the answer, and makes the sandbox tokens worthless that were issued for files of
  // that provider, to whomever: who still has a grant gets new ones. DVInvalidParameterError for the first argument that is absent,
  // DVNotFoundError when there is no such grant. An error of the system says that the list or the tokens' end could not be written: both
  // hold all the same, the list until it is read again (at a first unlock, and after a restart), the tokens' end until a restart. Asking
  // again writes the list again.
  virtual void revokeItemID(std::optional<ItemID> itemID, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> toConsumerID,
                            ErrorReply completionHandler) = 0;

  // Posts the system-wide notification of the first unlock; what follows from it comes later. Harmless when it has been posted before.
  virtual void announceFirstUnlockCompletionHandler(ErrorReply completionHandler) = 0;
};

template <>
struct QXProtocolTable<DVAdministration> {
  static constexpr std::string_view name = "DVAdministration";
  static constexpr auto operations = std::tuple{
      QXOperation<&DVAdministration::statusCompletionHandler>{"statusCompletionHandler:"},
      QXOperation<&DVAdministration::grantsOfProviderID>{"grantsOfProviderID:toConsumerID:startingAt:completionHandler:"},
      QXOperation<&DVAdministration::revokeItemID>{"revokeItemID:fromProviderID:toConsumerID:completionHandler:"},
      QXOperation<&DVAdministration::announceFirstUnlockCompletionHandler>{"announceFirstUnlockCompletionHandler:"},
  };
};

}  // namespace docuvend
