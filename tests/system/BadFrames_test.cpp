// Peers of the live daemon that do not keep to the protocol. Whatever one sends, it is told or dropped, and the daemon goes on.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <ostream>
#include <vector>

#include "platform/linux/identity/KernelFacilities.h"
#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/rpc_errors.h"
#include "tests/system/house/DaemonHouse.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::tests {
namespace {

using namespace linux_platform;
using ::testing::HasSubstr;
using Bytes = std::vector<std::uint8_t>;

constexpr const char* kWakeUp = "wakeUpCompletion:";
constexpr const char* kResolve = "documentURLFromBookmarkableString:completion:";
constexpr const char* kName = "bookmarkableStringFromDocumentURL:completion:";

std::int64_t codeOf(QXRpcErrorCode code) { return static_cast<std::int64_t>(code); }

Bytes operator+(Bytes first, const Bytes& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

Bytes hello() { return bytesOf(Hello{kProtocolVersion, std::nullopt}); }
Bytes wakeUp(std::uint64_t number) { return bytesOf(RequestFrame{number, true, kWakeUp, {}}); }

class BadFrames : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kEditor);
    house_.startDaemon();
  }

  // A peer that waits for nothing longer than the tests' patience.
  RawPeer connect() const {
    auto connected = connectToSocket(house_.publicSocket(kDVServiceName));
    auto* socket = std::get_if<UniqueDescriptor>(&connected);
    if (socket == nullptr) {
      ADD_FAILURE() << "the daemon cannot be reached";
      return RawPeer({});
    }
    const timeval patience{kPatience.count(), 0};
    ::setsockopt(socket->get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    ::setsockopt(socket->get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
    return RawPeer(std::move(*socket));
  }

  int closings() const { return house_.loggedBeginning("[NOTICE] Closing the connection of PID " + std::to_string(::getpid()) + ": "); }

  // The connection is ended with that code, after one line in the log, and others are served.
  void expectDropped(const RawPeer& peer, QXRpcErrorCode code, const std::string& reason) const {
    std::optional<EndFrame> end;
    while (auto frame = peer.read()) {
      if (auto* last = std::get_if<EndFrame>(&*frame)) end = *last;
    }
    ASSERT_TRUE(end);
    EXPECT_EQ(end->error.domain, kQXRpcErrorDomain);
    EXPECT_EQ(end->error.code, codeOf(code));
    EXPECT_EQ(end->error.texts.at("description"), reason);
    EXPECT_TRUE(peer.atEnd());
    EXPECT_TRUE(house_.awaitLog("[NOTICE] Closing the connection of PID " + std::to_string(::getpid()) + ": " + reason));
    EXPECT_EQ(closings(), 1);
    EXPECT_TRUE(house_.answers());
  }
};

struct Malformation {
  std::string name;
  Bytes bytes;
  std::string reason;
};
void PrintTo(const Malformation& malformation, std::ostream* out) { *out << malformation.reason; }

std::vector<Malformation> malformations() {
  std::vector<Malformation> all = {
      {"OfUnknownType", hello() + Bytes{2, 0, 0, 0, 0xee, 0}, "a frame of unknown type 238"},
      {"WithoutContents", hello() + Bytes{0, 0, 0, 0}, "a frame without a head"},
      {"LongerThanAllowed", hello() + Bytes{0xff, 0xff, 0xff, 0xff}, "a frame of 4294967295 bytes"},
      {"AByteLongerThanAllowed", hello() + Bytes{1, 0, 0x10, 0}, "a frame of 1048577 bytes"},
      {"WithoutItsDescriptors", hello() + Bytes{2, 0, 0, 0, 2, 3}, "a frame without the descriptors that it declares"},
      {"BeforeTheHello", wakeUp(1), "a frame before the hello"},
      {"ThatIsASecondHello", hello() + hello(), "a second hello"},
      {"WhoseNumberDoesNotRise", hello() + wakeUp(7) + wakeUp(7), "a request whose number does not rise"},
      {"ThatAnswersNothing", hello() + bytesOf(ReplyFrame{1, {}}), "an answer to a request that was not made"},
      {"ThatFailsNothing", hello() + bytesOf(FailureFrame{9, QXError::system(1, "x")}), "an answer to a request that was not made"},
      {"OfText", {'G', 'E', 'T', ' ', '/', ' ', 'H', 'T', 'T', 'P', '\r', '\n', '\r', '\n'}, "a frame of 542393671 bytes"},
      {"OfOnes", Bytes(4096, 0xff), "a frame of 4294967295 bytes"},
      {"OfZeros", Bytes(4096, 0), "a frame without a head"},
  };
  Bytes withControl = bytesOf(RequestFrame{1, true, kResolve, {"docuvend:p/~"}});
  std::replace(withControl.begin(), withControl.end(), std::uint8_t{'~'}, std::uint8_t{1});
  all.push_back({"WithAControlCharacter", hello() + withControl, "a text with characters that cannot be carried"});
  Bytes withBrokenText = bytesOf(RequestFrame{1, true, kResolve, {"docuvend:p/~"}});
  std::replace(withBrokenText.begin(), withBrokenText.end(), std::uint8_t{'~'}, std::uint8_t{0xff});
  all.push_back({"WithTextThatIsNoUTF8", hello() + withBrokenText, "a text with characters that cannot be carried"});
  Bytes withQuery = bytesOf(RequestFrame{1, true, kName, {*QXURL::fromString("file:///~")}});
  std::replace(withQuery.begin(), withQuery.end(), std::uint8_t{'~'}, std::uint8_t{'?'});
  all.push_back({"WithAURLThatIsNone", hello() + withQuery, "a text that is no file URL"});
  Bytes leftOver = wakeUp(1);
  leftOver.push_back(0);
  ++leftOver.front();
  all.push_back({"WithBytesLeftOver", hello() + leftOver, "1 bytes after the end of a frame's contents"});
  return all;
}

class MalformedFrames : public BadFrames, public ::testing::WithParamInterface<Malformation> {};

TEST_P(MalformedFrames, EndTheirConnectionWithOneLineAndNothingElse) {
  const RawPeer peer = connect();
  ASSERT_TRUE(peer.write(GetParam().bytes));
  expectDropped(peer, QXRpcErrorCode::malformedFrame, GetParam().reason);
}

INSTANTIATE_TEST_SUITE_P(AFrame, MalformedFrames, ::testing::ValuesIn(malformations()), [](const auto& info) { return info.param.name; });

TEST_F(BadFrames, AFrameThatBreaksOffIsMalformed) {
  const RawPeer peer = connect();
  Bytes half = hello() + wakeUp(1);
  half.erase(half.end() - 3, half.end());
  ASSERT_TRUE(peer.write(half));
  ASSERT_EQ(::shutdown(peer.socket(), SHUT_WR), 0);
  expectDropped(peer, QXRpcErrorCode::malformedFrame, "the connection ended inside a frame");
}

TEST_F(BadFrames, AnotherVersionOfTheProtocolIsTold) {
  const RawPeer peer = connect();
  ASSERT_TRUE(peer.write(Frame(Hello{kProtocolVersion + 1, std::nullopt})));
  expectDropped(peer, QXRpcErrorCode::unsupportedVersion,
                "version " + std::to_string(kProtocolVersion + 1) + " of the protocol is not supported");
}

TEST_F(BadFrames, AnUnknownOperationIsAnErrorAndTheConnectionGoesOn) {
  const RawPeer peer = connect();
  ASSERT_TRUE(peer.sayHello());
  ASSERT_TRUE(peer.read<Hello>());
  std::uint64_t number = 0;
  for (const std::string& operation : {std::string("shutDown:"), std::string(), std::string("wakeUpCompletion"),
                                       std::string(kMaximumTextBytes, 'x'), std::string("redeemToken:forWriting:completionHandler:")}) {
    ASSERT_TRUE(peer.write(Frame(RequestFrame{++number, true, operation, {}})));
    const auto failure = peer.read<FailureFrame>();
    ASSERT_TRUE(failure);
    EXPECT_EQ(failure->callID, number);
    EXPECT_EQ(failure->error.code, codeOf(QXRpcErrorCode::unknownOperation));
  }
  ASSERT_TRUE(peer.write(Frame(RequestFrame{++number, true, kWakeUp, {}})));
  EXPECT_TRUE(peer.read<ReplyFrame>());
  EXPECT_EQ(closings(), 0);
}

TEST_F(BadFrames, AnArgumentOfTheWrongTypeIsAnErrorAndTheConnectionGoesOn) {
  const RawPeer peer = connect();
  ASSERT_TRUE(peer.sayHello());
  ASSERT_TRUE(peer.read<Hello>());
  const QXURL url = *QXURL::fromString("file:///x");
  const std::vector<std::pair<const char*, QXArray>> requests = {
      {kWakeUp, {1}},
      {kResolve, {}},
      {kResolve, {url}},
      {kResolve, {7}},
      {kResolve, {QXValue(QXArray{"docuvend:p/i"})}},
      {kResolve, {"docuvend:p/i", "docuvend:p/i"}},
      {kName, {"file:///x"}},
      {kName, {QXDictionary{{"url", url}}}},
      {"extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:", {url, "p", true}},
      {"extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:", {url, "p"}},
      {"startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:", {url, QXData::fromText("p"), "c"}},
  };
  std::uint64_t number = 0;
  for (const auto& [operation, arguments] : requests) {
    ASSERT_TRUE(peer.write(Frame(RequestFrame{++number, true, operation, arguments})));
    const auto failure = peer.read<FailureFrame>();
    ASSERT_TRUE(failure) << operation << " " << QXValue(arguments).description();
    EXPECT_EQ(failure->error.code, codeOf(QXRpcErrorCode::invalidArguments)) << operation << " " << QXValue(arguments).description();
  }
  ASSERT_TRUE(peer.write(Frame(RequestFrame{++number, true, kWakeUp, {}})));
  EXPECT_TRUE(peer.read<ReplyFrame>());
  EXPECT_EQ(closings(), 0);
}

// Refused at its length, before anything of it is read.
TEST_F(BadFrames, AMessageThatIsTooLongIsNeitherKeptNorAnswered) {
  const RawPeer peer = connect();
  ByteWriter header;
  header.u32(static_cast<std::uint32_t>(kMaximumFrameBytes + 1));
  ASSERT_TRUE(peer.write(hello() + header.bytes()));
  peer.write(Bytes(kMaximumFrameBytes, 2));
  expectDropped(peer, QXRpcErrorCode::malformedFrame, "a frame of 1048577 bytes");
}

TEST_F(BadFrames, TheLongestMessageIsServed) {
  const RawPeer peer = connect();
  ASSERT_TRUE(peer.sayHello());
  ASSERT_TRUE(peer.read<Hello>());
  ASSERT_TRUE(peer.write(Frame(RequestFrame{1, true, kResolve, {std::string(kMaximumTextBytes, 'd')}})));
  const auto reply = peer.read<ReplyFrame>();
  ASSERT_TRUE(reply);
  EXPECT_NE(reply->values.back().as<QXError>(), nullptr);
}

TEST_F(BadFrames, ValuesWithinValuesHaveABound) {
  Bytes deep = bytesOf(RequestFrame{1, true, kResolve, {QXValue(QXArray{})}});
  const Bytes array(deep.end() - 5, deep.end());  // one empty array: its kind and a count
  deep.erase(deep.end() - 5, deep.end());
  Bytes one = array;
  one[1] = 1;
  for (std::size_t i = 0; i < 1000; ++i) deep = deep + one;
  deep = deep + array;
  const auto length = static_cast<std::uint32_t>(deep.size() - kFrameLengthBytes);
  for (unsigned i = 0; i < 4; ++i) deep[i] = static_cast<std::uint8_t>(length >> (8 * i));
  const RawPeer peer = connect();
  ASSERT_TRUE(peer.write(hello() + deep));
  expectDropped(peer, QXRpcErrorCode::malformedFrame, "values nested too deeply");
}

// The kernel refuses them to their sender, where it can: then nothing has been said, and the connection is as it was.
TEST_F(BadFrames, DescriptorsAreRefusedOrEndTheConnectionAndAreClosed) {
  std::array<int, 2> pipe{-1, -1};
  ASSERT_EQ(::pipe2(pipe.data(), O_CLOEXEC), 0);
  const UniqueDescriptor reading(pipe[0]);
  UniqueDescriptor writing(pipe[1]);
  const RawPeer peer = connect();
  const std::array<int, 1> passed{writing.get()};
  const bool isPassed = peer.write(hello() + wakeUp(1), passed);
  const int problem = errno;
  writing.reset();
  if (linux_platform::KernelFacilities::probe().refusedDescriptors) {
    EXPECT_FALSE(isPassed);
    EXPECT_EQ(problem, EPERM);
    ASSERT_TRUE(peer.write(hello() + wakeUp(1)));
    EXPECT_TRUE(peer.read<Hello>());
    EXPECT_TRUE(peer.read<ReplyFrame>());
  } else {
    ASSERT_TRUE(isPassed);
    expectDropped(peer, QXRpcErrorCode::malformedFrame, "descriptors that no frame declares");
  }
  // The pipe's end comes when nobody has the passed copy any more.
  pollfd waiting{reading.get(), POLLIN, 0};
  ASSERT_EQ(::poll(&waiting, 1, static_cast<int>(std::chrono::milliseconds(kPatience).count())), 1);
  EXPECT_NE(waiting.revents & POLLHUP, 0);
}

TEST_F(BadFrames, APeerThatNeverReadsIsDroppedAndHoldsNobodyUp) {
  const RawPeer peer = connect();
  ASSERT_TRUE(peer.sayHello());
  // Each request is answered with about as much as it brings.
  constexpr std::uint64_t kMostRequests = 2'000'000;
  std::uint64_t number = 0;
  Bytes batch;
  bool open = true;
  while (open && number < kMostRequests) {
    batch.clear();
    for (int i = 0; i < 200; ++i) {
      const Bytes request = bytesOf(RequestFrame{++number, true, std::string(250, 'x'), {}});
      batch.insert(batch.end(), request.begin(), request.end());
    }
    open = peer.write(batch);
  }
  EXPECT_FALSE(open) << "it was served for ever";
  EXPECT_TRUE(house_.awaitLog("[NOTICE] Closing the connection of PID " + std::to_string(::getpid()) +
                              ": the peer does not read what is sent to it"));
  EXPECT_EQ(closings(), 1);
  EXPECT_TRUE(house_.answers());
}

TEST_F(BadFrames, APeerThatSaysNothingHoldsNobodyUp) {
  std::vector<RawPeer> silent;
  for (int i = 0; i < 30; ++i) silent.push_back(connect());
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(house_.answers());
}

TEST_F(BadFrames, AFloodOfConnectionsIsLimitedWithOneLineAndLaterOnesAreServed) {
  constexpr int kConnections = 1200;
  // One that the house keeps is among those that are counted.
  constexpr int kAdmitted = 1023;
  rlimit descriptors{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &descriptors), 0);
  descriptors.rlim_cur = descriptors.rlim_max;
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &descriptors), 0);
  std::vector<RawPeer> peers;
  for (int i = 0; i < kConnections; ++i) peers.push_back(connect());
  int admitted = 0;
  int refused = 0;
  for (const RawPeer& peer : peers) {
    // One that has been closed already still says why.
    peer.write(hello() + wakeUp(1));
    EXPECT_TRUE(peer.read<Hello>());
    const auto answer = peer.read();
    ASSERT_TRUE(answer);
    if (std::holds_alternative<ReplyFrame>(*answer)) ++admitted;
    if (const auto* end = std::get_if<EndFrame>(&*answer)) {
      ++refused;
      EXPECT_EQ(end->error.code, codeOf(QXRpcErrorCode::refused));
      EXPECT_TRUE(peer.atEnd());
    }
  }
  EXPECT_EQ(admitted, kAdmitted);
  EXPECT_EQ(refused, kConnections - kAdmitted);
  const std::string line =
      "[NOTICE] Refusing a connection of PID " + std::to_string(::getpid()) + ": unconfined processes may not open more than 1024.";
  EXPECT_EQ(house_.logged(line), 1);
  // A confined application has a number of its own.
  EXPECT_NE(house_.confined(kEditor, {"show", "docuvend:p/i"}).errors.find("not permitted"), std::string::npos);

  peers.clear();
  eventually("a new client is served", [this] { return house_.client()->ask<&DVDaemon::wakeUpCompletion>().index() == 0; });
}

}  // namespace
}  // namespace docuvend::tests
