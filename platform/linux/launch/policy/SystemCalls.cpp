// What is refused, and why:
//
//   keys                 are found by the user, not by a path: /proc/keys names those of all sessions of the user, and the quota is one for
//                        all of them, so that one process could keep every other from making a key.
//   io_uring             makes calls without making them: what it does passes no filter. Libraries fall back to ordinary calls.
//   leases, delegations  of a file hold up everybody else who opens it, and who may only read it may take one: a bundle of itself, a
//                        consumer of its documents. EINVAL is what file systems without leases say. A provider's documents are its own,
//                        and a lease for writing tells it that nobody has one open: that one it may have. One for reading is given beside
//                        any number of readers, holds up who writes, and tells nothing of use. A delegation holds up renaming and
//                        changes of mode as well, which are the daemon's own acts.
//   SO_LINGER            makes the close of a TCP socket wait, in whatever process that happens: the socket can be sent away.
//   AF_ALG               takes a key of the user's keyrings by its number, without a call about keys.
//   AF_VSOCK             is another way out than the network: it leads to the host of a virtual machine, or to its guests.
//   ioctls of files      Landlock knows those of devices alone. A key of an encrypted directory opens and closes it for all of the user's
//                        processes, and counts as one of his keys; verity makes a file unwritable for ever, for whoever may read it; and
//                        a snapshot is of what lies beside what a confinement shows.
//   fanotify             groups are counted for all processes of the user together.
//   TIOCSTI, TIOCLINUX   type into the terminal that a launcher left open.
//
// A call of another architecture, or of the x32 kind, has other numbers: it ends the process, for nothing that is installed makes any. The
// number -1 is no call; tracers put it there, and programs that look whether calls are filtered.
//
// The kernel takes commands, levels, options, families and requests from the low half of their registers and does not look at the high one,
// so neither does the filter. No refusal depends on memory, which could change between this look and the kernel's.
#include "platform/linux/launch/policy/SystemCalls.h"

#include <asm/ioctls.h>
#include <fcntl.h>
#include <linux/audit.h>
#include <linux/btrfs.h>
#include <linux/filter.h>
#include <linux/fscrypt.h>
#include <linux/fsverity.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>

#include <array>
#include <bit>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "platform/linux/base/kernel.h"

namespace docuvend::linux_platform {
namespace {

#if defined(__x86_64__)
constexpr std::uint32_t kArchitecture = AUDIT_ARCH_X86_64;
#elif defined(__aarch64__)
constexpr std::uint32_t kArchitecture = AUDIT_ARCH_AARCH64;
#elif defined(__riscv) && __riscv_xlen == 64
constexpr std::uint32_t kArchitecture = AUDIT_ARCH_RISCV64;
#else
#error "The numbers of this architecture's system calls are not known to be those that the filter compares."
#endif
constexpr std::uint32_t kFirstOtherNumber = 0x40000000U;  // x32's begin here, and no architecture's own come so far
constexpr std::uint32_t kNoCall = 0xFFFFFFFFU;

struct Argument {
  unsigned index;
  std::uint32_t value;
};

struct Refusal {
  std::uint32_t call;
  std::uint32_t error;
  std::vector<Argument> when;  // all of them; always, when there is none
};

constexpr std::array<std::uint32_t, 8> kRefusedRequests = {
    TIOCSTI,
    TIOCLINUX,
    FS_IOC_ADD_ENCRYPTION_KEY,
    FS_IOC_REMOVE_ENCRYPTION_KEY,
    FS_IOC_REMOVE_ENCRYPTION_KEY_ALL_USERS,
    FS_IOC_ENABLE_VERITY,
    BTRFS_IOC_SNAP_CREATE,
    BTRFS_IOC_SNAP_CREATE_V2,
};

std::vector<Refusal> refusals(Leases leases) {
  std::vector<Refusal> all = {
      {SYS_add_key, ENOSYS, {}},
      {SYS_request_key, ENOSYS, {}},
      {SYS_keyctl, ENOSYS, {}},
      {SYS_io_uring_setup, ENOSYS, {}},
      {SYS_io_uring_enter, ENOSYS, {}},
      {SYS_io_uring_register, ENOSYS, {}},
      {SYS_fanotify_init, ENOSYS, {}},
      {SYS_setsockopt, ENOPROTOOPT, {{1, SOL_SOCKET}, {2, SO_LINGER}}},
      {SYS_socket, EAFNOSUPPORT, {{0, AF_ALG}}},
      {SYS_socket, EAFNOSUPPORT, {{0, AF_VSOCK}}},
      {SYS_fcntl, EINVAL, {{1, F_SETLEASE}, {2, F_RDLCK}}},
      {SYS_fcntl, EINVAL, {{1, kernel::kSetDelegation}}},
  };
  for (const std::uint32_t request : kRefusedRequests) all.push_back({SYS_ioctl, EPERM, {{1, request}}});
  if (leases == Leases::refused) all.push_back({SYS_fcntl, EINVAL, {{1, F_SETLEASE}}});
  return all;
}

using Program = std::vector<sock_filter>;

void load(Program& program, std::size_t offset) {
  program.push_back(BPF_STMT(BPF_LD | BPF_W | BPF_ABS, static_cast<std::uint32_t>(offset)));
}

// Goes on when the loaded word is the value, else passes over that many instructions.
void unlessEqualSkip(Program& program, std::uint32_t value, std::size_t instructions) {
  program.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, value, 0, static_cast<std::uint8_t>(instructions)));
}

void answer(Program& program, std::uint32_t action) { program.push_back(BPF_STMT(BPF_RET | BPF_K, action)); }

void endOthers(Program& program) {
  load(program, offsetof(seccomp_data, arch));
  program.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, kArchitecture, 1, 0));
  answer(program, SECCOMP_RET_KILL_PROCESS);
  load(program, offsetof(seccomp_data, nr));
  program.push_back(BPF_JUMP(BPF_JMP | BPF_JGE | BPF_K, kFirstOtherNumber, 0, 2));
  program.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, kNoCall, 1, 0));
  answer(program, SECCOMP_RET_KILL_PROCESS);
}

void refuse(Program& program, const Refusal& refusal) {
  constexpr std::size_t kLowHalf = std::endian::native == std::endian::little ? 0 : sizeof(std::uint32_t);
  constexpr std::size_t kPerArgument = 2;
  std::size_t left = kPerArgument * refusal.when.size() + 1;
  load(program, offsetof(seccomp_data, nr));
  unlessEqualSkip(program, refusal.call, left);
  for (const auto& [index, value] : refusal.when) {
    left -= kPerArgument;
    load(program, offsetof(seccomp_data, args) + index * sizeof(std::uint64_t) + kLowHalf);
    unlessEqualSkip(program, value, left);
  }
  answer(program, SECCOMP_RET_ERRNO | refusal.error);
}

}  // namespace

std::optional<QXError> refuseSystemCalls(Leases leases) {
  Program program;
  endOthers(program);
  for (const auto& refusal : refusals(leases)) refuse(program, refusal);
  answer(program, SECCOMP_RET_ALLOW);

  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return QXError::system(errno, "cannot give up gaining privileges");
  const sock_fprog filter{static_cast<unsigned short>(program.size()), program.data()};
  if (::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &filter, 0, 0) != 0) return QXError::system(errno, "cannot filter system calls");
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
