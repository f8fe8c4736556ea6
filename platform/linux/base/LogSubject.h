// Whom what a thread does right now is for, so that the log can keep one peer's lines from drowning those of others.
//
// A subject is set for as long as a scope lasts and follows the work: handlers and tasks that begin elsewhere are given it by `carrying`.
// Without one, work is the system's own.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <utility>

namespace docuvend::linux_platform {

class LogSubject {
 public:
  using Name = std::shared_ptr<const std::string>;  // null: nobody in particular

  explicit LogSubject(Name name) : name_(std::move(name)), outer_(std::exchange(innermost, this)) {}
  LogSubject(const LogSubject&) = delete;
  LogSubject& operator=(const LogSubject&) = delete;
  ~LogSubject() { innermost = outer_; }

  // This thread's.
  [[nodiscard]] static Name current() { return innermost == nullptr ? nullptr : innermost->name_; }

  // The same function, which will run for whom this thread is at work now.
  template <class... As>
  [[nodiscard]] static std::function<void(As...)> carrying(std::function<void(As...)> function) {
    auto name = current();
    if (!name || !function) return function;
    return [name = std::move(name), function = std::move(function)](As... values) {
      const LogSubject subject(name);
      function(std::forward<As>(values)...);
    };
  }

 private:
  // Has no destructor, so it may be used as long as the thread runs.
  static inline thread_local const LogSubject* innermost = nullptr;

  const Name name_;
  const LogSubject* const outer_;
};

}  // namespace docuvend::linux_platform
