// Asking for files and not taking them.
//
//   leave TOKEN CONNECTIONS COUNT         asks over each of so many connections so often for the file of a token, and takes no answer
//   leave-shut TOKEN CONNECTIONS COUNT    the same, with reading halves that are shut
//   leave-ended TOKEN CONNECTIONS ROUNDS  asks over so many for as much as is answered at once, has the daemon end them, and keeps its own
//                                         ends; so many times, or until it has no descriptors left: what kept it
//   collect TOKEN COUNT                   asks so often at once over one connection, and takes the answers: how many files came
#include <sys/socket.h>

#include <cerrno>
#include <cstdint>
#include <optional>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "tests/attacks/attacker/Acts.h"
#include "tests/attacks/attacker/Requests.h"
#include "tests/wire/TakingPeer.h"

namespace docuvend::attacker {
namespace {

using namespace linux_platform;
using tests::bytesOf;
using tests::TakingPeer;

constexpr const char* kRedeem = "redeemToken:forWriting:completionHandler:";
// A connection's requests are run by turns with those of the bundle's others: after so many turns of one, those have had theirs.
constexpr std::uint64_t kTurns = 100;

std::vector<TakingPeer>& kept() {
  static std::vector<TakingPeer> all;
  return all;
}

std::optional<TakingPeer> connectAndGreet() {
  auto connected = connectToSocket(publicSocket(kSandboxServiceName));
  auto* socket = std::get_if<UniqueDescriptor>(&connected);
  if (socket == nullptr) return std::nullopt;
  TakingPeer peer(std::move(*socket));
  if (!peer.sayHello()) return std::nullopt;
  return peer;
}

std::vector<std::uint8_t> requests(const QXData& token, std::uint64_t count) {
  std::vector<std::uint8_t> all;
  for (std::uint64_t number = 1; number <= count; ++number) {
    const auto request = bytesOf(Frame(RequestFrame{number, true, kRedeem, {token, false}}));
    all.insert(all.end(), request.begin(), request.end());
  }
  return all;
}

bool othersHaveHadTheirTurns() {
  auto peer = connectAndGreet();
  if (!peer || !peer->take<Hello>()) return false;
  for (std::uint64_t number = 1; number <= kTurns; ++number) {
    if (!peer->write(Frame(RequestFrame{number, true, "none", {}})) || !peer->take<FailureFrame>()) return false;
  }
  return true;
}

// As much of what is left to send as the sockets take, again and again while they take any.
void sendAll(const std::vector<std::uint8_t>& bytes, std::size_t firstPeer) {
  std::vector<std::size_t> sent(kept().size() - firstPeer);
  for (bool moved = true; moved;) {
    moved = false;
    for (std::size_t i = 0; i < sent.size(); ++i) {
      const std::size_t left = bytes.size() - sent[i];
      const ssize_t count =
          left == 0 ? 0 : ::send(kept()[firstPeer + i].socket(), bytes.data() + sent[i], left, MSG_DONTWAIT | MSG_NOSIGNAL);
      sent[i] += count > 0 ? static_cast<std::size_t>(count) : 0;
      moved = moved || count > 0;
    }
    if (!othersHaveHadTheirTurns()) return;
  }
}

enum class Reading { open, shut };

bool open(int connections, Reading reading) {
  for (int i = 0; i < connections; ++i) {
    auto peer = connectAndGreet();
    if (!peer) return false;
    if (reading == Reading::shut) ::shutdown(peer->socket(), SHUT_RD);
    kept().push_back(std::move(*peer));
  }
  return true;
}

std::string leave(Words& words, Reading reading) {
  const QXData token = QXData::fromText(words.next());
  const int connections = std::stoi(words.next());
  if (!open(connections, reading)) return "no connection";
  sendAll(requests(token, std::stoull(words.next())), 0);
  return "ok";
}

std::string leaveEnded(Words& words) {
  const QXData token = QXData::fromText(words.next());
  const int connections = std::stoi(words.next());
  // So few that what comes behind them is read, and is no frame.
  auto bytes = requests(token, kMaximumUntakenAnswers - 1);
  bytes.insert(bytes.end(), kFrameLengthBytes, 0xFF);
  for (int round = std::stoi(words.next()); round > 0; --round) {
    const std::size_t first = kept().size();
    if (!open(connections, Reading::open)) {
      const std::string why = outcome(-1);
      kept().erase(kept().end() - connections / 2, kept().end());  // it needs some for what it does next
      return why;
    }
    sendAll(bytes, first);
  }
  return "ok";
}

std::string collect(Words& words) {
  const QXData token = QXData::fromText(words.next());
  const std::uint64_t count = std::stoull(words.next());
  auto peer = connectAndGreet();
  if (!peer || !peer->take<Hello>() || !peer->write(requests(token, count))) return "no connection";
  std::uint64_t files = 0;
  for (std::uint64_t number = 1; number <= count; ++number) {
    const auto reply = peer->take<ReplyFrame>();
    if (!reply) break;
    files += reply->values[1].as<QXDescriptor>() != nullptr ? 1 : 0;
  }
  return std::to_string(files) + " files";
}

}  // namespace

Acts untakenActs() {
  return {{"leave", [](Words& words) { return leave(words, Reading::open); }},
          {"leave-shut", [](Words& words) { return leave(words, Reading::shut); }},
          {"leave-ended", leaveEnded},
          {"collect", collect}};
}

}  // namespace docuvend::attacker
