#include "platform/linux/sandbox/TokenKey.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {
namespace {

using testing::TemporaryDirectory;
using testing::write;

struct TokenKeyFile : ::testing::Test {
  [[nodiscard]] std::size_t entries() const {
    const std::filesystem::directory_iterator list(directory.path());
    return static_cast<std::size_t>(std::distance(begin(list), end(list)));
  }

  const TemporaryDirectory directory;
  const std::string path = directory.path() + "/token-key";
  const std::string key = std::string(TokenKey::kLength, 'k');
};

TEST_F(TokenKeyFile, IsMadeWithMode600AndFoundAgain) {
  ::umask(0277);
  const auto first = TokenKey::renew(path);
  ::umask(0);
  ASSERT_TRUE(std::holds_alternative<TokenKey>(first)) << std::get<QXError>(first).description();
  struct stat status {};
  ASSERT_EQ(::lstat(path.c_str(), &status), 0);
  EXPECT_TRUE(S_ISREG(status.st_mode));
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
  EXPECT_EQ(status.st_size, static_cast<off_t>(TokenKey::kLength));
  EXPECT_EQ(entries(), 1U);

  const auto second = TokenKey::load(path);
  ASSERT_TRUE(std::holds_alternative<TokenKey>(second));
  EXPECT_TRUE(std::get<TokenKey>(second).verifies("text", std::get<TokenKey>(first).authenticate("text")));
  EXPECT_FALSE(std::get<TokenKey>(second).verifies("texts", std::get<TokenKey>(first).authenticate("text")));
  EXPECT_FALSE(TokenKey::random().verifies("text", std::get<TokenKey>(first).authenticate("text")));
}

TEST_F(TokenKeyFile, IsReplacedWhenItIsRenewed) {
  const auto first = TokenKey::renew(path);
  const auto second = TokenKey::renew(path);
  const auto loaded = TokenKey::load(path);
  ASSERT_TRUE(std::holds_alternative<TokenKey>(loaded));
  EXPECT_TRUE(std::get<TokenKey>(loaded).verifies("text", std::get<TokenKey>(second).authenticate("text")));
  EXPECT_FALSE(std::get<TokenKey>(loaded).verifies("text", std::get<TokenKey>(first).authenticate("text")));
  EXPECT_EQ(entries(), 1U);
}

TEST_F(TokenKeyFile, IsNotThereBeforeItIsMade) {
  const auto loaded = TokenKey::load(path);
  ASSERT_TRUE(std::holds_alternative<QXError>(loaded));
  EXPECT_EQ(std::get<QXError>(loaded).code, ENOENT);
  EXPECT_EQ(entries(), 0U);
}

TEST_F(TokenKeyFile, IsRefusedAndLeftAloneWhenItIsNotWhatItShouldBe) {
  const auto makeFile = [this](const std::string& text, mode_t mode) {
    write(path, text);
    ASSERT_EQ(::chmod(path.c_str(), mode), 0);
  };
  const std::vector<std::pair<const char*, std::function<void()>>> table = {
      {"readable by the group", [&] { makeFile(key, 0640); }},
      {"readable by others", [&] { makeFile(key, 0604); }},
      {"executable", [&] { makeFile(key, 0700); }},
      {"set-user-identifier", [&] { makeFile(key, 04600); }},
      {"not readable", [&] { makeFile(key, 0200); }},
      {"empty", [&] { makeFile("", 0600); }},
      {"too short", [&] { makeFile(key.substr(1), 0600); }},
      {"too long", [&] { makeFile(key + "k", 0600); }},
      {"two links",
       [&] {
         makeFile(key, 0600);
         ASSERT_EQ(::link(path.c_str(), (directory.path() + "/second").c_str()), 0);
       }},
      {"symbolic link",
       [&] {
         write(directory.path() + "/target", key);
         ASSERT_EQ(::chmod((directory.path() + "/target").c_str(), 0600), 0);
         ASSERT_EQ(::symlink("target", path.c_str()), 0);
       }},
      {"dangling symbolic link", [&] { ASSERT_EQ(::symlink("nothing", path.c_str()), 0); }},
      {"directory", [&] { ASSERT_EQ(::mkdir(path.c_str(), 0700), 0); }},
      {"pipe", [&] { ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0); }},
  };
  for (const auto& [name, make] : table) {
    make();
    const auto before = std::filesystem::symlink_status(path);
    EXPECT_TRUE(std::holds_alternative<QXError>(TokenKey::load(path))) << name;
    EXPECT_EQ(std::filesystem::symlink_status(path), before) << name;
    for (const auto& entry : std::filesystem::directory_iterator(directory.path())) std::filesystem::remove_all(entry.path());
  }
  // And what it should be is accepted.
  makeFile(key, 0600);
  EXPECT_TRUE(std::holds_alternative<TokenKey>(TokenKey::load(path)));
}

TEST_F(TokenKeyFile, IsAnErrorWhenItsDirectoryIsMissing) {
  EXPECT_TRUE(std::holds_alternative<QXError>(TokenKey::renew(directory.path() + "/missing/token-key")));
}

}  // namespace
}  // namespace docuvend::linux_platform
