#include "platform/linux/rpc/ActivatedSockets.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include "platform/fake/FakeLog.h"
#include "platform/linux/wire/SocketAddress.h"
#include "tests/rpc/RpcDrivers.h"

namespace docuvend::linux_platform {
namespace {

// The descriptors from 3 on are the test's own here: each test is a process by itself, and these lines come before anything else in it.
class ActivatedSocketsTest : public testing::Test {
 protected:
  void SetUp() override {
    for (int i = kFirstActivatedDescriptor; i < kFirstActivatedDescriptor + 4; ++i) ::close(i);
    ::unsetenv("LISTEN_PID");
    ::unsetenv("LISTEN_FDS");
    ::unsetenv("LISTEN_FDNAMES");
  }

  void place(UniqueDescriptor descriptor, int number) {
    if (descriptor.get() == number) {
      static_cast<void>(descriptor.release());
      ASSERT_EQ(::fcntl(number, F_SETFD, 0), 0);
    } else {
      ASSERT_EQ(::dup2(descriptor.get(), number), number);
    }
  }
  UniqueDescriptor listening(const std::string& path) {
    UniqueDescriptor socket(::fcntl(::socket(AF_UNIX, SOCK_STREAM, 0), F_DUPFD_CLOEXEC, 20));
    const auto address = SocketAddress::forPath(path);
    EXPECT_EQ(::bind(socket.get(), std::get<SocketAddress>(address).address(), std::get<SocketAddress>(address).length()), 0);
    EXPECT_EQ(::listen(socket.get(), 5), 0);
    return socket;
  }
  void announce(pid_t process, const char* count, const char* names) {
    ::setenv("LISTEN_PID", std::to_string(process).c_str(), 1);
    ::setenv("LISTEN_FDS", count, 1);
    ::setenv("LISTEN_FDNAMES", names, 1);
  }

  fake_platform::FakeLog log;
  tests::TemporaryDirectory directory;
};

TEST_F(ActivatedSocketsTest, TakesWhatThisProcessWasGivenAndForgetsTheVariables) {
  const std::string one = directory.path() + "/one";
  const std::string two = directory.path() + "/two";
  place(listening(one), 3);
  place(listening(two), 4);
  announce(::getpid(), "2", "first:second");
  const auto sockets = takeActivatedSockets(log.defaultLog());
  ASSERT_EQ(sockets.size(), 2U);
  EXPECT_EQ(sockets[0].name, "first");
  EXPECT_EQ(sockets[0].path, one);
  EXPECT_EQ(sockets[0].descriptor.get(), 3);
  EXPECT_EQ(sockets[1].name, "second");
  EXPECT_EQ(sockets[1].path, two);
  for (const auto& socket : sockets) {
    EXPECT_NE(static_cast<unsigned>(::fcntl(socket.descriptor.get(), F_GETFD)) & static_cast<unsigned>(FD_CLOEXEC), 0U);
  }
  EXPECT_EQ(::getenv("LISTEN_PID"), nullptr);
  EXPECT_EQ(::getenv("LISTEN_FDS"), nullptr);
  EXPECT_EQ(::getenv("LISTEN_FDNAMES"), nullptr);
  EXPECT_THAT(log.texts(), testing::IsEmpty());
}

TEST_F(ActivatedSocketsTest, WhatIsNoListeningStreamSocketIsClosedWithOneLine) {
  UniqueDescriptor datagram(::fcntl(::socket(AF_UNIX, SOCK_DGRAM, 0), F_DUPFD_CLOEXEC, 20));
  UniqueDescriptor idle(::fcntl(::socket(AF_UNIX, SOCK_STREAM, 0), F_DUPFD_CLOEXEC, 20));
  UniqueDescriptor file(::fcntl(::open("/dev/null", O_RDONLY), F_DUPFD_CLOEXEC, 20));
  place(std::move(datagram), 3);
  place(std::move(idle), 4);
  place(std::move(file), 5);
  place(listening(directory.path() + "/one"), 6);
  announce(::getpid(), "4", "a:b:c:d");
  const auto sockets = takeActivatedSockets(log.defaultLog());
  ASSERT_EQ(sockets.size(), 1U);
  EXPECT_EQ(sockets[0].name, "d");
  const auto ignoring = [](int descriptor) {
    return fake_platform::FakeLogEntry{QXLogType::defaultType, "[NOTICE] Ignoring the passed descriptor " + std::to_string(descriptor) +
                                                                   ": it is no listening Unix stream socket."};
  };
  EXPECT_THAT(log.entries(), testing::ElementsAre(ignoring(3), ignoring(4), ignoring(5)));
  for (int i = 3; i < 6; ++i) EXPECT_LT(::fcntl(i, F_GETFD), 0) << i;
}

TEST_F(ActivatedSocketsTest, WhatWasMeantForAnotherProcessIsLeftAlone) {
  place(listening(directory.path() + "/one"), 3);
  announce(::getppid(), "1", "a");
  EXPECT_TRUE(takeActivatedSockets(log.defaultLog()).empty());
  EXPECT_GE(::fcntl(3, F_GETFD), 0);
  EXPECT_EQ(::getenv("LISTEN_FDS"), nullptr);
}

TEST_F(ActivatedSocketsTest, NonsenseIsNothing) {
  for (const char* count : {"", "x", "-1", "0", "1x", "99999999999999999999"}) {
    announce(::getpid(), count, "a");
    EXPECT_TRUE(takeActivatedSockets(log.defaultLog()).empty()) << count;
  }
  EXPECT_THAT(log.texts(), testing::IsEmpty());
}

TEST_F(ActivatedSocketsTest, WithoutVariablesThereIsNothing) { EXPECT_TRUE(takeActivatedSockets(log.defaultLog()).empty()); }

}  // namespace
}  // namespace docuvend::linux_platform
