// The service "com.orvane.FileCoordination" over real files and made-up peers, and clients that say one thing after another.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/fake/FakeQueues.h"
#include "platform/fake/FakeRpc.h"
#include "platform/linux/coordination/FileCoordinationListenerDelegate.h"
#include "platform/linux/files/LinuxFileSystem.h"
#include "tests/coordination/RecordingProvider.h"
#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform::testing {

// The answers so far, absent for success.
using Answers = std::vector<std::optional<QXError>>;

inline void expectSuccess(const Answers& answers) {
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(answers[0], std::nullopt) << answers[0]->description();
}

inline void expectError(const Answers& answers, FileCoordinationErrorCode code) {
  ASSERT_EQ(answers.size(), 1U);
  ASSERT_TRUE(answers[0]);
  EXPECT_EQ(answers[0]->domain, kQXFileCoordinationErrorDomain);
  EXPECT_EQ(answers[0]->code, static_cast<std::int64_t>(code)) << answers[0]->description();
}

inline QXUUID accessID(std::uint8_t number) {
  QXUUID id;
  id.bytes[0] = number;
  return id;
}

class CoordinationClient {
 public:
  using URL = std::optional<QXURL>;
  using ID = std::optional<QXUUID>;
  using Token = std::optional<std::string>;
  using Party = std::optional<std::int64_t>;
  using SharedAnswers = std::shared_ptr<Answers>;

  CoordinationClient(const FileCoordinationServicer::Surroundings& surroundings, const QXAuditToken& peer)
      : delegate_(std::make_shared<FileCoordinationListenerDelegate>(surroundings)) {
    listener_.setDelegate(delegate_);
    listener_.resume();
    connection->setAuditToken(peer);
    listener_.connect(connection);
  }

  [[nodiscard]] SharedAnswers read(const URL& url, const ID& id, const Token& token = {}, const Party& party = {}) const {
    return said<&QXFileCoordination::coordinateReadingItemAtURL>(url, data(token), id, party);
  }
  [[nodiscard]] SharedAnswers write(const URL& url, const ID& id, const Token& token = {}, const Party& party = {}) const {
    return said<&QXFileCoordination::coordinateWritingItemAtURL>(url, data(token), id, party);
  }
  [[nodiscard]] SharedAnswers end(const ID& id) const { return said<&QXFileCoordination::endAccess>(id); }
  [[nodiscard]] SharedAnswers didFinishWriting(const URL& url) const {
    return said<&QXFileCoordination::writerDidFinishWritingForURL>(url);
  }

  struct Progress {
    Answers answers;
    std::optional<std::int64_t> present;
    std::optional<std::int64_t> size;
  };
  [[nodiscard]] Progress progress(const ID& id) const {
    Progress heard;
    remote().call<&QXFileCoordination::progressOfAccess>(
        id, [&heard](std::optional<QXError> error, std::optional<std::int64_t> present, std::optional<std::int64_t> size) {
          heard.answers.push_back(std::move(error));
          heard.present = present;
          heard.size = size;
        });
    return heard;
  }
  struct Holders {
    Answers answers;
    std::optional<QXArray> list;
  };
  [[nodiscard]] Holders holders(const URL& url, const Token& token = {}) const {
    Holders heard;
    remote().call<&QXFileCoordination::holdersOfItemAtURL>(url, data(token),
                                                           [&heard](std::optional<QXError> error, std::optional<QXArray> list) {
                                                             heard.answers.push_back(std::move(error));
                                                             heard.list = std::move(list);
                                                           });
    return heard;
  }
  [[nodiscard]] QXRemote<QXFileCoordination> remote() const { return QXRemote<QXFileCoordination>(connection->peer()); }

  const std::shared_ptr<fake_platform::FakeRpcConnection> connection = fake_platform::FakeRpcConnection::create();

 private:
  template <auto Operation, class... Arguments>
  [[nodiscard]] SharedAnswers said(const Arguments&... arguments) const {
    auto answers = std::make_shared<Answers>();
    remote().call<Operation>(arguments..., [answers](std::optional<QXError> error) { answers->push_back(std::move(error)); });
    return answers;
  }
  [[nodiscard]] static std::optional<QXData> data(const Token& token) {
    return token ? std::optional(QXData::fromText(*token)) : std::nullopt;
  }

  const std::shared_ptr<FileCoordinationListenerDelegate> delegate_;
  fake_platform::FakeRpcListener listener_;
};

class CoordinationHouse : public SandboxHouse {
 protected:
  void SetUp() override {
    SandboxHouse::SetUp();
    coordinator._addDocuvend(provider);
    write(plain.fileSystemPath(), "plain");
  }

  // A provider of the same directory in the other's place, which is asked and told when the queues are turned.
  [[nodiscard]] std::shared_ptr<RecordingProvider> slowProvider() {
    coordinator._removeDocuvend(provider);
    auto slow = std::make_shared<RecordingProvider>(QXURL::fileURL(storage, QXURLKind::directory), queues.operationQueue(), kProvider);
    coordinator._addDocuvend(slow);
    return slow;
  }

  // Another process each time.
  [[nodiscard]] QXAuditToken unconfined() { return peers.add(thisProcess(Standing::unconfined)); }
  [[nodiscard]] QXAuditToken unconfinedAs(const std::string& bundle) {
    PeerIdentity peer = thisProcess(Standing::unconfined);
    peer.bundleIdentifier = bundle;
    return peers.add(std::move(peer));
  }
  [[nodiscard]] QXAuditToken editor(const std::string& instance = "1") { return peers.add(confined("com.example.editor", instance)); }
  [[nodiscard]] CoordinationClient client(const QXAuditToken& peer) { return {surroundings, peer}; }
  [[nodiscard]] CoordinationClient anybody() { return client(unconfined()); }
  [[nodiscard]] std::string issued(const std::string& path) { return sandbox.issueReadWriteExtension(path).value_or(""); }
  [[nodiscard]] static Paths pathsWithHome(const std::string& home) {
    Paths paths;
    paths.home = home;
    return paths;
  }

  static constexpr const char* kProvider = "com.example.cellar.provider";
  const QXURL item = QXURL::fileURL(document, QXURLKind::file);                       // in the provider's directory
  const QXURL plain = QXURL::fileURL(outside + "/plain.txt", QXURLKind::file);        // in nobody's
  const QXURL otherPlain = QXURL::fileURL(outside + "/secret.txt", QXURLKind::file);  // in nobody's
  fake_platform::FakeQueues queues;
  LinuxSandbox sandbox{loadedSession(), bundles, peers};
  LinuxFileSystem fileSystem{pathsWithHome(home)};
  LinuxFileCoordinator coordinator{fileSystem, {.isInPlace = &KeyedFile::isInPlace}};
  FileAccesses accesses{coordinator};
  const FileCoordinationServicer::Surroundings surroundings{coordinator, accesses, sandbox, peers};
  const std::shared_ptr<RecordingProvider> provider =
      std::make_shared<RecordingProvider>(QXURL::fileURL(storage, QXURLKind::directory), /*queue=*/nullptr, kProvider);
};

}  // namespace docuvend::linux_platform::testing
