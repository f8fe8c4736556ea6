// JSON objects as text.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace docuvend::ctl {

// The text in quotes, on one line. Each byte that belongs to no well-formed UTF-8 becomes the replacement character.
[[nodiscard]] std::string jsonString(std::string_view text);

// Its members stand in the order in which they were added; no name is to be added twice.
class JSONObject {
 public:
  void add(std::string_view name, std::string_view value) { addRaw(name, jsonString(value)); }
  void add(std::string_view name, std::int64_t value) { addRaw(name, std::to_string(value)); }
  void add(std::string_view name, const JSONObject& value) { addRaw(name, value.text()); }

  [[nodiscard]] std::string text() const { return "{" + members_ + "}"; }

 private:
  void addRaw(std::string_view name, const std::string& value);
  std::string members_;
};

}  // namespace docuvend::ctl
