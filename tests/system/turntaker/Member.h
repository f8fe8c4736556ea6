// One process of a crowd: reads and writes the crowd's files in its turn, one after another, until the board says that it is over.
//
// A write adds an entry that nobody else adds, and is acknowledged in the member's own file as soon as it is done. A member that may be
// killed exchanges the file for a new one; one that is spared writes it in place, in two pieces.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "sdk/Consumer.h"
#include "tests/system/turntaker/Board.h"

namespace docuvend::turntaker {

struct MemberPlan {
  enum class Fate { mayBeKilled, isSpared };
  std::size_t place = 0;
  std::uint64_t number = 0;
  Fate fate = Fate::isSpared;
  std::string board;
  std::string acknowledgements;  // where it writes "ITEM ENTRY" lines
  std::vector<std::string> items;
};

class Member {
 public:
  Member(MemberPlan plan, Board& board, Consumer& consumer);

  // What went wrong, if anything did.
  [[nodiscard]] Failure run();

 private:
  [[nodiscard]] Failure read(std::size_t item);
  [[nodiscard]] Failure write(std::size_t item);
  // Within a write.
  [[nodiscard]] Failure addEntry(std::size_t item);
  [[nodiscard]] Failure exchange(const std::string& path, const std::string& text) const;
  [[nodiscard]] static Failure writeInPlace(const std::string& path, const std::string& text);
  [[nodiscard]] Failure acknowledge(std::size_t item, const std::string& entry) const;
  // Has the file to itself, or shares it as it may.
  [[nodiscard]] Failure take(std::size_t item, Mark mark);
  [[nodiscard]] Failure failed(const std::string& what, std::size_t item) const;
  [[nodiscard]] Place& place() { return board_.contents().places[plan_.place]; }

  const MemberPlan plan_;
  Board& board_;
  Consumer& consumer_;
  std::uint64_t entries_ = 0;
};

}  // namespace docuvend::turntaker
