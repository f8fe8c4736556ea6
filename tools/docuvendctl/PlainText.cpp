#include "tools/docuvendctl/PlainText.h"

#include "tools/docuvendctl/FlatRecord.h"

namespace docuvend::ctl {
namespace {

std::string escaped(const std::string& text) {
  std::string result;
  for (const char c : text) {
    switch (c) {
      case '\\':
        result += "\\\\";
        break;
      case '\t':
        result += "\\t";
        break;
      case '\n':
        result += "\\n";
        break;
      case '\r':
        result += "\\r";
        break;
      default:
        result += c;
    }
  }
  return result;
}

std::string rowText(const std::vector<QXValue>& row) {
  std::string text;
  for (const QXValue& value : row) {
    if (&value != &row.front()) text += "\t";
    text += escaped(scalarText(value));
  }
  return text + "\n";
}

struct Plain {
  std::string operator()(const Nothing&) const { return {}; }
  std::string operator()(const Line& line) const { return line.text + "\n"; }
  std::string operator()(const Page& page) const { return page.text; }
  std::string operator()(const Contents&) const { return {}; }
  std::string operator()(const List& list) const {
    std::string text;
    for (const auto& row : list.rows) text += rowText(row);
    return text;
  }
  std::string operator()(const Report& report) const { return (*this)(report.list); }
  std::string operator()(const Record& record) const {
    std::string text;
    for (const auto& [name, value] : flattened(record).fields) {
      const std::string beginning = escaped(name) + "\t";
      if (const auto* list = std::get_if<List>(&value)) {
        for (const auto& row : list->rows) text.append(beginning).append(rowText(row));
      } else {
        text.append(beginning).append(rowText({std::get<QXValue>(value)}));
      }
    }
    return text;
  }
};

}  // namespace

std::string plainText(const Answer& answer) { return std::visit(Plain{}, answer); }

}  // namespace docuvend::ctl
