// Which processes are ended because they give no sign of life, and which are not, over real ones.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <future>
#include <vector>

#include "platform/linux/extension_host/ExtensionErrors.h"
#include "tests/extension_host/support/RealExtensions.h"

namespace docuvend::linux_platform {
namespace {

using std::chrono::milliseconds;

// Long enough for a process that is well, also on a busy machine; as long as these tests take.
constexpr milliseconds kLimit{2'000};
constexpr milliseconds kInterval{20};

ExtensionTimes times() {
  ExtensionTimes result;
  result.answerLimit = kLimit;
  result.livenessInterval = kInterval;
  return result;
}

class ExtensionLivenessTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!RealExtensions::mayRun()) GTEST_FAIL();
    set = real.extensions({real.makeBundle("com.orvane.bad"), real.makeBundle("com.orvane.good")});
    ASSERT_EQ(set.size(), 2U);
  }

  static void expectNotAnswering(std::future<Answer> future) {
    const auto answer = await(std::move(future));
    ASSERT_TRUE(answer && answer->error);
    EXPECT_EQ(answer->error->domain, kExtensionHostErrorDomain);
    EXPECT_EQ(answer->error->code, static_cast<std::int64_t>(ExtensionHostErrorCode::notAnswering)) << answer->error->description();
  }
  std::int64_t badLives(const std::string& identifier) const {
    const QXDictionary status = real.status(identifier);
    const auto* lives = qxFind<std::int64_t>(status, "badLivesInARow");
    return lives != nullptr ? *lives : -1;
  }

  RealExtensions real{times()};
  Reports::Set set;
};

TEST_F(ExtensionLivenessTest, AStoppedProcessIsEndedAndTheNextRequestHasAnother) {
  std::string process;
  {
    const Conversation conversation(set[0]);
    process = conversation.identifier("process");
    expectNotAnswering(conversation.start("suspend"));
  }
  EXPECT_EQ(badLives("com.orvane.bad"), 1);
  const std::string next = Conversation(set[0]).identifier("process");
  EXPECT_FALSE(next.empty());
  EXPECT_EQ(next.find_first_not_of("0123456789"), std::string::npos) << next;
  EXPECT_NE(next, process);
}

TEST_F(ExtensionLivenessTest, AProcessWhoseReadingThreadSpinsIsEndedWithAllItsOpenMessages) {
  const Conversation conversation(set[0]);
  auto waiting = conversation.start("wait");
  // Spinning may begin before or after the answer to what began it.
  const auto spun = conversation.start("spin");
  expectNotAnswering(std::move(waiting));
  EXPECT_EQ(badLives("com.orvane.bad"), 1);
}

TEST_F(ExtensionLivenessTest, AProcessThatOnlyWorksOrNeverAnswersLivesOnAndAnswersAtLast) {
  const Conversation good(set[1]);
  const std::string process = good.identifier("process");
  // More than the provider library has threads for.
  std::vector<std::future<Answer>> downloads;
  for (int i = 0; i < 40; ++i) downloads.push_back(good.start(std::to_string(i) + "/wait"));
  // The end of another shows that a sign of life was due for as long as it may take.
  expectNotAnswering(Conversation(set[0]).start("suspend"));
  EXPECT_EQ(good.identifier("process"), process);
  EXPECT_EQ(badLives("com.orvane.good"), 0);
  real.release("com.orvane.good");
  for (auto& download : downloads) {
    const auto answer = await(std::move(download));
    ASSERT_TRUE(answer);
    EXPECT_FALSE(answer->error) << answer->error->description();
  }
}

TEST_F(ExtensionLivenessTest, ARequestIsReasonEnoughToAskAlsoBeforeItsFirstMessage) {
  const std::string container = real.home() + "/containers/com.orvane.bad";
  std::filesystem::create_directories(container);
  std::ofstream(container + "/suspend") << "at once";
  const auto begun = begin(*set[0]);
  ASSERT_TRUE(begun && begun->request);
  EXPECT_TRUE(real.awaitLog("[NOTICE] The process of com.orvane.bad did not answer a ping in time."));
}

TEST_F(ExtensionLivenessTest, AProcessThatLingersIsAskedAgainWhenARequestJoinsIt) {
  ASSERT_EQ(Conversation(set[0]).identifier("suspended"), "soon");
  // While it lingers nothing is expected of it, and by the end of the other it has long been left alone.
  expectNotAnswering(Conversation(set[1]).start("suspend"));
  const auto joined = begin(*set[0]);
  ASSERT_TRUE(joined && joined->request);
  real.release("com.orvane.bad");
  EXPECT_TRUE(real.awaitLog("[NOTICE] The process of com.orvane.bad did not answer a ping in time."));
  EXPECT_EQ(set[0]->extensionContextForRequest(*joined->request), nullptr);
}

TEST(ExtensionsOfOneHost, OneThatHangsDelaysNoRequestOfAnother) {
  if (!RealExtensions::mayRun()) GTEST_FAIL();
  ExtensionTimes slow;
  slow.answerLimit = std::chrono::hours(1);
  RealExtensions real(slow);
  const auto set = real.extensions({real.makeBundle("com.orvane.bad"), real.makeBundle("com.orvane.good")});
  ASSERT_EQ(set.size(), 2U);
  const Conversation bad(set[0]);
  const auto hung = bad.start("suspend");
  const auto alsoHung = bad.identify("process");
  for (int i = 0; i < 20; ++i) EXPECT_NE(Conversation(set[1]).identifier("process"), "");
  EXPECT_NE(hung.wait_for(milliseconds(0)), std::future_status::ready);
}

}  // namespace
}  // namespace docuvend::linux_platform
