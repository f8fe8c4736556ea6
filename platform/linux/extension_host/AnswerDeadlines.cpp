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
  if (!timerIsSet_) result.setTimer = due;
  timerIsSet_ = true;
  return result;
}

AnswerDeadlines::Verdict AnswerDeadlines::timerFired(Time now) {
  timerIsSet_ = false;
  if (due_.empty()) return {};
  const Due& oldest = due_.begin()->second;
  if (oldest.time <= now) return {oldest.operationName, std::nullopt};
  timerIsSet_ = true;
  return {std::nullopt, oldest.time};
}

}  // namespace docuvend::linux_platform
