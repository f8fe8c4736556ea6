#include "tests/launch/PeerTest.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <stdexcept>

namespace docuvend::linux_platform {
namespace {

const std::string kProbe = std::string(DOCUVEND_BIN) + "/docuvend-launch-probe";

sockaddr_un addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof(address.sun_path) - 1);
  return address;
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

Peer PeerTest::unconfined(const std::vector<std::string>& attempts) {
  std::vector<std::string> words = {kProbe, "join", socketPath_};
  words.insert(words.end(), attempts.begin(), attempts.end());
  words.insert(words.end(), {"stay", "here"});
  auto process = startProgram(std::move(words));
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
  auto process = startProgram(std::move(words));
  return {std::move(process), accept()};
}

RunningProcess PeerTest::startProgram(std::vector<std::string> words) {
  return startChild([&words] {
    std::vector<char*> pointers;
    for (auto& word : words) pointers.push_back(word.data());
    pointers.push_back(nullptr);
    ::execv(pointers[0], pointers.data());
    return errno;
  });
}

UniqueDescriptor PeerTest::accept() {
  UniqueDescriptor connection(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
  if (!connection) throw std::runtime_error("nobody connected");
  return connection;
}

}  // namespace docuvend::linux_platform
