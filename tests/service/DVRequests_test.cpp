#include "service/DVRequests.h"

#include "tests/service/ServicerFixture.h"

namespace docuvend {
namespace {

class DVRequestsTest : public ServicerFixture {};

TEST_F(DVRequestsTest, AFailureIsTheErrorAndNoValueWhateverTheReply) {
  dvReplyWithError(errorReply(), kExtensionError);
  dvReplyWithError(sandboxReply(), kExtensionError);
  dvReplyWithError(providersReply(), kExtensionError);
  dvReplyWithError(stringReply(), kExtensionError);
  dvReplyWithError(documentReply(), kExtensionError);
  ASSERT_EQ(answers_.size(), 5U);
  for (const Answer& answer : answers_) {
    EXPECT_EQ(answer.error, kExtensionError);
    EXPECT_TRUE(answer.hasNoValue());
  }
}

TEST_F(DVRequestsTest, AReplyThatIsNotThereIsNotCalled) {
  dvReplyWithError(DVDaemon::ErrorReply{}, kExtensionError);
  dvReplyWithError(DVDaemon::SandboxReply{}, kExtensionError);
  dvReplyWithError(DVDaemon::ProvidersReply{}, kExtensionError);
  dvReplyWithError(DVDaemon::StringReply{}, kExtensionError);
  dvReplyWithError(DVDaemon::DocumentReply{}, kExtensionError);
  EXPECT_TRUE(answers_.empty());
}

TEST_F(DVRequestsTest, ASubmittedFailureIsATaskOfTheGlobalQueue) {
  dvSubmitError(stringReply(), kExtensionError);
  EXPECT_EQ(earlyAnswer().error, kExtensionError);
}

}  // namespace
}  // namespace docuvend
