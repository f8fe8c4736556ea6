#include "tests/attacks/StrangerTest.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <variant>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/ConnectToSocket.h"

namespace docuvend::tests {
namespace {

using linux_platform::UniqueDescriptor;

constexpr const char* kTemporaryDirectory = "TMPDIR";
constexpr const char* kSocket = "DOCUVEND_STRANGER";
constexpr const char* kDemanded = "DOCUVEND_STRANGER_REQUIRED";

std::optional<std::string> variable(const char* name) {
  const char* value = std::getenv(name);
  return value == nullptr ? std::nullopt : std::optional<std::string>(value);
}

UniqueDescriptor connectToStranger() {
  const auto path = variable(kSocket);
  if (!path) return {};
  auto connected = linux_platform::connectToSocket(*path);
  auto* socket = std::get_if<UniqueDescriptor>(&connected);
  return socket == nullptr ? UniqueDescriptor() : std::move(*socket);
}

void setMode(const std::string& path, mode_t mode) {
  if (::chmod(path.c_str(), mode) != 0) throw std::runtime_error("cannot open " + path + " to others");
}

}  // namespace

MeetingPlace::MeetingPlace() : before_(variable(kTemporaryDirectory)) {
  if (const auto socket = variable(kSocket)) {
    ::setenv(kTemporaryDirectory, std::filesystem::path(*socket).parent_path().c_str(), /*replace=*/1);
  }
}

MeetingPlace::~MeetingPlace() {
  if (before_) {
    ::setenv(kTemporaryDirectory, before_->c_str(), /*replace=*/1);
  } else {
    ::unsetenv(kTemporaryDirectory);
  }
}

std::optional<std::string> MeetingPlace::whyNoStranger() {
  if (!variable(kSocket)) return "there is no second user; the run of the tests makes one when root starts it";
  if (!connectToStranger()) return "nobody answers at " + *variable(kSocket);
  return std::nullopt;
}

bool MeetingPlace::isDemanded() { return variable(kDemanded).has_value(); }

std::vector<std::string> askStranger(const std::string& runtime, const std::vector<std::string>& words) {
  std::string line = runtime;
  for (const std::string& word : words) line.append("\t").append(word);
  line.push_back('\n');
  const UniqueDescriptor connection = connectToStranger();
  if (::send(connection.get(), line.data(), line.size(), MSG_NOSIGNAL) != static_cast<ssize_t>(line.size())) return {"no stranger"};
  const timeval patience{kPatience.count(), 0};
  ::setsockopt(connection.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  std::string answer;
  std::array<char, 4096> part{};
  for (;;) {
    const ssize_t count = ::recv(connection.get(), part.data(), part.size(), 0);
    if (count <= 0) break;
    answer.append(part.data(), static_cast<std::size_t>(count));
  }
  return linesOf(answer);
}

void openToAll(const std::string& path) { setMode(path, 0755); }
void openWide(const std::string& path) { setMode(path, 0777); }

}  // namespace docuvend::tests
