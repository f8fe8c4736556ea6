#include "tests/attacks/TwoApplications.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <filesystem>
#include <sstream>
#include <stdexcept>
#include <utility>

#include "platform/linux/wire/SocketAddress.h"
#include "tests/attacks/handing.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using linux_platform::UniqueDescriptor;

Lines linesOf(const Ending& ending) {
  EXPECT_EQ(ending.status, 0) << ending.errors;
  Lines lines;
  std::istringstream stream(ending.output);
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

}  // namespace

void TwoApplications::SetUp() {
  AttackTest::SetUp();
  if (HasFatalFailure()) return;
  for (const auto& bundle : {kCellar, kPicker}) house_.install(bundle);
  house_.installTrickster();
  house_.install(kVictim, "docuvend-attacker", stringEntry("QXBundleIdentifier", kVictim), {});
  installAttacker();
  fs::create_hard_link(victimsProgram(), sameProgram());
  ownPath_ = house_.putInCloud("own.txt", "mine\n");
  othersPath_ = house_.putInCloud("others.txt", "not yours\n");
  house_.startDaemon();
  own_ = house_.granted(ownPath_, kAttacker);
  others_ = house_.granted(othersPath_, kVictim);
}

Lines TwoApplications::joined(Lines first, const Lines& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

Lines TwoApplications::as(const std::string& bundle, const Lines& words) const { return linesOf(house_.confined(bundle, words)); }

Lines TwoApplications::unconfined(const Lines& words, const Lines& command) const {
  return unconfined(words, command, house_.environment());
}

Lines TwoApplications::unconfined(const Lines& words, const Lines& command, const Lines& environment) const {
  return linesOf(Process({joined(joined(command, {program()}), words), environment, {}}).wait());
}

Lines TwoApplications::whoIsAt(Client& connection) const {
  Lines lines;
  for (const auto& string : {others_, own_}) {
    lines.push_back(told(errorOf(connection.ask<&DVDaemon::documentURLFromBookmarkableString>(string))));
  }
  return lines;
}

long TwoApplications::refusalsOf(const std::string& bundle) const {
  const auto lines = house_.log();
  return std::count_if(lines.begin(), lines.end(), [&bundle](const std::string& line) {
    return line.starts_with("[ERROR] Provider ID ") && line.ends_with(" to consumer ID " + bundle);
  });
}

std::string TwoApplications::program() { return std::string(DOCUVEND_BIN) + "/docuvend-attacker"; }

Accomplice::Accomplice(const DaemonHouse& house, Lines words) : listener_(listenAt(hatch(house))) {
  Lines command = {std::string(DOCUVEND_BIN) + "/docuvend-run", kAttacker};
  command.insert(command.end(), words.begin(), words.end());
  command.insert(command.end(), {"hand-over", hatch(house)});
  process_ = std::make_unique<Process>(Command{command, house.environment(), {}});
  hand_ = acceptAt(listener_);
}

UniqueDescriptor Accomplice::connection() { return takeOver(hand_.get()); }

Ending Accomplice::end() {
  hand_.reset();
  listener_.reset();
  return process_->wait();
}

UniqueDescriptor listenAt(const std::string& path) {
  fs::create_directories(fs::path(path).parent_path());
  fs::permissions(fs::path(path).parent_path(), fs::perms::owner_all);
  fs::remove(path);
  const auto address = linux_platform::SocketAddress::forPath(path);
  const auto* known = std::get_if<linux_platform::SocketAddress>(&address);
  UniqueDescriptor listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (known == nullptr || ::bind(listener.get(), known->address(), known->length()) != 0 || ::listen(listener.get(), 1) != 0) {
    throw std::runtime_error("nobody can listen at " + path);
  }
  return listener;
}

UniqueDescriptor acceptAt(const UniqueDescriptor& listener) {
  pollfd waiting{listener.get(), POLLIN, 0};
  if (::poll(&waiting, 1, static_cast<int>(std::chrono::milliseconds(kPatience).count())) <= 0) throw std::runtime_error("nobody came");
  return UniqueDescriptor(::accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
}

std::string hatch(const DaemonHouse& house) { return house.container(kAttacker) + "/hatch"; }

}  // namespace docuvend::tests
