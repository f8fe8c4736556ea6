#include "service/DVBookmarkableString.h"

namespace docuvend {
namespace {

constexpr std::string_view kPrefix = "docuvend:";
constexpr char kSeparator = '/';

}  // namespace

std::string DVBookmarkableString::text() const { return std::string(kPrefix) + providerID.value + kSeparator + itemID.value; }

std::optional<DVBookmarkableString> DVBookmarkableString::parse(std::string_view text) {
  if (!text.starts_with(kPrefix)) return std::nullopt;
  text.remove_prefix(kPrefix.size());

  const std::size_t end = text.find(kSeparator);
  if (end == std::string_view::npos) return std::nullopt;
  const std::string_view provider = text.substr(0, end);
  const std::string_view item = text.substr(end + 1);
  // Later components of the item may be empty, the first one may not.
  if (provider.empty() || item.empty() || item.front() == kSeparator) return std::nullopt;
  return DVBookmarkableString{ProviderID{std::string(provider)}, ItemID{std::string(item)}};
}

}  // namespace docuvend
