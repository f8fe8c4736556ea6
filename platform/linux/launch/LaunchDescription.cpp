#include "platform/linux/launch/LaunchDescription.h"

#include <sys/random.h>

#include <algorithm>
#include <array>
#include <cstdint>

#include "platform/linux/bundles/BundleIdentifier.h"

namespace docuvend::linux_platform {
namespace {

constexpr std::string_view kHeader = "[Application]\n";
constexpr std::string_view kName = "name=";
constexpr std::string_view kIncarnation = "incarnation=";
constexpr std::string_view kInstance = "instance=";
constexpr std::string_view kKind = "kind=";
constexpr std::string_view kApplication = "application";
constexpr std::string_view kExtension = "extension";
constexpr std::string_view kDigits = "0123456789abcdef";
constexpr std::size_t kInstanceBytes = 16;

bool take(std::string_view& text, std::string_view expected) {
  if (!text.starts_with(expected)) return false;
  text.remove_prefix(expected.size());
  return true;
}

std::optional<std::string> takeLine(std::string_view& text, std::string_view key) {
  if (!take(text, key)) return std::nullopt;
  const std::size_t end = text.find('\n');
  if (end == std::string_view::npos) return std::nullopt;
  std::string value(text.substr(0, end));
  text.remove_prefix(end + 1);
  return value;
}

bool isInstance(std::string_view text) {
  return text.size() == 2 * kInstanceBytes &&
         std::all_of(text.begin(), text.end(), [](char digit) { return kDigits.find(digit) != std::string_view::npos; });
}

bool isIncarnation(std::string_view text) {
  return !text.empty() && std::all_of(text.begin(), text.end(), [](char c) { return (c >= '0' && c <= '9') || c == '.'; });
}

}  // namespace

std::string descriptionText(const LaunchDescription& description) {
  std::string text(kHeader);
  text.append(kName).append(description.bundleIdentifier).append("\n");
  text.append(kIncarnation).append(description.incarnation).append("\n");
  text.append(kInstance).append(description.instance).append("\n");
  text.append(kKind).append(description.kind == LaunchKind::extension ? kExtension : kApplication).append("\n");
  return text;
}

std::optional<LaunchDescription> parseDescription(std::string_view text) {
  if (text.size() > kLongestDescription || !take(text, kHeader)) return std::nullopt;
  auto name = takeLine(text, kName);
  if (!name || !isBundleIdentifier(*name)) return std::nullopt;
  auto incarnation = takeLine(text, kIncarnation);
  if (!incarnation || !isIncarnation(*incarnation)) return std::nullopt;
  auto instance = takeLine(text, kInstance);
  if (!instance || !isInstance(*instance)) return std::nullopt;
  const auto kind = takeLine(text, kKind);
  if (!kind || !text.empty()) return std::nullopt;
  if (*kind != kApplication && *kind != kExtension) return std::nullopt;
  return LaunchDescription{std::move(*name), std::move(*incarnation), std::move(*instance),
                           *kind == kExtension ? LaunchKind::extension : LaunchKind::application};
}

std::optional<std::string> newInstance() {
  std::array<std::uint8_t, kInstanceBytes> bytes{};
  if (::getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) return std::nullopt;
  std::string text;
  for (const std::uint8_t byte : bytes) {
    text.push_back(kDigits[byte >> 4U]);
    text.push_back(kDigits[byte & 0xfU]);
  }
  return text;
}

}  // namespace docuvend::linux_platform
