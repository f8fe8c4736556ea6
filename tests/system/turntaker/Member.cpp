#include "tests/system/turntaker/Member.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <random>
#include <string_view>
#include <thread>
#include <utility>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/system/turntaker/Ledger.h"

namespace docuvend::turntaker {
namespace {

using linux_platform::UniqueDescriptor;

// One of so many turns is a write.
constexpr int kTurnsForAWrite = 3;

QXURL urlOf(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }

Failure writeAll(const UniqueDescriptor& file, std::string_view text) {
  while (!text.empty()) {
    const ssize_t count = ::write(file.get(), text.data(), text.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return QXError::system(errno, "cannot write");
    text.remove_prefix(static_cast<std::size_t>(count));
  }
  return std::nullopt;
}

}  // namespace

Member::Member(MemberPlan plan, Board& board, Consumer& consumer) : plan_(std::move(plan)), board_(board), consumer_(consumer) {}

Failure Member::run() {
  std::mt19937_64 random(plan_.number);
  while (!board_.contents().isOver) {
    const std::size_t item = random() % plan_.items.size();
    if (auto failure = random() % kTurnsForAWrite == 0 ? write(item) : read(item)) return failure;
  }
  return std::nullopt;
}

Failure Member::read(std::size_t item) {
  const std::string& path = plan_.items[item];
  auto turn = consumer_.coordinateReading(urlOf(path));
  if (auto* error = std::get_if<QXError>(&turn)) return *error;
  if (auto failure = take(item, Mark::reading)) return failure;
  if (!parseLedger(contentsOf(path))) return failed("a reader saw half a write of", item);
  board_.mark(plan_.place, item, Mark::none);
  if (auto failure = std::get<CoordinatedAccess>(turn).end()) return failure;
  ++place().reads;
  return std::nullopt;
}

Failure Member::write(std::size_t item) {
  const std::uint64_t ended = place().endedWrites();
  place().setWrites(ended, WriteStage::asked);
  auto turn = consumer_.coordinateWriting(urlOf(plan_.items[item]));
  if (auto* error = std::get_if<QXError>(&turn)) return *error;
  place().setWrites(ended, WriteStage::begun);
  if (auto failure = take(item, Mark::writing)) return failure;
  if (auto failure = addEntry(item)) return failure;
  board_.mark(plan_.place, item, Mark::none);
  if (auto failure = std::get<CoordinatedAccess>(turn).end()) return failure;
  place().setWrites(ended + 1, WriteStage::none);
  return std::nullopt;
}

Failure Member::addEntry(std::size_t item) {
  const std::string& path = plan_.items[item];
  // Whoever writes asks for no contents, but this write needs them.
  auto reading = consumer_.coordinateReading(urlOf(path));
  if (auto* error = std::get_if<QXError>(&reading)) return *error;
  if (auto failure = std::get<CoordinatedAccess>(reading).end()) return failure;
  auto entries = parseLedger(contentsOf(path));
  if (!entries) return failed("a writer saw half a write of", item);
  const std::string entry = std::to_string(plan_.number) + "-" + std::to_string(++entries_);
  entries->push_back(entry);
  const std::string text = ledgerText(*entries);
  auto failure = plan_.fate == MemberPlan::Fate::mayBeKilled ? exchange(path, text) : writeInPlace(path, text);
  return failure ? failure : acknowledge(item, entry);
}

Failure Member::exchange(const std::string& path, const std::string& text) const {
  // Hidden, so that no provider takes it for a document.
  const std::size_t name = path.rfind('/') + 1;
  const std::string temporary = path.substr(0, name) + "." + path.substr(name) + "." + std::to_string(plan_.place);
  const UniqueDescriptor file(::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
  if (!file) return QXError::system(errno, "cannot make " + temporary);
  if (auto failure = writeAll(file, text)) return failure;
  if (std::rename(temporary.c_str(), path.c_str()) != 0) return QXError::system(errno, "cannot exchange " + path);
  return std::nullopt;
}

Failure Member::writeInPlace(const std::string& path, const std::string& text) {
  const UniqueDescriptor file(::open(path.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC));
  if (!file) return QXError::system(errno, "cannot open " + path);
  const std::size_t half = text.size() / 2;
  if (auto failure = writeAll(file, std::string_view(text).substr(0, half))) return failure;
  std::this_thread::yield();
  return writeAll(file, std::string_view(text).substr(half));
}

Failure Member::acknowledge(std::size_t item, const std::string& entry) const {
  const UniqueDescriptor file(::open(plan_.acknowledgements.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
  if (!file) return QXError::system(errno, "cannot open " + plan_.acknowledgements);
  return writeAll(file, std::to_string(item) + " " + entry + "\n");
}

Failure Member::take(std::size_t item, Mark mark) {
  board_.mark(plan_.place, item, mark);
  if (!board_.hasConflict(plan_.place, item, mark)) return std::nullopt;
  return failed("two had a turn that excludes the other's at", item);
}

Failure Member::failed(const std::string& what, std::size_t item) const {
  return QXError::make("TurntakerErrorDomain", 1, what + " " + plan_.items[item]);
}

}  // namespace docuvend::turntaker
