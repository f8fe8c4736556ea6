#include "platform/linux/identity/KernelFacilities.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace docuvend::linux_platform {
namespace {

using ::testing::HasSubstr;

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
  EXPECT_THAT(levels.peers, HasSubstr("can be mistaken"));
  EXPECT_THAT(levels.namespaces, HasSubstr("by process number"));
  EXPECT_THAT(levels.tokens, HasSubstr("start times"));
  EXPECT_THAT(levels.descriptors, HasSubstr("closed here"));
  EXPECT_THAT(levels.confinement, HasSubstr("truncation by the mount namespace alone"));
  EXPECT_THAT(protectionLevels({true, true, true, true, 5}).confinement, HasSubstr("an extension can reach abstract sockets"));
  EXPECT_THAT(protectionLevels({true, true, true, true, 0}).confinement, HasSubstr("no Landlock"));
}

}  // namespace
}  // namespace docuvend::linux_platform
