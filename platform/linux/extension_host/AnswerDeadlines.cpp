#include "platform/linux/extension_host/AnswerDeadlines.h"

#include <algorithm>
#include <array>
#include <utility>

namespace docuvend::linux_platform {
namespace {

constexpr std::array<std::string_view, 3> kLimited = {
    "_performInitialSetupWithCompletion:",
    "_identifierForItemAtURL:completion:",
    "_URLForItemIdentifier:completion:",
};

}  // namespace

bool hasLimitedAnswer(std::string_view operationName) {
  return std::find(kLimited.begin(), kLimited.end(), operationName) != kLimited.end();
}

AnswerDeadlines::Sent AnswerDeadlines::sent(std::string operationName, Time now) {
  Sent result{++last_, std::nullopt};
  const Time due = now + limit_;
  due_.emplace(result.message, Due{std::move(operationName), due});
  if (!timer_) result.setTimer = timer_ = due;
  return result;
}

AnswerDeadlines::Verdict AnswerDeadlines::timerFired(Time now) {
  const std::optional<Time> wasSetFor = std::exchange(timer_, std::nullopt);
  if (due_.empty()) return {};
  const Due& oldest = due_.begin()->second;
  if (oldest.time <= now && wasSetFor && now - *wasSetFor >= kFarTooLate) {
    const auto delay = now + limit_ - oldest.time;
    for (auto& [message, due] : due_) due.time += delay;
  }
  if (oldest.time <= now) return {oldest.operationName, std::nullopt};
  timer_ = oldest.time;
  return {std::nullopt, timer_};
}

}  // namespace docuvend::linux_platform
