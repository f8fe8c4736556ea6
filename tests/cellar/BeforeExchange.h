// Lets a test act in the middle: right before two files change names, wherever this process asks the kernel for that.
#pragma once

#include <cstddef>
#include <functional>
#include <vector>

namespace docuvend::cellar {

// While this lives the first exchange comes after the first action, the second after the second, and so on. There may be only one, and its
// exchanges must be on its thread.
class BeforeExchange {
 public:
  explicit BeforeExchange(std::vector<std::function<void()>> actions);
  ~BeforeExchange();
  BeforeExchange(const BeforeExchange&) = delete;
  BeforeExchange& operator=(const BeforeExchange&) = delete;

  // How many exchanges have been asked for.
  [[nodiscard]] std::size_t count() const { return count_; }
  void exchangeComes();

 private:
  const std::vector<std::function<void()>> actions_;
  std::size_t count_ = 0;
};

}  // namespace docuvend::cellar
