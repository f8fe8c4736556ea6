#include "platform/linux/files/PropertyListBuilder.h"

#include <algorithm>
#include <array>
#include <utility>

#include "platform/linux/files/property_list_scalars.h"

namespace docuvend::linux_platform {
namespace {

std::string tag(std::string_view name) { return std::string(1, '<').append(name).append(1, '>'); }

// The value of a leaf, or none when its text is not one.
std::optional<QXValue> leafValue(std::string_view name, std::string text) {
  if (name == "string") return QXValue(std::move(text));
  if (name == "true" || name == "false") return text.empty() ? std::optional<QXValue>(name == "true") : std::nullopt;
  if (name == "integer") {
    if (const auto value = integerFromText(text)) return QXValue(*value);
  } else if (name == "real") {
    if (const auto value = realFromText(text)) return QXValue(*value);
  } else if (name == "data") {
    if (auto value = dataFromText(text)) return QXValue(*std::move(value));
  }
  return std::nullopt;
}

}  // namespace

std::optional<PropertyListBuilder::Role> PropertyListBuilder::roleOf(std::string_view name) {
  static constexpr std::array<std::pair<std::string_view, Role>, 10> kRoles = {{
      {"plist", Role::plist},
      {"key", Role::key},
      {"dict", Role::dictionary},
      {"array", Role::array},
      {"string", Role::leaf},
      {"integer", Role::leaf},
      {"real", Role::leaf},
      {"true", Role::leaf},
      {"false", Role::leaf},
      {"data", Role::leaf},
  }};
  const auto found = std::find_if(kRoles.begin(), kRoles.end(), [name](const auto& entry) { return entry.first == name; });
  return found == kRoles.end() ? std::nullopt : std::optional<Role>(found->second);
}

PropertyListBuilder::Refusal PropertyListBuilder::beginElement(std::string_view name) {
  const auto role = roleOf(name);
  if (!role) return tag(name) + " is no element of a property list";
  if (++elements_ > kPropertyListMaximumElements) return "too many elements";
  if (frames_.size() >= kPropertyListMaximumDepth) return "elements are nested too deeply";
  if (frames_.empty()) {
    if (*role != Role::plist) return "the outermost element is not <plist>";
  } else if (auto refusal = mayHold(frames_.back(), *role, name)) {
    return refusal;
  }
  frames_.push_back(Frame{*role, std::string(name), {}, {}, {}, {}, {}});
  return std::nullopt;
}

PropertyListBuilder::Refusal PropertyListBuilder::mayHold(const Frame& parent, Role role, std::string_view name) const {
  if (role == Role::plist || parent.role == Role::leaf || parent.role == Role::key) {
    return tag(name) + " must not stand inside " + tag(parent.name);
  }
  const bool keyIsDue = parent.role == Role::dictionary && !parent.key;
  if (keyIsDue && role != Role::key) return "a value in a <dict> has no <key>";
  if (!keyIsDue && role == Role::key) return "a <key> stands where a value is due";
  if (parent.role == Role::plist && parent.value) return "there is more than one value in <plist>";
  return std::nullopt;
}

PropertyListBuilder::Refusal PropertyListBuilder::attribute(std::string_view name, std::string_view value) {
  const Frame& frame = frames_.back();
  if (frame.role != Role::plist || name != "version") return tag(frame.name) + " has the attribute \"" + std::string(name) + "\"";
  if (value != "1.0") return "this version of property lists is not known";
  return std::nullopt;
}

PropertyListBuilder::Refusal PropertyListBuilder::text(std::string_view text) {
  if (frames_.empty()) return std::nullopt;
  Frame& frame = frames_.back();
  if (frame.role == Role::leaf || frame.role == Role::key) {
    frame.text += text;
    return std::nullopt;
  }
  if (std::all_of(text.begin(), text.end(), isXMLSpace)) return std::nullopt;
  return "there is text between the elements of " + tag(frame.name);
}

PropertyListBuilder::Refusal PropertyListBuilder::endElement() {
  Frame frame = std::move(frames_.back());
  frames_.pop_back();
  switch (frame.role) {
    case Role::plist:
      if (!frame.value) return "there is no value in <plist>";
      value_ = std::move(frame.value);
      break;
    case Role::key:
      return addKey(std::move(frame.text));
    case Role::dictionary:
      if (frame.key) return "the key \"" + *frame.key + "\" has no value";
      addValue(std::move(frame.dictionary));
      break;
    case Role::array:
      addValue(std::move(frame.array));
      break;
    case Role::leaf:
      auto value = leafValue(frame.name, std::move(frame.text));
      if (!value) return "the content of " + tag(frame.name) + " is not one";
      addValue(*std::move(value));
      break;
  }
  return std::nullopt;
}

PropertyListBuilder::Refusal PropertyListBuilder::addKey(std::string key) {
  Frame& parent = frames_.back();
  if (parent.dictionary.contains(key)) return "the key \"" + key + "\" is there twice";
  parent.key = std::move(key);
  return std::nullopt;
}

void PropertyListBuilder::addValue(QXValue value) {
  Frame& parent = frames_.back();
  if (parent.role == Role::dictionary) {
    parent.dictionary.emplace(*std::exchange(parent.key, std::nullopt), std::move(value));
  } else if (parent.role == Role::array) {
    parent.array.push_back(std::move(value));
  } else {
    parent.value = std::move(value);
  }
}

std::optional<QXValue> PropertyListBuilder::takeValue() { return std::exchange(value_, std::nullopt); }

}  // namespace docuvend::linux_platform
