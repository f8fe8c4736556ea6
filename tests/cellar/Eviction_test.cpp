// A file is taken from nobody: not from who has it open, nor from who opens it in the middle.
#include "examples/cellar/Eviction.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <future>
#include <iterator>
#include <optional>
#include <stdexcept>
#include <string>

namespace docuvend::cellar {
namespace {

namespace fs = std::filesystem;

constexpr std::chrono::seconds kPatience{30};

class EvictionTest : public ::testing::Test {
 protected:
  EvictionTest() {
    std::string pattern = (fs::temp_directory_path() / "cellar-XXXXXX").string();
    if (mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory for a test");
    root = pattern;
    path = root + "/a.txt";
    std::ofstream(path) << "hello";
    placeholder.emplace(root + "/.new");
    if (placeholder->becomePlaceholder(5, 7'000'000'000)) throw std::runtime_error("no placeholder for a test");
  }
  ~EvictionTest() override {
    placeholder.reset();
    std::error_code ignored;
    fs::remove_all(root, ignored);
  }

  // Nothing has been taken: the contents lie at the name, and the placeholder at its own.
  void expectNothingTaken() const {
    EXPECT_EQ(read(path), "hello");
    EXPECT_FALSE(isPlaceholder(path));
    EXPECT_TRUE(isPlaceholder(root + "/.new"));
  }
  static bool isPlaceholder(const std::string& path) {
    const UniqueDescriptor file = openForReading(path);
    const auto fingerprint = file ? fingerprintOf(file) : std::nullopt;
    return fingerprint && fingerprint->isPlaceholder();
  }
  static std::string read(const std::string& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  }

  std::string root;
  std::string path;
  std::optional<Replacement> placeholder;
};

TEST_F(EvictionTest, PutsThePlaceholderInThePlaceOfAFileThatNobodyHasOpen) {
  {
    const Eviction eviction(path);
    ASSERT_FALSE(eviction.error()) << eviction.error()->description();
    EXPECT_FALSE(eviction.commit(*placeholder));
  }
  placeholder.reset();
  EXPECT_TRUE(isPlaceholder(path));
  struct stat status {};
  ASSERT_EQ(stat(path.c_str(), &status), 0);
  EXPECT_EQ(status.st_size, 5);
  EXPECT_EQ(status.st_blocks, 0);
  EXPECT_FALSE(fs::exists(root + "/.new")) << "the contents were left behind";
}

TEST_F(EvictionTest, WithoutCommitNothingIsTaken) {
  { const Eviction eviction(path); }
  expectNothingTaken();
}

TEST_F(EvictionTest, AFileThatSomebodyHasOpenIsNotLeased) {
  for (const int access : {O_RDONLY, O_WRONLY, O_RDWR}) {
    const UniqueDescriptor holder(open(path.c_str(), access | O_CLOEXEC));
    const Eviction eviction(path);
    ASSERT_TRUE(eviction.error()) << access;
    EXPECT_EQ(eviction.error()->code, EAGAIN) << access;
  }
  expectNothingTaken();
}

TEST_F(EvictionTest, AFileThatSomebodyHasMappedIsNotLeasedThoughItsDescriptorIsClosed) {
  for (const int kind : {MAP_SHARED, MAP_PRIVATE}) {
    UniqueDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    void* mapped = mmap(nullptr, 5, PROT_READ, kind, file.get(), 0);
    ASSERT_NE(mapped, MAP_FAILED);
    file.reset();
    const std::optional<QXError> refused = Eviction(path).error();
    munmap(mapped, 5);
    ASSERT_TRUE(refused) << kind;
    EXPECT_EQ(refused->code, EAGAIN) << kind;
    EXPECT_FALSE(Eviction(path).error()) << kind;
  }
}

TEST_F(EvictionTest, AFileThatIsNotThereIsNotLeased) {
  const Eviction eviction(root + "/b.txt");
  ASSERT_TRUE(eviction.error());
  EXPECT_EQ(eviction.error()->code, ENOENT);
}

TEST_F(EvictionTest, WhoOpensItInTheMiddleWithoutWaitingIsToldToComeBackAndFindsTheContents) {
  for (const int access : {O_RDONLY, O_RDWR}) {
    {
      const Eviction eviction(path);
      ASSERT_FALSE(eviction.error()) << eviction.error()->description();
      EXPECT_EQ(open(path.c_str(), access | O_NONBLOCK | O_CLOEXEC), -1);
      EXPECT_EQ(errno, EWOULDBLOCK);
      const auto refused = eviction.commit(*placeholder);
      ASSERT_TRUE(refused);
      EXPECT_EQ(refused->code, EAGAIN);
    }
    expectNothingTaken();
  }
}

TEST_F(EvictionTest, WhoOpensItInTheMiddleWaitsAndReadsTheContents) {
  std::optional<Eviction> eviction(std::in_place, path);
  ASSERT_FALSE(eviction->error()) << eviction->error()->description();
  auto reader = std::async(std::launch::async, [this] { return read(path); });
  // The lease turns when the reader asks for the file.
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (fcntl(eviction->file().get(), F_GETLEASE) == F_WRLCK && std::chrono::steady_clock::now() < deadline) {
  }
  EXPECT_NE(reader.wait_for(std::chrono::seconds(0)), std::future_status::ready);
  EXPECT_TRUE(eviction->commit(*placeholder));
  EXPECT_NE(reader.wait_for(std::chrono::seconds(0)), std::future_status::ready);
  eviction.reset();
  ASSERT_EQ(reader.wait_for(kPatience), std::future_status::ready);
  EXPECT_EQ(reader.get(), "hello");
  expectNothingTaken();
}

TEST_F(EvictionTest, WhatSomebodySavesOverItInTheMiddleStays) {
  const Eviction eviction(path);
  ASSERT_FALSE(eviction.error()) << eviction.error()->description();
  std::ofstream(root + "/.saved") << "saved";
  fs::rename(root + "/.saved", path);
  const auto refused = eviction.commit(*placeholder);
  ASSERT_TRUE(refused);
  EXPECT_EQ(refused->code, EAGAIN);
  placeholder.reset();
  EXPECT_EQ(read(path), "saved");
}

TEST_F(EvictionTest, WhoFoundItBeforeAndOpensItAfterwardsSeesThatItHasNoNameAnyMore) {
  const UniqueDescriptor found(open(path.c_str(), O_PATH | O_CLOEXEC));
  const Eviction eviction(path);
  ASSERT_FALSE(eviction.error()) << eviction.error()->description();
  EXPECT_FALSE(eviction.commit(*placeholder));
  // The lease still holds: nobody can have opened the file yet.
  EXPECT_EQ(fcntl(eviction.file().get(), F_GETLEASE), F_WRLCK);
  struct stat status {};
  ASSERT_EQ(fstat(found.get(), &status), 0);
  EXPECT_EQ(status.st_nlink, 0U);
}

TEST_F(EvictionTest, WhoOpensItAfterwardsFindsThePlaceholder) {
  const Eviction eviction(path);
  EXPECT_FALSE(eviction.commit(*placeholder));
  EXPECT_EQ(read(path), std::string(5, '\0'));
}

}  // namespace
}  // namespace docuvend::cellar
