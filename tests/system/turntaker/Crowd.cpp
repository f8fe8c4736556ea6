#include "tests/system/turntaker/Crowd.h"

#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <fstream>
#include <sstream>
#include <thread>
#include <utility>

#include "tests/system/turntaker/Ledger.h"

namespace docuvend::turntaker {
namespace {

constexpr auto kBetweenKills = std::chrono::milliseconds(20);
constexpr auto kBetweenLooks = std::chrono::milliseconds(2);
// A safety net for members that never end.
constexpr auto kPatience = std::chrono::seconds(60);
// Every second member may be killed.
constexpr std::size_t kKindsOfFate = 2;

}  // namespace

Crowd::Crowd(CrowdPlan plan, Board& board) : plan_(std::move(plan)), board_(board), random_(plan_.members) {}

Crowd::~Crowd() {
  for (const auto& [place, process] : processes_) {
    ::kill(process, SIGKILL);
    ::waitpid(process, nullptr, 0);
  }
}

CrowdAccount Crowd::run() {
  const auto end = std::chrono::steady_clock::now() + plan_.time;
  for (std::size_t place = 0; place < plan_.members; ++place) start(place);
  while (std::chrono::steady_clock::now() < end && account_.faults.empty()) {
    std::this_thread::sleep_for(kBetweenKills);
    killSomebody();
  }
  board_.contents().isOver = true;
  awaitEnds();
  compareFiles();
  return account_;
}

MemberPlan::Fate Crowd::fateOf(std::size_t place) {
  return place % kKindsOfFate == 0 ? MemberPlan::Fate::mayBeKilled : MemberPlan::Fate::isSpared;
}

std::string Crowd::acknowledgementsOf(std::uint64_t member) const { return plan_.directory + "/done-" + std::to_string(member); }

void Crowd::start(std::size_t place) {
  Place& at = board_.contents().places[place];
  at.setWrites(0, WriteStage::none);
  at.reads = 0;
  at.member = ++lastMember_;
  std::vector<std::string> words = {"docuvend-turntaker",
                                    "member",
                                    std::to_string(place),
                                    std::to_string(lastMember_),
                                    fateOf(place) == MemberPlan::Fate::mayBeKilled ? "may-be-killed" : "is-spared",
                                    plan_.directory + "/board",
                                    acknowledgementsOf(lastMember_)};
  words.insert(words.end(), plan_.items.begin(), plan_.items.end());
  std::vector<char*> pointers;
  for (std::string& word : words) pointers.push_back(word.data());
  pointers.push_back(nullptr);
  pid_t process = -1;
  if (::posix_spawn(&process, "/proc/self/exe", nullptr, nullptr, pointers.data(), environ) != 0) {
    account_.faults.emplace_back("a member could not be started");
    return;
  }
  processes_[place] = process;
}

void Crowd::killSomebody() {
  const std::size_t place = random_() % ((plan_.members + 1) / kKindsOfFate) * kKindsOfFate;
  const auto found = processes_.find(place);
  if (found == processes_.end()) return;
  const pid_t process = found->second;
  Place& at = board_.contents().places[place];
  killed_.insert(at.member);
  // From here on its marks do not count.
  at.member = ++lastMember_;
  ::kill(process, SIGKILL);
  int status = 0;
  ::waitpid(process, &status, 0);
  processes_.erase(found);
  if (!WIFSIGNALED(status)) account_.faults.emplace_back("a member ended before it was killed");
  ++account_.kills;
  if (at.writeStage() == WriteStage::begun) ++account_.killedWrites;
  if (at.writeStage() == WriteStage::asked) ++account_.perhapsKilledWrites;
  account(place);
  start(place);
}

void Crowd::account(std::size_t place) {
  const Place& at = board_.contents().places[place];
  account_.reads += at.reads;
  account_.writes += at.endedWrites();
}

void Crowd::awaitEnds() {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (!processes_.empty() && std::chrono::steady_clock::now() < deadline) {
    for (auto at = processes_.begin(); at != processes_.end();) {
      int status = 0;
      if (::waitpid(at->second, &status, WNOHANG) != at->second) {
        ++at;
        continue;
      }
      if (status != 0) account_.faults.emplace_back("a member has failed; it has said why");
      account(at->first);
      at = processes_.erase(at);
    }
    std::this_thread::sleep_for(kBetweenLooks);
  }
  if (!processes_.empty()) account_.faults.push_back(std::to_string(processes_.size()) + " members wait for ever");
}

void Crowd::compareFiles() {
  // Item and entry.
  std::set<std::pair<std::size_t, std::string>> acknowledged;
  for (std::uint64_t member = 1; member <= lastMember_; ++member) {
    std::istringstream lines(contentsOf(acknowledgementsOf(member)));
    std::size_t item = 0;
    for (std::string entry; lines >> item >> entry;) acknowledged.emplace(item, entry);
  }
  account_.acknowledged = acknowledged.size();
  for (std::size_t item = 0; item < plan_.items.size(); ++item) {
    const std::string& path = plan_.items[item];
    const auto entries = parseLedger(contentsOf(path));
    if (!entries) {
      account_.faults.push_back("half a write stayed in " + path);
      continue;
    }
    std::set<std::string> seen;
    for (const std::string& entry : *entries) {
      if (!seen.insert(entry).second) account_.faults.push_back("twice in " + path + ": " + entry);
      const bool isOfKilled = killed_.contains(std::stoull(entry));
      if (acknowledged.erase({item, entry}) == 0 && !isOfKilled) account_.faults.push_back("nobody's in " + path + ": " + entry);
    }
  }
  for (const auto& [item, entry] : acknowledged) account_.faults.push_back("lost from " + plan_.items[item] + ": " + entry);
}

}  // namespace docuvend::turntaker
