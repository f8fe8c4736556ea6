#include "tools/docuvendctl/TerminalText.h"

#include <algorithm>
#include <cctype>
#include <numeric>

#include "platform/linux/log/LogText.h"
#include "tools/docuvendctl/FlatRecord.h"
#include "tools/docuvendctl/TextWidth.h"

namespace docuvend::ctl {
namespace {

using linux_platform::visibleText;

constexpr std::size_t kGap = 2;
// Columns are not shortened below this; a terminal that is narrower still folds the lines.
constexpr std::size_t kNarrowestColumn = 8;

using Row = std::vector<std::string>;

std::string heading(const std::string& column) {
  std::string text = visibleText(column);
  for (char& c : text) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
  return text;
}

std::vector<Row> visibleRows(const List& list) {
  std::vector<Row> rows;
  for (const auto& values : list.rows) {
    Row& row = rows.emplace_back();
    for (const QXValue& value : values) row.push_back(visibleText(scalarText(value)));
  }
  return rows;
}

std::vector<std::size_t> widthsOf(const std::vector<Row>& rows) {
  std::vector<std::size_t> widths;
  for (const Row& row : rows) {
    widths.resize(std::max(widths.size(), row.size()));
    for (std::size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], textWidth(row[i]));
  }
  return widths;
}

// Takes from the widest column, one by one, until all fit.
void narrow(std::vector<std::size_t>& widths, std::size_t room) {
  if (widths.empty()) return;
  std::size_t total = std::accumulate(widths.begin(), widths.end(), kGap * (widths.size() - 1));
  for (; total > room; --total) {
    const auto widest = std::max_element(widths.begin(), widths.end());
    if (*widest <= kNarrowestColumn) return;
    --*widest;
  }
}

std::string line(const Row& row, const std::vector<std::size_t>& widths) {
  std::string text;
  for (std::size_t i = 0; i < row.size(); ++i) {
    const std::string cell = cutToWidth(row[i], widths[i]);
    // Nothing stands behind the last one, so it needs no filling.
    text += i + 1 == row.size() ? cell : filledToWidth(cell, widths[i] + kGap);
  }
  return text + "\n";
}

std::string table(const List& list, std::size_t room) {
  std::vector<Row> rows = visibleRows(list);
  Row& head = *rows.emplace(rows.begin());
  for (const std::string& column : list.columns) head.push_back(heading(column));
  auto widths = widthsOf(rows);
  narrow(widths, room);
  std::string text;
  for (const Row& row : rows) text += line(row, widths);
  return text;
}

// The name stands before a field's first line only.
std::string fieldText(const std::string& name, std::size_t nameWidth, const Record::Value& value) {
  std::vector<Row> rows;
  if (const auto* list = std::get_if<List>(&value)) {
    rows = visibleRows(*list);
    if (rows.empty()) rows = {{"none"}};
  } else {
    rows = {{visibleText(scalarText(std::get<QXValue>(value)))}};
  }
  const auto widths = widthsOf(rows);
  std::string text;
  for (const Row& row : rows) text += filledToWidth(text.empty() ? name : std::string(), nameWidth + kGap) + line(row, widths);
  return text;
}

struct Terminal {
  std::size_t width;

  std::string operator()(const Nothing&) const { return {}; }
  std::string operator()(const Line& line) const { return visibleText(line.text) + "\n"; }
  std::string operator()(const Page& page) const { return page.text; }
  std::string operator()(const Contents&) const { return {}; }
  std::string operator()(const List& list) const { return table(list, width); }
  std::string operator()(const Report& report) const { return table(report.list, width); }
  std::string operator()(const Record& record) const {
    const Record flat = flattened(record);
    std::size_t nameWidth = 0;
    for (const auto& field : flat.fields) nameWidth = std::max(nameWidth, textWidth(visibleText(field.first)));
    std::string text;
    for (const auto& [name, value] : flat.fields) text += fieldText(visibleText(name), nameWidth, value);
    return text;
  }
};

}  // namespace

std::string terminalText(const Answer& answer, std::size_t width) { return std::visit(Terminal{width}, answer); }

}  // namespace docuvend::ctl
