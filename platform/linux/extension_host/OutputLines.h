// Cuts a stream of bytes into lines of bounded length.
#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>

namespace docuvend::linux_platform {

class OutputLines {
 public:
  using Sink = std::function<void(const std::string& line)>;

  // What a line has beyond this many bytes is dropped.
  static constexpr std::size_t kLongestLine = 1024;

  explicit OutputLines(Sink sink) : sink_(std::move(sink)) {}

  // Calls the sink for every line that ends in these bytes. Empty lines are dropped. Bytes that are no UTF-8 become "?".
  void add(std::string_view bytes);
  // The stream is over: what is left is a line.
  void finish();

 private:
  // A character of which the length limit has left only the beginning.
  void dropCutCharacter();

  Sink sink_;
  std::string line_;
};

}  // namespace docuvend::linux_platform
