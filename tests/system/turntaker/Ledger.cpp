#include "tests/system/turntaker/Ledger.h"

#include <cstdint>
#include <fstream>
#include <sstream>
#include <utility>

namespace docuvend::turntaker {
namespace {

// FNV-1a: any change shows.
std::string lastLine(const std::string& body) {
  std::uint64_t sum = 0xcbf29ce484222325U;
  for (const char character : body) sum = (sum ^ static_cast<unsigned char>(character)) * 0x100000001b3U;
  return "sum " + std::to_string(sum) + " of " + std::to_string(body.size()) + "\n";
}

}  // namespace

std::string contentsOf(const std::string& path) {
  const std::ifstream file(path, std::ios::binary);
  std::ostringstream contents;
  contents << file.rdbuf();
  return std::move(contents).str();
}

std::string ledgerText(const std::vector<std::string>& entries) {
  std::string body;
  for (const std::string& entry : entries) body.append(entry).append("\n");
  return body + lastLine(body);
}

std::optional<std::vector<std::string>> parseLedger(const std::string& text) {
  if (text.size() < 2 || text.back() != '\n') return std::nullopt;
  const std::size_t before = text.rfind('\n', text.size() - 2);
  const std::size_t last = before == std::string::npos ? 0 : before + 1;
  const std::string body = text.substr(0, last);
  if (text.substr(last) != lastLine(body)) return std::nullopt;
  std::vector<std::string> entries;
  std::istringstream lines(body);
  for (std::string line; std::getline(lines, line);) entries.push_back(line);
  return entries;
}

}  // namespace docuvend::turntaker
