// What the crowd's files hold: one line for each write that was ever done, and a last line that says how much stands before it. Who sees
// half of a write sees that.
#pragma once

#include <optional>
#include <string>
#include <vector>

namespace docuvend::turntaker {

// All that a file holds, and nothing when there is none.
[[nodiscard]] std::string contentsOf(const std::string& path);
[[nodiscard]] std::string ledgerText(const std::vector<std::string>& entries);
// None when the text is no whole ledger.
[[nodiscard]] std::optional<std::vector<std::string>> parseLedger(const std::string& text);

}  // namespace docuvend::turntaker
