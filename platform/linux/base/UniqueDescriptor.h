// An open file of this process, closed when the object goes.
#pragma once

#include <unistd.h>

#include <memory>
#include <utility>

#include "platform/QXValue.h"

namespace docuvend::linux_platform {

class UniqueDescriptor {
 public:
  UniqueDescriptor() = default;
  explicit UniqueDescriptor(int number) : number_(number) {}
  UniqueDescriptor(UniqueDescriptor&& other) noexcept : number_(std::exchange(other.number_, -1)) {}
  UniqueDescriptor& operator=(UniqueDescriptor&& other) noexcept {
    if (this != &other) reset(std::exchange(other.number_, -1));
    return *this;
  }
  UniqueDescriptor(const UniqueDescriptor&) = delete;
  UniqueDescriptor& operator=(const UniqueDescriptor&) = delete;
  ~UniqueDescriptor() { reset(); }

  [[nodiscard]] int get() const { return number_; }
  [[nodiscard]] explicit operator bool() const { return number_ >= 0; }
  [[nodiscard]] int release() { return std::exchange(number_, -1); }
  void reset(int number = -1) {
    if (number_ >= 0) ::close(number_);
    number_ = number;
  }

 private:
  int number_ = -1;
};

// The same file as a value that can cross the seam.
[[nodiscard]] inline QXDescriptor toValue(UniqueDescriptor descriptor) {
  const int number = descriptor.get();
  return {number, std::make_shared<UniqueDescriptor>(std::move(descriptor))};
}

}  // namespace docuvend::linux_platform
