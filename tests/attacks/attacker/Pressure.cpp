// More than its part of what the daemon shares out. What it takes it keeps until it ends.
//
//   crowd SERVICE COUNT     opens connections and has each answered; how many were served, how many refused
//   garble SERVICE          sends, each over a connection of its own, what is no frame; how many of these connections were ended for it
//   half SERVICE COUNT      opens connections and sends each the beginning of a frame
//   turns URL COUNT         takes turns at a file and does not end them; how many it got, and the error of the first that it did not get
//   scribble PATH PROVIDER CONSUMER FILES WRITES
//                           grants itself so many files, PATH with a number behind it, and writes each so often in a turn of its own; how
//                           many turns that were, or the first error
//   start URL PROVIDER CONSUMER COUNT
//                           asks for an item again and again, and what the first answer is
//   start-silently URL PROVIDER CONSUMER COUNT
//                           the same, and wants no answers; the first failure
//   fork                    starts processes until it may not; why it may not
//   pass-around             puts descriptors into sockets and leaves them unread until it may not; why it may not
//   hold NAME               makes the file NAME.holding and waits until NAME.go is there
#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <thread>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/Limits.h"
#include "platform/rpc_errors.h"
#include "tests/attacks/attacker/Acts.h"
#include "tests/attacks/attacker/Requests.h"
#include "tests/system/house/Client.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::attacker {
namespace {

using namespace linux_platform;
using tests::bytesOf;
using tests::RawPeer;
using Bytes = std::vector<std::uint8_t>;

constexpr const char* kWakeUp = "wakeUpCompletion:";
constexpr const char* kStart = "startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:";
// More than any limit of a confinement, less than what a machine could not bear.
constexpr int kMostProcesses = 3'000;
constexpr int kMostMessages = 2'000;
constexpr std::size_t kDescriptorsOfAMessage = 250;

// What is kept to the end.
struct Hoard {
  std::vector<RawPeer> peers;
  std::vector<std::unique_ptr<tests::Client>> clients;
  std::vector<UniqueDescriptor> sockets;
};
Hoard& hoard() {
  static Hoard all;
  return all;
}

RawPeer connectTo(const std::string& service) {
  auto connected = connectToSocket(publicSocket(service));
  auto* socket = std::get_if<UniqueDescriptor>(&connected);
  if (socket == nullptr) return RawPeer({});
  const timeval patience{tests::kPatience.count(), 0};
  ::setsockopt(socket->get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  ::setsockopt(socket->get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
  return RawPeer(std::move(*socket));
}

// The code for which the connection was ended; none when it did not end so.
std::optional<std::int64_t> endOf(const RawPeer& peer) {
  while (const auto frame = peer.read()) {
    if (const auto* end = std::get_if<EndFrame>(&*frame)) return end->error.code;
  }
  return std::nullopt;
}

Bytes operator+(Bytes first, const Bytes& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}
Bytes hello() { return bytesOf(Hello{kProtocolVersion, std::nullopt}); }
Bytes request(std::uint64_t number) { return bytesOf(RequestFrame{number, true, kWakeUp, {}}); }

std::string crowd(Words& words) {
  const std::string service = words.next();
  int served = 0;
  int refused = 0;
  for (int i = std::stoi(words.next()); i > 0; --i) {
    RawPeer peer = connectTo(service);
    // One that has been closed already still says why.
    peer.write(hello() + request(1));
    if (peer.read<Hello>()) {
      const auto answer = peer.read();
      if (answer && std::holds_alternative<EndFrame>(*answer)) {
        refused += std::get<EndFrame>(*answer).error.code == static_cast<std::int64_t>(QXRpcErrorCode::refused) ? 1 : 0;
      } else if (answer) {
        ++served;  // with an answer or with an error
      }
    }
    hoard().peers.push_back(std::move(peer));
  }
  return std::to_string(served) + " served, " + std::to_string(refused) + " refused";
}

std::string garble(Words& words) {
  const std::string service = words.next();
  const std::vector<Bytes> garbage = {
      Bytes(4096, 0xff),
      Bytes(4096, 0),
      {'G', 'E', 'T', ' ', '/', '\r', '\n', '\r', '\n'},
      request(1),
      hello() + hello(),
      hello() + request(7) + request(7),
      hello() + bytesOf(ReplyFrame{1, {}}),
      hello() + Bytes{2, 0, 0, 0, 0xee, 0},
      hello() + Bytes{1, 0, 0x10, 0},
  };
  int ended = 0;
  for (const Bytes& bytes : garbage) {
    const RawPeer peer = connectTo(service);
    peer.write(bytes);
    if (endOf(peer) == static_cast<std::int64_t>(QXRpcErrorCode::malformedFrame)) ++ended;
  }
  return std::to_string(ended) + " of " + std::to_string(garbage.size()) + " ended";
}

std::string sendHalves(Words& words) {
  const std::string service = words.next();
  const Bytes whole = hello() + request(1);
  for (int i = std::stoi(words.next()); i > 0; --i) {
    hoard().peers.push_back(connectTo(service));
    if (!hoard().peers.back().write(std::span(whole).first(whole.size() - 1))) return "ended";
  }
  return "ok";
}

// An access's identifier is the connection's own matter.
QXUUID accessID(int number) {
  QXUUID result;
  std::memcpy(result.bytes.data(), &number, sizeof number);
  return result;
}

std::string takeTurns(Words& words) {
  const QXURL url = QXURL::fileURL(words.next(), QXURLKind::file);
  hoard().clients.push_back(std::make_unique<tests::Client>(publicSocket(kFileCoordinationServiceName), std::nullopt));
  tests::Client& client = *hoard().clients.back();
  const int count = std::stoi(words.next());
  for (int i = 0; i < count; ++i) {
    const auto error = tests::errorOf(client.ask<&QXFileCoordination::coordinateReadingItemAtURL>(
        std::optional(url), std::optional<QXData>(), std::optional(accessID(i)), std::optional<std::int64_t>(i)));
    if (error) return std::to_string(i) + ", then " + told(error);
  }
  return std::to_string(count);
}

std::string scribble(Words& words) {
  const std::string path = words.next();
  const ProviderID provider{words.next()};
  const ConsumerID consumer{words.next()};
  const int files = std::stoi(words.next());
  const int writes = std::stoi(words.next());
  tests::Client daemon(publicSocket(kDVServiceName), std::nullopt);
  tests::Client coordination(publicSocket(kFileCoordinationServiceName), std::nullopt);
  int written = 0;
  for (int file = 0; file < files; ++file) {
    const std::optional url = QXURL::fileURL(path + std::to_string(file), QXURLKind::file);
    const auto granted = daemon.ask<&DVDaemon::extendSandboxForFileURL>(url, provider, consumer);
    if (const auto error = tests::errorOf(granted)) return told(error);
    const std::optional<QXData> token = std::get<1>(std::get<0>(granted));
    for (int i = 0; i < writes; ++i, ++written) {
      const std::optional id = accessID(written);
      const std::optional<std::int64_t> party = 0;
      auto error = tests::errorOf(coordination.ask<&QXFileCoordination::coordinateWritingItemAtURL>(url, token, id, party));
      if (!error) error = tests::errorOf(coordination.ask<&QXFileCoordination::endAccess>(id));
      if (error) return std::to_string(written) + ", then " + told(error);
    }
  }
  return std::to_string(written);
}

enum class Answers { wanted, unwanted };

std::string startAgainAndAgain(Words& words, Answers answers) {
  const QXURL url = QXURL::fileURL(words.next(), QXURLKind::file);
  const std::string provider = words.next();
  const std::string consumer = words.next();
  const std::uint64_t count = std::stoull(words.next());
  hoard().peers.push_back(connectTo(kDVServiceName));
  const RawPeer& peer = hoard().peers.back();
  if (!peer.sayHello()) return "ended at once";
  for (std::uint64_t number = 1; number <= count; ++number) {
    if (!peer.write(Frame(RequestFrame{number, answers == Answers::wanted, kStart, {url, provider, consumer}}))) return "ended";
  }
  while (const auto frame = peer.read()) {
    if (const auto* failure = std::get_if<FailureFrame>(&*frame)) {
      return std::to_string(failure->callID) + ": " + told(failure->error);
    }
    if (std::holds_alternative<ReplyFrame>(*frame)) return "answered";
  }
  return "no answer";
}

// The processes that it started go before it does: a sanitizer starts one at the end.
std::vector<pid_t>& forked() {
  static std::vector<pid_t> all;
  return all;
}

void endForked() {
  for (const pid_t child : forked()) ::kill(child, SIGKILL);
  for (const pid_t child : forked()) ::waitpid(child, nullptr, 0);
}

std::string forkUntilRefused(Words& /*words*/) {
  forked().reserve(kMostProcesses);
  std::atexit(endForked);
  for (int i = 0; i < kMostProcesses; ++i) {
    const pid_t child = ::fork();
    if (child < 0) return outcome(child);
    if (child > 0) {
      forked().push_back(child);
      continue;
    }
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    ::pause();
    ::_exit(0);
  }
  return "never refused";
}

// Of one socket that nobody reads.
int sendDescriptors(int socket, int descriptor) {
  std::array<int, kDescriptorsOfAMessage> descriptors{};
  descriptors.fill(descriptor);
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof descriptors)> control{};
  char byte = 0;
  iovec bytes{&byte, 1};
  msghdr message{};
  message.msg_iov = &bytes;
  message.msg_iovlen = 1;
  message.msg_control = control.data();
  message.msg_controllen = control.size();
  cmsghdr* const header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof descriptors);
  std::memcpy(CMSG_DATA(header), descriptors.data(), sizeof descriptors);
  return static_cast<int>(::sendmsg(socket, &message, MSG_DONTWAIT | MSG_NOSIGNAL));
}

std::string passAround(Words& /*words*/) {
  rlimit limit{};
  ::getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  ::setrlimit(RLIMIT_NOFILE, &limit);
  const UniqueDescriptor descriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  for (int i = 0; i < kMostMessages; ++i) {
    if (!hoard().sockets.empty() && sendDescriptors(hoard().sockets.back().get(), descriptor.get()) >= 0) continue;
    // One that is full is followed by another.
    if (!hoard().sockets.empty() && errno != EAGAIN) return outcome(-1);
    std::array<int, 2> ends{};
    if (::socketpair(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0, ends.data()) != 0) return outcome(-1);
    for (const int end : ends) hoard().sockets.emplace_back(end);
  }
  return "never refused";
}

std::string hold(Words& words) {
  constexpr std::chrono::milliseconds kBetweenLooks{2};
  const std::string name = words.next();
  std::ofstream(name + ".holding").close();
  const auto deadline = std::chrono::steady_clock::now() + tests::kPatience;
  while (!std::filesystem::exists(name + ".go")) {
    if (std::chrono::steady_clock::now() > deadline) return "nobody came";
    std::this_thread::sleep_for(kBetweenLooks);
  }
  return "ok";
}

}  // namespace

Acts pressureActs() {
  return {{"crowd", crowd},
          {"garble", garble},
          {"half", sendHalves},
          {"turns", takeTurns},
          {"scribble", scribble},
          {"start", [](Words& words) { return startAgainAndAgain(words, Answers::wanted); }},
          {"start-silently", [](Words& words) { return startAgainAndAgain(words, Answers::unwanted); }},
          {"fork", forkUntilRefused},
          {"pass-around", passAround},
          {"hold", hold}};
}

}  // namespace docuvend::attacker
