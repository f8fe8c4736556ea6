// What every sandbox answers, the one in memory and the real one.
#include "platform/sandbox.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "platform/fake/FakeSandbox.h"
#include "tests/sandbox/SandboxHouse.h"

namespace docuvend {
namespace {

using linux_platform::Standing;

class Fake : public linux_platform::testing::SandboxHouse {
 protected:
  QXSandbox& sandbox() { return sandbox_; }
  QXAuditToken writer() {
    sandbox_.setAnswer(document, fake_platform::FakeSandbox::kAllowed);
    return peers.add(thisProcess(Standing::unconfined));
  }
  std::string refusedPath() {
    sandbox_.refuseIssuing(storage);
    return storage;
  }

 private:
  fake_platform::FakeSandbox sandbox_;
};

class Linux : public linux_platform::testing::SandboxHouse {
 protected:
  QXSandbox& sandbox() { return sandbox_; }
  QXAuditToken writer() { return peers.add(thisProcess(Standing::unconfined)); }
  std::string refusedPath() { return storage; }

 private:
  linux_platform::LinuxSandbox sandbox_{loadedSession(), bundles, peers};
};

template <class Platform>
class QXSandboxTest : public Platform {};

using Platforms = ::testing::Types<Fake, Linux>;
TYPED_TEST_SUITE(QXSandboxTest, Platforms);

TYPED_TEST(QXSandboxTest, IssuesPrintableTextForAFileAndForOneThatIsNotThereYet) {
  for (const std::string& path : {this->document, this->sibling}) {
    const auto token = this->sandbox().issueReadWriteExtension(path);
    ASSERT_TRUE(token) << path;
    EXPECT_FALSE(token->empty());
    EXPECT_TRUE(std::all_of(token->begin(), token->end(), [](char c) { return c >= ' ' && c < '\x7f'; })) << *token;
  }
}

TYPED_TEST(QXSandboxTest, IssuesNothingWhereItRefuses) {
  EXPECT_EQ(this->sandbox().issueReadWriteExtension(this->refusedPath()), std::nullopt);
}

TYPED_TEST(QXSandboxTest, TakesBackWhatItIssuedAndGoesOnIssuing) {
  for (const auto& directory : {std::optional(this->storage), std::optional<std::string>()}) {
    EXPECT_EQ(this->sandbox().invalidateReadWriteExtensions(directory), std::nullopt);
    EXPECT_TRUE(this->sandbox().issueReadWriteExtension(this->document));
  }
}

TEST(FakeSandbox, RemembersWhatWasTakenBackAndAnswersAsItWasTold) {
  fake_platform::FakeSandbox sandbox;
  const QXError error = QXError::system(28, "no room");
  EXPECT_EQ(sandbox.invalidateReadWriteExtensions("/a"), std::nullopt);
  sandbox.setInvalidationError(error);
  EXPECT_EQ(sandbox.invalidateReadWriteExtensions(std::nullopt), error);
  sandbox.setInvalidationError(std::nullopt);
  EXPECT_EQ(sandbox.invalidateReadWriteExtensions("/b"), std::nullopt);
  EXPECT_EQ(sandbox.invalidations(), (std::vector<std::optional<std::string>>{"/a", std::nullopt, "/b"}));
}

TYPED_TEST(QXSandboxTest, AllowsTheWriterToReadAndWriteAndNothingElse) {
  const QXAuditToken writer = this->writer();
  EXPECT_EQ(this->sandbox().checkWithoutReport(writer, kQXSandboxFileWriteData, this->document), 0);
  EXPECT_EQ(this->sandbox().checkWithoutReport(writer, kQXSandboxFileReadData, this->document), 0);
  EXPECT_NE(this->sandbox().checkWithoutReport(writer, "file-read-metadata", this->document), 0);
  EXPECT_NE(this->sandbox().checkWithoutReport(writer, kQXSandboxFileWriteData, "/etc/passwd"), 0);
}

TYPED_TEST(QXSandboxTest, RefusesTheZeroToken) {
  static_cast<void>(this->writer());
  EXPECT_NE(this->sandbox().checkWithoutReport(QXAuditToken{}, kQXSandboxFileWriteData, this->document), 0);
}

}  // namespace
}  // namespace docuvend
