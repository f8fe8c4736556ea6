// What the crowd's files hold: one line for each write that was ever done, and a last line that says how much stands before it. Who sees
// half of a write sees that.
#pragma once

#include <optional>
#include <string>
#include <vector>

namespace docuvend::turntaker {

[[nodiscard]] std::string ledgerText(const std::vector<std::string>& entries);
// None when the text is no whole ledger.
[[nodiscard]] std::optional<std::vector<std::string>> parseLedger(const std::string& text);

}  // namespace docuvend::turntaker
