#include "platform/linux/launch/policy/ConfinePolicy.h"

#include <array>
#include <charconv>
#include <string_view>
#include <utility>

namespace docuvend::linux_platform {
namespace {

constexpr std::array<std::pair<PathAccess, std::string_view>, 4> kAccessOptions = {{
    {PathAccess::readExecute, "--read-execute"},
    {PathAccess::read, "--read"},
    {PathAccess::readWrite, "--read-write"},
    {PathAccess::device, "--device"},
}};
constexpr std::string_view kDescriptorsOption = "--descriptors";
constexpr std::array<std::pair<std::string_view, std::optional<std::uint64_t> ConfinePolicy::*>, 5> kLimitOptions = {{
    {"--processes", &ConfinePolicy::processes},
    {"--memory", &ConfinePolicy::memory},
    {"--open-files", &ConfinePolicy::openFiles},
    {"--pending-signals", &ConfinePolicy::pendingSignals},
    {"--locked-memory", &ConfinePolicy::lockedMemory},
}};
constexpr std::string_view kLeasesOption = "--leases";
constexpr std::string_view kLeasesTaken = "taken";
constexpr std::string_view kEndOfOptions = "--";
constexpr std::uint64_t kFewestDescriptors = 3;
constexpr std::uint64_t kMostDescriptors = 4;

std::optional<std::uint64_t> parseNumber(const std::string& text) {
  std::uint64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<PathAccess> accessNamed(std::string_view option) {
  for (const auto& [access, name] : kAccessOptions) {
    if (name == option) return access;
  }
  return std::nullopt;
}

// None when all is well, else what is wrong.
std::optional<std::string> takeOption(const std::string& option, const std::string& value, ConfinePolicy& policy) {
  if (const auto access = accessNamed(option)) {
    if (value.empty() || value[0] != '/') return option + " needs an absolute path, not \"" + value + "\"";
    policy.rules.push_back({*access, value});
    return std::nullopt;
  }
  if (option == kLeasesOption) {
    if (value != kLeasesTaken) return option + " cannot be \"" + value + "\"";
    policy.leases = Leases::taken;
    return std::nullopt;
  }
  const auto number = parseNumber(value);
  if (option == kDescriptorsOption) {
    if (!number || *number < kFewestDescriptors || *number > kMostDescriptors) return option + " cannot be \"" + value + "\"";
    policy.descriptors = static_cast<int>(*number);
    return std::nullopt;
  }
  for (const auto& [name, limit] : kLimitOptions) {
    if (option != name) continue;
    if (!number || *number == 0) return option + " cannot be \"" + value + "\"";
    policy.*limit = number;
    return std::nullopt;
  }
  return "unknown option \"" + option + "\"";
}

}  // namespace

std::vector<std::string> confineArguments(const ConfineCommand& command) {
  std::vector<std::string> arguments;
  const auto add = [&arguments](std::string_view option, std::string value) {
    arguments.emplace_back(option);
    arguments.push_back(std::move(value));
  };
  for (const auto& rule : command.policy.rules) {
    for (const auto& [access, name] : kAccessOptions) {
      if (access == rule.access) add(name, rule.path);
    }
  }
  add(kDescriptorsOption, std::to_string(command.policy.descriptors));
  for (const auto& [name, limit] : kLimitOptions) {
    if (const auto& most = command.policy.*limit) add(name, std::to_string(*most));
  }
  if (command.policy.leases == Leases::taken) add(kLeasesOption, std::string(kLeasesTaken));
  arguments.emplace_back(kEndOfOptions);
  arguments.insert(arguments.end(), command.command.begin(), command.command.end());
  return arguments;
}

std::variant<ConfineCommand, std::string> parseConfineArguments(const std::vector<std::string>& arguments) {
  ConfineCommand result;
  bool sawDescriptors = false;
  std::size_t next = 0;
  while (next < arguments.size() && arguments[next] != kEndOfOptions) {
    if (next + 1 == arguments.size()) return "option \"" + arguments[next] + "\" has no value";
    if (auto problem = takeOption(arguments[next], arguments[next + 1], result.policy)) return *problem;
    sawDescriptors = sawDescriptors || arguments[next] == kDescriptorsOption;
    next += 2;
  }
  if (next == arguments.size()) return "no \"--\" before the command";
  if (!sawDescriptors) return std::string(kDescriptorsOption) + " is missing";
  result.command.assign(arguments.begin() + static_cast<std::ptrdiff_t>(next) + 1, arguments.end());
  if (result.command.empty()) return "no command";
  if (result.command[0].empty() || result.command[0][0] != '/') return "the command is not an absolute path";
  return result;
}

}  // namespace docuvend::linux_platform
