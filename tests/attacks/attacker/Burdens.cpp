// Asking for what is dear to answer, and not taking it.
//
//   burden CONNECTIONS COUNT   has as many accesses to a file of its own as it may, and over each of so many connections asks so often who
//                              has access to it, without taking an answer
//   relieve                    takes all the answers: how many came
//   send SERVICE               sends the daemon a descriptor of its own, with its hello
//   hail SERVICE               sends the hello alone: "ok" when one comes back
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <optional>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/coordination/AccessSession.h"
#include "platform/linux/coordination/FileAccesses.h"
#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "tests/attacks/attacker/Acts.h"
#include "tests/attacks/attacker/Requests.h"
#include "tests/system/house/Client.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::attacker {
namespace {

using namespace linux_platform;
using tests::RawPeer;

constexpr const char* kHoldersOf = "holdersOfItemAtURL:token:completionHandler:";

struct Burden {
  std::vector<std::unique_ptr<tests::Client>> accessing;
  std::vector<RawPeer> asking;
  std::uint64_t count = 0;
};

Burden& theBurden() {
  static Burden burden;
  return burden;
}

bool takeAccesses(const QXURL& url) {
  std::int64_t number = 0;
  while (number < static_cast<std::int64_t>(FileAccesses::kMaximumAccessesOfApplication)) {
    theBurden().accessing.push_back(std::make_unique<tests::Client>(publicSocket(kFileCoordinationServiceName), std::nullopt));
    for (std::size_t i = 0; i < AccessSession::kMaximumAccesses; ++i, ++number) {
      QXUUID id;
      std::memcpy(id.bytes.data(), &number, sizeof number);
      const auto begun = theBurden().accessing.back()->ask<&QXFileCoordination::coordinateReadingItemAtURL>(
          url, std::nullopt, std::optional(id), std::optional(number));
      if (tests::errorOf(begun)) return false;
    }
  }
  return true;
}

std::string burden(Words& words) {
  const int connections = std::stoi(words.next());
  theBurden().count = std::stoull(words.next());
  const std::string path = std::string(std::getenv("HOME")) + "/held";
  std::ofstream(path) << "held\n";
  const QXURL url = QXURL::fileURL(path, QXURLKind::file);
  if (!takeAccesses(url)) return "no access";
  std::vector<std::uint8_t> requests = tests::bytesOf(Frame(Hello{kProtocolVersion, std::nullopt}));
  for (std::uint64_t number = 1; number <= theBurden().count; ++number) {
    const auto request = tests::bytesOf(Frame(RequestFrame{number, true, kHoldersOf, {url, QXValue()}}));
    requests.insert(requests.end(), request.begin(), request.end());
  }
  for (int i = 0; i < connections; ++i) {
    auto connected = connectToSocket(publicSocket(kFileCoordinationServiceName));
    auto* socket = std::get_if<UniqueDescriptor>(&connected);
    if (socket == nullptr) return "no connection";
    const timeval patience{tests::kPatience.count(), 0};
    ::setsockopt(socket->get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    const RawPeer& peer = theBurden().asking.emplace_back(std::move(*socket));
    if (!peer.write(requests)) return "ended";
  }
  return "ok";
}

std::string relieve(Words&) {
  std::uint64_t answers = 0;
  for (const RawPeer& peer : theBurden().asking) {
    static_cast<void>(peer.read<Hello>());
    for (std::uint64_t number = 1; number <= theBurden().count && peer.read<ReplyFrame>(); ++number) ++answers;
  }
  return std::to_string(answers) + " answers";
}

std::string send(Words& words) {
  auto connected = connectToSocket(publicSocket(words.next()));
  auto* socket = std::get_if<UniqueDescriptor>(&connected);
  if (socket == nullptr) return "no connection";
  const std::array<int, 1> own{STDIN_FILENO};
  const bool isSent = RawPeer(std::move(*socket)).write(tests::bytesOf(Frame(Hello{kProtocolVersion, std::nullopt})), own);
  return outcome(isSent ? 0 : -1);
}

std::string hail(Words& words) {
  auto connected = connectToSocket(publicSocket(words.next()));
  auto* socket = std::get_if<UniqueDescriptor>(&connected);
  if (socket == nullptr) return "no connection";
  const RawPeer peer(std::move(*socket));
  return peer.sayHello() && peer.read<Hello>() ? "ok" : "ended";
}

}  // namespace

Acts burdenActs() { return {{"burden", burden}, {"relieve", relieve}, {"send", send}, {"hail", hail}}; }

}  // namespace docuvend::attacker
