// Many threads at few files, with a provider that answers from a thread of its own.
//
// The seed of a run is printed; --gtest_random_seed=SEED repeats its choices, though not their interleaving.
#include <gtest/gtest.h>

#include <array>
#include <atomic>
#include <iostream>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <random>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/linux/coordination/FileAccesses.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "tests/coordination/Turns.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kThreads = 8;
constexpr int kRounds = 250;
constexpr int kThreadsOfAProcess = 2;
constexpr std::array<std::string_view, 4> kPaths = {"/storage/one", "/storage/two", "/storage/three", "/other/four"};

std::uint32_t seedOfThisRun() {
  const auto given = static_cast<std::uint32_t>(GTEST_FLAG_GET(random_seed));
  const std::uint32_t seed = given != 0 ? given : std::random_device{}() % 99999 + 1;  // as the flag allows
  std::cout << "seed " << seed << "\n";
  return seed;
}

// Answers every question from its own thread: one in seven with an error, one in three twice. What it is told it lets go of there too.
class AnsweringProvider final : public QXDocuvend {
 public:
  AnsweringProvider() : thread_(&AnsweringProvider::work, this) {}
  ~AnsweringProvider() override { stop(); }

  // When it returns, what it was asked and told before has been answered.
  void awaitAnswers() {
    // Held by the question, which may be answered twice.
    const auto reached = std::make_shared<tests::Mailbox<bool>>();
    questions_.put([reached](const std::optional<QXError>&) { reached->put(true); });
    EXPECT_TRUE(reached->take());
  }
  // Nothing may be asked or told any more.
  void stop() {
    if (!thread_.joinable()) return;
    questions_.put(std::nullopt);
    thread_.join();
  }

  std::optional<QXURL> _providedItemsURL() const override { return directory_; }
  std::shared_ptr<QXOperationQueue> _providedItemsOperationQueue() const override { return nullptr; }
  std::optional<std::string> _fileReactorID() const override { return std::nullopt; }
  void _provideItemAtURL(const QXURL& /*url*/, const std::optional<QXCoordinationID>& /*toReaderWithID*/,
                         ProvideCompletion completionHandler) override {
    questions_.put(std::move(completionHandler));
  }
  void _provideItemAtURL(const QXURL& /*url*/, ProvideCompletion /*completionHandler*/) override {}
  void _writerWithID(const QXCoordinationID& writer, const QXURL& didFinishWritingForURL) override {
    ++told;
    const std::string path = didFinishWritingForURL.fileSystemPath();
    for (std::size_t i = 0; i < kPaths.size(); ++i) {
      if (kPaths[i] == path) seen[i] = written[i].load();
    }
    questions_.put([untilTold = writer.untilTold](const std::optional<QXError>&) {});
  }

  std::atomic<int> asked{0};  // and told
  std::atomic<int> told{0};
  // How often each file has been written, and had been when the provider was told last.
  std::array<std::atomic<int>, kPaths.size()> written{};
  std::array<std::atomic<int>, kPaths.size()> seen{};

 private:
  void work() {
    while (true) {
      // Outer: none when nothing came for long; inner: none to stop.
      const auto question = questions_.take();
      if (!question || !*question) return;
      const int number = ++asked;
      const QXError broken = QXError::make("CloudDomain", 3, "the cloud is away");
      (**question)(number % 7 == 0 ? std::optional(broken) : std::nullopt);
      if (number % 3 == 0) (**question)(broken);
    }
  }

  const QXURL directory_ = QXURL::fileURL("/storage", QXURLKind::directory);
  tests::Mailbox<std::optional<ProvideCompletion>> questions_;
  std::thread thread_;
};

// Who has which file as the threads know it: noted after an access has begun, and taken back before it ends.
class Occupation {
 public:
  void enter(const FileAccess& access) {
    const std::lock_guard lock(mutex_);
    auto& processes = files_[access.file];
    ++processes[access.party.process][access.kind];
    for (auto& [process, counts] : processes) {
      if (process == access.party.process) continue;
      const int excluded = counts[AccessKind::writing] + (access.kind == AccessKind::writing ? counts[AccessKind::reading] : 0);
      EXPECT_EQ(excluded, 0) << "two processes have what only one can have";
    }
  }
  void leave(const FileAccess& access) {
    const std::lock_guard lock(mutex_);
    --files_[access.file][access.party.process][access.kind];
  }

 private:
  std::mutex mutex_;
  std::map<FileKey, std::map<QXAuditToken, std::map<AccessKind, int>>> files_;
};

struct FileAccessesThreads : ::testing::Test {
  void SetUp() override {
    fileSystem.addDirectory("/storage");
    fileSystem.addDirectory("/other");
    coordinator._addDocuvend(provider);
  }
  // What it has not answered yet is still to be taken by the accesses.
  void TearDown() override { provider->stop(); }

