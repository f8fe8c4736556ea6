// Texts that are none, in every field of every operation that takes one, written to the socket as bytes: not UTF-8, with NUL, longer than
// texts may be. The connection ends with one clean line in the log, and nobody else notices.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <algorithm>
#include <chrono>

#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/rpc_errors.h"
#include "tests/attacks/AttackTest.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::tests {
namespace {

using linux_platform::EndFrame;
using linux_platform::FailureFrame;
using linux_platform::kFileCoordinationServiceName;
using linux_platform::kMaximumTextBytes;
using linux_platform::kSandboxServiceName;
using linux_platform::UniqueDescriptor;
using Bytes = std::vector<std::uint8_t>;

// The kinds of values, as they stand on the wire.
enum class Kind : std::uint8_t { boolean = 1, integer = 2, string = 4, data = 5, url = 6, uuid = 7 };

struct Operation {
  const char* service;
  std::string name;
  std::vector<Kind> arguments;
};

const std::vector<Operation>& operations() {
  using enum Kind;
  static const std::vector<Operation> all = {
      {kDVServiceName, "wakeUpCompletion:", {}},
      {kDVServiceName, "extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:", {url, string, string}},
      {kDVServiceName, "providePlaceholderForItemAtURL:fromProviderID:forConsumerID:completionHandler:", {url, string, string}},
      {kDVServiceName, "startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:", {url, string, string}},
      {kDVServiceName, "stopProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:", {url, string, string}},
      {kDVServiceName, "extendBookmarkForFileURL:toConsumerID:completionHandler:", {url, string}},
      {kDVServiceName, "bookmarkableStringFromDocumentURL:completion:", {url}},
      {kDVServiceName, "documentURLFromBookmarkableString:completion:", {string}},
      {kSandboxServiceName, "redeemToken:forWriting:completionHandler:", {data, boolean}},
      {kSandboxServiceName, "replaceItemWithToken:bySiblingWithToken:completionHandler:", {data, data}},
      {kFileCoordinationServiceName, "coordinateReadingItemAtURL:token:accessID:party:completionHandler:", {url, data, uuid, integer}},
      {kFileCoordinationServiceName, "coordinateWritingItemAtURL:token:accessID:party:completionHandler:", {url, data, uuid, integer}},
      {kFileCoordinationServiceName, "holdersOfItemAtURL:token:completionHandler:", {url, data}},
      {kFileCoordinationServiceName, "writerDidFinishWritingForURL:completionHandler:", {url}},
      {kDVAdministrationServiceName, "grantsOfProviderID:toConsumerID:startingAt:completionHandler:", {string, string, integer}},
      {kDVAdministrationServiceName, "revokeItemID:fromProviderID:toConsumerID:completionHandler:", {string, string, string}},
  };
  return all;
}

// What a text must not be; with `before` in front where it is a URL's.
std::vector<std::string> badTexts(const std::string& before) {
  std::vector<std::string> texts = {
      "\xff", "\xc0\x80",           "\xc1\xbf", "\xe0\x80\xaf", "\xed\xa0\x80", "\xf4\x90\x80\x80",    "\xe2\x82",
      "\x80", std::string(1, '\0'), "\x01",     "\x1b[2J",      "\xef\xbf\xbf", std::string("a\0b", 3)};
  texts.push_back(std::string(kMaximumTextBytes - before.size(), 'x') + "x");
  for (std::string& text : texts) text.insert(0, before);
  return texts;
}

class Message {
 public:
  void u8(std::uint8_t value) { bytes_.push_back(value); }
  void u32(std::uint32_t value) {
    for (unsigned shift = 0; shift < 32; shift += 8) u8(static_cast<std::uint8_t>(value >> shift));
  }
  void u64(std::uint64_t value) {
    u32(static_cast<std::uint32_t>(value));
    u32(static_cast<std::uint32_t>(value >> 32U));
  }
  void text(const std::string& text) {
    u32(static_cast<std::uint32_t>(text.size()));
    bytes_.insert(bytes_.end(), text.begin(), text.end());
  }
  // As it goes over the wire.
  [[nodiscard]] Bytes framed() const {
    Message whole;
    whole.u32(static_cast<std::uint32_t>(bytes_.size()));
    whole.bytes_.insert(whole.bytes_.end(), bytes_.begin(), bytes_.end());
    return whole.bytes_;
  }

 private:
  Bytes bytes_;
};

// `text` stands in the place of that argument; of the operation's name when it is the one after the last.
Bytes request(const Operation& operation, std::size_t place, const std::string& text) {
  Message message;
  message.u8(2);
  message.u8(0);
  message.u64(1);
  message.u8(1);
  message.text(place == operation.arguments.size() ? text : operation.name);
  message.u32(static_cast<std::uint32_t>(operation.arguments.size()));
  for (std::size_t i = 0; i < operation.arguments.size(); ++i) {
    const Kind kind = operation.arguments[i];
    if (kind != Kind::string && kind != Kind::url) {
      message.u8(0);
      continue;
    }
    message.u8(static_cast<std::uint8_t>(kind));
    message.text(i == place ? text : kind == Kind::url ? "file:///nowhere" : "nobody");
  }
  return message.framed();
}

class WireTexts : public AttackTest {
 protected:
  void SetUp() override {
    AttackTest::SetUp();
    house_.install(kEditor);
    house_.startDaemon();
  }

