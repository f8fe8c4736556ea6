#include "tests/messages/catalogue/Catalogue.h"

#include <algorithm>
#include <istream>
#include <ostream>
#include <string_view>
#include <utility>

#include "platform/QXLogMessage.h"

namespace docuvend::tests {
namespace {

using fake_platform::AssertedMessage;

constexpr char kBetweenPlaceAndText = '\t';
constexpr std::string_view kValue = "%@";
constexpr std::string_view kAbsent = "(null)";

std::vector<std::string> piecesOf(const std::string& message) {
  std::vector<std::string> pieces;
  std::size_t from = 0;
  for (std::size_t to = message.find(kValue); to != message.npos; to = message.find(kValue, from)) {
    pieces.push_back(message.substr(from, to - from));
    from = to + kValue.size();
  }
  pieces.push_back(message.substr(from));
  return pieces;
}

std::size_t ownCharacters(const std::string& message) { return message.size() - kValue.size() * (piecesOf(message).size() - 1); }

bool areTelling(const std::vector<std::string>& values) {
  const std::set<std::string> different(values.begin(), values.end());
  return different.size() == values.size() && !different.contains("") && !different.contains(std::string(kAbsent));
}

std::string listed(const std::vector<std::string>& texts, const std::string& start) {
  std::string list;
  for (const std::string& text : texts) list.append("\n    ").append(start).append(text);
  return list;
}

}  // namespace

std::optional<std::vector<std::string>> valuesOf(const std::string& message, const std::string& text) {
  const std::vector<std::string> pieces = piecesOf(message);
  if (pieces.size() == 1) return message == text ? std::optional(std::vector<std::string>()) : std::nullopt;
  const std::string& last = pieces.back();
  if (!text.starts_with(pieces.front()) || !text.ends_with(last) || text.size() < pieces.front().size() + last.size()) return std::nullopt;
  const std::size_t end = text.size() - last.size();
  std::vector<std::string> values;
  std::size_t from = pieces.front().size();
  for (std::size_t i = 1; i < pieces.size(); ++i) {
    const std::size_t to = i + 1 == pieces.size() ? end : text.find(pieces[i], from);
    if (to == text.npos || to > end) return std::nullopt;
    values.push_back(text.substr(from, to - from));
    from = to + pieces[i].size();
  }
  return values;
}

Catalogue Catalogue::from(std::istream& stream) {
  Catalogue catalogue;
  for (std::string line; std::getline(stream, line);) {
    const std::size_t tab = line.find(kBetweenPlaceAndText);
    catalogue.add(line.substr(0, tab), line.substr(tab + 1));
  }
  return catalogue;
}

void Catalogue::write(std::ostream& stream) const {
  for (const auto& [text, places] : messages_) {
    for (const std::string& place : places) stream << place << kBetweenPlaceAndText << text << "\n";
  }
}

void Catalogue::add(const std::string& place, const std::string& text) { messages_[text].push_back(place); }

std::optional<std::string> Catalogue::owner(const std::string& text) const {
  std::optional<std::string> best;
  for (const auto& [message, places] : messages_) {
    if (valuesOf(message, text) && (!best || ownCharacters(message) > ownCharacters(*best))) best = message;
  }
  return best;
}

MessageFindings Catalogue::compare(const std::set<AssertedMessage>& asserted) const {
  MessageFindings findings;
  std::set<std::string> good;
  std::map<std::string, std::vector<std::string>> notTelling;
  for (const AssertedMessage& assertion : asserted) {
    const auto message = owner(assertion.text);
    if (!message) {
      findings.unknown.push_back("no source writes: " + assertion.text);
    } else if (qxTypeOfLevel(*message) != assertion.type) {
      findings.unknown.push_back("at another type than its level's: " + assertion.text);
    } else if (areTelling(*valuesOf(*message, assertion.text))) {
      good.insert(*message);
    } else {
      notTelling[*message].push_back(assertion.text);
    }
  }
  findings.asserted = good.size();
  for (const auto& [message, places] : messages_) {
    if (good.contains(message)) continue;
    findings.unasserted.push_back(message + listed(places, "written by ") + listed(notTelling[message], "asserted only as "));
  }
  return findings;
}

}  // namespace docuvend::tests
