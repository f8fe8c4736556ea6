// Keeps what the look through the bundles had to say. It matters here only when the wanted bundle is not found; the daemon logs the rest.
#pragma once

#include <string>
#include <vector>

#include "platform/log.h"

namespace docuvend {

class HeldLog final : public QXLogHandle {
 public:
  [[nodiscard]] bool isEnabled(QXLogType type) const override { return type == QXLogType::defaultType || type == QXLogType::fault; }
  void write(QXLogType type, const std::string& message) override;

  [[nodiscard]] const std::vector<std::string>& lines() const { return lines_; }

 private:
  std::vector<std::string> lines_;
};

}  // namespace docuvend
