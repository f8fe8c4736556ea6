#include "platform/linux/extension_host/AnswerDeadlines.h"

#include <algorithm>
#include <utility>

namespace docuvend::linux_platform {
namespace {

struct LimitedOperation {
  std::string_view name;
  AnswerLine line;
};

constexpr std::array<LimitedOperation, 3> kLimited = {{
    {"_performInitialSetupWithCompletion:", AnswerLine::setup},
    {"_identifierForItemAtURL:completion:", AnswerLine::names},
    {"_URLForItemIdentifier:completion:", AnswerLine::names},
}};

}  // namespace

std::optional<AnswerLine> answerLineOf(std::string_view operationName) {
  const auto* found = std::find_if(kLimited.begin(), kLimited.end(),
                                   [operationName](const LimitedOperation& operation) { return operation.name == operationName; });
  return found == kLimited.end() ? std::nullopt : std::optional(found->line);
}

AnswerDeadlines::Sent AnswerDeadlines::sent(AnswerLine line, std::string operationName, Time now) {
  Sent result{{line, ++last_}, std::nullopt};
  Line& behind = lines_.at(static_cast<std::size_t>(line));
  if (behind.operationNames.empty()) behind.since = now;
  behind.operationNames.emplace(result.message.number, std::move(operationName));
  // Whatever the timer is set for lies no later than this.
  if (!timer_) result.setTimer = timer_ = now + limit_;
  return result;
}

void AnswerDeadlines::answered(const Message& message, Time now) {
  Line& line = lines_.at(static_cast<std::size_t>(message.line));
  const auto found = line.operationNames.find(message.number);
  if (found == line.operationNames.end()) return;
  if (found == line.operationNames.begin()) line.since = now;
  line.operationNames.erase(found);
}

AnswerDeadlines::Verdict AnswerDeadlines::timerFired(Time now) {
  const std::optional<Time> wasSetFor = std::exchange(timer_, std::nullopt);
  const Line* const next = nextDue();
  if (next == nullptr) return {};
  if (next->since + limit_ <= now && wasSetFor && now - *wasSetFor >= kFarTooLate) {
    for (Line& line : lines_) line.since = now;
  }
  const Time due = next->since + limit_;
  if (due <= now) return {next->operationNames.begin()->second, std::nullopt};
  timer_ = due;
  return {std::nullopt, timer_};
}

const AnswerDeadlines::Line* AnswerDeadlines::nextDue() const {
  const Line* next = nullptr;
  for (const Line& line : lines_) {
    if (!line.operationNames.empty() && (next == nullptr || line.since < next->since)) next = &line;
  }
  return next;
}

}  // namespace docuvend::linux_platform
