// A provider that does what the last component of an item's URL says.
//
//   identifierForItem   process      which process this is: a text that differs for each
//                       descriptors  the numbers of the descriptors that were open at its start
//                       hang         never answers
//                       suspended    answers, and stops the process as a whole when the file "release" lies in its container
//                       say-TEXT     writes TEXT to both outputs, a line each
//                       anything     refused
//   startProviding      crash        abort()
//                       leave        _exit(7)
//                       wait         answers when the file "release" lies in its container
//                       stay         lets the process outlive its connection
//                       suspend      stops the process as a whole
//                       spin         keeps the thread busy that reads the connection
//                       anything     succeeds
//   at the start        stops the process as a whole if the file "suspend" lies in its container
//   performInitialSetup as the file "setup" in its container says: "hang" never answers, a number fails that often
//   itemURL             the URL of a file of that name in its container
#include <fcntl.h>
#include <signal.h>
#include <sys/random.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

#include "sdk/Provider.h"

namespace docuvend {
namespace {

constexpr int kHighestDescriptor = 256;

std::string openDescriptors() {
  std::string result;
  for (int number = 0; number < kHighestDescriptor; ++number) {
    if (fcntl(number, F_GETFD) >= 0) result += (result.empty() ? "" : " ") + std::to_string(number);
  }
  return result;
}

std::string randomText() {
  unsigned long number = 0;
  if (getrandom(&number, sizeof number, 0) != sizeof number) std::abort();
  return std::to_string(number);
}

[[noreturn]] void waitForever() {
  for (;;) pause();
}

void waitForRelease() {
  while (access("release", F_OK) != 0) std::this_thread::sleep_for(std::chrono::milliseconds(1));
}

void suspendWhenReleased() {
  waitForRelease();
  raise(SIGSTOP);
}

// Keeps every thread busy but this one and the main one, which only waits: the one that reads is among them.
void spinReader() {
  signal(SIGUSR1, [](int) {
    for (volatile bool isOn = true; isOn;) {
    }
  });
  for (const auto& entry : std::filesystem::directory_iterator("/proc/self/task")) {
    const pid_t thread = std::stoi(entry.path().filename());
    if (thread != getpid() && thread != gettid() && tgkill(getpid(), thread, SIGUSR1) != 0) std::abort();
  }
}

class TestProvider : public Provider {
 public:
  [[nodiscard]] Failure performInitialSetup() override {
    std::string what = "0";
    std::ifstream("setup") >> what;
    if (what == "hang") waitForever();
    const int failures = std::stoi(what);
    if (failures == 0) return std::nullopt;
    std::ofstream("setup") << failures - 1;
    return QXError::make("TestProvider", 2, "not yet");
  }
  [[nodiscard]] Failure providePlaceholder(const QXURL&) override { return std::nullopt; }

  [[nodiscard]] Failure startProviding(const QXURL& url) override {
    const std::string what = command(url);
    if (what == "crash") std::abort();
    if (what == "leave") _exit(7);
    if (what == "stay") std::atexit([] { waitForever(); });
    if (what == "suspend") raise(SIGSTOP);
    if (what == "spin") spinReader();
    if (what == "wait") waitForRelease();
    return std::nullopt;
  }

  [[nodiscard]] Failure itemChanged(const QXURL&) override { return std::nullopt; }
  [[nodiscard]] Failure stopProviding(const QXURL&) override { return std::nullopt; }

  [[nodiscard]] Result<ItemID> identifierForItem(const QXURL& url) override {
    const std::string what = command(url);
    if (what == "process") return ItemID{process_};
    if (what == "descriptors") return ItemID{descriptors_};
    if (what == "hang") waitForever();
    if (what == "suspended") {
      std::thread(suspendWhenReleased).detach();
      return ItemID{"soon"};
    }
    if (what.starts_with("say-")) {
      std::fprintf(stderr, "%s\n", what.c_str() + 4);
      std::printf("%s\n", what.c_str() + 4);
      std::fflush(stdout);
      return ItemID{"said"};
    }
    return QXError::make("TestProvider", 1, "no such item");
  }

  [[nodiscard]] Result<QXURL> itemURL(const ItemID& identifier) override {
    return QXURL::fileURL(providerContainer().value_or("") + "/" + identifier.value, QXURLKind::file);
  }

 private:
  static std::string command(const QXURL& url) {
    const std::string path = url.fileSystemPath();
    return path.substr(path.rfind('/') + 1);
  }

  const std::string descriptors_ = openDescriptors();
  const std::string process_ = randomText();
};

}  // namespace
}  // namespace docuvend

int main() {
  if (access("suspend", F_OK) == 0) raise(SIGSTOP);
  docuvend::TestProvider provider;
  return docuvend::runProvider(provider);
}
