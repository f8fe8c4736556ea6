#include "platform/linux/log/LinuxLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/time.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <map>
#include <regex>
#include <string>

#include "platform/fake/FakeLog.h"
#include "platform/linux/base/LogSubject.h"
#include "platform/linux/log/LogAllowance.h"
#include "platform/linux/log/LogText.h"
#include "tests/log/LogBench.h"

namespace docuvend::linux_platform {
namespace {

using fake_platform::FakeLogEntry;
using testing::ElementsAre;
using testing::IsEmpty;

class LinuxLogTest : public testing::Test {
 protected:
  LinuxLogOptions options() const {
    LinuxLogOptions options;
    options.identifier = "docuvendd";
    options.streamDescriptor = stream.writeEnd.get();
    options.journalSocketPath = journal.path();
    return options;
  }
  // What the journal was given since the last call.
  [[nodiscard]] std::vector<FakeLogEntry> journalEntries() const {
    static const std::map<std::string, QXLogType> kTypes = {
        {"2", QXLogType::fault}, {"5", QXLogType::defaultType}, {"6", QXLogType::info}, {"7", QXLogType::debug}};
    static const std::regex kEntry("PRIORITY=(.)\nSYSLOG_IDENTIFIER=docuvendd\nMESSAGE=([^\n]*)\n");
    std::vector<FakeLogEntry> entries;
    for (const std::string& datagram : journal.read()) {
      std::smatch parts;
      EXPECT_TRUE(std::regex_match(datagram, parts, kEntry)) << datagram;
      entries.push_back({kTypes.at(parts[1]), parts[2], /*isWritten=*/true});
    }
    return entries;
  }
  static std::string line(const std::string& text) { return "docuvendd[" + std::to_string(::getpid()) + "]: " + text + "\n"; }

