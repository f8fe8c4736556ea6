// Turns over real connections: processes that are killed, clients that leave, hundreds at once.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/pidfd.h"
#include "platform/linux/coordination/FileCoordinationListenerDelegate.h"
#include "platform/linux/files/LinuxFileSystem.h"
#include "platform/linux/rpc/LinuxRpcService.h"
#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Reactor.h"
#include "tests/sandbox/SandboxHouse.h"
#include "tests/support/Eventually.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {
namespace {

using tests::Mailbox;
using Error = std::optional<QXError>;

[[nodiscard]] bool isSuccess(const std::optional<Error>& heard) { return heard && !*heard; }

// Takes everybody for an unconfined process of this user, each connection for another one.
class EverybodyIsAnother final : public PeerDirectory {
 public:
  std::shared_ptr<const PeerIdentity> identify(int socket) override {
    ucred credentials{};
    socklen_t size = sizeof(credentials);
    ::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size);
    auto peer = std::make_shared<PeerIdentity>();
    peer->pid = credentials.pid;
    peer->uid = credentials.uid;
    peer->standing = Standing::unconfined;
    peer->pidfd = openPidfd(credentials.pid);
    const std::lock_guard lock(mutex_);
    ++count_;
    peer->token.bytes[0] = static_cast<std::uint8_t>(count_);
    peer->token.bytes[1] = static_cast<std::uint8_t>(count_ >> 8U);
    peers_[peer->token] = peer;
    return peer;
  }
  std::shared_ptr<const PeerIdentity> declare(const PeerIdentity&, const std::string&) override { return nullptr; }
  bool isCurrent(const PeerIdentity&) override { return true; }
  std::shared_ptr<const PeerIdentity> find(const QXAuditToken& token) override {
    const std::lock_guard lock(mutex_);
    const auto found = peers_.find(token);
    return found == peers_.end() ? nullptr : found->second.lock();
  }

 private:
  std::mutex mutex_;
  unsigned count_ = 0;
  std::map<QXAuditToken, std::weak_ptr<const PeerIdentity>> peers_;
};

// Hears, and never brings anything.
class HangingProvider final : public QXDocuvend {
 public:
  explicit HangingProvider(QXURL directory) : directory_(std::move(directory)) {}
  std::optional<QXURL> _providedItemsURL() const override { return directory_; }
  std::shared_ptr<QXOperationQueue> _providedItemsOperationQueue() const override { return nullptr; }
  std::optional<std::string> _fileReactorID() const override { return "com.example.hanging"; }
  void _provideItemAtURL(const QXURL& /*url*/, const std::optional<QXCoordinationID>& toReaderWithID, ProvideCompletion) override {
    asked.put(toReaderWithID ? toReaderWithID->value : "");
  }
  void _provideItemAtURL(const QXURL& /*url*/, ProvideCompletion /*completionHandler*/) override {}
  void _writerWithID(const QXCoordinationID& writer, const QXURL& /*didFinishWritingForURL*/) override { told.put(writer.value); }

  Mailbox<std::string> asked;
  Mailbox<std::string> told;

 private:
  const QXURL directory_;
};

constexpr auto kRead = &QXFileCoordination::coordinateReadingItemAtURL;
constexpr auto kWrite = &QXFileCoordination::coordinateWritingItemAtURL;

class SocketClient {
 public:
  SocketClient(Reactor& reactor, const std::string& socketPath) {
    auto socket = connectToSocket(socketPath);
    if (!std::holds_alternative<UniqueDescriptor>(socket)) return;
    endpoint_ = Endpoint::create(reactor, std::get<UniqueDescriptor>(std::move(socket)), Hello{}, {});
    endpoint_->resume();
  }

  template <auto Operation>
  void coordinate(const QXURL& url, QXFileCoordination::ErrorReply reply) const {
    remote().call<Operation>(url, std::nullopt, QXUUID{}, std::nullopt, std::move(reply));
  }
  void end(QXFileCoordination::ErrorReply reply) const { remote().call<&QXFileCoordination::endAccess>(QXUUID{}, std::move(reply)); }
  void leave() { endpoint_.reset(); }
  [[nodiscard]] bool isConnected() const { return endpoint_ != nullptr; }

