// Much of what is allowed in small numbers.
//
//   pile PATH CONNECTIONS COUNT   asks over each connection so often for the string of a document, named as lengthily as it can be, and
//                                 waits for all answers; "ok" when they came
//   name PATH COUNT               asks so often at once for the string of a document, and waits for all answers; "ok" when they came
//   nag COUNT                     passes on what it has not to somebody with a long name, so often, and waits for all answers
//   misread STRING COUNT          reads the document of a bookmarkable string in so many accesses, over connections that it ends without
//   ending
//                                 the accesses; how many could not begin
//   gather SERVICE COUNT          makes connections whose makers have ended since, and keeps them
//   survey PATH                   over each of these asks to wake the daemon and for the string of a document: how many were refused, and
//                                 what the others were answered
#include <sys/socket.h>
#include <sys/time.h>

#include <atomic>
#include <cstdint>
#include <cstring>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <thread>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/rpc_errors.h"
#include "tests/attacks/attacker/Acts.h"
#include "tests/attacks/attacker/Requests.h"
#include "tests/system/house/Client.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::attacker {
namespace {

using namespace linux_platform;
using tests::RawPeer;

constexpr const char* kWakeUp = "wakeUpCompletion:";
constexpr const char* kStringOf = "bookmarkableStringFromDocumentURL:completion:";
constexpr const char* kPassOn = "extendBookmarkForFileURL:toConsumerID:completionHandler:";
constexpr std::size_t kLengthyPath = 3800;
constexpr std::size_t kLengthyName = 4000;

RawPeer patient(UniqueDescriptor socket) {
  const timeval patience{tests::kPatience.count(), 0};
  ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
  return RawPeer(std::move(socket));
}

RawPeer connectTo(const std::string& service) {
  auto connected = connectToSocket(publicSocket(service));
  auto* socket = std::get_if<UniqueDescriptor>(&connected);
  return socket == nullptr ? RawPeer({}) : patient(std::move(*socket));
}

// A path below that one whose every byte is escaped.
QXURL lengthyURL(std::string path) {
  static constexpr char kDigits[] = "0123456789abcdef";
  while (path.size() < kLengthyPath) path.append("/").append(200, 'a');
  std::string text = "file:///";
  for (const char c : path.substr(1)) {
    const auto byte = static_cast<unsigned char>(c);
    text.append({'%', kDigits[byte >> 4U], kDigits[byte & 0xFU]});
  }
  return *QXURL::fromString(text);
}

// Sends so many, without waiting for an answer, and takes the answers; whether all came.
bool askForMany(const RawPeer& peer, const std::string& operation, const QXArray& arguments, std::uint64_t count) {
  if (!peer.sayHello()) return false;
  std::thread asking([&] {
    for (std::uint64_t number = 1; number <= count; ++number) {
      if (!peer.write(Frame(RequestFrame{number, true, operation, arguments}))) return;
    }
  });
  std::uint64_t answers = 0;
  while (answers < count) {
    const auto frame = peer.read();
    if (!frame || std::holds_alternative<EndFrame>(*frame)) break;
    if (!std::holds_alternative<Hello>(*frame)) ++answers;
  }
  asking.join();
  return answers == count;
}

std::string pile(Words& words) {
  const QXURL url = lengthyURL(words.next());
  const int connections = std::stoi(words.next());
  const std::uint64_t count = std::stoull(words.next());
  std::atomic<int> answered = 0;
  std::vector<std::thread> threads;
  for (int i = 0; i < connections; ++i) {
    threads.emplace_back([&] { answered += askForMany(connectTo(kDVServiceName), kStringOf, {url}, count) ? 1 : 0; });
  }
  for (auto& thread : threads) thread.join();
  return answered == connections ? "ok" : "only " + std::to_string(answered) + " were answered";
}

std::string name(Words& words) {
  const QXURL url = QXURL::fileURL(words.next(), QXURLKind::file);
  return askForMany(connectTo(kDVServiceName), kStringOf, {url}, std::stoull(words.next())) ? "ok" : "ended";
}

std::string nag(Words& words) {
  const std::uint64_t count = std::stoull(words.next());
  const QXArray arguments = {QXValue(), QXValue(std::string(kLengthyName, 'x'))};
  return askForMany(connectTo(kDVServiceName), kPassOn, arguments, count) ? "ok" : "ended";
}

std::string misread(Words& words) {
  constexpr int kAccessesOfAConnection = 50;
  tests::Client daemon(publicSocket(kDVServiceName), std::nullopt);
  const auto resolved = daemon.ask<&DVDaemon::documentURLFromBookmarkableString>(words.next());
  if (const auto error = tests::errorOf(resolved)) return tests::told(*error);
  const std::optional<QXURL> url = std::get<0>(std::get<0>(resolved));
  const std::optional<QXData> token = std::get<1>(std::get<0>(resolved));
  const int count = std::stoi(words.next());
  int failed = 0;
  std::unique_ptr<tests::Client> coordination;
  for (int number = 0; number < count; ++number) {
    if (number % kAccessesOfAConnection == 0) {
      coordination = std::make_unique<tests::Client>(publicSocket(kFileCoordinationServiceName), std::nullopt);
    }
    QXUUID id;
    std::memcpy(id.bytes.data(), &number, sizeof number);
    const std::optional<std::int64_t> party = number;
    const auto begun = coordination->ask<&QXFileCoordination::coordinateReadingItemAtURL>(url, token, std::optional(id), party);
    failed += tests::errorOf(begun) ? 1 : 0;
  }
  return std::to_string(failed);
}

std::vector<RawPeer>& orphans() {
  static std::vector<RawPeer> all;
  return all;
}

std::string gather(Words& words) {
  const std::string service = words.next();
  for (int i = std::stoi(words.next()); i > 0; --i) {
    auto connection = connectionOfTheDead(service);
    if (!connection) return "no connection";
    orphans().push_back(patient(std::move(connection)));
  }
  return "ok";
}

std::string survey(Words& words) {
  const QXURL url = QXURL::fileURL(words.next(), QXURLKind::file);
  int refused = 0;
  std::set<std::string> answers;
  for (const RawPeer& peer : orphans()) {
    static_cast<void>(peer.sayHello() && peer.write(Frame(RequestFrame{1, true, kWakeUp, {}})) &&
                      peer.write(Frame(RequestFrame{2, true, kStringOf, {url}})));
    std::map<std::uint64_t, std::string> told{{1, "nothing"}, {2, "nothing"}};
    bool isRefused = false;
    for (int left = 2; left > 0;) {
      const auto frame = peer.read();
      if (!frame || std::holds_alternative<EndFrame>(*frame)) {
        isRefused = frame && std::get<EndFrame>(*frame).error.code == static_cast<std::int64_t>(QXRpcErrorCode::refused);
        break;
      }
      if (const auto* reply = std::get_if<ReplyFrame>(&*frame)) told[reply->callID] = "an answer";
      if (const auto* failure = std::get_if<FailureFrame>(&*frame)) told[failure->callID] = tests::told(failure->error);
      if (!std::holds_alternative<Hello>(*frame)) --left;
    }
    refused += isRefused ? 1 : 0;
    if (!isRefused) answers.insert(told[1] + ", " + told[2]);
  }
  std::string result = std::to_string(refused) + " refused";
  for (const auto& answer : answers) result.append("; ").append(answer);
  return result;
}

}  // namespace

Acts floodActs() { return {{"pile", pile}, {"name", name}, {"nag", nag}, {"misread", misread}, {"gather", gather}, {"survey", survey}}; }

}  // namespace docuvend::attacker
