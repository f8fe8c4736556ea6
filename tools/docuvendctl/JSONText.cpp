#include "tools/docuvendctl/JSONText.h"

#include <nlohmann/json.hpp>
#include <string>

#include "tools/docuvendctl/FlatRecord.h"

namespace docuvend::ctl {
namespace {

using JSON = nlohmann::ordered_json;

// Bytes that are no UTF-8 become the replacement character.
std::string oneLine(const JSON& value) { return value.dump(/*indent=*/-1, ' ', /*ensure_ascii=*/false, JSON::error_handler_t::replace); }

JSON jsonOf(const QXError& error) { return {{"domain", error.domain}, {"code", error.code}, {"description", error.description()}}; }

JSON jsonOf(const QXValue& value) {
  switch (value.kind()) {
    case QXValueKind::absent:
    case QXValueKind::descriptor:
      return nullptr;
    case QXValueKind::boolean:
      return *value.as<bool>();
    case QXValueKind::integer:
      return *value.as<std::int64_t>();
    case QXValueKind::real:
      return *value.as<double>();
    case QXValueKind::array: {
      JSON array = JSON::array();
      for (const QXValue& element : *value.as<QXArray>()) array.push_back(jsonOf(element));
      return array;
    }
    case QXValueKind::dictionary: {
      JSON object = JSON::object();
      for (const auto& [key, element] : *value.as<QXDictionary>()) object[key] = jsonOf(element);
      return object;
    }
    case QXValueKind::error:
      return jsonOf(*value.as<QXError>());
    case QXValueKind::string:
    case QXValueKind::data:
    case QXValueKind::url:
    case QXValueKind::uuid:
      return scalarText(value);
  }
  return nullptr;
}

JSON jsonOf(const List& list) {
  JSON array = JSON::array();
  for (const auto& row : list.rows) {
    JSON object = JSON::object();
    for (std::size_t i = 0; i < row.size(); ++i) object[list.columns[i]] = jsonOf(row[i]);
    array.push_back(std::move(object));
  }
  return array;
}

struct AsJSON {
  JSON operator()(const Nothing&) const { return JSON::object(); }
  JSON operator()(const Line& line) const { return {{line.name, line.text}}; }
  JSON operator()(const Page& page) const { return {{page.name, page.text}}; }
  JSON operator()(const Contents& contents) const { return {{"url", contents.url.absoluteString()}}; }
  JSON operator()(const List& list) const { return jsonOf(list); }
  JSON operator()(const Report& report) const { return jsonOf(report.list); }
  JSON operator()(const Record& record) const {
    JSON object = JSON::object();
    for (const auto& [name, value] : record.fields) {
      object[name] = std::visit([](const auto& inner) { return jsonOf(inner); }, value);
    }
    return object;
  }
};

}  // namespace

std::string jsonText(const Answer& answer) { return oneLine(std::visit(AsJSON{}, answer)) + "\n"; }

std::string jsonText(const QXError& error) { return oneLine(JSON{{"error", jsonOf(error)}}) + "\n"; }

std::string jsonString(const std::string& text) { return oneLine(JSON(text)); }

}  // namespace docuvend::ctl