 private:
  [[nodiscard]] QXRemote<QXFileCoordination> remote() const {
    return QXRemote<QXFileCoordination>(endpoint_->remoteObjectProxy(QXErrorHandler{}));
  }
  std::shared_ptr<Endpoint> endpoint_;
};

// A process of its own that begins a write when it is let, says so, and then does nothing until it is killed.
class DoomedWriter {
 public:
  // Before this process has threads.
  DoomedWriter(std::string socketPath, const QXURL& file) {
    std::array<int, 2> go{};
    std::array<int, 2> begun{};
    if (::pipe2(go.data(), O_CLOEXEC) != 0 || ::pipe2(begun.data(), O_CLOEXEC) != 0) std::abort();
    pid_ = ::fork();
    if (pid_ == 0) {
      ::close(go[1]);
      ::close(begun[0]);
      run(socketPath, file, go[0], begun[1]);
    }
    ::close(go[0]);
    ::close(begun[1]);
    go_.reset(go[1]);
    begun_.reset(begun[0]);
  }
  DoomedWriter(const DoomedWriter&) = delete;
  DoomedWriter& operator=(const DoomedWriter&) = delete;
  ~DoomedWriter() { kill(); }

  [[nodiscard]] bool begins() {
    char byte = 'g';
    return ::write(go_.get(), &byte, 1) == 1 && ::read(begun_.get(), &byte, 1) == 1 && byte == 'b';
  }
  void kill() {
    if (pid_ <= 0) return;
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
    pid_ = -1;
  }
  [[nodiscard]] pid_t pid() const { return pid_; }

 private:
  [[noreturn]] static void run(const std::string& socketPath, const QXURL& file, int go, int begun) {
    char byte = 0;
    if (::read(go, &byte, 1) != 1) ::_exit(1);
    Reactor reactor{1};
    const SocketClient client(reactor, socketPath);
    if (!client.isConnected()) ::_exit(1);
    client.coordinate<kWrite>(file, [begun](const Error& error) {
      const char answer = error ? 'e' : 'b';
      if (::write(begun, &answer, 1) != 1) ::_exit(1);
    });
    while (::read(go, &byte, 1) > 0) continue;  // until it is killed, or its maker is gone
    ::_exit(0);
  }

  pid_t pid_ = -1;
  UniqueDescriptor go_;
  UniqueDescriptor begun_;
};

class CoordinationOverSockets : public testing::SandboxHouse {
 protected:
  void SetUp() override {
    SandboxHouse::SetUp();
    doomed = std::make_unique<DoomedWriter>(socketPath, item);
    reactor = std::make_unique<Reactor>(3);
    sandbox = std::make_unique<LinuxSandbox>(loadedSession(), bundles, everybody);
    coordinator._addDocuvend(provider);
    service = std::make_unique<LinuxRpcService>(*reactor, everybody, log.defaultLog(), NamedServices{{"service", {socketPath}}});
    delegate = std::make_shared<FileCoordinationListenerDelegate>(
        FileCoordinationServicer::Surroundings{coordinator, accesses, *sandbox, everybody});
    listener = service->listenerForService("service");
    listener->setDelegate(delegate);
    listener->resume();
  }
  void TearDown() override {
    doomed.reset();
    listener.reset();
    service.reset();
    reactor.reset();  // nothing of the service runs any more
  }

