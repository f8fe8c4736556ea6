// What ends a connection with its peer to blame.
#include <cstdint>
#include <initializer_list>
#include <ostream>
#include <string>
#include <vector>

#include "tests/wire/EndpointTest.h"

namespace docuvend::linux_platform {
namespace {

// What a peer must not send, and the reason that ends the connection.
struct Misbehaviour {
  std::string name;
  std::vector<std::uint8_t> bytes;
  std::string reason;
};
void PrintTo(const Misbehaviour& misbehaviour, std::ostream* out) { *out << misbehaviour.name; }

std::vector<std::uint8_t> joined(std::initializer_list<Frame> frames) {
  std::vector<std::uint8_t> all;
  for (const Frame& frame : frames) {
    const auto bytes = tests::bytesOf(frame);
    all.insert(all.end(), bytes.begin(), bytes.end());
  }
  return all;
}

class EndpointMisbehaviourTest : public EndpointTest, public testing::WithParamInterface<Misbehaviour> {};

TEST_P(EndpointMisbehaviourTest, EndsTheConnectionWithItsReasonToldToBothEnds) {
  auto raw = connectRaw(recorder);
  raw.write(GetParam().bytes);
  const auto closed = server.closed->take();
  ASSERT_TRUE(closed);
  EXPECT_EQ(closed->domain, kQXRpcErrorDomain);
  EXPECT_THAT(closed->texts.at("description"), testing::HasSubstr(GetParam().reason));
  EXPECT_EQ(server.blamed->take(), closed);
  ASSERT_TRUE(raw.read<Hello>());
  const auto end = raw.read<EndFrame>();
  ASSERT_TRUE(end);
  EXPECT_EQ(end->error, *closed);
  EXPECT_TRUE(raw.atEnd());
  EXPECT_EQ(recorder->requests.count(), 0U);
}

INSTANTIATE_TEST_SUITE_P(
    Table, EndpointMisbehaviourTest,
    testing::Values(Misbehaviour{"over-long frame", {0xFF, 0xFF, 0xFF, 0xFF, 0x01, 0x00}, "a frame of 4294967295 bytes"},
                    Misbehaviour{"just over-long frame", {0x01, 0x00, 0x10, 0x00}, "a frame of 1048577 bytes"},
                    Misbehaviour{"empty frame", {0x00, 0x00, 0x00, 0x00}, "a frame without a head"},
                    Misbehaviour{"no hello", joined({RequestFrame{1, true, kEcho.name, {QXValue("a")}}}), "a frame before the hello"},
                    Misbehaviour{"two hellos", joined({kHello, kHello}), "a second hello"},
                    Misbehaviour{"another version", joined({Hello{9, std::nullopt}}), "version 9 of the protocol is not supported"},
                    Misbehaviour{"unknown frame type", {0x02, 0x00, 0x00, 0x00, 0x63, 0x00}, "a frame of unknown type 99"},
                    Misbehaviour{"request number 0", joined({kHello, RequestFrame{0, true, kEcho.name, {}}}),
                                 "a request whose number does not rise"},
                    Misbehaviour{"an answer to nothing", joined({kHello, ReplyFrame{1, {}}}), "an answer to a request that was not made"},
                    Misbehaviour{"a failure of nothing", joined({kHello, FailureFrame{1, {}}}), "an answer to a request that was not made"},
                    Misbehaviour{"a descriptor that is declared and not sent",
                                 {0x07, 0x00, 0x00, 0x00, 0x01, 0x01, 0x01, 0x00, 0x00, 0x00, 0x00},
                                 "a frame without the descriptors that it declares"}));

TEST_F(EndpointTest, ARequestNumberMustRise) {
  auto raw = connectRaw(recorder);
  raw.sayHello();
  raw.write(Frame(RequestFrame{5, false, kEcho.name, {QXValue("a")}}));
  raw.write(Frame(RequestFrame{5, false, kEcho.name, {QXValue("b")}}));
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
  EXPECT_EQ(recorder->requests.count(), 1U);
}

TEST_F(EndpointTest, AConnectionThatEndsInsideAFrameIsMalformed) {
  auto raw = connectRaw(recorder);
  ASSERT_TRUE(raw.read<Hello>());
  auto bytes = joined({kHello, RequestFrame{1, true, kEcho.name, {QXValue("a")}}});
  bytes.pop_back();
  raw.write(bytes);
  raw.leave();
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
}

}  // namespace
}  // namespace docuvend::linux_platform