  [[nodiscard]] RawPeer connect(const std::string& service) const {
    const bool isAdministration = service == kDVAdministrationServiceName;
    auto connected = linux_platform::connectToSocket(isAdministration ? house_.administrationSocket() : house_.publicSocket(service));
    auto* socket = std::get_if<UniqueDescriptor>(&connected);
    if (socket == nullptr) return RawPeer({});
    const timeval patience{kPatience.count(), 0};
    ::setsockopt(socket->get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    return RawPeer(std::move(*socket));
  }
  // Why the connection ended; 0 when it did not say.
  [[nodiscard]] static std::int64_t endOf(const RawPeer& peer) {
    while (const auto frame = peer.read()) {
      if (const auto* end = std::get_if<EndFrame>(&*frame)) return end->error.code;
      if (std::holds_alternative<FailureFrame>(*frame) || std::holds_alternative<linux_platform::ReplyFrame>(*frame)) return 0;
    }
    return 0;
  }
  static constexpr auto kMalformed = static_cast<std::int64_t>(QXRpcErrorCode::malformedFrame);

  void expectCleanLog() const {
    for (const std::string& line : house_.log()) {
      EXPECT_TRUE(std::none_of(line.begin(), line.end(), [](unsigned char c) { return c < 0x20 || c == 0x7f; })) << line;
      EXPECT_LT(line.size(), 1'000U);
    }
  }
};

TEST_F(WireTexts, InAnyArgumentEndTheConnectionAndNothingElse) {
  int malformed = 0;
  for (const Operation& operation : operations()) {
    // The name of the operation is a text as well.
    for (std::size_t place = 0; place <= operation.arguments.size(); ++place) {
      const bool isName = place == operation.arguments.size();
      if (!isName && operation.arguments[place] != Kind::string && operation.arguments[place] != Kind::url) continue;
      for (const std::string& text : badTexts(!isName && operation.arguments[place] == Kind::url ? "file:///" : "")) {
        const RawPeer peer = connect(operation.service);
        peer.sayHello();
        peer.write(request(operation, place, text));
        EXPECT_EQ(endOf(peer), kMalformed) << operation.name << " " << place << " " << ::testing::PrintToString(text.substr(0, 20));
        ++malformed;
      }
    }
    // The same message with a text in that place is answered.
    const RawPeer honest = connect(operation.service);
    honest.sayHello();
    honest.write(request(operation, operation.arguments.size(), operation.name));
    ASSERT_TRUE(honest.read<linux_platform::Hello>());
    EXPECT_TRUE(honest.read<linux_platform::ReplyFrame>()) << operation.name;
  }
  EXPECT_EQ(house_.loggedContaining("[NOTICE] Closing the connection of PID "), malformed);
  EXPECT_TRUE(house_.answers());
  expectCleanLog();
}

TEST_F(WireTexts, InADeclarationEndTheConnectionAndNothingElse) {
  for (const std::string& text : badTexts("")) {
    Message hello;
    hello.u8(1);
    hello.u8(0);
    hello.u32(linux_platform::kProtocolVersion);
    hello.u8(1);
    hello.text(text);
    const RawPeer peer = connect(kDVServiceName);
    peer.write(hello.framed());
    EXPECT_EQ(endOf(peer), kMalformed) << ::testing::PrintToString(text.substr(0, 20));
  }
  EXPECT_EQ(house_.loggedContaining(" declares itself to be "), 0);
  EXPECT_EQ(house_.client(kEditor)->ask<&DVDaemon::wakeUpCompletion>().index(), 0U);
  EXPECT_EQ(house_.loggedContaining(" declares itself to be com.orvane.editor."), 1);
  expectCleanLog();
}

TEST_F(WireTexts, WhoseLengthIsNotThatOfTheirBytesEndTheConnectionAndNothingElse) {
  const Operation& operation = operations()[7];
  const Bytes honest = request(operation, 0, "docuvend:p/i");
  const std::size_t lengthAt = honest.size() - std::string("docuvend:p/i").size() - sizeof(std::uint32_t);
  for (const std::uint8_t wrong : {0, 1, 11, 13, 255}) {
    for (const std::size_t byte : {0U, 1U, 3U}) {
      Bytes changed = honest;
      changed[lengthAt + byte] = wrong;
      if (changed == honest || (byte != 0 && wrong == 0)) continue;
      const RawPeer peer = connect(operation.service);
      peer.sayHello();
      peer.write(changed);
      EXPECT_EQ(endOf(peer), kMalformed) << byte << " " << int{wrong};
    }
  }
  EXPECT_TRUE(house_.answers());
  expectCleanLog();
}

TEST_F(WireTexts, TheLongestOnesAndEveryCharacterThatIsOneAreServed) {
  const Operation& operation = operations()[7];
  for (const std::string& text : {std::string(kMaximumTextBytes, 'x'), std::string("\t\r\n \u0085\u2028\u202e\U0010fffd\u00e9")}) {
    const RawPeer peer = connect(operation.service);
    peer.sayHello();
    peer.write(request(operation, 0, text));
    ASSERT_TRUE(peer.read<linux_platform::Hello>());
    EXPECT_TRUE(peer.read<linux_platform::ReplyFrame>());
  }
  EXPECT_EQ(house_.loggedContaining("[NOTICE] Closing the connection of PID "), 0);
}

}  // namespace
}  // namespace docuvend::tests
