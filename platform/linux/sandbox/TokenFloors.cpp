#include "platform/linux/sandbox/TokenFloors.h"

#include <cassert>

namespace docuvend::linux_platform {
namespace {

constexpr std::string_view kHeader = "docuvend-token-floors:2\n";
constexpr std::string_view kNumber = "number:";
constexpr std::string_view kPlaces = "places:";
constexpr std::string_view kFloor = "floor:";

bool skip(std::string_view& text, std::string_view expected) {
  if (!text.starts_with(expected)) return false;
  text.remove_prefix(expected.size());
  return true;
}

// The number that stands before the separator, which goes with it.
std::optional<TokenNumber> numberUntil(std::string_view& text, char separator) {
  const auto end = text.find(separator);
  if (end == std::string_view::npos) return std::nullopt;
  const auto number = tokenNumberFrom(text.substr(0, end));
  text.remove_prefix(end + 1);
  return number;
}

}  // namespace

bool TokenFloors::isGood(std::string_view path, TokenNumber number) const {
  if (number > number_) return false;
  for (auto slash = path.find('/'); slash != std::string_view::npos; slash = path.find('/', slash + 1)) {
    const auto floor = floors_.find(std::string(path.substr(0, slash + 1)));
    if (floor != floors_.end() && number < floor->second) return false;
  }
  return true;
}

void TokenFloors::raise(const std::string& directory) {
  assert(directory.starts_with('/') && directory.ends_with('/'));
  ++number_;
  if (directory.size() > kMaximumTokenPathLength) return;
  // What lies below the directory is cut with it.
  std::erase_if(floors_, [&directory](const auto& floor) { return floor.first.starts_with(directory); });
  floors_[directory] = number_;
  if (floors_.size() > kMaximumDirectories) floors_ = {{std::string(kEverything), number_}};
}

std::string TokenFloors::printed() const {
  std::string text(kHeader);
  text.append(kNumber).append(std::to_string(number_)).append("\n");
  if (places_) {
    text.append(kPlaces);
    appendHex(text, *places_);
    text += '\n';
  }
  for (const auto& [directory, floor] : floors_) {
    text.append(kFloor).append(std::to_string(floor)).append(":").append(escapedPath(directory)).append("\n");
  }
  return text;
}

std::optional<TokenFloors> TokenFloors::parsed(std::string_view text) {
  const std::string_view whole = text;
  TokenFloors result;
  if (!skip(text, kHeader) || !skip(text, kNumber)) return std::nullopt;
  const auto number = numberUntil(text, '\n');
  if (!number) return std::nullopt;
  result.number_ = *number;
  if (skip(text, kPlaces)) {
    const auto end = text.find('\n');
    if (end == std::string_view::npos || !readHex(text.substr(0, end), result.places_.emplace())) return std::nullopt;
    text.remove_prefix(end + 1);
  }
  while (!text.empty()) {
    if (!skip(text, kFloor)) return std::nullopt;
    const auto floor = numberUntil(text, ':');
    const auto end = text.find('\n');
    if (!floor || *floor > result.number_ || end == std::string_view::npos) return std::nullopt;
    const auto directory = pathFrom(text.substr(0, end));
    if (!directory || !directory->ends_with('/')) return std::nullopt;
    result.floors_[*directory] = *floor;
    text.remove_prefix(end + 1);
  }
  // Lines in another order, or two for one directory, are another text for what has one.
  if (result.floors_.size() > kMaximumDirectories || result.printed() != whole) return std::nullopt;
  return result;
}

}  // namespace docuvend::linux_platform
