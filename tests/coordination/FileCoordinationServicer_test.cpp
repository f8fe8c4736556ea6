#include "platform/linux/coordination/FileCoordinationServicer.h"

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/fake/FakeRpc.h"
#include "platform/fake/FakeSandbox.h"
#include "platform/linux/coordination/FileCoordinationListenerDelegate.h"
#include "platform/linux/files/LinuxFileSystem.h"
#include "tests/coordination/RecordingProvider.h"
#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {
namespace {

using testing::RecordingProvider;

// A client of the service: what it says, and what it hears.
class Client {
 public:
  Client(LinuxFileCoordinator& coordinator, QXSandbox& sandbox)
      : delegate_(std::make_shared<FileCoordinationListenerDelegate>(coordinator, sandbox)) {
    listener_.setDelegate(delegate_);
    listener_.resume();
    connection->setProcessIdentifier(4711);
  }

  // The answers so far, absent for success.
  std::vector<std::optional<QXError>> say(const std::optional<QXURL>& url) {
    if (!connection->isResumed()) listener_.connect(connection);
    std::vector<std::optional<QXError>> answers;
    QXRemote<QXFileCoordination>(connection->peer())
        .call<&QXFileCoordination::writerDidFinishWritingForURL>(
            url, [&answers](std::optional<QXError> error) { answers.push_back(std::move(error)); });
    return answers;
  }

  const std::shared_ptr<fake_platform::FakeRpcConnection> connection = fake_platform::FakeRpcConnection::create();

 private:
  const std::shared_ptr<FileCoordinationListenerDelegate> delegate_;
  fake_platform::FakeRpcListener listener_;
};

void expectError(const std::vector<std::optional<QXError>>& answers, FileCoordinationErrorCode code) {
  ASSERT_EQ(answers.size(), 1U);
  ASSERT_TRUE(answers[0]);
  EXPECT_EQ(answers[0]->domain, kQXFileCoordinationErrorDomain);
  EXPECT_EQ(answers[0]->code, static_cast<std::int64_t>(code));
}

struct FileCoordinationServicerTest : ::testing::Test {
  void SetUp() override {
    fileSystem.addDirectory("/a/storage");
    coordinator._addDocuvend(provider);
    caller.bytes[0] = 7;
    client.connection->setAuditToken(caller);
  }

  const QXURL directory = QXURL::fileURL("/a/storage", QXURLKind::directory);
  const QXURL file = directory.appendingPathComponent("x y.txt", QXURLKind::file);
  fake_platform::FakeFileSystem fileSystem;
  fake_platform::FakeSandbox sandbox;
  LinuxFileCoordinator coordinator{fileSystem};
  const std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>(directory);
  QXAuditToken caller;
  Client client{coordinator, sandbox};
};

TEST_F(FileCoordinationServicerTest, TellsTheProviderAndAnswersWithoutError) {
  sandbox.setAnswer("/a/storage/x y.txt", fake_platform::FakeSandbox::kAllowed);
  const auto answers = client.say(file);
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0], std::nullopt);
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told[0].first, "writer 4711-1");
  EXPECT_EQ(provider->told[0].second, file);
  const std::vector<fake_platform::FakeSandbox::Check> expected = {{caller, "file-write-data", "/a/storage/x y.txt"}};
  EXPECT_EQ(sandbox.checks(), expected);
}

TEST_F(FileCoordinationServicerTest, RefusesACallerWhoMayNotWriteTheFile) {
  for (const QXURL& url : {file, QXURL::fileURL("/elsewhere/x.txt", QXURLKind::file)}) {
    expectError(client.say(url), FileCoordinationErrorCode::notPermitted);
  }
  EXPECT_TRUE(provider->told.empty());
  EXPECT_TRUE(fileSystem.calls().empty()) << "nobody asks about a file that the caller may not write";
}

TEST_F(FileCoordinationServicerTest, RefusesAFileOfNoProvider) {
  sandbox.setAnswer(fake_platform::FakeSandbox::kAllowed);
  expectError(client.say(QXURL::fileURL("/elsewhere/x.txt", QXURLKind::file)), FileCoordinationErrorCode::noProvider);
  coordinator._removeDocuvend(provider);
  expectError(client.say(file), FileCoordinationErrorCode::noProvider);
  EXPECT_TRUE(provider->told.empty());
}

TEST_F(FileCoordinationServicerTest, LeavesTheDirectoryItselfToTheProvider) {
  sandbox.setAnswer(fake_platform::FakeSandbox::kAllowed);
  const auto answers = client.say(directory);
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0], std::nullopt);
  EXPECT_EQ(provider->told.size(), 1U);
}

TEST_F(FileCoordinationServicerTest, RefusesAMissingURL) {
  sandbox.setAnswer(fake_platform::FakeSandbox::kAllowed);
  expectError(client.say(std::nullopt), FileCoordinationErrorCode::missingURL);
}

TEST_F(FileCoordinationServicerTest, IsNobodyOnceItsConnectionIsGone) {
  sandbox.setAnswer(fake_platform::FakeSandbox::kAllowed);
  FileCoordinationServicer servicer(coordinator, sandbox, /*connection=*/{});
  std::optional<QXError> heard;
  servicer.writerDidFinishWritingForURL(file, [&heard](std::optional<QXError> error) { heard = std::move(error); });
  ASSERT_TRUE(heard);
  EXPECT_EQ(heard->code, static_cast<std::int64_t>(FileCoordinationErrorCode::notPermitted));
  servicer.writerDidFinishWritingForURL(file, /*completionHandler=*/{});
  EXPECT_TRUE(provider->told.empty());
}

// The way of a confined editor's save, on the real file system.
class SavedDocument : public testing::SandboxHouse {
 protected:
  static Paths pathsWithHome(const std::string& home) {
    Paths paths;
    paths.home = home;
    return paths;
  }
  std::string issued(const std::string& path) { return sandbox.issueReadWriteExtension(path).value_or(""); }

  LinuxSandbox sandbox{loadedSession(), bundles, peers};
  LinuxFileSystem fileSystem{pathsWithHome(home)};
  LinuxFileCoordinator coordinator{fileSystem};
};

TEST_F(SavedDocument, IsAnnouncedByTheOneWhoReplacedItAndByNoOther) {
  const auto provider = std::make_shared<RecordingProvider>(QXURL::fileURL(storage, QXURLKind::directory));
  coordinator._addDocuvend(provider);
  const QXAuditToken editor = peers.add(confined("com.example.editor", "1"));
  Client saver(coordinator, sandbox);
  saver.connection->setAuditToken(editor);
  Client stranger(coordinator, sandbox);
  stranger.connection->setAuditToken(peers.add(confined("com.example.editor", "2")));
  const QXURL url = QXURL::fileURL(document, QXURLKind::file);

  expectError(saver.say(url), FileCoordinationErrorCode::notPermitted);
  ASSERT_TRUE(std::holds_alternative<UniqueDescriptor>(sandbox.redeem(editor, issued(sibling), TokenUse::writing)));
  ASSERT_EQ(sandbox.replaceItem(editor, issued(document), issued(sibling)), std::nullopt);
  expectError(stranger.say(url), FileCoordinationErrorCode::notPermitted);
  const auto answers = saver.say(url);
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0], std::nullopt);
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told[0].second, url);
}

}  // namespace
}  // namespace docuvend::linux_platform
