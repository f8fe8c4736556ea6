#include "tests/system/turntaker/Board.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

namespace docuvend::turntaker {
namespace {

constexpr std::uint64_t kMarkBits = 2;

}  // namespace

std::variant<Board, QXError> Board::open(const std::string& path, Use use) {
  const linux_platform::UniqueDescriptor file(::open(path.c_str(), O_RDWR | O_CLOEXEC | (use == Use::make ? O_CREAT | O_EXCL : 0), 0600));
  if (!file) return QXError::system(errno, "cannot open the board");
  if (use == Use::make && ::ftruncate(file.get(), sizeof(Contents)) != 0) return QXError::system(errno, "cannot make the board");
  void* memory = ::mmap(nullptr, sizeof(Contents), PROT_READ | PROT_WRITE, MAP_SHARED, file.get(), 0);
  if (memory == MAP_FAILED) return QXError::system(errno, "cannot map the board");
  // Nothing but words, for which zeros are the beginning.
  return Board(static_cast<Contents*>(memory));
}

Board::Board(Board&& other) noexcept : contents_(std::exchange(other.contents_, nullptr)) {}

Board::~Board() {
  if (contents_ != nullptr) ::munmap(contents_, sizeof(Contents));
}

void Board::mark(std::size_t place, std::size_t item, Mark mark) {
  Place& own = contents_->places[place];
  own.marks[item] = (own.member << kMarkBits) | static_cast<std::uint64_t>(mark);
}

bool Board::hasConflict(std::size_t place, std::size_t item, Mark mark) const {
  for (std::size_t other = 0; other < kMaximumMembers; ++other) {
    if (other == place) continue;
    const Place& theirs = contents_->places[other];
    const std::uint64_t word = theirs.marks[item];
    const auto their = static_cast<Mark>(word & ((1U << kMarkBits) - 1));
    if (their == Mark::none || (their == Mark::reading && mark == Mark::reading)) continue;
    // Read after the mark: of one that was killed before this one's turn came, the place has passed on by now.
    if (word >> kMarkBits == theirs.member) return true;
  }
  return false;
}

}  // namespace docuvend::turntaker
