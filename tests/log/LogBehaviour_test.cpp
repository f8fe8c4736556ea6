// What platform/log.h promises, over every implementation there is.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include "platform/fake/FakeLog.h"
#include "platform/linux/log/LinuxLog.h"
#include "tests/log/LogBench.h"

namespace docuvend {
namespace {

using testing::ElementsAre;

struct FakeBench {
  QXLogService& make(bool isInfoOn, bool isDebugOn) {
    using fake_platform::FakeLogSwitch;
    log.setEnabled(QXLogType::info, isInfoOn ? FakeLogSwitch::on : FakeLogSwitch::off);
    log.setEnabled(QXLogType::debug, isDebugOn ? FakeLogSwitch::on : FakeLogSwitch::off);
    return log;
  }
  std::vector<std::string> texts() { return log.texts(); }

  fake_platform::FakeLog log;
};

std::optional<std::string> settingFor(bool isInfoOn, bool isDebugOn) {
  if (isDebugOn) return "debug";
  return isInfoOn ? std::optional<std::string>("info") : std::nullopt;
}

struct StreamBench {
  QXLogService& make(bool isInfoOn, bool isDebugOn) {
    linux_platform::LinuxLogOptions options;
    options.identifier = "program";
    options.setting = settingFor(isInfoOn, isDebugOn);
    options.streamDescriptor = reader.writeEnd.get();
    return log.emplace(options);
  }
  std::vector<std::string> texts() {
    std::vector<std::string> texts;
    const std::string prefix = "program[" + std::to_string(::getpid()) + "]: ";
    std::string rest = reader.read();
    while (!rest.empty()) {
      const std::size_t end = rest.find('\n');
      const std::string line = rest.substr(0, end);
      EXPECT_EQ(line.substr(0, prefix.size()), prefix);
      texts.push_back(line.substr(std::min(prefix.size(), line.size())));
      rest.erase(0, end == std::string::npos ? end : end + 1);
    }
    return texts;
  }

  linux_platform::StreamReader reader;
  std::optional<linux_platform::LinuxLog> log;
};

struct JournalBench {
  QXLogService& make(bool isInfoOn, bool isDebugOn) {
    linux_platform::LinuxLogOptions options;
    options.identifier = "program";
    options.setting = settingFor(isInfoOn, isDebugOn);
    options.streamDescriptor = reader.writeEnd.get();
    options.journalStream = reader.deviceAndInode();
    options.journalSocketPath = journal.path();
    return log.emplace(options);
  }
  std::vector<std::string> texts() {
    EXPECT_EQ(reader.read(), "");
    std::vector<std::string> texts;
    for (const std::string& entry : journal.read()) {
      const std::size_t begin = entry.find("\nMESSAGE=");
      EXPECT_NE(begin, std::string::npos);
      EXPECT_EQ(entry.back(), '\n');
      texts.push_back(entry.substr(begin + 9, entry.size() - begin - 10));
    }
    return texts;
  }

  linux_platform::StreamReader reader;
  linux_platform::JournalReader journal;
  std::optional<linux_platform::LinuxLog> log;
};

template <class Bench>
class LogBehaviour : public testing::Test {
 protected:
  Bench bench;
};

class BenchNames {
 public:
  template <class Bench>
  static std::string GetName(int) {
    if (std::is_same_v<Bench, FakeBench>) return "Fake";
    return std::is_same_v<Bench, StreamBench> ? "Stream" : "Journal";
  }
};
using Benches = testing::Types<FakeBench, StreamBench, JournalBench>;
TYPED_TEST_SUITE(LogBehaviour, Benches, BenchNames);

TYPED_TEST(LogBehaviour, DefaultAndFaultAreOnWhateverTheSetting) {
  QXLogHandle& log = this->bench.make(false, false).defaultLog();
  EXPECT_TRUE(log.isEnabled(QXLogType::defaultType));
  EXPECT_TRUE(log.isEnabled(QXLogType::fault));
  EXPECT_FALSE(log.isEnabled(QXLogType::info));
  EXPECT_FALSE(log.isEnabled(QXLogType::debug));
}

TYPED_TEST(LogBehaviour, InfoCanBeOnWithoutDebug) {
  QXLogHandle& log = this->bench.make(true, false).defaultLog();
  EXPECT_TRUE(log.isEnabled(QXLogType::info));
  EXPECT_FALSE(log.isEnabled(QXLogType::debug));
}

TYPED_TEST(LogBehaviour, EntriesStandInTheOrderOfTheirWriting) {
  QXLogHandle& log = this->bench.make(true, true).defaultLog();
  log.write(QXLogType::defaultType, "[NOTICE] a");
  log.write(QXLogType::debug, "[DEBUG] b");
  log.write(QXLogType::fault, "[ERROR] c");
  log.write(QXLogType::info, "[INFO] d");
  EXPECT_THAT(this->bench.texts(), ElementsAre("[NOTICE] a", "[DEBUG] b", "[ERROR] c", "[INFO] d"));
}

TYPED_TEST(LogBehaviour, AnEntryOfATypeThatIsOffIsNotKept) {
  QXLogHandle& log = this->bench.make(false, false).defaultLog();
  log.write(QXLogType::info, "[INFO] a");
  log.write(QXLogType::debug, "[DEBUG] b");
  log.write(QXLogType::fault, "[ERROR] c");
  EXPECT_THAT(this->bench.texts(), ElementsAre("[ERROR] c"));
}

TYPED_TEST(LogBehaviour, EntriesOfSeveralThreadsStayWhole) {
  constexpr int kThreads = 3;
  constexpr int kEntries = 5;  // fits a pipe, and the queue of a datagram socket
  QXLogHandle& log = this->bench.make(true, true).defaultLog();
  const std::vector<std::string> expected = {std::string(800, 'a'), std::string(800, 'b'), std::string(800, 'c')};
  std::vector<std::string> texts;
  for (int round = 0; round < kEntries; ++round) {
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) threads.emplace_back([&log, &expected, i] { log.write(QXLogType::info, expected[i]); });
    for (std::thread& thread : threads) thread.join();
    std::vector<std::string> found = this->bench.texts();
    if constexpr (std::is_same_v<TypeParam, FakeBench>) this->bench.log.clear();
    std::sort(found.begin(), found.end());
    EXPECT_EQ(found, expected);
  }
}

}  // namespace
}  // namespace docuvend