  [[nodiscard]] SocketClient connected() { return {*reactor, socketPath}; }
  QXFileCoordination::ErrorReply intoAnswers() {
    return [this](Error error) { answers.put(std::move(error)); };
  }
  // Until so many have the file or wait for it: a request that was sent is not entered yet.
  void awaitAccesses(const QXURL& url, std::size_t count) const {
    const FileKey file = std::get<KeyedFile>(KeyedFile::of(url)).key;
    tests::eventually(std::to_string(count) + " have the file or wait for it", [&] { return accesses.of(file).size() == count; });
  }
  const std::string socketPath = directory.path() + "/service";
  const QXURL item = QXURL::fileURL(document, QXURLKind::file);
  const QXURL plain = QXURL::fileURL(outside + "/secret.txt", QXURLKind::file);
  // What the clients hear: filled until the reactor has ended.
  Mailbox<Error> answers;
  Mailbox<Error> ends;
  Mailbox<int> begun;
  std::unique_ptr<DoomedWriter> doomed;
  EverybodyIsAnother everybody;
  LinuxFileSystem fileSystem{Paths{}};
  LinuxFileCoordinator coordinator{fileSystem};
  FileAccesses accesses{coordinator};
  const std::shared_ptr<HangingProvider> provider = std::make_shared<HangingProvider>(QXURL::fileURL(storage, QXURLKind::directory));
  std::unique_ptr<LinuxSandbox> sandbox;
  std::unique_ptr<Reactor> reactor;
  std::unique_ptr<LinuxRpcService> service;
  std::shared_ptr<FileCoordinationListenerDelegate> delegate;
  std::shared_ptr<QXRpcListener> listener;
};

TEST_F(CoordinationOverSockets, OfAKilledWriterTheProviderHearsOnceAndTheNextHasItsTurn) {
  ASSERT_TRUE(doomed->begins());
  const auto next = connected();
  next.coordinate<kWrite>(item, intoAnswers());
  const std::string writer = "writer " + std::to_string(doomed->pid()) + "-";
  doomed->kill();
  EXPECT_TRUE(isSuccess(answers.take()));
  const auto told = provider->told.take();
  ASSERT_TRUE(told);
  EXPECT_TRUE(told->starts_with(writer)) << *told;
  next.end([this](Error error) { ends.put(std::move(error)); });
  EXPECT_TRUE(isSuccess(ends.take()));
  const auto second = provider->told.take();
  ASSERT_TRUE(second);
  EXPECT_FALSE(second->starts_with(writer)) << "it was told of the killed one twice";
}

TEST_F(CoordinationOverSockets, WhoLeavesWhileItsProviderHangsHoldsUpNobody) {
  auto reader = connected();
  reader.coordinate<kRead>(item, [](const Error&) {});
  ASSERT_TRUE(provider->asked.take());
  const auto writer = connected();
  writer.coordinate<kWrite>(item, intoAnswers());
  awaitAccesses(item, 2);
  reader.leave();
  EXPECT_TRUE(isSuccess(answers.take()));
}

TEST_F(CoordinationOverSockets, WhoLeavesWhileItWaitsIsForgotten) {
  const auto holder = connected();
  holder.coordinate<kWrite>(plain, intoAnswers());
  ASSERT_TRUE(isSuccess(answers.take()));
  auto waiter = connected();
  waiter.coordinate<kWrite>(plain, [](const Error&) {});
  awaitAccesses(plain, 2);
  const auto last = connected();
  last.coordinate<kWrite>(plain, intoAnswers());
  awaitAccesses(plain, 3);
  waiter.leave();
  holder.end({});
  EXPECT_TRUE(isSuccess(answers.take()));
}

TEST_F(CoordinationOverSockets, TwoHundredWritersTakeTurns) {
  constexpr int kWriters = 200;
  std::vector<SocketClient> writers;
  for (int i = 0; i < kWriters; ++i) writers.push_back(connected());
  for (int i = 0; i < kWriters; ++i) {
    writers[static_cast<std::size_t>(i)].coordinate<kWrite>(plain, [this, i](const Error& error) { begun.put(error ? -1 : i); });
  }
  std::set<int> seen;
  for (int i = 0; i < kWriters; ++i) {
    const auto writer = begun.take();
    ASSERT_TRUE(writer);
    ASSERT_GE(*writer, 0);
    EXPECT_TRUE(seen.insert(*writer).second);
    EXPECT_EQ(accesses.of(std::get<KeyedFile>(KeyedFile::of(plain)).key).front().state, AccessState::holding);
    if (i % 2 == 0) {
      writers[static_cast<std::size_t>(*writer)].leave();
    } else {
      writers[static_cast<std::size_t>(*writer)].end({});
    }
  }
  EXPECT_EQ(seen.size(), static_cast<std::size_t>(kWriters));
}

}  // namespace
}  // namespace docuvend::linux_platform
