// Installed bundles and callers, as a test says they are.
//
// Differs from the real registry: nothing is read from disk and no process is looked at; a token names whom the test said, also the zero
// token if the test gave it a bundle. It may be used from any thread, and counts how often it was asked.
#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>

#include "platform/application_registry.h"

namespace docuvend::fake_platform {

class FakeApplicationRegistry : public QXApplicationRegistry {
 public:
  using GroupContainers = std::map<std::string, QXURL, std::less<>>;

  [[nodiscard]] std::optional<std::string> bundleIdentifierForAuditToken(const QXAuditToken& token) override;
  [[nodiscard]] std::optional<QXApplicationRecord> recordForIdentifier(const std::string& identifier) override;

  void setRecord(const std::string& identifier, QXDictionary infoPlist, GroupContainers groupContainers);
  // A record such as a well-formed provider has: its group's container is the directory at that path.
  void setProviderRecord(const std::string& identifier, const std::string& group, const std::string& containerPath);
  void removeRecord(const std::string& identifier);
  void setBundleIdentifier(const QXAuditToken& token, std::string bundleIdentifier);
  void removeBundleIdentifier(const QXAuditToken& token);

  [[nodiscard]] int recordQueryCount() const;
  [[nodiscard]] int tokenQueryCount() const;

  // A token that differs for each number; 0 gives the zero token.
  [[nodiscard]] static QXAuditToken token(std::uint8_t number);

 private:
  mutable std::mutex mutex_;  // guards all below
  std::map<std::string, QXApplicationRecord, std::less<>> records_;
  std::map<QXAuditToken, std::string> bundleIdentifiers_;
  int recordQueries_ = 0;
  int tokenQueries_ = 0;
};

}  // namespace docuvend::fake_platform