  FileAccess randomAccess(std::mt19937& random, int thread) const {
    const auto process = static_cast<std::uint8_t>(1 + thread / kThreadsOfAProcess);
    const std::string path(kPaths[random() % kPaths.size()]);
    const AccessKind kind = random() % 3 == 0 ? AccessKind::writing : AccessKind::reading;
    return {testing::fileNamed(path), QXURL::fileURL(path, QXURLKind::file), kind, testing::partyOf(process, thread), {process, {}}};
  }

  void work(std::uint32_t seed, int thread) {
    std::mt19937 random(seed + static_cast<std::uint32_t>(thread));
    for (int round = 0; round < kRounds && !HasFailure(); ++round) {
      if (random() % 8 == 0) {
        giveUp(randomAccess(random, thread));
      } else {
        accessThenMore(random, thread, /*depth=*/random() % 3);
      }
    }
  }

  // An access, and within it another one, and so on.
  void accessThenMore(std::mt19937& random, int thread, unsigned depth) {
    const FileAccess access = randomAccess(random, thread);
    const AccessNumber number = accesses.newNumber();
    tests::Mailbox<std::optional<QXError>> answers;
    accesses.begin(number, access, [&answers, token = token](std::optional<QXError> error) { answers.put(std::move(error)); });
    const auto answer = answers.take();
    ASSERT_TRUE(answer) << "no answer";
    if (!*answer) {
      occupation.enter(access);
      noteWriting(access);
      if (depth > 0) accessThenMore(random, thread, depth - 1);
      occupation.leave(access);
      noteWritten(access);
    } else if ((*answer)->domain == kQXFileCoordinationErrorDomain) {
      EXPECT_EQ((*answer)->code, static_cast<std::int64_t>(FileCoordinationErrorCode::wouldDeadlock));
      ++refused;
    }
    tests::Mailbox<bool> ends;
    accesses.end(number, [&ends, token = token] { ends.put(true); });
    ASSERT_TRUE(ends.take()) << "no end";
    EXPECT_EQ(answers.count(), 0U) << "a second answer";
  }

  // Ends it whether it has begun or not.
  void giveUp(const FileAccess& access) {
    const AccessNumber number = accesses.newNumber();
    tests::Mailbox<std::optional<QXError>> answers;
    tests::Mailbox<bool> ends;
    accesses.begin(number, access, [&answers, token = token](std::optional<QXError> error) { answers.put(std::move(error)); });
    accesses.end(number, [&ends, token = token] { ends.put(true); });
    const auto answer = answers.take();
    ASSERT_TRUE(answer) << "no answer";
    ASSERT_TRUE(ends.take()) << "no end";
    if (!*answer) noteWriting(access);
  }

  // Before the access ends.
  void noteWritten(const FileAccess& access) {
    if (access.kind != AccessKind::writing) return;
    for (std::size_t i = 0; i < kPaths.size(); ++i) {
      if (kPaths[i] == access.file.name) ++provider->written[i];
    }
  }

  void noteWriting(const FileAccess& access) {
    if (access.kind == AccessKind::writing && access.file.name.starts_with("/storage/")) ++writes;
  }

  fake_platform::FakeFileSystem fileSystem;
  LinuxFileCoordinator coordinator{fileSystem};
  const std::shared_ptr<AnsweringProvider> provider = std::make_shared<AnsweringProvider>();
  FileAccesses accesses{coordinator};
  Occupation occupation;
  std::atomic<int> writes{0};
  std::atomic<int> refused{0};
  // Everything that is to be called holds it.
  const std::shared_ptr<int> token = std::make_shared<int>();
};

TEST_F(FileAccessesThreads, KeepTurnsApartAndLeaveNothingBehind) {
  const std::uint32_t seed = seedOfThisRun();
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (int thread = 0; thread < kThreads; ++thread) threads.emplace_back(&FileAccessesThreads::work, this, seed, thread);
  for (std::thread& thread : threads) thread.join();
  if (HasFailure()) return;

  provider->awaitAnswers();  // it is told then of what was written while it had not answered
  provider->awaitAnswers();
  EXPECT_LE(provider->told, writes) << "of no write the provider is told twice";
  for (std::size_t i = 0; i < kPaths.size(); ++i) {
    const bool isProvided = kPaths[i].starts_with("/storage/");
    EXPECT_EQ(provider->seen[i], isProvided ? provider->written[i].load() : 0) << "the last write is told of";
    EXPECT_TRUE(accesses.of(testing::fileNamed(std::string(kPaths[i]))).empty()) << kPaths[i];
  }
  EXPECT_GT(refused, 0) << "nothing came near a cycle";
  provider->stop();
  EXPECT_EQ(token.use_count(), 1) << "somebody is still to be answered";
  std::cout << writes << " writes, " << provider->told << " told, " << provider->asked << " questions, " << refused << " refused\n";
}

}  // namespace
}  // namespace docuvend::linux_platform
