#include "platform/linux/identity/KernelFacilities.h"

#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

TEST(KernelFacilities, SayWhatAFullKernelGuarantees) {
  const auto levels = protectionLevels({true, true, true, true, 7});
  EXPECT_EQ(levels.peers, "Peers are known by the process that connected.");
  EXPECT_EQ(levels.namespaces, "Namespaces are read from the process itself.");
  EXPECT_EQ(levels.tokens, "Audit tokens never repeat while the machine runs.");
  EXPECT_EQ(levels.descriptors, "Descriptors that processes send are refused.");
  EXPECT_EQ(levels.confinement, "Landlock level 7: files, abstract sockets and signals are closed to confined processes.");
}

TEST(KernelFacilities, SayWhatAnOlderKernelDoesNotGuarantee) {
  const auto levels = protectionLevels({false, false, false, false, 2});
  EXPECT_EQ(levels.peers,
            "Peers are known by process number: one that ends before it is looked at can be mistaken for the next with its number.");
  EXPECT_EQ(levels.namespaces, "Namespaces are read by process number, and the process is seen alive afterwards.");
  EXPECT_EQ(levels.tokens, "Audit tokens hold start times: two processes with one number within one clock tick share one.");
  EXPECT_EQ(levels.descriptors, "Descriptors that processes send are closed here: one whose closing takes long keeps a thread busy.");
  EXPECT_EQ(levels.confinement,
            "Landlock level 2: files are closed to confined processes, truncation by the mount namespace alone; applications have no "
            "network, and an extension can reach abstract sockets.");
  EXPECT_EQ(protectionLevels({true, true, true, true, 5}).confinement,
            "Landlock level 5: files are closed to confined processes; applications have no network, and an extension can reach abstract "
            "sockets.");
  EXPECT_EQ(protectionLevels({true, true, true, true, 0}).confinement,
            "The kernel has no Landlock: no application and no extension can be started.");
}

}  // namespace
}  // namespace docuvend::linux_platform
