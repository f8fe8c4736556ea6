// The quota of the user's keys, which is one for all of the user's processes: whoever has one of these is alone with it among the tests.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/keyctl.h>
#include <sys/file.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::tests {

class KeyQuota {
 public:
  // Goes into a session keyring of its own, with which all that is made goes at last.
  KeyQuota() : turn_(::open(DOCUVEND_BIN "/docuvend-confine", O_RDONLY | O_CLOEXEC)) {
    EXPECT_EQ(::flock(turn_.get(), LOCK_EX), 0);
    EXPECT_GE(::syscall(SYS_keyctl, KEYCTL_JOIN_SESSION_KEYRING, nullptr), 0);
  }
  // The bytes of a revoked key are given back at once.
  ~KeyQuota() {
    for (const long key : keys_) EXPECT_EQ(::syscall(SYS_keyctl, KEYCTL_REVOKE, key), 0);
    EXPECT_GE(add("docuvend-test-afterwards", 1), 0);
  }
  KeyQuota(const KeyQuota&) = delete;
  KeyQuota& operator=(const KeyQuota&) = delete;

  // The new key in the session's keyring, or a negative number.
  static long add(const std::string& name, std::size_t size) {
    const std::string payload(size, 'x');
    return ::syscall(SYS_add_key, "user", name.c_str(), payload.data(), payload.size(), KEY_SPEC_SESSION_KEYRING);
  }

  // With few keys of great size, then with smaller ones, to the last bytes: a name counts too, so they have short ones.
  void useUp() {
    constexpr std::size_t kMostKeys = 1000;
    for (std::size_t size = 1U << 14U; size > 0; size /= 2) {
      for (long key = 0; key >= 0 && keys_.size() < kMostKeys;) {
        key = add(std::to_string(keys_.size()), size);
        if (key >= 0) keys_.push_back(key);
      }
    }
    ASSERT_LT(keys_.size(), kMostKeys) << "this user's quota is not used up by a test";
    ASSERT_LT(::syscall(SYS_keyctl, KEYCTL_JOIN_SESSION_KEYRING, nullptr), 0);
    ASSERT_EQ(errno, EDQUOT);
  }

 private:
  const linux_platform::UniqueDescriptor turn_;
  std::vector<long> keys_;
};

}  // namespace docuvend::tests
