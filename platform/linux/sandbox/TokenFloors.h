// Which tokens of a session are still good.
//
// A token carries the number that was current when it was issued. A cut raises that number and makes it the floor of a directory: below
// the directory, only tokens with at least that number are good. A directory is an absolute path with a final slash, free of links; "/"
// is the one that holds everything. With the floors goes a fingerprint of the places that the tokens may be for, by which a process that
// goes on with the session tells whether they are still the same. A pure value; its text is the body of the file that docs/tokens.md
// describes.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/sandbox/TokenText.h"

namespace docuvend::linux_platform {

class TokenFloors {
 public:
  using Fingerprint = std::array<std::uint8_t, 32>;

  // One directory more, and a single floor for everything takes the place of all.
  static constexpr std::size_t kMaximumDirectories = 64;
  static constexpr std::string_view kEverything = "/";
  // No text is longer.
  static constexpr std::size_t kMaximumTextLength = 160 + kMaximumDirectories * (3 * kMaximumTokenPathLength + 32);

  // What new tokens get.
  [[nodiscard]] TokenNumber number() const { return number_; }
  // The path is absolute, without a final slash. A number that was never given out is not good.
  [[nodiscard]] bool isGood(std::string_view path, TokenNumber number) const;
  // No token for a path below the directory is good that has a number given out until now. A directory whose path is longer than a
  // token's may be holds nothing that has a token.
  void raise(const std::string& directory);

  // None as long as nobody has said.
  [[nodiscard]] const std::optional<Fingerprint>& places() const { return places_; }
  void setPlaces(const Fingerprint& places) { places_ = places; }

  [[nodiscard]] std::string printed() const;
  // None unless it is what `printed` gives.
  [[nodiscard]] static std::optional<TokenFloors> parsed(std::string_view text);

  friend bool operator==(const TokenFloors&, const TokenFloors&) = default;

 private:
  TokenNumber number_ = 1;
  std::optional<Fingerprint> places_;
  std::map<std::string, TokenNumber> floors_;  // by directory; none is higher than number_
};

}  // namespace docuvend::linux_platform
