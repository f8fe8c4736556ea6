// The run-time directory, made beforehand by somebody who was faster than the daemon. The daemon uses nothing that is not as it would have
// made it, says what is in its way, and starts as soon as that is gone.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <filesystem>

#include "tests/attacks/RuntimeTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using linux_platform::UniqueDescriptor;
using ::testing::HasSubstr;

class RuntimeDirectory : public RuntimeTest {
 protected:
  static void make(const std::string& path, fs::perms mode = fs::perms::owner_all) {
    fs::create_directories(path);
    fs::permissions(path, mode);
  }
  static UniqueDescriptor listenAt(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof(address.sun_path) - 1);
    UniqueDescriptor listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(::bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0) << path;
    EXPECT_EQ(::listen(listener.get(), SOMAXCONN), 0);
    return listener;
  }
};

TEST_F(RuntimeDirectory, OneThatOthersMayEnterOrReadIsRefused) {
  for (const auto mode : {fs::perms::group_exec, fs::perms::others_exec, fs::perms::others_read, fs::perms::group_write, fs::perms::set_gid,
                          fs::perms::sticky_bit}) {
    make(directory(), fs::perms::owner_all | mode);
    expectRefused(directory() + " must have mode 700");
  }
  make(directory());
  make(directory() + "/public", fs::perms::owner_all | fs::perms::others_write);
  expectRefused(directory() + "/public must have mode 700");
  make(directory() + "/public");
  expectStarts();
}

TEST_F(RuntimeDirectory, OneThatBelongsToSomebodyElseIsRefused) {
  const std::string somebodyElses = "/usr";
  struct stat status {};
  ASSERT_EQ(::stat(somebodyElses.c_str(), &status), 0);
  ASSERT_NE(status.st_uid, ::geteuid());
  auto environment = house_.environment();
  for (std::string& entry : environment) {
    if (entry.starts_with("XDG_RUNTIME_DIR=")) entry = "XDG_RUNTIME_DIR=" + somebodyElses;
  }
  const Ending ending = house_.runDaemon(environment);
  EXPECT_EQ(ending.status, 1);
  EXPECT_THAT(ending.errors, HasSubstr(somebodyElses + " belongs to another user"));
  expectStarts();
}

TEST_F(RuntimeDirectory, ALinkInItsPlaceIsRefusedAndNotFollowed) {
  const std::string elsewhere = house_.home() + "/elsewhere";
  make(elsewhere);
  fs::create_directory_symlink(elsewhere, directory());
  expectRefused(directory() + ": Not a directory");
  EXPECT_TRUE(fs::is_empty(elsewhere));

  fs::remove(directory());
  make(directory());
  fs::create_directory_symlink(elsewhere, directory() + "/public");
  expectRefused(directory() + "/public: Not a directory");
  EXPECT_TRUE(fs::is_empty(elsewhere));

  fs::remove(directory() + "/public");
  expectStarts();
}

TEST_F(RuntimeDirectory, AFileInItsPlaceIsRefused) {
  writeFile(directory(), "");
  expectRefused(directory() + ": Not a directory");
  EXPECT_EQ(contentsOf(directory()), "");
  fs::remove(directory());
  expectStarts();
}

TEST_F(RuntimeDirectory, ALinkInPlaceOfTheLockOrTheTokenKeyIsNotFollowed) {
  const std::string elsewhere = house_.home() + "/elsewhere";
  for (const std::string& name : {directory() + "/lock", directory() + "/token-key"}) {
    make(directory());
    fs::create_symlink(elsewhere, name);
    expectRefused(name);
    EXPECT_FALSE(fs::exists(elsewhere)) << name;
    fs::remove(name);
  }
  expectStarts();
}

TEST_F(RuntimeDirectory, WhatLiesAtTheServicesPathIsNeitherUsedNorRemovedUnlessItIsAStaleSocket) {
  make(directory());
  make(directory() + "/public");
  const std::string victim = house_.home() + "/victim";
  writeFile(victim, "precious\n");

  fs::create_symlink(victim, socket());
  expectRefused(socket() + " is not a socket");
  EXPECT_TRUE(fs::is_symlink(socket()));
  fs::remove(socket());

  writeFile(socket(), "precious\n");
  expectRefused(socket() + " is not a socket");
  EXPECT_EQ(contentsOf(socket()), "precious\n");
  fs::remove(socket());

  ASSERT_EQ(::mkfifo(socket().c_str(), 0600), 0);
  expectRefused(socket() + " is not a socket");
  fs::remove(socket());

  EXPECT_EQ(contentsOf(victim), "precious\n");
  { const auto stale = listenAt(socket()); }
  expectStarts();
}

// Somebody who pretends to be the daemon: it does not share the place, nor push him out and leave his clients with him unseen.
TEST_F(RuntimeDirectory, ALivingSocketAtTheServicesPathIsLeftAloneAndReported) {
  make(directory());
  make(directory() + "/public");
  {
    const auto pretender = listenAt(socket());
    expectRefused("another process listens at " + socket());
    EXPECT_TRUE(fs::is_socket(socket()));
  }
  expectStarts();
}

TEST_F(RuntimeDirectory, ASecretNameThatTheSocketHasBeforeItIsPublishedGivesNobodyAWayIn) {
  make(directory());
  make(directory() + "/public");
  const std::string before = directory() + "/public/." + kDVServiceName + ".new";
  fs::create_symlink(house_.home() + "/elsewhere", before);
  expectRefused(before + " is not a socket");
  EXPECT_FALSE(fs::exists(house_.home() + "/elsewhere"));
  fs::remove(before);
  expectStarts();
}

}  // namespace
}  // namespace docuvend::tests
