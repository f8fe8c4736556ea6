#include "tests/system/asker/Turns.h"

#include <thread>
#include <utility>

namespace docuvend::asker {
namespace {

constexpr auto kPatience = std::chrono::seconds(60);
constexpr auto kBetweenLooks = std::chrono::milliseconds(2);
constexpr const char* kNoTurn = "no turn";

}  // namespace

std::optional<std::string> Turns::perform(const std::string& verb, Words& words) {
  if (verb == "bring") return bring(words.next());
  if (verb == "bring-sibling") return bringSibling(words.next());
  if (verb == "reading") return take(CoordinationKind::reading, words.nextURL());
  if (verb == "writing") return take(CoordinationKind::writing, words.nextURL());
  if (verb == "end") return end();
  if (verb == "lost") return awaitLoss();
  if (verb == "holders") return holders(words.nextURL());
  if (verb != "within") return std::nullopt;
  deadline_ = std::chrono::milliseconds(std::stoi(words.next()));
  return "ok";
}

std::string Turns::bring(const std::string& string) {
  const auto resolved = consumer_.documentURL(string);
  if (const auto* error = std::get_if<QXError>(&resolved)) return text(*error);
  options_.token = std::get<Document>(resolved).itemToken;
  return std::get<Document>(resolved).url.absoluteString();
}

std::string Turns::bringSibling(const std::string& string) {
  const auto resolved = consumer_.documentURL(string);
  if (const auto* error = std::get_if<QXError>(&resolved)) return text(*error);
  const auto& document = std::get<Document>(resolved);
  options_.token = document.siblingToken;
  return document.siblingURL ? document.siblingURL->absoluteString() : "no sibling";
}

std::string Turns::take(CoordinationKind kind, const QXURL& url) {
  Consumer within = consumer_.within(deadline_);
  auto turn = kind == CoordinationKind::reading ? within.coordinateReading(url, options_) : within.coordinateWriting(url, options_);
  if (const auto* error = std::get_if<QXError>(&turn)) return text(*error);
  turns_.push_back(std::get<CoordinatedAccess>(std::move(turn)));
  return "ok";
}

std::string Turns::end() {
  if (turns_.empty()) return kNoTurn;
  const Failure failure = turns_.back().end();
  turns_.pop_back();
  return text(failure);
}

std::string Turns::awaitLoss() {
  if (turns_.empty()) return kNoTurn;
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (turns_.back().isHeld()) {
    if (std::chrono::steady_clock::now() > deadline) return "in vain";
    std::this_thread::sleep_for(kBetweenLooks);
  }
  return "ok";
}

std::string Turns::holders(const QXURL& url) {
  const auto result = consumer_.holders(url, options_.token);
  if (const auto* error = std::get_if<QXError>(&result)) return text(*error);
  std::string line;
  for (const FileHolder& holder : std::get<std::vector<FileHolder>>(result)) {
    if (!line.empty()) line += ", ";
    line.append(nameOf(holder.kind)).append(" ").append(nameOf(holder.state));
    if (holder.isOwnProcess) line += " own";
    if (holder.processIdentifier) line.append(" process");
    if (holder.bundleIdentifier) line.append(" ").append(holder.bundleIdentifier->value);
  }
  return line.empty() ? "nobody" : line;
}

}  // namespace docuvend::asker
