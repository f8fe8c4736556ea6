// Open files that travel with messages.
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <vector>

#include "tests/wire/EndpointTest.h"

namespace docuvend::linux_platform {
namespace {

TEST_F(EndpointTest, DescriptorsTravelInBothDirections) {
  connect(recorder);
  UniqueDescriptor file(::open("/dev/null", O_RDWR | O_CLOEXEC));
  struct stat sent {};
  ASSERT_EQ(::fstat(file.get(), &sent), 0);
  proxy()->send(kOpen, {QXValue(toValue(std::move(file)))}, intoReplies());
  auto request = recorder->requests.take();
  ASSERT_TRUE(request);
  const auto* received = request->arguments[0].as<QXDescriptor>();
  ASSERT_NE(received, nullptr);
  struct stat arrived {};
  ASSERT_EQ(::fstat(received->number, &arrived), 0);
  EXPECT_EQ(arrived.st_rdev, sent.st_rdev);
  EXPECT_NE(static_cast<unsigned>(::fcntl(received->number, F_GETFD)) & static_cast<unsigned>(FD_CLOEXEC), 0U);
  request->reply({request->arguments[0], QXValue()});
  const auto reply = replies.take();
  ASSERT_TRUE(reply);
  ASSERT_NE((*reply)[0].as<QXDescriptor>(), nullptr);
  EXPECT_GE(::fcntl((*reply)[0].as<QXDescriptor>()->number, F_GETFD), 0);
}

TEST_F(EndpointTest, DescriptorsOfARefusedRequestAreClosed) {
  connect(recorder);
  for (int i = 0; i < 10; ++i) {
    proxy()->send(kEcho, {QXValue(toValue(UniqueDescriptor(::open("/dev/null", O_RDWR | O_CLOEXEC))))}, intoReplies());
    EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::invalidArguments));
  }
}

TEST_F(EndpointTest, WhenTheSystemPassesNoMoreDescriptorsOnTheConnectionEndsAndNobodyWaitsForEver) {
  auto raw = connectRaw(nullptr);
  raw.sayHello();
  rlimit usual{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &usual), 0);
  const rlimit tight{64, usual.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &tight), 0);
  // What lies in the socket counts, and the peer takes nothing.
  const auto remote = server.endpoint->remoteObjectProxy([this](const QXError& error) { errors.put(error); });
  for (int i = 0; i < 200 && server.closed->count() == 0; ++i) {
    remote->send(kOpen, {toValue(UniqueDescriptor(::open("/dev/null", O_RDWR | O_CLOEXEC)))}, intoReplies());
  }
  EXPECT_EQ(::setrlimit(RLIMIT_NOFILE, &usual), 0);
  EXPECT_THAT(server.closed->take(), IsSystemError(ETOOMANYREFS));
  EXPECT_THAT(errors.take(), IsSystemError(ETOOMANYREFS));
  EXPECT_EQ(server.blamed->count(), 0U);
}

TEST_F(EndpointTest, DescriptorsThatNoFrameDeclaresEndTheConnection) {
  auto raw = connectRaw(recorder);
  const std::array<int, 1> one{raw.socket()};
  raw.write(tests::bytesOf(kHello), one);
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
}

TEST_F(EndpointTest, MoreDescriptorsThanAFrameMayHaveEndTheConnection) {
  auto raw = connectRaw(recorder);
  std::vector<int> many(kMaximumDescriptors + 1, raw.socket());
  raw.write(tests::bytesOf(kHello), many);
  EXPECT_THAT(server.closed->take(), IsRpcError(QXRpcErrorCode::malformedFrame));
}

}  // namespace
}  // namespace docuvend::linux_platform
