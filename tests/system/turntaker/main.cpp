// Many turns at files, all unconfined.
//
//   turntaker crowd MILLISECONDS MEMBERS DIRECTORY FILE...    a crowd at these files; the empty directory is for its own
//   turntaker member ...                                      one of a crowd, started by it
//   turntaker hang ROUNDS HEALTHY-URL HANGING-URL FREE-FILE   what one provider that hangs does to the reads of another's item
//
// Prints lines "name: figure". The status is 0 when nothing was against the rules; else standard error says what.
#include <cstdio>
#include <iostream>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "tests/system/turntaker/Board.h"
#include "tests/system/turntaker/Crowd.h"
#include "tests/system/turntaker/HangMeasure.h"
#include "tests/system/turntaker/Member.h"

namespace docuvend::turntaker {
namespace {

using Words = std::vector<std::string>;

int fail(const QXError& error) {
  std::cerr << error.description() << "\n";
  return 1;
}

int crowd(const Words& words) {
  CrowdPlan plan{std::chrono::milliseconds(std::stol(words[1])), std::stoul(words[2]), words[3], {words.begin() + 4, words.end()}};
  if (plan.members == 0 || plan.members > kMaximumMembers || plan.items.size() > kMaximumItems) return 2;
  auto board = Board::open(plan.directory + "/board", Board::Use::make);
  if (const auto* error = std::get_if<QXError>(&board)) return fail(*error);
  Crowd crowd(std::move(plan), std::get<Board>(board));
  const CrowdAccount account = crowd.run();
  std::cout << "reads: " << account.reads << "\nwrites: " << account.writes << "\nkills: " << account.kills
            << "\nkilled writes: " << account.killedWrites << "\nperhaps killed writes: " << account.perhapsKilledWrites
            << "\nacknowledged: " << account.acknowledged << "\n";
  for (const std::string& fault : account.faults) std::cerr << fault << "\n";
  return account.faults.empty() ? 0 : 1;
}

int member(const Words& words) {
  MemberPlan plan;
  plan.place = std::stoul(words[1]);
  plan.number = std::stoull(words[2]);
  plan.fate = words[3] == "may-be-killed" ? MemberPlan::Fate::mayBeKilled : MemberPlan::Fate::isSpared;
  plan.board = words[4];
  plan.acknowledgements = words[5];
  plan.items = {words.begin() + 6, words.end()};
  auto board = Board::open(plan.board, Board::Use::join);
  if (const auto* error = std::get_if<QXError>(&board)) return fail(*error);
  auto connected = Consumer::connect({});
  if (const auto* error = std::get_if<QXError>(&connected)) return fail(*error);
  const auto failure = Member(std::move(plan), std::get<Board>(board), *std::get<std::unique_ptr<Consumer>>(connected)).run();
  return failure ? fail(*failure) : 0;
}

void print(const char* name, const std::vector<double>& times) {
  constexpr std::size_t kHundred = 100;
  std::printf("%s: %zu reads, median %.0f us, 99th percentile %.0f us\n", name, times.size(), times[times.size() / 2],
              times[times.size() * (kHundred - 1) / kHundred]);
}

int hang(const Words& words) {
  const auto healthy = QXURL::fromString(words[2]);
  const auto hanging = QXURL::fromString(words[3]);
  if (!healthy || !hanging || std::stoul(words[1]) == 0) return 2;
  auto connected = Consumer::connect({});
  if (const auto* error = std::get_if<QXError>(&connected)) return fail(*error);
  const auto measured = measureHang(*std::get<std::unique_ptr<Consumer>>(connected), {*healthy, *hanging, words[4], std::stoul(words[1])});
  if (const auto* error = std::get_if<QXError>(&measured)) return fail(*error);
  print("without", std::get<HangFigures>(measured).without);
  print("with", std::get<HangFigures>(measured).with);
  return 0;
}

int run(const Words& words) {
  if (words.size() > 4 && words[0] == "crowd") return crowd(words);
  if (words.size() > 6 && words[0] == "member") return member(words);
  if (words.size() == 5 && words[0] == "hang") return hang(words);
  return 2;
}

}  // namespace
}  // namespace docuvend::turntaker

int main(int count, char** words) { return docuvend::turntaker::run({words + 1, words + count}); }
