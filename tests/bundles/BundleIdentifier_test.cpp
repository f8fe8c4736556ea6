#include "platform/linux/bundles/BundleIdentifier.h"

#include <gtest/gtest.h>

#include <string>

namespace docuvend::linux_platform {
namespace {

TEST(BundleIdentifier, IsMadeOfLettersDigitsDashesAndSingleDots) {
  for (const std::string& text : {std::string("a"), std::string("com.orvane.cellar"), std::string("A-1.b-2"), std::string("0"),
                                  std::string("a-"), std::string(kLongestIdentifier, 'x')}) {
    EXPECT_TRUE(isBundleIdentifier(text)) << text;
  }
}

TEST(BundleIdentifier, IsNothingThatCouldBeAnotherDirectoryOrAnOption) {
  for (const std::string& text :
       {std::string(), std::string("."), std::string(".."), std::string("a..b"), std::string(".a"), std::string("a."), std::string("-a"),
        std::string("a/b"), std::string("a b"), std::string("a_b"), std::string("a\n"), std::string("a\0b", 3), std::string("\xc3\xa9"),
        std::string(kLongestIdentifier + 1, 'x')}) {
    EXPECT_FALSE(isBundleIdentifier(text)) << text;
  }
}

TEST(BundleIdentifier, HasSeveralPartsWhenItHasADot) {
  EXPECT_TRUE(hasSeveralParts("com.a"));
  EXPECT_TRUE(hasSeveralParts("com.a.b"));
  EXPECT_FALSE(hasSeveralParts("com"));
}

}  // namespace
}  // namespace docuvend::linux_platform
