#include "tests/launch/probe/SystemCalls.h"

#include <asm/ioctls.h>
#include <fcntl.h>
#include <linux/btrfs.h>
#include <linux/fs.h>
#include <linux/fscrypt.h>
#include <linux/fsverity.h>
#include <linux/io_uring.h>
#include <linux/keyctl.h>
#include <linux/vm_sockets.h>
#include <netinet/in.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/fanotify.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <map>

#include "platform/linux/base/kernel.h"

namespace docuvend::probe {
namespace {

// What the kernel does not look at where it takes an int.
constexpr long kHighHalf = 0x5EC5L << 32U;
constexpr int kX32Bit = 0x40000000;
// Of a socket: the kernel says so before it looks whether it has the family.
constexpr int kNoType = 0xF;
constexpr int kOtherMachine = 200;  // how a child ends

std::string outcome(long result) { return result >= 0 ? "ok" : ::strerrorname_np(errno); }

// For one call, and not closed after it: there are few.
int ownFile() {
  char name[] = "file-XXXXXX";
  return ::mkostemp(name, O_CLOEXEC);
}
int tcpSocket() { return ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0); }

long lease(long command, long kind) { return ::syscall(SYS_fcntl, ownFile(), command, kind); }

// A lease for reading is given to who has the file open for reading alone.
long leaseForReading(long command, long kind) {
  char name[] = "file-XXXXXX";
  ::close(::mkostemp(name, O_CLOEXEC));
  return ::syscall(SYS_fcntl, ::open(name, O_RDONLY | O_CLOEXEC), command, kind);
}

// Of no file, which says that it is none, whether or not the kernel has the command.
long delegation(long command) { return ::syscall(SYS_fcntl, -1, command, nullptr); }

long lockFile(int command) {
  struct flock whole {};
  whole.l_type = F_WRLCK;
  return ::fcntl(ownFile(), command, &whole);
}

long setLinger(long level, long option) {
  const linger long_{1, 600};
  return ::syscall(SYS_setsockopt, tcpSocket(), level, option, &long_, sizeof(long_));
}

long getLinger() {
  linger found{};
  socklen_t size = sizeof(found);
  return ::getsockopt(tcpSocket(), SOL_SOCKET, SO_LINGER, &found, &size);
}

long setOne(int level, int option) {
  const int one = 1;
  return ::setsockopt(tcpSocket(), level, option, &one, sizeof(one));
}

long openSocket(long family, int type) { return ::syscall(SYS_socket, family, type | SOCK_CLOEXEC, 0); }

// Of a socket, which answers that it is no terminal, whatever a terminal would.
long askSocket(unsigned long request) {
  char letter = 'x';
  return ::syscall(SYS_ioctl, ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0), request, &letter);
}

long askTerminal() {
  termios state{};
  return ::ioctl(STDIN_FILENO, TCGETS, &state);
}

long setUpRing() {
  io_uring_params parameters{};
  return ::syscall(SYS_io_uring_setup, 1, &parameters);
}

// In a child, which the call may end.
std::string inChild(const std::function<int()>& work) {
  const pid_t child = ::fork();
  if (child == 0) ::_exit(work());
  int status = 0;
  if (::waitpid(child, &status, 0) != child) return outcome(-1);
  if (WIFSIGNALED(status)) return std::string("SIG") + ::sigabbrev_np(WTERMSIG(status));
  return WEXITSTATUS(status) == kOtherMachine ? "another machine" : "ok";
}

int callAsI386() {
#if defined(__x86_64__)
  long number = 20;  // getpid
  __asm__ volatile("int $0x80" : "+a"(number) : : "memory");
  return 0;
#else
  return kOtherMachine;
#endif
}

int callAsX32() {
#if defined(__x86_64__)
  static_cast<void>(::syscall(kX32Bit + SYS_getpid));
  return 0;
#else
  return kOtherMachine;
#endif
}

using Calls = std::map<std::string, std::function<long()>>;

