// Which answers of an extension are due by when.
//
// A value without clock or lock. All limited answers have the same limit, so the oldest message is always due first, and one timer for all
// is enough: it is set when a message is sent while it is not set, and looks around when it fires. Most messages are answered long before
// and cost no timer call.
//
// A timer that fires far too late tells that this process has not run meanwhile: it was stopped, or the machine was busy. Then the answers
// may lie here unread, and nobody is blamed before another limit has passed.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace docuvend::linux_platform {

// True for the operations whose answer must be quick: they ask the extension for something that it knows, not for work.
[[nodiscard]] bool hasLimitedAnswer(std::string_view operationName);

class AnswerDeadlines {
 public:
  using Time = std::chrono::steady_clock::time_point;
  using Message = std::uint64_t;

  explicit AnswerDeadlines(std::chrono::milliseconds limit) : limit_(limit) {}

  struct Sent {
    Message message;
    std::optional<Time> setTimer;  // absent: it is set already
  };
  [[nodiscard]] Sent sent(std::string operationName, Time now);
  void answered(Message message) { due_.erase(message); }

  // By which a timer that fires is far too late.
  static constexpr std::chrono::milliseconds kFarTooLate{1'000};

  struct Verdict {
    std::optional<std::string> overdue;  // the operation that was not answered in time
    std::optional<Time> setTimer;        // when nothing is overdue but something is due later
  };
  [[nodiscard]] Verdict timerFired(Time now);

 private:
  struct Due {
    std::string operationName;
    Time time;
  };

  std::chrono::milliseconds limit_;
  Message last_ = 0;
  std::map<Message, Due> due_;  // in the order of sending, so in the order of time
  std::optional<Time> timer_;   // what it is set for
};

}  // namespace docuvend::linux_platform
