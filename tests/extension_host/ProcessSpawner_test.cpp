// Processes of the system's shell: what they see is what the spawner gave them.
#include "platform/linux/extension_host/ProcessSpawner.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <future>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/extension_host/ProcessTree.h"
#include "platform/linux/base/pidfd.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kPatience = 60'000;  // milliseconds

class ProcessSpawnerTest : public ::testing::Test {
 protected:
  ProcessSpawnerTest() {
    std::array<int, 2> ends{};
    EXPECT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
    output.reset(ends[0]);
    input.reset(ends[1]);
  }
  ~ProcessSpawnerTest() override {
    if (process.descriptor) {
      endProcessTree(process);
      siginfo_t info{};
      waitid(P_PIDFD, static_cast<id_t>(process.descriptor.get()), &info, WEXITED);
    }
    spawner.stop();
  }

  static LaunchPlan shell(const std::string& script) {
    LaunchPlan plan;
    plan.arguments = {"/bin/sh", "-c", script};
    plan.environment = {"PATH=/usr/bin:/bin", "MARK=here"};
    return plan;
  }
  static UniqueDescriptor file(const std::string& text) {
    UniqueDescriptor result(memfd_create("test", MFD_CLOEXEC));
    EXPECT_EQ(write(result.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
    lseek(result.get(), 0, SEEK_SET);
    return result;
  }

  std::optional<QXError> spawn(LaunchPlan plan) {
    std::promise<std::optional<QXError>> done;
    EXPECT_TRUE(spawner.perform([this, &done, &plan] {
      auto result = spawner.spawn(std::move(plan), input);
      if (auto* error = std::get_if<QXError>(&result)) {
        done.set_value(std::move(*error));
      } else {
        process = std::move(std::get<SpawnedProcess>(result));
        done.set_value(std::nullopt);
      }
    }));
    auto result = done.get_future().get();
    input.reset();
    return result;
  }
  // One line of what the process writes.
  std::string line() {
    std::string result;
    pollfd ready{output.get(), POLLIN, 0};
    char c = 0;
    while (poll(&ready, 1, kPatience) == 1 && read(output.get(), &c, 1) == 1 && c != '\n') result += c;
    return result;
  }

  ProcessSpawner spawner;
  UniqueDescriptor output;
  UniqueDescriptor input;
  SpawnedProcess process;
};

TEST_F(ProcessSpawnerTest, AProcessHasItsEnvironmentAndBothOutputsAndNoInput) {
  ASSERT_FALSE(spawn(shell("echo $MARK; echo there >&2; cat; echo $#; echo end")));
  EXPECT_EQ(line(), "here");
  EXPECT_EQ(line(), "there");
  EXPECT_EQ(line(), "0");
  EXPECT_EQ(line(), "end");
}

TEST_F(ProcessSpawnerTest, DescriptorsLieUnderTheirNumbersAlsoIfTheyCrossAndGapsAreClosed) {
  // Each lies under the number that the process is to see another as.
  std::array<UniqueDescriptor, 3> files = {file("first"), file("second"), file("third")};
  const std::array<int, 3> numbers = {files[0].get(), files[1].get(), files[2].get()};
  std::string script;
  for (const int number : numbers) script += "cat <&" + std::to_string(number) + "; echo; ";
  LaunchPlan plan = shell(script + "ls /proc/self/fd | wc -l");
  plan.inherited.push_back({numbers[0], std::move(files[2])});
  plan.inherited.push_back({numbers[1], std::move(files[0])});
  plan.inherited.push_back({numbers[2], std::move(files[1])});
  // Inheritable by mistake, and not meant for the process.
  const UniqueDescriptor stray(dup(output.get()));
  ASSERT_FALSE(spawn(std::move(plan)));
  EXPECT_EQ(line(), "third");
  EXPECT_EQ(line(), "first");
  EXPECT_EQ(line(), "second");
  EXPECT_EQ(line(), "7");  // three, three, and the directory that is listed
}

TEST_F(ProcessSpawnerTest, AProgramThatDoesNotExistIsAnError) {
  LaunchPlan plan;
  plan.arguments = {"/nonexistent/program"};
  const auto error = spawn(std::move(plan));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, ENOENT);
  EXPECT_NE(error->description().find("/nonexistent/program"), std::string::npos);
}

TEST_F(ProcessSpawnerTest, SignalsThatThisProcessIgnoresOrBlocksAreNotIgnoredOrBlockedThere) {
  ASSERT_NE(signal(SIGTERM, SIG_IGN), SIG_ERR);
  const auto error = spawn(shell("kill -TERM $$; echo still here"));
  signal(SIGTERM, SIG_DFL);
  ASSERT_FALSE(error);
  EXPECT_EQ(line(), "");
}

TEST_F(ProcessSpawnerTest, AProcessDiesWithWhatItStarted) {
  ASSERT_FALSE(spawn(shell("sleep 1000 & echo $!; wait")));
  const UniqueDescriptor child = openPidfd(static_cast<pid_t>(std::stoi(line())));
  ASSERT_TRUE(child);
  endProcessTree(process);
  for (const int descriptor : {process.descriptor.get(), child.get()}) {
    pollfd ended{descriptor, POLLIN, 0};
    EXPECT_EQ(poll(&ended, 1, kPatience), 1);
  }
}

TEST_F(ProcessSpawnerTest, EndingAProcessThatHasEndedDoesNothing) {
  ASSERT_FALSE(spawn(shell("exit 3")));
  pollfd ended{process.descriptor.get(), POLLIN, 0};
  ASSERT_EQ(poll(&ended, 1, kPatience), 1);
  endProcessTree(process);
  siginfo_t info{};
  ASSERT_EQ(waitid(P_PIDFD, static_cast<id_t>(process.descriptor.get()), &info, WEXITED), 0);
  process.descriptor.reset();
  EXPECT_EQ(info.si_code, CLD_EXITED);
  EXPECT_EQ(info.si_status, 3);
}

TEST_F(ProcessSpawnerTest, TasksRunInOrderOnOneThreadAndNoneAfterTheStop) {
  std::vector<std::thread::id> threads;
  std::promise<void> done;
  for (int i = 0; i < 3; ++i) {
    ASSERT_TRUE(spawner.perform([&threads] { threads.push_back(std::this_thread::get_id()); }));
  }
  ASSERT_TRUE(spawner.perform([&done] { done.set_value(); }));
  done.get_future().wait();
  ASSERT_EQ(threads.size(), 3U);
  EXPECT_EQ(threads[0], threads[1]);
  EXPECT_EQ(threads[1], threads[2]);
  EXPECT_NE(threads[0], std::this_thread::get_id());
  spawner.stop();
  EXPECT_FALSE(spawner.perform([&threads] { threads.clear(); }));
  EXPECT_EQ(threads.size(), 3U);
}

}  // namespace
}  // namespace docuvend::linux_platform