const Calls& calls() {
  static const Calls all = {
      {"add_key", [] { return ::syscall(SYS_add_key, "user", "docuvend-probe", "x", 1, KEY_SPEC_PROCESS_KEYRING); }},
      {"request_key", [] { return ::syscall(SYS_request_key, "user", "docuvend-probe", nullptr, KEY_SPEC_PROCESS_KEYRING); }},
      {"keyctl", [] { return ::syscall(SYS_keyctl, KEYCTL_GET_KEYRING_ID, KEY_SPEC_PROCESS_KEYRING, 1); }},
      {"io_uring_setup", setUpRing},
      {"io_uring_enter", [] { return ::syscall(SYS_io_uring_enter, -1, 0, 0, 0, nullptr, 0); }},
      {"io_uring_register", [] { return ::syscall(SYS_io_uring_register, -1, 0, nullptr, 0); }},
      {"lease", [] { return lease(F_SETLEASE, F_WRLCK); }},
      {"lease-with-a-high-half", [] { return lease(kHighHalf | F_SETLEASE, F_WRLCK); }},
      {"lease-for-reading", [] { return leaseForReading(F_SETLEASE, F_RDLCK); }},
      {"lease-for-reading-with-high-halves", [] { return leaseForReading(kHighHalf | F_SETLEASE, kHighHalf | F_RDLCK); }},
      {"lease-given-back", [] { return lease(F_SETLEASE, F_UNLCK); }},
      {"lease-asked-for", [] { return lease(F_GETLEASE, 0); }},
      {"delegation", [] { return delegation(linux_platform::kernel::kSetDelegation); }},
      {"delegation-with-a-high-half", [] { return delegation(kHighHalf | linux_platform::kernel::kSetDelegation); }},
      {"lock", [] { return lockFile(F_SETLK); }},
      {"lock-of-description", [] { return lockFile(F_OFD_SETLK); }},
      {"linger", [] { return setLinger(SOL_SOCKET, SO_LINGER); }},
      {"linger-with-high-halves", [] { return setLinger(kHighHalf | SOL_SOCKET, kHighHalf | SO_LINGER); }},
      {"linger-asked-for", getLinger},
      {"same-level-as-linger", [] { return setOne(SOL_SOCKET, SO_KEEPALIVE); }},
      {"same-number-as-linger", [] { return setOne(IPPROTO_IP, SO_LINGER); }},
      {"vsock", [] { return openSocket(AF_VSOCK, SOCK_STREAM); }},
      {"vsock-with-a-high-half", [] { return openSocket(kHighHalf | AF_VSOCK, SOCK_STREAM); }},
      {"cipher", [] { return openSocket(AF_ALG, kNoType); }},
      {"cipher-with-a-high-half", [] { return openSocket(kHighHalf | AF_ALG, kNoType); }},
      {"unix", [] { return openSocket(AF_UNIX, SOCK_STREAM); }},
      {"inet", [] { return openSocket(AF_INET, SOCK_STREAM); }},
      {"inet6", [] { return openSocket(AF_INET6, SOCK_DGRAM); }},
      {"type", [] { return askSocket(TIOCSTI); }},
      {"type-with-a-high-half", [] { return askSocket(static_cast<unsigned long>(kHighHalf) | TIOCSTI); }},
      {"paste", [] { return askSocket(TIOCLINUX); }},
      {"paste-with-a-high-half", [] { return askSocket(static_cast<unsigned long>(kHighHalf) | TIOCLINUX); }},
      {"terminal-state", askTerminal},
      {"add-encryption-key", [] { return askSocket(FS_IOC_ADD_ENCRYPTION_KEY); }},
      {"remove-encryption-key", [] { return askSocket(FS_IOC_REMOVE_ENCRYPTION_KEY); }},
      {"remove-encryption-key-of-all", [] { return askSocket(FS_IOC_REMOVE_ENCRYPTION_KEY_ALL_USERS); }},
      {"enable-verity", [] { return askSocket(FS_IOC_ENABLE_VERITY); }},
      {"make-snapshot", [] { return askSocket(BTRFS_IOC_SNAP_CREATE); }},
      {"make-snapshot-2", [] { return askSocket(BTRFS_IOC_SNAP_CREATE_V2); }},
      {"read-version", [] { return askSocket(FS_IOC_GETVERSION); }},
      {"fanotify_init", [] { return ::syscall(SYS_fanotify_init, FAN_CLASS_NOTIF | FAN_REPORT_FID, O_RDONLY); }},
      {"no-call", [] { return ::syscall(-1L); }},
      {"unknown-call", [] { return ::syscall(0x3FFFFFFFL); }},
  };
  return all;
}

}  // namespace

std::string call(const std::string& name) {
  if (name == "i386") return inChild(callAsI386);
  if (name == "x32") return inChild(callAsX32);
  const auto found = calls().find(name);
  return found == calls().end() ? "unknown" : outcome(found->second());
}

}  // namespace docuvend::probe
