// Reads an open file as a standard stream. A read that fails sets the stream's bad bit, so that it is not taken for the file's end; so it
// is from the start when there is no descriptor.
#pragma once

#include <array>
#include <istream>
#include <streambuf>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

class DescriptorStream : public std::istream {
 public:
  explicit DescriptorStream(UniqueDescriptor descriptor);

 private:
  class Buffer : public std::streambuf {
   public:
    Buffer(DescriptorStream& stream, UniqueDescriptor descriptor) : stream_(stream), descriptor_(std::move(descriptor)) {}

    [[nodiscard]] bool hasDescriptor() const { return static_cast<bool>(descriptor_); }

   protected:
    int_type underflow() override;

   private:
    DescriptorStream& stream_;
    UniqueDescriptor descriptor_;
    std::array<char, 16384> bytes_{};
  };

  Buffer buffer_;
};

}  // namespace docuvend::linux_platform
