#include "platform/linux/launch/LaunchDescription.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace docuvend::linux_platform {
namespace {

const std::string kIncarnation = "2049.131.7.42";
const std::string kInstance = "0123456789abcdef0123456789abcdef";

TEST(LaunchDescription, IsReadAsItWasWritten) {
  for (const LaunchKind kind : {LaunchKind::application, LaunchKind::extension}) {
    const LaunchDescription description{"org.example.a", kIncarnation, kInstance, kind};
    const auto parsed = parseDescription(descriptionText(description));
    ASSERT_TRUE(parsed);
    EXPECT_EQ(*parsed, description);
  }
  EXPECT_EQ(descriptionText({"org.a", kIncarnation, kInstance, LaunchKind::extension}),
            "[Application]\nname=org.a\nincarnation=2049.131.7.42\ninstance=" + kInstance + "\nkind=extension\n");
}

TEST(LaunchDescription, IsNothingElse) {
  const std::string good = "[Application]\nname=org.a\nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n";
  ASSERT_TRUE(parseDescription(good));
  for (const std::string& text : std::vector<std::string>{
           std::string(),
           good.substr(0, good.size() - 1),
           good + "\n",
           good + "x=y\n",
           " " + good,
           std::string("\xef\xbb\xbf") + good,
           std::string("[Application]\n"),
           "name=org.a\nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\r\nname=org.a\nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=org.a\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=org.a\nincarnation=\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=org.a\nincarnation=1.a\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=org.a\nincarnation=-1\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=org.a\ninstance=" + kInstance + "\nincarnation=1.2\nkind=application\n",
           "[Application]\nincarnation=1.2\ninstance=" + kInstance + "\nname=org.a\nkind=application\n",
           "[Application]\nname=org.a\nname=org.b\nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=\nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=../a\nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=org.a \nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=" + std::string("org\0a", 5) + "\nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=" + std::string(600, 'a') + "\nincarnation=1.2\ninstance=" + kInstance + "\nkind=application\n",
           "[Application]\nname=org.a\nincarnation=1.2\ninstance=" + kInstance.substr(1) + "\nkind=application\n",
           "[Application]\nname=org.a\nincarnation=1.2\ninstance=" + kInstance + "0\nkind=application\n",
           "[Application]\nname=org.a\nincarnation=1.2\ninstance=0123456789ABCDEF0123456789ABCDEF\nkind=application\n",
           "[Application]\nname=org.a\nincarnation=1.2\ninstance=" + kInstance + "\nkind=daemon\n",
           "[Application]\nname=org.a\nincarnation=1.2\ninstance=" + kInstance + "\nkind=\n",
       }) {
    EXPECT_FALSE(parseDescription(text)) << text;
  }
}

TEST(LaunchDescription, EveryInstanceIsAnother) {
  const auto one = newInstance();
  const auto other = newInstance();
  ASSERT_TRUE(one && other);
  EXPECT_NE(*one, *other);
  EXPECT_TRUE(parseDescription(descriptionText({"org.a", kIncarnation, *one, LaunchKind::application})));
}

}  // namespace
}  // namespace docuvend::linux_platform
