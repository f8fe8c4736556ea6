// What the members of a crowd know of each other: memory that all of them share, in which each marks the files that it has.
//
// Every member has a number that no other one ever has, and a place that it inherits from a member that was killed. A mark carries its
// member's number, and counts while that member is the one in its place: whoever kills a member first leaves the place to the next number.
// A member that takes a turn sets its mark and then looks for others that exclude it, so of two that have a file against the rules at least
// one sees it.
#pragma once

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::turntaker {

inline constexpr std::size_t kMaximumMembers = 256;
inline constexpr std::size_t kMaximumItems = 32;

enum class Mark : std::uint64_t { none = 0, reading = 1, writing = 2 };
// Where a member is with the write that it does now.
enum class WriteStage : std::uint64_t { none = 0, asked = 1, begun = 2 };

struct Place {
  std::atomic<std::uint64_t> member;
  // Of a member: the writes that have ended and the stage of the present one, in one word so that it is never seen half changed.
  std::atomic<std::uint64_t> writes;
  std::atomic<std::uint64_t> reads;
  std::array<std::atomic<std::uint64_t>, kMaximumItems> marks;

  void setWrites(std::uint64_t ended, WriteStage stage) { writes = (ended << 2U) | static_cast<std::uint64_t>(stage); }
  [[nodiscard]] std::uint64_t endedWrites() const { return writes >> 2U; }
  [[nodiscard]] WriteStage writeStage() const { return static_cast<WriteStage>(writes & 3U); }
};

class Board {
 public:
  struct Contents {
    std::atomic<bool> isOver;
    std::array<Place, kMaximumMembers> places;
  };
  static_assert(std::atomic<std::uint64_t>::is_always_lock_free);

  // A file for all members; the one that makes it gives it its size.
  enum class Use { make, join };
  [[nodiscard]] static std::variant<Board, QXError> open(const std::string& path, Use use);
  Board(Board&& other) noexcept;
  Board& operator=(Board&&) = delete;
  Board(const Board&) = delete;
  Board& operator=(const Board&) = delete;
  ~Board();

  [[nodiscard]] Contents& contents() { return *contents_; }

  void mark(std::size_t place, std::size_t item, Mark mark);
  // Somebody else has the file in a way that excludes this.
  [[nodiscard]] bool hasConflict(std::size_t place, std::size_t item, Mark mark) const;

 private:
  explicit Board(Contents* contents) : contents_(contents) {}

  Contents* contents_;
};

}  // namespace docuvend::turntaker
