#include "platform/linux/wire/FrameReader.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <thread>

#include "platform/linux/wire/FrameWriter.h"
#include "platform/linux/wire/Limits.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::linux_platform {
namespace {

using tests::RawPeer;

class FrameReaderTest : public testing::Test {
 protected:
  FrameReaderTest() : FrameReaderTest(tests::socketPair()) {}
  explicit FrameReaderTest(std::pair<UniqueDescriptor, UniqueDescriptor> ends)
      : peer(std::move(ends.first)), socket(std::move(ends.second)) {}

  // Reads what is there and gives the next frame.
  std::variant<FrameReader::Incomplete, Frame, Malformed> readNext() {
    auto next = reader.next();
    while (std::holds_alternative<FrameReader::Incomplete>(next)) {
      auto reading = reader.read(socket.get());
      if (auto* malformed = std::get_if<Malformed>(&reading)) return std::move(*malformed);
      if (!std::holds_alternative<FrameReader::Got>(reading)) return next;
      next = reader.next();
    }
    return next;
  }

  RawPeer peer;
  UniqueDescriptor socket;
  FrameReader reader;
};

std::vector<std::uint8_t> echo(std::uint64_t number) { return tests::bytesOf(RequestFrame{number, true, "echo:", {QXValue("a")}}); }

std::uint64_t numberOf(const std::variant<FrameReader::Incomplete, Frame, Malformed>& next) {
  const auto* frame = std::get_if<Frame>(&next);
  const auto* request = frame == nullptr ? nullptr : std::get_if<RequestFrame>(frame);
  return request == nullptr ? 0 : request->callID;
}

TEST_F(FrameReaderTest, AFrameThatComesByteByByteIsWholeWithItsLastByte) {
  const auto bytes = echo(7);
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    EXPECT_TRUE(std::holds_alternative<FrameReader::Incomplete>(readNext())) << i;
    EXPECT_EQ(reader.insideFrame(), i > 0);
    ASSERT_TRUE(peer.write(std::span(bytes).subspan(i, 1)));
  }
  EXPECT_EQ(numberOf(readNext()), 7U);
  EXPECT_FALSE(reader.insideFrame());
}

TEST_F(FrameReaderTest, SeveralFramesInOneReadingComeInOrder) {
  std::vector<std::uint8_t> all;
  for (std::uint64_t i = 1; i <= 3; ++i) {
    const auto one = echo(i);
    all.insert(all.end(), one.begin(), one.end());
  }
  ASSERT_TRUE(peer.write(all));
  for (std::uint64_t i = 1; i <= 3; ++i) EXPECT_EQ(numberOf(readNext()), i);
  EXPECT_TRUE(std::holds_alternative<FrameReader::Incomplete>(readNext()));
}

TEST_F(FrameReaderTest, NothingAndTheEndAreToldApart) {
  EXPECT_TRUE(std::holds_alternative<FrameReader::Nothing>(reader.read(socket.get())));
  peer.leave();
  EXPECT_TRUE(std::holds_alternative<FrameReader::Ended>(reader.read(socket.get())));
}

TEST_F(FrameReaderTest, DescriptorsGoToTheFramesThatDeclareThem) {
  FrameWriter writer;
  const QXArray two = {QXValue(QXDescriptor{socket.get(), nullptr}), QXValue(QXDescriptor{0, nullptr})};
  writer.add(std::get<EncodedFrame>(encodeFrame(ReplyFrame{1, {}})));
  writer.add(std::get<EncodedFrame>(encodeFrame(ReplyFrame{2, two})));
  writer.add(std::get<EncodedFrame>(encodeFrame(ReplyFrame{3, {QXValue(QXDescriptor{0, nullptr})}})));
  writer.add(std::get<EncodedFrame>(encodeFrame(ReplyFrame{4, {}})));
  ASSERT_EQ(writer.write(peer.socket()), FrameWriter::Progress::drained);
  for (const std::size_t count : {0U, 2U, 1U, 0U}) {
    const auto next = readNext();
    ASSERT_TRUE(std::holds_alternative<Frame>(next));
    const auto& values = std::get<ReplyFrame>(std::get<Frame>(next)).values;
    ASSERT_EQ(values.size(), count);
    for (const QXValue& value : values) {
      ASSERT_NE(value.as<QXDescriptor>(), nullptr);
      const int flags = ::fcntl(value.as<QXDescriptor>()->number, F_GETFD);
      ASSERT_GE(flags, 0);
      EXPECT_NE(static_cast<unsigned>(flags) & static_cast<unsigned>(FD_CLOEXEC), 0U);
    }
  }
}

TEST_F(FrameReaderTest, ADescriptorBesideABegunFrameMustBeOneThatItDeclares) {
  auto bytes = echo(1);
  const std::array<int, 1> one{0};
  ASSERT_TRUE(peer.write(std::span(bytes).first(kFrameHeaderBytes - 1), one));
  EXPECT_TRUE(std::holds_alternative<FrameReader::Incomplete>(readNext())) << "it may still declare one";
  ASSERT_TRUE(peer.write(std::span(bytes).subspan(kFrameHeaderBytes - 1, 1)));
  const auto next = readNext();
  ASSERT_TRUE(std::holds_alternative<Malformed>(next));
  EXPECT_EQ(std::get<Malformed>(next).reason, "descriptors that no frame declares");
}

TEST(FrameWriterTest, WhatIsNotTakenIsKeptWithItsNumberUntilItIs) {
  auto [one, two] = tests::socketPair();
  const RawPeer peer(std::move(two));
  const auto block = [](std::uint64_t number) {
    return std::get<EncodedFrame>(
        encodeFrame(RequestFrame{number, false, "data:", {QXValue(QXData{std::vector<std::uint8_t>(kMaximumFrameBytes / 2)})}}));
  };
  FrameWriter writer;
  for (std::uint64_t i = 1; i <= 4; ++i) writer.add(block(i), {.request = i});
  EXPECT_EQ(writer.unwritten(), (std::vector<std::uint64_t>{1, 2, 3, 4}));
  EXPECT_EQ(writer.write(one.get()), FrameWriter::Progress::blocked);
  EXPECT_GT(writer.pendingBytes(), 0U);
  EXPECT_EQ(writer.unwritten().back(), 4U);
  std::thread reading([&peer] {
    for (std::uint64_t i = 1; i <= 4; ++i) EXPECT_EQ(peer.read<RequestFrame>().value_or(RequestFrame{}).callID, i);
  });
  while (writer.write(one.get()) == FrameWriter::Progress::blocked) std::this_thread::yield();
  reading.join();
  EXPECT_EQ(writer.pendingBytes(), 0U);
  EXPECT_TRUE(writer.unwritten().empty());
}

TEST(FrameWriterTest, ASocketWhosePeerHasLeftIsOverWithoutASignal) {
  auto [one, two] = tests::socketPair();
  two.reset();
  FrameWriter writer;
  writer.add(std::get<EncodedFrame>(encodeFrame(ReplyFrame{1, {}})));
  EXPECT_EQ(writer.write(one.get()), FrameWriter::Progress::over);
}

}  // namespace
}  // namespace docuvend::linux_platform