  StreamReader stream;
  JournalReader journal;
};

TEST_F(LinuxLogTest, OnlyTheTwoSettingsSwitchTypesOn) {
  struct Row {
    std::optional<std::string> setting;
    bool isInfoOn;
    bool isDebugOn;
  };
  const Row rows[] = {{std::nullopt, false, false}, {"", false, false},      {"info", true, false}, {"debug", true, true},
                      {"INFO", false, false},       {"info ", false, false}, {"1", false, false}};
  for (const Row& row : rows) {
    LinuxLogOptions some = options();
    some.setting = row.setting;
    LinuxLog log(some);
    EXPECT_EQ(log.defaultLog().isEnabled(QXLogType::info), row.isInfoOn) << row.setting.value_or("unset");
    EXPECT_EQ(log.defaultLog().isEnabled(QXLogType::debug), row.isDebugOn) << row.setting.value_or("unset");
  }
}

TEST_F(LinuxLogTest, TheSettingsComeFromTheEnvironment) {
  ::setenv("DOCUVEND_LOG", "info", 1);
  ::setenv("JOURNAL_STREAM", "8:123", 1);
  const LinuxLogOptions set = LinuxLogOptions::fromEnvironment("program");
  ::unsetenv("DOCUVEND_LOG");
  ::unsetenv("JOURNAL_STREAM");
  const LinuxLogOptions unset = LinuxLogOptions::fromEnvironment("program");
  EXPECT_EQ(set.identifier, "program");
  EXPECT_EQ(set.setting, "info");
  EXPECT_EQ(set.journalStream, "8:123");
  EXPECT_EQ(set.journalSocketPath, "/run/systemd/journal/socket");
  EXPECT_EQ(set.streamDescriptor, 2);
  EXPECT_EQ(unset.setting, std::nullopt);
  EXPECT_EQ(unset.journalStream, std::nullopt);
}

TEST_F(LinuxLogTest, ALineNamesTheProgramAndItsProcess) {
  LinuxLog log(options());
  log.defaultLog().write(QXLogType::defaultType, "[NOTICE] starting.");
  EXPECT_EQ(stream.read(), line("[NOTICE] starting."));
}

TEST_F(LinuxLogTest, APeersTextCannotStartALine) {
  LinuxLog log(options());
  log.defaultLog().write(QXLogType::fault, "[ERROR] bad\ndocuvendd[1]: [NOTICE] forged\x1b[2J\u2028");
  EXPECT_EQ(stream.read(), line("[ERROR] bad\\ndocuvendd[1]: [NOTICE] forged\\x1b[2J\\u{2028}"));
}

TEST_F(LinuxLogTest, ALongMessageIsOneBoundedWrite) {
  LinuxLog log(options());
  log.defaultLog().write(QXLogType::fault, std::string(100000, 'a'));
  const std::string text = stream.read();
  EXPECT_LE(text.size(), 4096u);
  EXPECT_EQ(text, line(std::string(kLongestLogText, 'a') + "... [" + std::to_string(100000 - kLongestLogText) + " more bytes]"));
}

TEST_F(LinuxLogTest, AJournalEntryCarriesPriorityAndIdentifier) {
  LinuxLogOptions some = options();
  some.setting = "debug";
  some.journalStream = stream.deviceAndInode();
  LinuxLog log(some);
  log.defaultLog().write(QXLogType::defaultType, "[NOTICE] a");
  log.defaultLog().write(QXLogType::info, "[INFO] b");
  log.defaultLog().write(QXLogType::debug, "[DEBUG] c");
  log.defaultLog().write(QXLogType::fault, "[ERROR] d\nPRIORITY=7");
  EXPECT_THAT(journal.read(), ElementsAre("PRIORITY=5\nSYSLOG_IDENTIFIER=docuvendd\nMESSAGE=[NOTICE] a\n",
                                          "PRIORITY=6\nSYSLOG_IDENTIFIER=docuvendd\nMESSAGE=[INFO] b\n",
                                          "PRIORITY=7\nSYSLOG_IDENTIFIER=docuvendd\nMESSAGE=[DEBUG] c\n",
                                          "PRIORITY=2\nSYSLOG_IDENTIFIER=docuvendd\nMESSAGE=[ERROR] d\\nPRIORITY=7\n"));
  EXPECT_EQ(stream.read(), "");
}

TEST_F(LinuxLogTest, AStreamThatIsNotTheJournalsGetsTheLines) {
  StreamReader other;
  for (const std::string& journalStream : {other.deviceAndInode(), std::string(), std::string(":"), std::string("1"),
                                           stream.deviceAndInode() + "0", stream.deviceAndInode() + " ", "x" + stream.deviceAndInode()}) {
    LinuxLogOptions some = options();
    some.journalStream = journalStream;
    LinuxLog log(some);
    log.defaultLog().write(QXLogType::defaultType, "[NOTICE] a");
    EXPECT_EQ(stream.read(), line("[NOTICE] a")) << journalStream;
    EXPECT_THAT(journal.read(), IsEmpty()) << journalStream;
  }
}

TEST_F(LinuxLogTest, AnEntryThatTheJournalDoesNotTakeGoesToTheStream) {
  for (const std::string& path : {journal.path() + "-missing", "/" + std::string(200, 'x')}) {
    LinuxLogOptions some = options();
    some.journalStream = stream.deviceAndInode();
    some.journalSocketPath = path;
    LinuxLog log(some);
    log.defaultLog().write(QXLogType::defaultType, "[NOTICE] a");
    EXPECT_EQ(stream.read(), line("[NOTICE] a")) << path;
  }
}

TEST_F(LinuxLogTest, AClosedPipeNeitherEndsTheProgramNorLeavesASignal) {
  LinuxLog log(options());
  stream.readEnd.reset();
  log.defaultLog().write(QXLogType::fault, "[ERROR] lost");
  sigset_t pending;
  ASSERT_EQ(::sigpending(&pending), 0);
  EXPECT_EQ(::sigismember(&pending, SIGPIPE), 0);
  sigset_t mask;
  ASSERT_EQ(::pthread_sigmask(SIG_SETMASK, nullptr, &mask), 0);
  EXPECT_EQ(::sigismember(&mask, SIGPIPE), 0);
}

TEST_F(LinuxLogTest, AFullPipeThatDoesNotWaitAndAClosedDescriptorLoseTheEntry) {
  ASSERT_EQ(::fcntl(stream.writeEnd.get(), F_SETFL, O_NONBLOCK), 0);
  ASSERT_GT(::fcntl(stream.writeEnd.get(), F_SETPIPE_SZ, 4096), 0);
  LinuxLog log(options());
  for (int i = 0; i < 20; ++i) log.defaultLog().write(QXLogType::fault, std::string(1000, 'a'));
  EXPECT_LE(stream.read().size(), 4096u);
  LinuxLogOptions closed = options();
  closed.streamDescriptor = -1;
  LinuxLog other(closed);
  other.defaultLog().write(QXLogType::fault, "[ERROR] lost");
  EXPECT_EQ(stream.read(), "");
}

TEST_F(LinuxLogTest, ASubjectsLinesThatAreAlwaysOnAreNoMoreThanItsAllowanceAndAllOthersAreWritten) {
  ASSERT_GT(::fcntl(stream.writeEnd.get(), F_SETPIPE_SZ, 1 << 20), 0);
  LinuxLogOptions some = options();
  some.setting = "debug";
  LinuxLog log(some);
  constexpr std::size_t kMany = 4 * LogAllowance::kLinesAtOnce;
  const auto began = std::chrono::steady_clock::now();
  {
    const LogSubject subject(std::make_shared<const std::string>("com.example.App"));
    for (std::size_t i = 0; i < kMany; ++i) {
      log.defaultLog().write(i % 2 == 0 ? QXLogType::fault : QXLogType::defaultType, "limited");
      log.defaultLog().write(QXLogType::info, "asked for");
      log.defaultLog().write(QXLogType::debug, "asked for");
    }
  }
  const std::size_t back = (std::chrono::steady_clock::now() - began) / LogAllowance::kTimeForALine + 1;
  for (std::size_t i = 0; i < kMany; ++i) log.defaultLog().write(QXLogType::fault, "the system's own");
  const std::string text = stream.read();
  const auto written = [&text](const std::string& line) {
    std::size_t count = 0;
    for (std::size_t at = text.find(line); at != std::string::npos; at = text.find(line, at + 1)) ++count;
    return count;
  };
  EXPECT_GE(written("limited"), LogAllowance::kLinesAtOnce);
  EXPECT_LE(written("limited"), LogAllowance::kLinesAtOnce + back);
  EXPECT_EQ(written("asked for"), 2 * kMany);
  EXPECT_EQ(written("the system's own"), kMany);
}

TEST_F(LinuxLogTest, WhatWasLeftOutIsToldWhenItIsDue) {
  LogAllowance::Time now = std::chrono::steady_clock::now();
  LinuxLogOptions some = options();
  some.journalStream = stream.deviceAndInode();
  some.now = [&now] { return now; };
  LinuxLog log(some);
  {
    const LogSubject subject(std::make_shared<const std::string>("com.example.App"));
    for (std::size_t i = 0; i < LogAllowance::kLinesAtOnce + 3; ++i) {
      log.defaultLog().write(QXLogType::fault, "limited");
      EXPECT_EQ(journal.read().size(), i < LogAllowance::kLinesAtOnce ? 1U : 0U);
    }
  }
  // What is written before the line that makes the log look at the time.
  const auto nextTold = [this, &log] {
    log.defaultLog().write(QXLogType::fault, "the system's own");
    auto entries = journalEntries();
    EXPECT_TRUE(!entries.empty() && entries.back().text == "the system's own");
    entries.resize(entries.size() - std::min<std::size_t>(entries.size(), 1));
    return entries;
  };
  now += LineAllowance::kTimeUntilCount - std::chrono::milliseconds(1);
  EXPECT_THAT(nextTold(), IsEmpty()) << "not yet";
  now += std::chrono::milliseconds(1);
  EXPECT_THAT(nextTold(), ElementsAre(FakeLogEntry{QXLogType::defaultType, "[NOTICE] 3 lines about com.example.App were left out."}));
  now += 2 * LineAllowance::kTimeUntilCount;
  EXPECT_THAT(nextTold(), IsEmpty()) << "once";
}

// The datagrams lie there unread until no more fit.
TEST_F(LinuxLogTest, AJournalThatStandsStillIsWaitedForOnceAndNotForEveryLine) {
  ASSERT_GT(::fcntl(stream.writeEnd.get(), F_SETPIPE_SZ, 1 << 20), 0);
  LinuxLogOptions some = options();
  some.journalStream = stream.deviceAndInode();
  LinuxLog log(some);
  constexpr int kLines = 400;
  const auto began = std::chrono::steady_clock::now();
  for (int i = 0; i < kLines; ++i) log.defaultLog().write(QXLogType::fault, "text");
  const std::string text = stream.read();
  const auto lost = std::count(text.begin(), text.end(), '\n');
  EXPECT_GT(lost, 60) << "the journal took them all, or this test shows nothing";
  EXPECT_EQ(static_cast<std::size_t>(lost) + journal.read().size(), static_cast<std::size_t>(kLines));
  EXPECT_LT(std::chrono::steady_clock::now() - began, std::chrono::seconds(60)) << "a second for each";
  log.defaultLog().write(QXLogType::fault, "text");
  EXPECT_EQ(journal.read().size(), 1U) << "it is not given up";
}

// A line that waits for room in the pipe is interrupted again and again and still arrives whole.
TEST_F(LinuxLogTest, AnInterruptedWriteGoesOn) {
  ASSERT_GT(::fcntl(stream.writeEnd.get(), F_SETPIPE_SZ, 4096), 0);
  static volatile std::sig_atomic_t interruptions;
  static int readDescriptor;
  interruptions = 0;
  readDescriptor = stream.readEnd.get();
  struct sigaction action {};
  action.sa_handler = [](int) {
    interruptions = interruptions + 1;
    char buffer[4096];
    // Room is made only after several interruptions.
    if (interruptions == 5) (void)!::read(readDescriptor, buffer, sizeof buffer);
  };
  struct sigaction before {};
  ASSERT_EQ(::sigaction(SIGALRM, &action, &before), 0);  // without SA_RESTART
  const std::string filler(4096, 'x');
  ASSERT_EQ(::write(stream.writeEnd.get(), filler.data(), filler.size()), 4096);
  LinuxLog log(options());
  const itimerval often{{0, 2000}, {0, 2000}};
  ASSERT_EQ(::setitimer(ITIMER_REAL, &often, nullptr), 0);
  log.defaultLog().write(QXLogType::defaultType, "[NOTICE] whole");
  const itimerval never{};
  ASSERT_EQ(::setitimer(ITIMER_REAL, &never, nullptr), 0);
  ASSERT_EQ(::sigaction(SIGALRM, &before, nullptr), 0);
  EXPECT_GE(interruptions, 5);
  EXPECT_EQ(stream.read(), line("[NOTICE] whole"));
}

}  // namespace
}  // namespace docuvend::linux_platform
