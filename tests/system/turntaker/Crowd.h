// Many processes that take turns at a few files for some time, some of which are killed at random and replaced; and the account of it.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "sdk/Result.h"
#include "tests/system/turntaker/Board.h"
#include "tests/system/turntaker/Member.h"

namespace docuvend::turntaker {

struct CrowdPlan {
  std::chrono::milliseconds time{};
  std::size_t members = 0;
  std::string directory;  // for the crowd's own files; empty
  std::vector<std::string> items;
};

struct CrowdAccount {
  std::uint64_t reads = 0;
  std::uint64_t writes = 0;  // that have ended
  std::uint64_t kills = 0;
  // Writes of killed members: that had begun, and that may have begun without the member's hearing of it.
  std::uint64_t killedWrites = 0;
  std::uint64_t perhapsKilledWrites = 0;
  std::uint64_t acknowledged = 0;
  // What must not be; one sentence each.
  std::vector<std::string> faults;
};

class Crowd {
 public:
  Crowd(CrowdPlan plan, Board& board);
  // Ends what still runs.
  ~Crowd();
  Crowd(const Crowd&) = delete;
  Crowd& operator=(const Crowd&) = delete;

  [[nodiscard]] CrowdAccount run();

 private:
  [[nodiscard]] static MemberPlan::Fate fateOf(std::size_t place);
  [[nodiscard]] std::string acknowledgementsOf(std::uint64_t member) const;
  void start(std::size_t place);
  void killSomebody();
  // Of the member in a place, which has ended with that status.
  void account(std::size_t place);
  void awaitEnds();
  void compareFiles();

  const CrowdPlan plan_;
  Board& board_;
  std::mt19937_64 random_;
  std::uint64_t lastMember_ = 0;
  std::map<std::size_t, int> processes_;  // by place, those that have not been waited for
  std::set<std::uint64_t> killed_;
  CrowdAccount account_;
};

}  // namespace docuvend::turntaker
