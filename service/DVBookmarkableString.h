// The text that names one item of one provider for longer than its URL lasts: "docuvend:", the provider identifier, "/", the item
// identifier. Nothing in it is escaped; an item identifier may hold slashes, a provider identifier that holds one does not read back.
// docs/bookmarkable-string.md has the grammar.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/identifiers.h"

namespace docuvend {

struct DVBookmarkableString {
  ProviderID providerID;
  ItemID itemID;

  [[nodiscard]] std::string text() const;

  // None unless the text has the prefix, a provider identifier, and an item identifier that does not begin with a slash.
  [[nodiscard]] static std::optional<DVBookmarkableString> parse(std::string_view text);

  friend bool operator==(const DVBookmarkableString&, const DVBookmarkableString&) = default;
};

}  // namespace docuvend
