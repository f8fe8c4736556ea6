#include "platform/linux/files/DescriptorStream.h"

#include <unistd.h>

#include <cerrno>

namespace docuvend::linux_platform {

DescriptorStream::DescriptorStream(UniqueDescriptor descriptor) : std::istream(nullptr), buffer_(*this, std::move(descriptor)) {
  rdbuf(&buffer_);  // also clears the state that the missing buffer left
  if (!buffer_.hasDescriptor()) setstate(std::ios::badbit);
}

DescriptorStream::Buffer::int_type DescriptorStream::Buffer::underflow() {
  ssize_t count = 0;
  do {
    count = ::read(descriptor_.get(), bytes_.data(), bytes_.size());
  } while (count < 0 && errno == EINTR);
  if (count < 0) stream_.setstate(std::ios::badbit);
  if (count <= 0) return traits_type::eof();
  setg(bytes_.data(), bytes_.data(), bytes_.data() + count);
  return traits_type::to_int_type(bytes_.front());
}

}  // namespace docuvend::linux_platform
