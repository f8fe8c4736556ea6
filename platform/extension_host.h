// Installed extensions, and conversations with their processes.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/QXError.h"
#include "platform/QXUUID.h"
#include "platform/rpc.h"

namespace docuvend {

// The attribute that names an extension point, in a match and in a bundle's "QXExtension" dictionary.
inline constexpr std::string_view kQXExtensionPointName = "QXExtensionPointName";

// This process's side of one request.
class QXExtensionContext {
 public:
  QXExtensionContext() = default;
  QXExtensionContext(const QXExtensionContext&) = delete;
  QXExtensionContext& operator=(const QXExtensionContext&) = delete;
  virtual ~QXExtensionContext() = default;

  // The connection to the extension's process. URLs in its replies come under their straight names.
  [[nodiscard]] virtual std::shared_ptr<QXRpcConnection> auxiliaryConnection() = 0;
};

// One installed extension. An update of its bundle makes a new object that is not equal to the old one.
class QXExtension {
 public:
  // The request's identifier, or why there is none: one of the two is present. Runs on a thread of the extension host, or inside the call
  // when there is nothing to wait for.
  using BeginCompletion = std::function<void(std::optional<QXUUID> request, std::optional<QXError> error)>;

  QXExtension() = default;
  QXExtension(const QXExtension&) = delete;
  QXExtension& operator=(const QXExtension&) = delete;
  virtual ~QXExtension() = default;

  // The bundle identifier.
  [[nodiscard]] virtual std::optional<std::string> identifier() const = 0;
  [[nodiscard]] virtual std::string description() const = 0;
  [[nodiscard]] virtual bool isEqual(const QXExtension& other) const = 0;

  // Starts the extension's process or reaches the running one. No input items.
  virtual void beginExtensionRequest(BeginCompletion completion) = 0;
  // Unknown identifiers are ignored. A request of which a message failed has ended by itself.
  virtual void cancelExtensionRequest(const QXUUID& request) = 0;
  // None when the request is unknown, or its process is gone.
  [[nodiscard]] virtual std::shared_ptr<QXExtensionContext> extensionContextForRequest(const QXUUID& request) = 0;
};

// The protocols that an extension point's conversations speak.
struct QXExtensionContextClass {
  const QXRpcInterface& hostInterface;    // offered to the extension
  const QXRpcInterface& vendorInterface;  // offered by the extension
};

// Keeps a match going; dropping it ends the match.
class QXExtensionMatch {
 public:
  QXExtensionMatch() = default;
  QXExtensionMatch(const QXExtensionMatch&) = delete;
  QXExtensionMatch& operator=(const QXExtensionMatch&) = delete;
  virtual ~QXExtensionMatch() = default;
};

class QXExtensionHost {
 public:
  using Attributes = std::map<std::string, std::string, std::less<>>;
  using MatchHandler = std::function<void(std::vector<std::shared_ptr<QXExtension>> extensions, std::optional<QXError> error)>;

  QXExtensionHost() = default;
  QXExtensionHost(const QXExtensionHost&) = delete;
  QXExtensionHost& operator=(const QXExtensionHost&) = delete;
  virtual ~QXExtensionHost() = default;

  // Calls the handler with all installed extensions that have every attribute: once with the present set, then again each time the set
  // changes. Changes that come while a call runs may be reported as one, or not at all when they cancel out. Never inside this call; one
  // call at a time.
  [[nodiscard]] virtual std::unique_ptr<QXExtensionMatch> beginMatching(Attributes attributes, QXExtensionContextClass contextClass,
                                                                        MatchHandler handler) = 0;
};

}  // namespace docuvend
