#include "platform/linux/wire/ConnectToSocket.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace docuvend::linux_platform {
namespace {

TEST(ConnectToSocketTest, SaysWhyThereIsNoConnection) {
  const auto result = connectToSocket("/nonexistent/socket");
  ASSERT_TRUE(std::holds_alternative<QXError>(result));
  EXPECT_EQ(std::get<QXError>(result).code, ENOENT);
}

TEST(ConnectToSocketTest, WaitsForAFullQueueNoLongerThanItIsTold) {
  std::string pattern = (std::filesystem::temp_directory_path() / "dvXXXXXX").string();
  ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
  const std::string path = pattern + "/s";
  UniqueDescriptor service(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof(address.sun_path) - 1);
  ASSERT_EQ(::bind(service.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  ASSERT_EQ(::listen(service.get(), 0), 0);
  std::vector<UniqueDescriptor> clients;
  std::optional<QXError> failure;
  for (int i = 0; i < 3 && !failure; ++i) {
    auto connected = connectToSocket(path, std::chrono::milliseconds(1));
    if (auto* error = std::get_if<QXError>(&connected)) {
      failure = *error;
    } else {
      clients.push_back(std::get<UniqueDescriptor>(std::move(connected)));
    }
  }
  EXPECT_TRUE(failure && failure->domain == kQXSystemErrorDomain && failure->code == EAGAIN);
  EXPECT_EQ(clients.size(), 1U);
  std::filesystem::remove_all(pattern);
}

}  // namespace
}  // namespace docuvend::linux_platform
