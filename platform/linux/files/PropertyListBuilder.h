// Makes a value of a property list's elements, given one by one in document order. Knows the list's grammar and nothing of XML.
//
//   plist      = the element "plist" around one value
//   value      = dict | array | string | integer | real | true | false | data
//   dict       = pairs of the element "key" and a value; no key twice
//   array      = values
//
// White space between elements means nothing, other text there is refused. Used on one thread; after a refusal the object is useless.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/QXValue.h"

namespace docuvend::linux_platform {

class PropertyListBuilder {
 public:
  // Why the list is refused, for people; none: it is well so far.
  using Refusal = std::optional<std::string>;

  [[nodiscard]] Refusal beginElement(std::string_view name);
  [[nodiscard]] Refusal attribute(std::string_view name, std::string_view value);  // of the element begun last
  [[nodiscard]] Refusal text(std::string_view text);
  [[nodiscard]] Refusal endElement();

  // The list's value once its last element has ended.
  [[nodiscard]] std::optional<QXValue> takeValue();

 private:
  enum class Role { plist, key, dictionary, array, leaf };
  struct Frame {
    Role role;
    std::string name;
    std::string text;                // of a leaf or a key
    std::optional<QXValue> value;    // of the plist
    QXDictionary dictionary;         // of a dictionary
    std::optional<std::string> key;  // of a dictionary: waits for its value
    QXArray array;                   // of an array
  };

  [[nodiscard]] static std::optional<Role> roleOf(std::string_view name);
  [[nodiscard]] Refusal mayHold(const Frame& parent, Role role, std::string_view name) const;
  [[nodiscard]] Refusal addKey(std::string key);
  void addValue(QXValue value);

  std::vector<Frame> frames_;  // the elements that are open, outermost first
  std::size_t elements_ = 0;
  std::optional<QXValue> value_;
};

}  // namespace docuvend::linux_platform
