#include "tests/launch/PeerTest.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <stdexcept>
#include <string_view>

namespace docuvend::linux_platform {
namespace {

sockaddr_un addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof(address.sun_path) - 1);
  return address;
}

bool writeFile(const char* path, const std::string& text) {
  const UniqueDescriptor file(::open(path, O_WRONLY | O_CLOEXEC));
  return file && ::write(file.get(), text.data(), text.size()) == static_cast<ssize_t>(text.size());
}

}  // namespace

void PeerTest::SetUp() {
  ConfinedTest::SetUp();
  if (HasFatalFailure()) return;
  ASSERT_FALSE(prepareRuntimeDirectories(house_.paths));
  socketPath_ = house_.paths.publicSockets + "/service";
  const auto address = addressOf(socketPath_);
  listener_.reset(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::bind(listener_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  ASSERT_EQ(::listen(listener_.get(), 8), 0);
}

Bundle PeerTest::install(const std::string& identifier) {
  (void)house_.installProbe(identifier);
  BundleHouse::write(house_.paths.userBundles + "/" + identifier + "/Entitlements.plist",
                     BundleHouse::propertyList("<key>right-of-" + identifier + "</key><true/>"));
  bundles_.bundles = house_.scan();
  return bundles_.bundles.at(identifier);
}

Peer PeerTest::confined(const Bundle& bundle, const std::string& attempt) {
  auto process = ConfinedHouse::start(house_.plan(bundle, {attempt, socketPath_}));
  return {std::move(process), accept()};
}

Peer PeerTest::unconfined(std::function<int()> work) {
  auto process = startChild([this, &work] {
    const UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const auto address = addressOf(socketPath_);
    if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) return errno;
    const int status = work();
    char byte = 0;
    if (::write(socket.get(), &byte, 1) != 1) return errno;
    while (::read(socket.get(), &byte, 1) > 0) {
    }
    return status;
  });
  auto connection = accept();
  char byte = 0;
  if (::read(connection.get(), &byte, 1) != 1) throw std::runtime_error("the peer is gone");
  return {std::move(process), std::move(connection)};
}

Peer PeerTest::handMade(const std::vector<std::string>& arguments) {
  std::vector<std::string> words = {
      "/usr/bin/bwrap", "--unshare-user", "--unshare-pid", "--die-with-parent", "--dev-bind", "/usr",       "/usr",
      "--symlink",      "usr/lib",        "/lib",          "--symlink",         "usr/lib64",  "/lib64",     "--proc",
      "/proc",          "--bind",         house_.root(),   house_.root(),       "--ro-bind",  DOCUVEND_BIN, "/programs"};
  words.insert(words.end(), arguments.begin(), arguments.end());
  words.insert(words.end(), {"--", "/programs/docuvend-launch-probe", "stay-connected", socketPath_});
  auto process = startChild([&words] {
    std::vector<char*> pointers;
    for (auto& word : words) pointers.push_back(word.data());
    pointers.push_back(nullptr);
    ::execv(pointers[0], pointers.data());
    return errno;
  });
  return {std::move(process), accept()};
}

UniqueDescriptor PeerTest::accept() {
  UniqueDescriptor connection(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
  if (!connection) throw std::runtime_error("nobody connected");
  return connection;
}

int enterNamespaces() {
  const std::string user = std::to_string(::geteuid());
  const std::string group = std::to_string(::getegid());
  if (::unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0) return errno;
  if (!writeFile("/proc/self/setgroups", "deny") || !writeFile("/proc/self/uid_map", user + " " + user + " 1") ||
      !writeFile("/proc/self/gid_map", group + " " + group + " 1")) {
    return errno;
  }
  return 0;
}

}  // namespace docuvend::linux_platform
