// Little-endian numbers and counted texts in a run of bytes.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace docuvend::linux_platform {

// Why bytes could not be read, or a value not be written, in words.
struct Malformed {
  std::string reason;
};

// True for well-formed UTF-8 made of the characters that XML 1.0 can carry: what the daemon is told may end up in a property list.
[[nodiscard]] bool isTransmissibleText(std::string_view text);

// Writes; keeps the first failure and goes on harmlessly after it.
class ByteWriter {
 public:
  void u8(std::uint8_t value) { bytes_.push_back(value); }
  void u32(std::uint32_t value);
  void u64(std::uint64_t value);
  void raw(std::span<const std::uint8_t> bytes) { bytes_.insert(bytes_.end(), bytes.begin(), bytes.end()); }
  // A length and the text; refuses what is too long or not transmissible.
  void text(std::string_view text);
  void setU32At(std::size_t position, std::uint32_t value);

  void fail(std::string reason);
  [[nodiscard]] const std::optional<Malformed>& failure() const { return failure_; }
  [[nodiscard]] const std::vector<std::uint8_t>& bytes() const { return bytes_; }
  [[nodiscard]] std::vector<std::uint8_t> take() { return std::move(bytes_); }

 private:
  std::vector<std::uint8_t> bytes_;
  std::optional<Malformed> failure_;
};

// Reads; keeps the first failure and gives zeros and empty texts after it.
class ByteReader {
 public:
  explicit ByteReader(std::span<const std::uint8_t> bytes) : rest_(bytes) {}

  std::uint8_t u8();
  std::uint32_t u32();
  std::uint64_t u64();
  // 0 or 1; `what` names the thing in the failure.
  bool flag(const char* what);
  std::span<const std::uint8_t> raw(std::size_t count);
  std::string text();

  [[nodiscard]] std::size_t remaining() const { return rest_.size(); }
  void fail(std::string reason);
  [[nodiscard]] bool ok() const { return !failure_; }
  [[nodiscard]] const std::optional<Malformed>& failure() const { return failure_; }

 private:
  std::span<const std::uint8_t> rest_;
  std::optional<Malformed> failure_;
};

}  // namespace docuvend::linux_platform
