#include "tools/docuvendctl/ProcessPrivileges.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <limits>

namespace docuvend::ctl {
namespace {

// The lines that matter among others.
std::string page(const std::string& user, const std::string& noNewPrivileges, const std::string& effective) {
  const std::string none(16, '0');
  return "Name:\tdocuvendd\nUid:\t" + user + "\t" + user + "\t" + user + "\t" + user + "\nCapInh:\t" + none + "\nCapPrm:\t" + none +
         "\nCapEff:\t" + effective + "\nCapBnd:\t000001ffffffffff\nCapAmb:\t" + none + "\nNoNewPrivs:\t" + noNewPrivileges +
         "\nSeccomp:\t0\n";
}

TEST(ProcessPrivileges, AreThoseOfTheKernelsPage) {
  const auto plain = parsePrivileges(page("1000", "1", "0000000000000000"));
  ASSERT_TRUE(plain);
  EXPECT_TRUE(plain->hasNoNewPrivileges);
  EXPECT_FALSE(plain->hasCapabilities);
  EXPECT_FALSE(plain->isRoot);
  const auto strong = parsePrivileges(page("0", "0", "0000000000000400"));
  ASSERT_TRUE(strong);
  EXPECT_FALSE(strong->hasNoNewPrivileges);
  EXPECT_TRUE(strong->hasCapabilities);
  EXPECT_TRUE(strong->isRoot);
}

TEST(ProcessPrivileges, AreNotGuessedWhereALineIsMissingOrMalformed) {
  const std::string whole = page("1000", "1", "0000000000000000");
  for (const char* name : {"Uid:", "CapInh:", "CapPrm:", "CapEff:", "CapAmb:", "NoNewPrivs:"}) {
    std::string without = whole;
    without.replace(without.find(name), 1, "X");
    EXPECT_FALSE(parsePrivileges(without)) << name;
  }
  EXPECT_FALSE(parsePrivileges(page("", "1", "0")));
  EXPECT_FALSE(parsePrivileges(page("1000", "yes", "0")));
  EXPECT_FALSE(parsePrivileges(page("1000", "1", "g")));
  EXPECT_FALSE(parsePrivileges(""));
}

TEST(ProcessPrivileges, OfAProcessAreRead) {
  const auto own = privilegesOf(::getpid());
  ASSERT_TRUE(own);
  EXPECT_EQ(own->isRoot, ::getuid() == 0);
  EXPECT_TRUE(own->isInThisUserNamespace);
  EXPECT_FALSE(privilegesOf(std::numeric_limits<std::int32_t>::max()));
}

}  // namespace
}  // namespace docuvend::ctl
