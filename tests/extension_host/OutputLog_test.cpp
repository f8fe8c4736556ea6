#include "platform/linux/extension_host/OutputLog.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "platform/fake/FakeLog.h"

namespace docuvend::linux_platform {
namespace {

class OutputLogTest : public ::testing::Test {
 protected:
  OutputLogTest() {
    std::array<int, 2> ends{};
    EXPECT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
    UniqueDescriptor reading(ends[0]);
    pipe.reset(ends[1]);
    EXPECT_EQ(fcntl(reading.get(), F_SETFL, O_NONBLOCK), 0);
    output = std::make_unique<OutputLog>(reactor, log.defaultLog(), "com.orvane.test", std::move(reading));
  }
  // Waits while the pipe is full.
  void write(const std::string& text) const { ASSERT_EQ(::write(pipe.get(), text.data(), text.size()), static_cast<ssize_t>(text.size())); }
  // All that was written has been taken then.
  void end() {
    pipe.reset();
    output.reset();
  }

  fake_platform::FakeLog log;
  Reactor reactor{1U};
  UniqueDescriptor pipe;
  std::unique_ptr<OutputLog> output;
};

TEST_F(OutputLogTest, LinesComeUnderTheNameAndTheLastNeedsNoEnd) {
  write("one\ntwo");
  end();
  EXPECT_EQ(log.entries(), (std::vector<fake_platform::FakeLogEntry>{{QXLogType::info, "[INFO] com.orvane.test: one"},
                                                                     {QXLogType::info, "[INFO] com.orvane.test: two"}}));
}

TEST_F(OutputLogTest, AFloodIsTakenWholeAndLoggedInPart) {
  constexpr std::size_t kLines = 20'000;
  const auto began = std::chrono::steady_clock::now();
  for (std::size_t i = 0; i < kLines; ++i) write("again\n");
  end();
  std::size_t logged = 0;
  std::size_t dropped = 0;
  for (const auto& entry : log.entries()) {
    unsigned long count = 0;
    if (std::sscanf(entry.text.c_str(), "[INFO] com.orvane.test wrote %lu", &count) == 1) {
      dropped += count;
      EXPECT_EQ(entry, (fake_platform::FakeLogEntry{
                           QXLogType::info, "[INFO] com.orvane.test wrote " + std::to_string(count) + " lines more than are logged."}));
    } else {
      ++logged;
      EXPECT_EQ(entry, (fake_platform::FakeLogEntry{QXLogType::info, "[INFO] com.orvane.test: again"}));
    }
  }
  EXPECT_GT(logged, 0U);
  EXPECT_LE(logged, OutputLog::kLinesAtOnce + (std::chrono::steady_clock::now() - began) / OutputLog::kTimeForALine + 1);
  EXPECT_EQ(logged + dropped, kLines);
}

TEST_F(OutputLogTest, WhileTheInfoTypeIsOffNothingIsLoggedOrCounted) {
  log.setEnabled(QXLogType::info, fake_platform::FakeLogSwitch::off);
  for (int i = 0; i < 1000; ++i) write("again\n");
  end();
  EXPECT_EQ(log.writes(), 0U);
}

}  // namespace
}  // namespace docuvend::linux_platform
