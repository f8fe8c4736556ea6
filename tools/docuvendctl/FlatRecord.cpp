#include "tools/docuvendctl/FlatRecord.h"

#include <cstddef>
#include <utility>
#include <variant>

namespace docuvend::ctl {
namespace {

bool isContainer(const QXValue& value) { return value.kind() == QXValueKind::array || value.kind() == QXValueKind::dictionary; }

class Flattening {
 public:
  void add(const std::string& name, const QXValue& value) {
    if (const auto* dictionary = value.as<QXDictionary>()) {
      for (const auto& [key, inner] : *dictionary) add(name + "." + key, inner);
    } else if (const auto* array = value.as<QXArray>()) {
      add(name, *array);
    } else {
      record_.fields.emplace_back(name, QXValue(scalarText(value)));
    }
  }
  void add(const std::string& name, const List& list) {
    List texts{list.columns, {}};
    for (const auto& row : list.rows) {
      auto& cells = texts.rows.emplace_back();
      for (const QXValue& value : row) cells.emplace_back(scalarText(value));
    }
    record_.fields.emplace_back(name, std::move(texts));
  }
  Record result() { return std::move(record_); }

 private:
  // Values together, containers numbered from 1.
  void add(const std::string& name, const QXArray& array) {
    List values{{""}, {}};
    for (const QXValue& value : array) {
      if (!isContainer(value)) values.rows.push_back({QXValue(scalarText(value))});
    }
    if (!values.rows.empty()) record_.fields.emplace_back(name, std::move(values));
    std::size_t number = 0;
    for (const QXValue& value : array) {
      ++number;
      if (isContainer(value)) add(name + "." + std::to_string(number), value);
    }
  }

  Record record_;
};

}  // namespace

Record flattened(const Record& record) {
  Flattening flattening;
  for (const auto& field : record.fields) {
    std::visit([&](const auto& value) { flattening.add(field.first, value); }, field.second);
  }
  return flattening.result();
}

std::string scalarText(const QXValue& value) {
  if (value.isAbsent()) return "unknown";
  if (const auto* text = value.as<std::string>()) return *text;
  if (const auto* boolean = value.as<bool>()) return *boolean ? "true" : "false";
  if (const auto* url = value.as<QXURL>()) return url->absoluteString();
  return value.description();
}

}  // namespace docuvend::ctl
