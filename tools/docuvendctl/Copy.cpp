#include "tools/docuvendctl/Copy.h"

#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <functional>
#include <string>
#include <variant>

namespace docuvend::ctl {
namespace {

// A multiple of three, so that Base64 groups end with the buffer.
constexpr std::size_t kBufferSize = std::size_t{3} * 16 * 1024;

// As much as the buffer holds; less only at the end.
Result<std::string_view> fill(int from, std::array<char, kBufferSize>& buffer) {
  std::size_t size = 0;
  while (size < buffer.size()) {
    const ssize_t count = ::read(from, buffer.data() + size, buffer.size() - size);
    if (count == 0) break;
    if (count < 0 && errno != EINTR) return QXError::system(errno, "cannot read");
    if (count > 0) size += static_cast<std::size_t>(count);
  }
  return std::string_view(buffer.data(), size);
}

std::string base64(std::string_view bytes) {
  static constexpr std::string_view kDigits = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::string text;
  text.reserve((bytes.size() + 2) / 3 * 4);
  for (std::size_t i = 0; i < bytes.size(); i += 3) {
    const std::string_view group = bytes.substr(i, 3);
    std::uint32_t bits = 0;
    for (std::size_t j = 0; j < 3; ++j) bits = bits << 8U | (j < group.size() ? static_cast<unsigned char>(group[j]) : 0U);
    for (std::size_t j = 0; j < 4; ++j) text += j <= group.size() ? kDigits[bits >> (18U - 6U * j) & 0x3FU] : '=';
  }
  return text;
}

Failure copyInPieces(int from, const std::function<Failure(std::string_view)>& take) {
  std::array<char, kBufferSize> buffer;
  for (;;) {
    const auto piece = fill(from, buffer);
    if (const auto* error = std::get_if<QXError>(&piece)) return *error;
    if (std::get<std::string_view>(piece).empty()) return std::nullopt;
    if (auto failure = take(std::get<std::string_view>(piece))) return failure;
  }
}

}  // namespace

Failure writeAll(int to, std::string_view text) {
  while (!text.empty()) {
    const ssize_t count = ::write(to, text.data(), text.size());
    if (count < 0 && errno != EINTR) return QXError::system(errno, "cannot write");
    if (count > 0) text.remove_prefix(static_cast<std::size_t>(count));
  }
  return std::nullopt;
}

Failure copyAll(int from, int to) {
  return copyInPieces(from, [to](std::string_view piece) { return writeAll(to, piece); });
}

Failure copyAllAsBase64(int from, int to) {
  return copyInPieces(from, [to](std::string_view piece) { return writeAll(to, base64(piece)); });
}

}  // namespace docuvend::ctl
