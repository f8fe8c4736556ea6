// Which answers of an extension are due by when.
//
// A value without clock or lock. An extension may do one thing after another, and how many it is asked for at once is not its choice: so
// what it is asked for is awaited in lines. The first of a line has the limit; the next one's begins when the first is answered, so that no
// extension that answers one after another in time is overdue, however long the line. One that answers those that came later and keeps the
// first waiting has the limit and no more: nobody waits for longer than the limit for each of those in the line.
//
// All lines have the same limit, so one timer for all is enough: it is set when a message is sent while it is not set, and looks around
// when it fires. Most messages are answered long before and cost no timer call.
//
// A timer that fires far too late tells that this process has not run meanwhile: it was stopped, or the machine was busy. Then the answers
// may lie here unread, and nobody is blamed before another limit has passed.
#pragma once

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace docuvend::linux_platform {

// What is awaited side by side. Names are all that asks for an identifier or a URL: an application may have any number of them asked at
// once. Neither a setup nor a sign of life waits for them.
enum class AnswerLine { setup, names, signsOfLife };

// That of the operations whose answer must be quick: they ask the extension for something that it knows, not for work. None of the others.
[[nodiscard]] std::optional<AnswerLine> answerLineOf(std::string_view operationName);

class AnswerDeadlines {
 public:
  using Time = std::chrono::steady_clock::time_point;

  explicit AnswerDeadlines(std::chrono::milliseconds limit) : limit_(limit) {}

  struct Message {
    AnswerLine line;
    std::uint64_t number;

    friend bool operator==(const Message&, const Message&) = default;
  };
  struct Sent {
    Message message;
    std::optional<Time> setTimer;  // absent: it is set already
  };
  [[nodiscard]] Sent sent(AnswerLine line, std::string operationName, Time now);
  // Also of one that was answered before.
  void answered(const Message& message, Time now);

  // By which a timer that fires is far too late.
  static constexpr std::chrono::milliseconds kFarTooLate{1'000};

  struct Verdict {
    std::optional<std::string> overdue;  // the operation that was not answered in time
    std::optional<Time> setTimer;        // when nothing is overdue but something is due later
  };
  [[nodiscard]] Verdict timerFired(Time now);

 private:
  struct Line {
    std::map<std::uint64_t, std::string> operationNames;  // in the order of sending
    Time since;                                           // when the first became the first
  };
  // The one whose first is due first; null when nothing is awaited.
  [[nodiscard]] const Line* nextDue() const;

  static constexpr std::size_t kLines = static_cast<std::size_t>(AnswerLine::signsOfLife) + 1;

  std::chrono::milliseconds limit_;
  std::uint64_t last_ = 0;
  std::array<Line, kLines> lines_;
  std::optional<Time> timer_;  // what it is set for
};

}  // namespace docuvend::linux_platform
