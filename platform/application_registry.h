// What is installed, and who is calling.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/QXURL.h"
#include "platform/QXValue.h"
#include "platform/rpc.h"

namespace docuvend {

// One installed extension as the registry knew it when it was asked.
class QXApplicationRecord {
 public:
  QXApplicationRecord(QXDictionary infoPlist, std::map<std::string, QXURL, std::less<>> groupContainers)
      : infoPlist_(std::move(infoPlist)), groupContainers_(std::move(groupContainers)) {}

  // The value of a top-level key of Info.plist when it is a dictionary, else null.
  [[nodiscard]] const QXDictionary* infoDictionaryForKey(std::string_view key) const { return qxFind<QXDictionary>(infoPlist_, key); }
  // Group identifier to container directory, for the groups that the bundle belongs to.
  [[nodiscard]] const std::map<std::string, QXURL, std::less<>>& groupContainers() const { return groupContainers_; }

 private:
  QXDictionary infoPlist_;
  std::map<std::string, QXURL, std::less<>> groupContainers_;
};

class QXApplicationRegistry {
 public:
  QXApplicationRegistry() = default;
  QXApplicationRegistry(const QXApplicationRegistry&) = delete;
  QXApplicationRegistry& operator=(const QXApplicationRegistry&) = delete;
  virtual ~QXApplicationRegistry() = default;

  // None for a process that belongs to no bundle, for one that is gone, and for the zero token.
  [[nodiscard]] virtual std::optional<std::string> bundleIdentifierForAuditToken(const QXAuditToken& token) = 0;
  // None when no such bundle is installed.
  [[nodiscard]] virtual std::optional<QXApplicationRecord> recordForIdentifier(const std::string& identifier) = 0;
};

}  // namespace docuvend
