#include "platform/linux/wire/Frame.h"

#include <gtest/gtest.h>

#include <random>

#include "platform/linux/wire/Limits.h"

namespace docuvend::linux_platform {
namespace {

std::vector<Frame> everyFrame() {
  QXError error = QXError::make("A domain", 7, "Something");
  error.url = QXURL::fileURL("/a b", QXURLKind::file);
  error.underlying = std::make_shared<const QXError>(QXError::system(2, "below"));
  return {
      Hello{kProtocolVersion, std::nullopt},
      Hello{kProtocolVersion, "com.example.App"},
      RequestFrame{1, true, "echo:", {QXValue("a"), QXValue(), QXValue(QXDictionary{{"k", QXValue(true)}})}},
      RequestFrame{~std::uint64_t{0}, false, "", {}},
      ReplyFrame{5, {QXValue(QXData{{1, 2, 3}}), QXValue(1.5), QXValue(QXUUID{})}},
      FailureFrame{9, error},
      EndFrame{error},
      PingFrame{},
      PongFrame{},
  };
}

std::span<const std::uint8_t> contentsOf(const std::vector<std::uint8_t>& frame) { return std::span(frame).subspan(kFrameLengthBytes); }

std::vector<std::uint8_t> encoded(const Frame& frame) { return std::get<EncodedFrame>(encodeFrame(frame)).bytes; }

TEST(FrameTest, EveryFrameComesBackAsItWent) {
  for (const Frame& frame : everyFrame()) {
    const auto bytes = encoded(frame);
    const auto decoded = decodeFrame(contentsOf(bytes), {});
    ASSERT_TRUE(std::holds_alternative<Frame>(decoded)) << frame.index();
    // Equal contents have equal bytes.
    EXPECT_EQ(std::get<Frame>(decoded).index(), frame.index());
    EXPECT_EQ(encoded(std::get<Frame>(decoded)), bytes);
  }
}

TEST(FrameTest, TheLengthCountsWhatFollowsIt) {
  for (const Frame& frame : everyFrame()) {
    const auto bytes = encoded(frame);
    EXPECT_EQ(ByteReader(bytes).u32(), bytes.size() - kFrameLengthBytes);
  }
}

TEST(FrameTest, EveryCutFrameIsRefused) {
  for (const Frame& frame : everyFrame()) {
    const auto bytes = encoded(frame);
    for (std::size_t size = 0; size < bytes.size() - kFrameLengthBytes; ++size) {
      EXPECT_TRUE(std::holds_alternative<Malformed>(decodeFrame(contentsOf(bytes).first(size), {}))) << frame.index() << " cut to " << size;
    }
  }
}

TEST(FrameTest, AByteTooManyIsRefused) {
  for (const Frame& frame : everyFrame()) {
    auto bytes = encoded(frame);
    bytes.push_back(0);
    EXPECT_TRUE(std::holds_alternative<Malformed>(decodeFrame(contentsOf(bytes), {}))) << frame.index();
  }
}

TEST(FrameTest, OfAnotherVersionsHelloOnlyTheNumberIsRead) {
  const std::vector<std::uint8_t> contents = {1, 0, kProtocolVersion + 1, 0, 0, 0, 'w', 'h', 'a', 't', 255};
  const auto decoded = decodeFrame(contents, {});
  ASSERT_TRUE(std::holds_alternative<Frame>(decoded));
  const auto* hello = std::get_if<Hello>(&std::get<Frame>(decoded));
  ASSERT_NE(hello, nullptr);
  EXPECT_EQ(hello->version, kProtocolVersion + 1);
}

TEST(FrameTest, AFrameIsNotLongerThanTheLimit) {
  const std::size_t overhead = encoded(ReplyFrame{1, {QXValue(QXData{})}}).size() - kFrameLengthBytes;
  const QXData fitting{std::vector<std::uint8_t>(kMaximumFrameBytes - overhead)};
  EXPECT_TRUE(std::holds_alternative<EncodedFrame>(encodeFrame(ReplyFrame{1, {QXValue(fitting)}})));
  const QXData over{std::vector<std::uint8_t>(kMaximumFrameBytes - overhead + 1)};
  EXPECT_TRUE(std::holds_alternative<Malformed>(encodeFrame(ReplyFrame{1, {QXValue(over)}})));
}

TEST(FrameTest, AFrameCarriesNoMoreDescriptorsThanTheLimit) {
  const QXArray most(kMaximumDescriptors, QXValue(QXDescriptor{0, nullptr}));
  const auto fitting = encodeFrame(ReplyFrame{1, most});
  ASSERT_TRUE(std::holds_alternative<EncodedFrame>(fitting));
  EXPECT_EQ(std::get<EncodedFrame>(fitting).descriptors.size(), kMaximumDescriptors);
  const QXArray over(kMaximumDescriptors + 1, QXValue(QXDescriptor{0, nullptr}));
  EXPECT_TRUE(std::holds_alternative<Malformed>(encodeFrame(ReplyFrame{1, over})));
}

// Whatever the bytes are, they are refused or are a frame that can be written again.
TEST(FrameTest, ChangedBytesAreRefusedOrAreAFrameThatCanBeSent) {
  constexpr int kRounds = 20000;
  constexpr int kMostChanges = 4;
  std::mt19937 random(20240607);
  const auto frames = everyFrame();
  int accepted = 0;
  int refused = 0;
  for (int round = 0; round < kRounds; ++round) {
    auto bytes = encoded(frames[random() % frames.size()]);
    bytes.erase(bytes.begin(), bytes.begin() + kFrameLengthBytes);
    const auto changes = 1 + random() % kMostChanges;
    for (unsigned i = 0; i < changes && !bytes.empty(); ++i) {
      const std::size_t at = random() % bytes.size();
      switch (random() % 3) {
        case 0:
          bytes[at] = static_cast<std::uint8_t>(random());
          break;
        case 1:
          bytes.erase(bytes.begin() + static_cast<std::ptrdiff_t>(at));
          break;
        default:
          bytes.insert(bytes.begin() + static_cast<std::ptrdiff_t>(at), static_cast<std::uint8_t>(random()));
      }
    }
    const auto decoded = decodeFrame(bytes, {});
    if (const auto* frame = std::get_if<Frame>(&decoded)) {
      ++accepted;
      ASSERT_TRUE(std::holds_alternative<EncodedFrame>(encodeFrame(*frame))) << "round " << round;
    } else {
      ++refused;
      EXPECT_FALSE(std::get<Malformed>(decoded).reason.empty());
    }
  }
  EXPECT_GT(accepted, 0);
  EXPECT_GT(refused, 0);
}

}  // namespace
}  // namespace docuvend::linux_platform
