// Mounts in the namespaces that this process is in already.
//
//   bind-here PATH PLACE   puts a file or a directory in another's place
//   clone-tree PATH        takes what is mounted at a path into a descriptor, with which it could be mounted elsewhere
//   new-filesystem         asks for one that could be mounted
//   make-writable PLACE    lifts a mount's ban on writing
//   unmount PLACE
#include <fcntl.h>
#include <linux/mount.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tests/attacks/attacker/Acts.h"

// The library's own header of mounts cannot be had beside the kernel's.
extern "C" int mount(const char*, const char*, const char*, unsigned long, const void*) noexcept;
extern "C" int umount2(const char*, int) noexcept;

namespace docuvend::attacker {
namespace {

using linux_platform::UniqueDescriptor;

std::string bindHere(Words& words) {
  const std::string path = words.next();
  return outcome(::mount(path.c_str(), words.next().c_str(), nullptr, MS_BIND, nullptr));
}

std::string outcomeOfOpening(long descriptor) {
  const UniqueDescriptor opened(static_cast<int>(descriptor));
  return outcome(descriptor);
}

std::string cloneTree(Words& words) {
  return outcomeOfOpening(::syscall(SYS_open_tree, AT_FDCWD, words.next().c_str(), OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC));
}

std::string newFilesystem(Words& /*words*/) { return outcomeOfOpening(::syscall(SYS_fsopen, "tmpfs", FSOPEN_CLOEXEC)); }

std::string makeWritable(Words& words) {
  mount_attr attributes{};
  attributes.attr_clr = MOUNT_ATTR_RDONLY;
  return outcome(::syscall(SYS_mount_setattr, AT_FDCWD, words.next().c_str(), 0, &attributes, sizeof(attributes)));
}

}  // namespace

Acts mountActs() {
  return {
      {"bind-here", bindHere},
      {"clone-tree", cloneTree},
      {"new-filesystem", newFilesystem},
      {"make-writable", makeWritable},
      {"unmount", [](Words& words) { return outcome(::umount2(words.next().c_str(), 0)); }},
  };
}

}  // namespace docuvend::attacker
