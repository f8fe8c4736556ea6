#include "platform/QXValue.h"

#include <array>

namespace docuvend {
namespace {

std::string quoted(std::string_view text) { return std::string(1, '"').append(text).append(1, '"'); }

struct Describer {
  std::string operator()(std::monostate) const { return "(null)"; }
  std::string operator()(bool value) const { return value ? "true" : "false"; }
  std::string operator()(std::int64_t value) const { return std::to_string(value); }
  std::string operator()(double value) const { return std::to_string(value); }
  std::string operator()(const std::string& value) const { return quoted(value); }
  std::string operator()(const QXData& value) const {
    return std::string(1, '<').append(std::to_string(value.bytes.size())).append(" bytes>");
  }
  std::string operator()(const QXURL& value) const { return value.absoluteString(); }
  std::string operator()(const QXUUID& value) const { return value.string(); }
  std::string operator()(const QXError& value) const { return value.description(); }
  std::string operator()(const QXDescriptor&) const { return "<descriptor>"; }
  std::string operator()(const QXArray& value) const {
    std::string text(1, '(');
    for (const QXValue& element : value) text.append(text.size() > 1 ? ", " : "").append(element.description());
    return text.append(1, ')');
  }
  std::string operator()(const QXDictionary& value) const {
    std::string text(1, '{');
    for (const auto& [key, element] : value) {
      text.append(text.size() > 1 ? ", " : "").append(quoted(key)).append(" = ").append(element.description());
    }
    return text.append(1, '}');
  }
};

}  // namespace

std::string_view qxKindName(QXValueKind kind) {
  static constexpr std::array<std::string_view, 12> kNames = {"absent", "boolean", "integer", "real",       "string", "data",
                                                              "URL",    "UUID",    "array",   "dictionary", "error",  "descriptor"};
  return kNames[static_cast<std::size_t>(kind)];
}

std::string QXValue::description() const { return std::visit(Describer{}, storage_); }

}  // namespace docuvend
