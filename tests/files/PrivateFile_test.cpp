#include "platform/linux/files/PrivateFile.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <string>

#include "tests/files/TemporaryDirectory.h"
#include "tests/files/system_calls.h"

namespace docuvend::linux_platform {
namespace {

// What is refused besides, a key's tests and the floors' say: TokenKey_test.cpp, TokenSession_test.cpp.
struct PrivateFile : ::testing::Test {
  void expectError(std::size_t maximumLength, int code) const {
    const auto read = readPrivateFile(path, maximumLength);
    ASSERT_TRUE(std::holds_alternative<QXError>(read));
    EXPECT_EQ(std::get<QXError>(read).code, code) << std::get<QXError>(read).description();
  }

  const test::TemporaryDirectory directory;
  const std::string path = directory.path() + "/file";
};

TEST_F(PrivateFile, IsReadAsItWasWritten) {
  const std::string bytes = std::string("a\0\n\xff", 4) + std::string(100'000, 'x');
  for (const std::string& contents : {bytes, std::string("shorter"), std::string()}) {
    EXPECT_EQ(writePrivateFile(path, contents), std::nullopt);
    const auto read = readPrivateFile(path, bytes.size());
    ASSERT_TRUE(std::holds_alternative<std::string>(read));
    EXPECT_EQ(std::get<std::string>(read), contents);
  }
}

TEST_F(PrivateFile, IsNotReadBeyondItsMaximumLength) {
  ASSERT_EQ(writePrivateFile(path, "12345678"), std::nullopt);
  EXPECT_TRUE(std::holds_alternative<std::string>(readPrivateFile(path, 8)));
  expectError(7, EFBIG);
}

TEST_F(PrivateFile, IsMissingBeforeItIsWritten) { expectError(100, ENOENT); }

TEST_F(PrivateFile, IsNotReadWhenItBelongsToAnother) {
  ASSERT_EQ(writePrivateFile(path, "text"), std::nullopt);
  test::SystemCalls calls;
  calls.setEffectiveUser(::geteuid() + 1);
  expectError(100, EPERM);
}

TEST_F(PrivateFile, TakesThePlaceOfWhateverIsThereButADirectory) {
  ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
  expectError(100, EINVAL);
  EXPECT_EQ(writePrivateFile(path, "new"), std::nullopt);
  EXPECT_EQ(test::readText(path), "new");
  std::filesystem::remove(path);
  ASSERT_EQ(::mkdir(path.c_str(), 0700), 0);
  EXPECT_TRUE(writePrivateFile(path, "new"));
  expectError(100, EINVAL);
}

}  // namespace
}  // namespace docuvend::linux_platform
