#include "tools/docuvendctl/ProcessPrivileges.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string_view>
#include <system_error>

namespace docuvend::ctl {
namespace {

constexpr int kDecimal = 10;
constexpr int kHexadecimal = 16;

// What stands on the line that begins with that name, up to the first white space.
std::string_view fieldOf(std::string_view text, const std::string& name) {
  std::size_t at = text.find("\n" + name + ":\t");
  if (at == std::string_view::npos) return {};
  at += name.size() + 3;
  return text.substr(at, text.find_first_of("\t\n", at) - at);
}

std::optional<std::uint64_t> numberOf(std::string_view text, const std::string& name, int base) {
  const std::string_view field = fieldOf(text, name);
  std::uint64_t number = 0;
  const auto [stopped, error] = std::from_chars(field.begin(), field.end(), number, base);
  if (field.empty() || error != std::errc{} || stopped != field.end()) return std::nullopt;
  return number;
}

std::optional<bool> hasCapabilitiesIn(std::string_view text) {
  // What it has, and what it may take: the bounding set is of no use to who cannot gain privileges.
  bool hasSome = false;
  for (const char* set : {"CapInh", "CapPrm", "CapEff", "CapAmb"}) {
    const auto bits = numberOf(text, set, kHexadecimal);
    if (!bits) return std::nullopt;
    hasSome = hasSome || *bits != 0;
  }
  return hasSome;
}

}  // namespace

std::optional<ProcessPrivileges> parsePrivileges(const std::string& text) {
  const auto noNewPrivileges = numberOf(text, "NoNewPrivs", kDecimal);
  const auto user = numberOf(text, "Uid", kDecimal);
  const auto hasCapabilities = hasCapabilitiesIn(text);
  if (!noNewPrivileges || !user || !hasCapabilities) return std::nullopt;
  ProcessPrivileges privileges;
  privileges.hasNoNewPrivileges = *noNewPrivileges != 0;
  privileges.hasCapabilities = *hasCapabilities;
  privileges.isRoot = *user == 0;
  return privileges;
}

std::optional<ProcessPrivileges> privilegesOf(std::int64_t process) {
  const std::string directory = "/proc/" + std::to_string(process);
  std::ifstream file(directory + "/status");
  auto privileges = parsePrivileges({std::istreambuf_iterator<char>(file), {}});
  if (!privileges) return std::nullopt;
  std::error_code error;
  const auto its = std::filesystem::read_symlink(directory + "/ns/user", error);
  if (error) return std::nullopt;
  privileges->isInThisUserNamespace = its == std::filesystem::read_symlink("/proc/self/ns/user", error);
  return privileges;
}

}  // namespace docuvend::ctl
