#include "tools/docuvendctl/ProgressLine.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <limits>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/tools/PseudoTerminal.h"

namespace docuvend::ctl {
namespace {

using ::testing::EndsWith;
using ::testing::MatchesRegex;
using ::testing::StartsWith;

TEST(ProgressText, BytesHaveTheUnitThatFits) {
  const std::vector<std::pair<std::uint64_t, std::string>> table = {
      {0, "0 B"},
      {999, "999 B"},
      {1000, "1.0 kB"},
      {1049, "1.0 kB"},
      {1050, "1.1 kB"},
      {999'949, "999.9 kB"},
      {999'951, "1.0 MB"},
      {12'345'678, "12.3 MB"},
      {1'000'000'000, "1.0 GB"},
      {std::numeric_limits<std::uint64_t>::max(), "18.4 EB"},
  };
  for (const auto& [bytes, text] : table) EXPECT_EQ(bytesText(bytes), text) << bytes;
}

TEST(ProgressText, TellsShareBytesAndRateAsFarAsTheyAreKnown) {
  EXPECT_EQ(progressText({0, 1000}, std::nullopt), "  0 %  0 B of 1.0 kB");
  EXPECT_EQ(progressText({430'000, 1'000'000}, 5000), " 43 %  430.0 kB of 1.0 MB  5.0 kB/s");
  EXPECT_EQ(progressText({999'999, 1'000'000}, 5000), " 99 %  1.0 MB of 1.0 MB  5.0 kB/s");
  EXPECT_EQ(progressText({1000, 1000}, 0), "100 %  1.0 kB of 1.0 kB  0 B/s");
  // More than there should be is no more than all.
  EXPECT_EQ(progressText({3000, 1000}, std::nullopt), "100 %  3.0 kB of 1.0 kB");
  EXPECT_EQ(progressText({500, 0}, std::nullopt), "500 B");
}

class ProgressLineTest : public ::testing::Test {
 protected:
  [[nodiscard]] std::string written() const {
    std::string text(static_cast<std::size_t>(::lseek(terminal_.get(), 0, SEEK_END)), '\0');
    EXPECT_EQ(::pread(terminal_.get(), text.data(), text.size(), 0), static_cast<ssize_t>(text.size()));
    return text;
  }
  linux_platform::UniqueDescriptor terminal_{::memfd_create("terminal", MFD_CLOEXEC)};
};

TEST_F(ProgressLineTest, IsRewrittenInPlaceAndClearedAtTheEnd) {
  {
    ProgressLine line(terminal_.get());
    line.show({0, 1000});
    EXPECT_EQ(written(), "\r  0 %  0 B of 1.0 kB");
    line.show({500, 1000});
    EXPECT_THAT(written(), MatchesRegex("\r  0 %  0 B of 1.0 kB\r 50 %  500 B of 1.0 kB  [0-9.]+ [kMGTPE]?B/s"));
  }
  EXPECT_THAT(written(), EndsWith(" \r"));
  EXPECT_EQ(written().find('\n'), std::string::npos);
}

TEST_F(ProgressLineTest, AShorterTextCoversTheLongerOneBeforeIt) {
  ProgressLine line(terminal_.get());
  line.show({123'456'789, 1'000'000'000});
  const std::string before = written();
  line.show({0, 0});
  EXPECT_EQ(written().substr(before.size()), "\r0 B" + std::string(before.size() - 1 - 3, ' '));
  line.clear();
  EXPECT_THAT(written(), EndsWith("\r   \r"));
}

TEST_F(ProgressLineTest, WithoutNewBytesThereIsNoRate) {
  ProgressLine line(terminal_.get());
  line.show({500, 1000});
  line.show({500, 1000});
  line.show({400, 1000});
  EXPECT_EQ(written(), "\r 50 %  500 B of 1.0 kB\r 50 %  500 B of 1.0 kB\r 40 %  400 B of 1.0 kB");
}

TEST_F(ProgressLineTest, OnANarrowTerminalItLeavesTheLastColumnFree) {
  tests::PseudoTerminal terminal(12);
  ProgressLine line(terminal.descriptor());
  line.show({500, 1000});
  line.clear();
  EXPECT_EQ(terminal.finished(), "\r 50 %  500\u2026\r           \r");
}

TEST_F(ProgressLineTest, WritesNothingWhenNothingWasShownAndNothingMoreOnceItIsCleared) {
  ProgressLine line(terminal_.get());
  line.clear();
  line.show({1, 2});
  line.clear();
  EXPECT_EQ(written(), "");
}

}  // namespace
}  // namespace docuvend::ctl
