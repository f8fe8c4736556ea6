// To be taken for the process that got one's number. Which process gets which number is said in a process namespace of one's own.
#include <gtest/gtest.h>
#include <linux/sched.h>
#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <functional>
#include <stdexcept>
#include <string>

#include "platform/fake/FakeLog.h"
#include "platform/linux/identity/LinuxPeerDirectory.h"
#include "tests/attacks/namespaces.h"
#include "tests/support/Sanitizers.h"

namespace docuvend::tests {
namespace {

using linux_platform::KernelFacilities;
using linux_platform::LinuxPeerDirectory;
using linux_platform::Standing;
using linux_platform::UniqueDescriptor;

constexpr pid_t kNumber = 4711;

class NoBundles final : public linux_platform::BundleRegistry {
 public:
  std::optional<linux_platform::Bundle> find(const std::string&) override { return std::nullopt; }
  std::vector<linux_platform::Bundle> all() override { return {}; }
  void onChange(std::function<void()>) override {}
};

// A child with that number, which does the work and then waits to be ended.
pid_t startAs(pid_t number, const std::function<void()>& work) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  const UniqueDescriptor output(ends[0]);
  UniqueDescriptor input(ends[1]);
  clone_args arguments{};
  arguments.exit_signal = SIGCHLD;
  arguments.set_tid = reinterpret_cast<std::uintptr_t>(&number);
  arguments.set_tid_size = 1;
  const long child = ::syscall(SYS_clone3, &arguments, sizeof(arguments));
  if (child < 0) throw std::runtime_error("no process with that number: " + std::string(::strerrorname_np(errno)));
  if (child == 0) {
    work();
    input.reset();
    for (;;) ::pause();
  }
  input.reset();
  char byte = 0;
  if (::read(output.get(), &byte, 1) != 0) throw std::runtime_error("the child wrote");
  return static_cast<pid_t>(child);
}

void end(pid_t child) {
  ::kill(child, SIGKILL);
  ::waitpid(child, nullptr, 0);
}

class Listener {
 public:
  Listener() : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    address_.sun_family = AF_UNIX;
    // The kernel chooses a name without a path.
    if (::bind(socket_.get(), reinterpret_cast<const sockaddr*>(&address_), sizeof(sa_family_t)) != 0 || ::listen(socket_.get(), 1) != 0) {
      throw std::runtime_error("no socket");
    }
    ::getsockname(socket_.get(), reinterpret_cast<sockaddr*>(&address_), &length_);
  }
  // Connects for as long as the calling process lives.
  void connect() const {
    const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (::connect(socket, reinterpret_cast<const sockaddr*>(&address_), length_) != 0) ::_exit(1);
  }
  [[nodiscard]] UniqueDescriptor accept() const { return UniqueDescriptor(::accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC)); }

 private:
  UniqueDescriptor socket_;
  sockaddr_un address_{};
  socklen_t length_ = sizeof(address_);
};

std::string nameOf(Standing standing) {
  switch (standing) {
    case Standing::nobody:
      return "nobody";
    case Standing::unconfined:
      return "unconfined";
    case Standing::confined:
      break;
  }
  return "confined";
}

// Run by the first process of its namespace. Who connects is nobody: it is in namespaces without a description. Who gets its number
// afterwards is not confined. The answers are for the first one alive, for its connection when it is gone, for the same as seen by process
// number, for the same where only what is read about a process goes by its number, and for the second one, by a connection of its own.
std::string connectAndLeaveTheNumber() {
  if (::mount("proc", "/proc", "proc", 0, nullptr) != 0) return "no view of the processes";
  NoBundles bundles;
  fake_platform::FakeLog log;
  KernelFacilities byNumberAlone = KernelFacilities::probe();
  byNumberAlone.peerPidfd = false;
  KernelFacilities readByNumber = KernelFacilities::probe();
  readByNumber.pidfdNamespaces = false;
  LinuxPeerDirectory directory(bundles, log.defaultLog());
  LinuxPeerDirectory careless(bundles, log.defaultLog(), byNumberAlone);
  LinuxPeerDirectory lookingTwice(bundles, log.defaultLog(), readByNumber);
  const Listener listener;
  const auto standing = [](LinuxPeerDirectory& seenBy, const UniqueDescriptor& connection) {
    return nameOf(seenBy.identify(connection.get())->standing);
  };

  const pid_t first = startAs(kNumber, [&listener] {
    if (!enterNamespaces(CLONE_NEWUSER | CLONE_NEWNS)) ::_exit(1);
    listener.connect();
  });
  const UniqueDescriptor connection = listener.accept();
  std::string result = standing(directory, connection);
  end(first);
  const pid_t second = startAs(kNumber, [&listener] { listener.connect(); });
  const UniqueDescriptor another = listener.accept();
  result += " " + standing(directory, connection) + " " + standing(careless, connection) + " " + standing(lookingTwice, connection) + " " +
            standing(directory, another);
  end(second);
  return result;
}

// What the work gives as the first process of namespaces of its own.
std::string inNamespaces(const std::function<std::string()>& work) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  const UniqueDescriptor output(ends[0]);
  UniqueDescriptor input(ends[1]);
  const pid_t outer = ::fork();
  if (outer == 0) {
    if (!enterNamespaces(CLONE_NEWUSER | CLONE_NEWPID | CLONE_NEWNS)) ::_exit(1);
    const pid_t inner = ::fork();
    if (inner == 0) {
      std::string text;
      try {
        text = work();
      } catch (const std::exception& exception) {
        text = exception.what();
      }
      ::_exit(::write(input.get(), text.data(), text.size()) < 0 ? 1 : 0);
    }
    ::waitpid(inner, nullptr, 0);
    ::_exit(0);
  }
  input.reset();
  std::array<char, 256> text{};
  const ssize_t count = ::read(output.get(), text.data(), text.size());
  ::waitpid(outer, nullptr, 0);
  return {text.data(), static_cast<std::size_t>(count < 0 ? 0 : count)};
}

TEST(IdentityReuse, AProcessThatGotTheNumberOfOneThatConnectedIsNotTakenForIt) {
  ASSERT_NE(::geteuid(), 0U) << "run this test as an unprivileged user";
  if (tests::kThreadSanitizer) GTEST_SKIP() << "the sanitizer has a thread of its own, and two threads cannot enter a user namespace";
  // A kernel that tells a peer by its number alone cannot do better than who looks at nothing else.
  const bool hasPeerPidfd = KernelFacilities::probe().peerPidfd;
  EXPECT_EQ(inNamespaces(connectAndLeaveTheNumber),
            hasPeerPidfd ? "nobody nobody unconfined nobody unconfined" : "nobody unconfined unconfined unconfined unconfined");
}

}  // namespace
}  // namespace docuvend::tests
