#include "platform/linux/rpc/LinuxRpcService.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <fstream>
#include <functional>
#include <iostream>
#include <utility>
#include <vector>

#include "platform/linux/rpc/BoundSocket.h"
#include "platform/linux/rpc/ConnectionLimiter.h"
#include "platform/linux/rpc/LinuxRpcConnection.h"
#include "platform/linux/wire/ConnectToSocket.h"
#include "platform/linux/wire/Limits.h"
#include "platform/linux/wire/SocketAddress.h"
#include "tests/rpc/RpcDrivers.h"
#include "tests/rpc/TestProtocol.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::linux_platform {
namespace {

using tests::kServiceName;
using tests::LinuxDriver;
using tests::Mailbox;
using tests::RawPeer;
using tests::TestObject;
using tests::TestProtocol;

MATCHER_P(IsRpcError, value, "") {
  return arg.has_value() && arg->domain == kQXRpcErrorDomain && arg->code == static_cast<std::int64_t>(value);
}

class StandardErrorLog final : public QXLogHandle {
 public:
  [[nodiscard]] bool isEnabled(QXLogType) const override { return true; }
  void write(QXLogType type, const std::string& message) override { std::cerr << static_cast<int>(type) << message << std::endl; }
};

// Tells for whom each line is written.
class SubjectLog final : public QXLogHandle {
 public:
  [[nodiscard]] bool isEnabled(QXLogType) const override { return true; }
  void write(QXLogType, const std::string&) override {
    const auto subject = LogSubject::current();
    subjects.put(subject ? *subject : "nobody in particular");
  }

  Mailbox<std::string> subjects;
};

// Answers a ping only when the test says so, and stands still until then.
class SlowObject final : public TestProtocol {
 public:
  void echo(std::optional<std::string>, TextReply) override {}
  void echoMany(std::optional<bool>, std::optional<std::int64_t>, std::optional<double>, std::optional<QXData>, std::optional<QXURL>,
                std::optional<QXUUID>, std::optional<QXArray>, std::optional<QXDictionary>, std::optional<QXError>, std::optional<ItemID>,
                ManyReply) override {}
  void list(ListReply) override {}
  void ping(Done completion) override {
    begun.put(true);
    (void)mayEnd.take();
    completion();
  }

  Mailbox<bool> begun;
  Mailbox<bool> mayEnd;
};

// Serves the test protocol to everybody, and hands over the connections.
class Delegate final : public QXRpcListenerDelegate {
 public:
  bool listener(QXRpcListener&, const std::shared_ptr<QXRpcConnection>& shouldAcceptNewConnection) override {
    shouldAcceptNewConnection->setExportedInterface(qxInterfaceOf<TestProtocol>());
    shouldAcceptNewConnection->setExportedObject(std::make_shared<QXRpcExport<TestProtocol>>(makeObject()));
    shouldAcceptNewConnection->resume();
    connections.put(shouldAcceptNewConnection);
    return true;
  }

  // Called for each connection; set before the first.
  std::function<std::shared_ptr<TestProtocol>()> makeObject = [] { return std::make_shared<TestObject>(); };
  Mailbox<std::shared_ptr<QXRpcConnection>> connections;
};

class LinuxRpcServiceTest : public testing::Test {
 protected:
  void serve() {
    listener = driver.listener();
    listener->setDelegate(delegate);
    listener->resume();
  }
  // True when a request was answered.
  bool roundTrip(const LinuxDriver::Client& client) {
    Mailbox<bool> answered;
    QXRemote<TestProtocol>(client.proxy([&answered](const QXError&) { answered.put(false); })).call<&TestProtocol::ping>([&answered] {
      answered.put(true);
    });
    return answered.take() == true;
  }
  static fake_platform::FakeLogEntry notice(const std::string& text) { return {QXLogType::defaultType, "[NOTICE] " + text}; }
  RawPeer connectRaw() const { return RawPeer(std::get<UniqueDescriptor>(connectToSocket(driver.socketPath))); }

  std::shared_ptr<Delegate> delegate = std::make_shared<Delegate>();
  Mailbox<QXError> closed;
  LinuxDriver driver;
  std::shared_ptr<QXRpcListener> listener;
};

TEST_F(LinuxRpcServiceTest, TheSocketIsTheOwnersAloneAndGoesWithTheListener) {
  serve();
  struct stat status {};
  ASSERT_EQ(::lstat(driver.socketPath.c_str(), &status), 0);
  EXPECT_TRUE(S_ISSOCK(status.st_mode));
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(driver.directory.path()), {}), 1) << "no temporary name is left";
  listener.reset();
  EXPECT_NE(::lstat(driver.socketPath.c_str(), &status), 0);
}

// A socket file that nobody listens to, as a killed process leaves it.
void leaveSocket(const std::string& path) {
  const auto address = SocketAddress::forPath(path);
  const UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const auto& to = std::get<SocketAddress>(address);
  ASSERT_EQ(::bind(socket.get(), to.address(), to.length()), 0);
}

TEST_F(LinuxRpcServiceTest, AStaleSocketIsReplaced) {
  leaveSocket(driver.socketPath);
  leaveSocket(driver.directory.path() + "/." + kServiceName + ".new");
  serve();
  EXPECT_TRUE(roundTrip(driver.connect()));
}

TEST_F(LinuxRpcServiceTest, AnotherListenersSocketIsLeftToItWhenThisOneGoes) {
  serve();
  std::filesystem::remove(driver.socketPath);
  const auto second = driver.listener();
  listener.reset();
  EXPECT_TRUE(std::filesystem::exists(driver.socketPath));
}

struct Publishing {
  int status = -1;     // as from waitpid
  std::string output;  // what the process wrote to standard error: the number of a message's type, the message, a line end

  [[nodiscard]] fake_platform::FakeLogEntry message() const {
    const std::size_t end = output.find('\n');
    if (output.empty() || end == std::string::npos) return {};
    return {static_cast<QXLogType>(output.front() - '0'), output.substr(1, end - 1), /*isWritten=*/true};
  }
};

// What becomes of a process that publishes `name` while `path` is the service's. Forked: no other thread may be running.
enum class PassedSocket { none, ofThatName };
Publishing publish(const std::string& path, const std::string& name, PassedSocket passed = PassedSocket::none) {
  std::array<int, 2> ends{-1, -1};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) return {};
  const UniqueDescriptor out(ends[0]);
  UniqueDescriptor in(ends[1]);
  const pid_t child = ::fork();
  if (child < 0) return {};
  if (child == 0) {
    ::dup2(in.get(), STDERR_FILENO);
    StandardErrorLog log;
    tests::TestPeerDirectory peers;
    Reactor reactor(1);
    std::vector<ActivatedSocket> sockets;
    if (passed == PassedSocket::ofThatName) sockets.push_back({name, "", UniqueDescriptor(::socket(AF_UNIX, SOCK_STREAM, 0))});
    LinuxRpcService service(reactor, peers, log, {{kServiceName, {path}}}, std::move(sockets));
    const auto listener = service.listenerForService(name);
    ::_exit(0);
  }
  in.reset();
  Publishing result;
  std::array<char, 256> bytes{};
  for (ssize_t count = 0; (count = ::read(out.get(), bytes.data(), bytes.size())) > 0;) {
    result.output.append(bytes.data(), static_cast<std::size_t>(count));
  }
  ::waitpid(child, &result.status, 0);
  return result;
}

MATCHER_P(EndedWith, line, "") {
  return WIFEXITED(arg.status) && WEXITSTATUS(arg.status) == EXIT_FAILURE &&
         arg.output.find("[ERROR] Cannot publish the service ") != std::string::npos && arg.output.find(line) != std::string::npos;
}
void PrintTo(const Publishing& publishing, std::ostream* out) { *out << "status " << publishing.status << ": " << publishing.output; }

TEST(LinuxRpcServicePublishingTest, ANameThatCannotBePublishedEndsTheProcess) {
  const tests::TemporaryDirectory directory;
  const std::string path = directory.path() + "/" + kServiceName;
  EXPECT_EQ(publish(path, kServiceName).status, 0);
  std::filesystem::remove(path);

  const Publishing unknown = publish(path, "com.example.Other");
  EXPECT_THAT(unknown, EndedWith("no socket is known for it"));
  EXPECT_EQ(unknown.message(),
            (fake_platform::FakeLogEntry{QXLogType::fault, "[ERROR] Cannot publish the service com.example.Other: " +
                                                               QXError::system(ENOENT, "no socket is known for it").description()}));
  EXPECT_THAT(publish(directory.path() + "/missing/socket", kServiceName), EndedWith("cannot open"));
  std::ofstream(path) << "a file";
  EXPECT_THAT(publish(path, kServiceName), EndedWith("is not a socket"));
  EXPECT_TRUE(std::filesystem::is_regular_file(path));
  std::filesystem::remove(path);
  std::filesystem::create_symlink("/dev/null", path);
  EXPECT_THAT(publish(path, kServiceName), EndedWith("is not a socket"));
  std::filesystem::remove(path);
  const auto live = BoundSocket::create(path);
  ASSERT_TRUE(std::holds_alternative<std::unique_ptr<BoundSocket>>(live));
  EXPECT_THAT(publish(path, kServiceName), EndedWith("another process listens at"));
}

TEST_F(LinuxRpcServiceTest, APathMayBeLongerThanASocketAddress) {
  std::string deep = driver.directory.path();
  while (deep.size() <= 2 * sizeof(sockaddr_un::sun_path)) deep += "/" + std::string(50, 'd');
  std::filesystem::create_directories(deep);
  const std::string path = deep + "/" + kServiceName;
  LinuxRpcService service(driver.reactor, driver.peers, driver.log.defaultLog(), {{kServiceName, {path}}});
  listener = service.listenerForService(kServiceName);
  listener->setDelegate(delegate);
  listener->resume();
  auto socket = connectToSocket(path);
  ASSERT_TRUE(std::holds_alternative<UniqueDescriptor>(socket)) << std::get<QXError>(socket).description();
  const auto endpoint = Endpoint::create(driver.reactor, std::get<UniqueDescriptor>(std::move(socket)), {}, {});
  endpoint->resume();
  EXPECT_TRUE(roundTrip(LinuxDriver::Client(endpoint)));
}

TEST(BoundSocketTest, TheNameGoesWithTheSocketWhereverItIs) {
  const tests::TemporaryDirectory directory;
  std::string deep = directory.path();
  while (deep.size() <= 2 * sizeof(sockaddr_un::sun_path)) deep += "/" + std::string(50, 'd');
  std::filesystem::create_directories(deep);
  for (const std::string& path : {directory.path() + "/s", deep + "/s"}) {
    {
      const auto bound = BoundSocket::create(path);
      ASSERT_TRUE(std::holds_alternative<std::unique_ptr<BoundSocket>>(bound)) << std::get<QXError>(bound).description();
      EXPECT_TRUE(std::filesystem::is_socket(path));
    }
    EXPECT_FALSE(std::filesystem::exists(path));
  }
}

TEST_F(LinuxRpcServiceTest, AMalformedFrameClosesThatConnectionWithOneLogLineAndTheServiceGoesOn) {
  serve();
  const auto raw = connectRaw();
  raw.sayHello();
  const std::vector<std::uint8_t> nonsense = {2, 0, 0, 0, 99, 0};
  raw.write(nonsense);
  ASSERT_TRUE(raw.read<Hello>());
  ASSERT_TRUE(raw.read<EndFrame>());
  EXPECT_TRUE(raw.atEnd());
  EXPECT_TRUE(roundTrip(driver.connect()));
  const auto line = notice("Closing the connection of PID " + std::to_string(::getpid()) + ": a frame of unknown type 99");
  // The line is written by another thread than the one that closes the socket.
  for (int i = 0; i < 1000 && driver.log.texts().empty(); ++i) EXPECT_TRUE(roundTrip(driver.connect()));
  EXPECT_THAT(driver.log.entries(), testing::ElementsAre(line));
}

TEST_F(LinuxRpcServiceTest, LinesAboutAPeerAreOnItsOwnAccountUnlessItIsTrusted) {
  SubjectLog log;
  Reactor reactor(2);  // ends before the log does
  LinuxRpcService service(reactor, driver.peers, log, {{kServiceName, {driver.socketPath}}});
  listener = service.listenerForService(kServiceName);
  listener->setDelegate(delegate);
  listener->resume();
  const auto subjectOfGarbage = [this, &log] {
    const auto raw = connectRaw();
    raw.write(std::vector<std::uint8_t>(64, 0xff));
    return log.subjects.take();
  };
  EXPECT_EQ(subjectOfGarbage(), "com.example.App");
  driver.peers.setNextPeer(Standing::unconfined, std::nullopt, {});
  EXPECT_EQ(subjectOfGarbage(), "nobody in particular");
  driver.peers.setNextPeer(Standing::nobody, std::nullopt, {});
  EXPECT_EQ(subjectOfGarbage(), "processes without an identity");
  std::vector<RawPeer> crowd;
  for (std::size_t i = 0; i < 2 * kMaximumConnectionsOfNobody; ++i) crowd.push_back(connectRaw());
  EXPECT_EQ(log.subjects.take(), "processes without an identity") << "of a refused connection, too";
  listener.reset();
}

TEST_F(LinuxRpcServiceTest, TheEndThatAPeerAnnouncesIsNotLogged) {
  serve();
  auto client = driver.connect();
  EXPECT_TRUE(roundTrip(client));
  client.leave();
  const auto raw = connectRaw();
  raw.write(Frame(EndFrame{QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(QXRpcErrorCode::malformedFrame), "forged")}));
  ASSERT_TRUE(raw.read<Hello>());
  EXPECT_TRUE(raw.atEnd());
  EXPECT_TRUE(roundTrip(driver.connect()));
  EXPECT_THAT(driver.log.texts(), testing::IsEmpty());
}

TEST_F(LinuxRpcServiceTest, NobodyHasNeitherTokenNorEntitlementsAndMayConnect) {
  driver.peers.setNextPeer(Standing::nobody, std::nullopt, {{"right", QXValue(true)}});
  serve();
  EXPECT_TRUE(roundTrip(driver.connect()));
  const auto connection = delegate->connections.take();
  ASSERT_TRUE(connection);
  EXPECT_EQ((*connection)->auditToken(), QXAuditToken{});
  EXPECT_EQ((*connection)->valueForEntitlement("right"), std::nullopt);
}

TEST_F(LinuxRpcServiceTest, NobodyMayAskForWhatTheServiceLetsEverybodyAskForAndForNothingElse) {
  driver.peers.setNextPeer(Standing::nobody, std::nullopt, {});
  serve();
  const auto nobody = driver.connect();
  Mailbox<QXError> errors;
  QXRemote<TestProtocol>(nobody.proxy([&errors](const QXError& error) {
    errors.put(error);
  })).call<&TestProtocol::echo>("who am I?", [](const auto&...) { ADD_FAILURE() << "answered"; });
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::notPermitted));
  EXPECT_TRUE(roundTrip(nobody));
}

TEST_F(LinuxRpcServiceTest, AllWithoutAnIdentityHaveFewConnectionsTogetherAndTakeNobodysPlace) {
  driver.peers.setNextPeer(Standing::nobody, std::nullopt, {});
  serve();
  std::vector<LinuxDriver::Client> clients;
  for (std::size_t i = 0; i < kMaximumConnectionsOfNobody; ++i) {
    clients.push_back(driver.connect());
    ASSERT_TRUE(roundTrip(clients.back()));
  }
  const auto refused = driver.connect({}, [this](const QXError& reason) { closed.put(reason); });
  EXPECT_THAT(closed.take(), IsRpcError(QXRpcErrorCode::refused));
  EXPECT_THAT(driver.log.entries(), testing::ElementsAre(notice("Refusing a connection of PID " + std::to_string(::getpid()) +
                                                                ": processes without an identity may not open more than " +
                                                                std::to_string(kMaximumConnectionsOfNobody) + ".")));
  driver.peers.setNextPeer(Standing::confined, "com.example.App", {});
  EXPECT_TRUE(roundTrip(driver.connect()));
}

TEST_F(LinuxRpcServiceTest, AnUnconfinedPeerActsForTheBundleThatItDeclares) {
  driver.peers.setNextPeer(Standing::unconfined, std::nullopt, {});
  driver.peers.install("com.example.App", {{"right", QXValue(true)}});
  serve();
  Hello hello;
  hello.declaredBundle = "com.example.App";
  EXPECT_TRUE(roundTrip(driver.connect(hello)));
  const auto connection = delegate->connections.take();
  ASSERT_TRUE(connection);
  EXPECT_EQ((*connection)->valueForEntitlement("right"), QXValue(true));
  EXPECT_EQ((*connection)->auditToken(), tests::TestPeerDirectory::tokenOf(1));
  EXPECT_EQ((*connection)->processIdentifier(), ::getpid());
}

TEST_F(LinuxRpcServiceTest, ADeclarationThatTheDirectoryRefusesEndsTheConnectionWithAReason) {
  driver.peers.setNextPeer(Standing::confined, "com.example.Other", {});
  driver.peers.install("com.example.App", {{"right", QXValue(true)}});
  serve();
  Hello hello;
  hello.declaredBundle = "com.example.App";
  const auto client = driver.connect(hello, [this](const QXError& reason) { closed.put(reason); });
  Mailbox<QXError> errors;
  QXRemote<TestProtocol>(client.proxy([&errors](const QXError& error) { errors.put(error); })).call<&TestProtocol::ping>([] {
    ADD_FAILURE() << "answered";
  });
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::refused));
  EXPECT_THAT(closed.take(), IsRpcError(QXRpcErrorCode::refused));
}

TEST_F(LinuxRpcServiceTest, OnePeersConnectionsAreLimitedAndOthersAreServed) {
  serve();
  std::vector<LinuxDriver::Client> clients;
  for (std::size_t i = 0; i < kMaximumConnectionsPerPeer; ++i) {
    clients.push_back(driver.connect());
    ASSERT_TRUE(roundTrip(clients.back()));
  }
  for (int i = 0; i < 3; ++i) {
    const auto refused = driver.connect({}, [this](const QXError& reason) { closed.put(reason); });
    EXPECT_THAT(closed.take(), IsRpcError(QXRpcErrorCode::refused));
  }
  EXPECT_THAT(driver.log.entries(),
              testing::ElementsAre(notice("Refusing a connection of PID " + std::to_string(::getpid()) +
                                          ": com.example.App may not open more than " + std::to_string(kMaximumConnectionsPerPeer) + ".")));
  driver.peers.setNextPeer(Standing::confined, "com.example.Other", {});
  EXPECT_TRUE(roundTrip(driver.connect()));
  driver.peers.setNextPeer(Standing::confined, "com.example.App", {});
  clients.pop_back();
  // The place is free when the service has noticed.
  bool admitted = false;
  for (int i = 0; i < 1000 && !admitted; ++i) admitted = roundTrip(driver.connect());
  EXPECT_TRUE(admitted);
}

// Whose requests are not answered. Each connection asks for all that it may.
class LinuxRpcServiceBudgetTest : public LinuxRpcServiceTest, public testing::WithParamInterface<std::pair<Standing, std::size_t>> {};

TEST_P(LinuxRpcServiceBudgetTest, OnePeersUnansweredRequestsAreLimitedOverAllItsConnectionsAndOthersAreServed) {
  serve();
  const auto [standing, limit] = GetParam();
  driver.peers.setNextPeer(standing, standing == Standing::confined ? std::optional<std::string>("com.example.App") : std::nullopt, {});
  const auto refusals = std::make_shared<Mailbox<QXError>>();  // the clients fill it once more when they go
  std::vector<LinuxDriver::Client> clients;
  std::optional<QXRemote<TestProtocol>> remote;
  for (std::size_t asked = 0; asked < limit; ++asked) {
    if (asked % (limit / 4) == 0) {
      clients.push_back(driver.connect());
      remote.emplace(clients.back().proxy([refusals](const QXError& error) { refusals->put(error); }));
    }
    remote->call<&TestProtocol::list>([](const auto&...) { ADD_FAILURE() << "answered"; });
  }
  // Each connection's requests run one after another: when its last one has been refused, the ones before it have been counted.
  for (const auto& client : clients) {
    Mailbox<QXError> unknown;
    client.proxy([&unknown](const QXError& error) { unknown.put(error); })->send({"unheard:of:", {}, {}}, {}, {});
    ASSERT_THAT(unknown.take(), IsRpcError(standing == Standing::nobody ? QXRpcErrorCode::notPermitted : QXRpcErrorCode::unknownOperation));
  }
  EXPECT_EQ(refusals->count(), 0U);
  EXPECT_FALSE(roundTrip(clients.front()));
  EXPECT_FALSE(roundTrip(driver.connect()));
  driver.peers.setNextPeer(Standing::confined, "com.example.Other", {});
  EXPECT_TRUE(roundTrip(driver.connect()));
}

TEST_F(LinuxRpcServiceTest, WhatGivesSomethingBackIsServedAlsoAtTheLimit) {
  constexpr std::size_t kReleases = 100;
  serve();
  driver.peers.setNextPeer(Standing::confined, "com.example.App", {});
  const auto refusals = std::make_shared<Mailbox<QXError>>();  // the client fills it once more when it goes
  const auto client = driver.connect();
  const auto ask = [&client, refusals](const std::string& operation, std::size_t times) {
    const auto proxy = client.proxy([refusals](const QXError& error) { refusals->put(error); });
    const QXRpcInterface interface = qxInterfaceOf<TestProtocol>();
    const QXRpcOperation& asked = interface.operations().at(interface.indexOf(operation).value());
    for (std::size_t i = 0; i < times; ++i) {
      proxy->send(asked, QXArray(asked.arguments.size()), [](const QXArray&) {});
    }
  };
  ask(tests::kGivesSomethingBack, kReleases);
  ask("list:", kMaximumCallsPerPeer);
  ask(tests::kGivesSomethingBack, kReleases);
  // One connection's requests run one after another: the first refusal is that of the one too many.
  ask("list:", 1);
  EXPECT_THAT(refusals->take(), IsRpcError(QXRpcErrorCode::tooManyCalls));
  EXPECT_EQ(refusals->count(), 0U);
}

INSTANTIATE_TEST_SUITE_P(Of, LinuxRpcServiceBudgetTest,
                         testing::Values(std::pair(Standing::confined, kMaximumCallsPerPeer),
                                         std::pair(Standing::nobody, kMaximumCallsOfNobody),
                                         std::pair(Standing::unconfined, kMaximumUnconfinedCalls)),
                         [](const auto& info) {
                           if (info.param.first == Standing::confined) return "ABundle";
                           return info.param.first == Standing::nobody ? "ProcessesWithoutAnIdentity" : "UnconfinedProcesses";
                         });

class LinuxRpcServiceBytesTest : public LinuxRpcServiceBudgetTest {};

TEST_P(LinuxRpcServiceBytesTest, OnePeersUnansweredRequestsHaveALimitedNumberOfBytesOverAllItsConnections) {
  serve();
  const auto [standing, limit] = GetParam();
  driver.peers.setNextPeer(standing, standing == Standing::confined ? std::optional<std::string>("com.example.App") : std::nullopt, {});
  const auto refusals = std::make_shared<Mailbox<QXError>>();  // the clients fill it once more when they go
  const std::vector<LinuxDriver::Client> clients = {driver.connect(), driver.connect()};
  const auto ask = [refusals](const LinuxDriver::Client& client) {
    QXRemote<TestProtocol>(client.proxy([refusals](const QXError& error) {
      refusals->put(error);
    })).call<&TestProtocol::echo>(std::string(kMaximumTextBytes, 'a'), [](const auto&...) { ADD_FAILURE() << "answered"; });
  };
  for (const auto& client : clients) ASSERT_TRUE(roundTrip(client));
  // Each is a little longer than its text.
  for (std::size_t i = 0; i + 1 < limit / kMaximumTextBytes; ++i) {
    ask(clients.front());
    ASSERT_TRUE(roundTrip(clients.front())) << "it is not refused, nor are short ones";
  }
  EXPECT_EQ(refusals->count(), 0U);
  ask(clients.back());
  EXPECT_THAT(refusals->take(), IsRpcError(QXRpcErrorCode::tooManyCalls));
  EXPECT_TRUE(roundTrip(clients.back())) << "a short one has room";
  driver.peers.setNextPeer(Standing::confined, "com.example.Other", {});
  const auto other = driver.connect();
  ask(other);
  EXPECT_TRUE(roundTrip(other));
  EXPECT_EQ(refusals->count(), 0U);
}

INSTANTIATE_TEST_SUITE_P(Of, LinuxRpcServiceBytesTest,
                         testing::Values(std::pair(Standing::confined, kMaximumCallBytesPerPeer),
                                         std::pair(Standing::unconfined, kMaximumUnconfinedCallBytes)),
                         [](const auto& info) { return info.param.first == Standing::confined ? "ABundle" : "UnconfinedProcesses"; });

TEST_F(LinuxRpcServiceTest, WithoutFreeDescriptorsAClientIsDroppedAndTheServiceGoesOn) {
  serve();
  const auto served = driver.connect();
  ASSERT_TRUE(roundTrip(served));
  ASSERT_TRUE(delegate->connections.take());
  // Sanitizers need descriptors when they meet a type for the first time: the log and the error texts are met here.
  QXLogHandle& log = driver.log.defaultLog();
  log.write(QXLogType::defaultType, "[NOTICE] " + QXError::system(EMFILE, "nothing").description());
  driver.log.clear();
  const auto found = SocketAddress::forPath(driver.socketPath);
  const auto& address = std::get<SocketAddress>(found);
  UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const RawPeer raw(std::move(socket));

  // The first hundred, among which all of this process are, are filled.
  constexpr rlim_t kDescriptors = 100;
  rlimit old{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &old), 0);
  rlimit tight = old;
  tight.rlim_cur = kDescriptors;
  std::vector<UniqueDescriptor> fillers;
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &tight), 0);
  while (true) {
    UniqueDescriptor filler(::dup(raw.socket()));
    if (!filler) break;
    fillers.push_back(std::move(filler));
  }
  const bool connected = ::connect(raw.socket(), address.address(), address.length()) == 0;
  const bool dropped = connected && raw.atEnd();
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &old), 0);
  EXPECT_TRUE(dropped);
  EXPECT_THAT(driver.log.entries(), testing::ElementsAre(notice("Refusing connections: cannot accept: Too many open files")));
  EXPECT_TRUE(roundTrip(served));
  EXPECT_TRUE(roundTrip(driver.connect()));
}

TEST_F(LinuxRpcServiceTest, APassedSocketServesItsName) {
  const std::string path = driver.directory.path() + "/" + kServiceName;
  auto found = SocketAddress::forPath(path);
  const auto& address = std::get<SocketAddress>(found);
  for (const bool byName : {true, false}) {
    UniqueDescriptor passed(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    ASSERT_EQ(::bind(passed.get(), address.address(), address.length()), 0);
    ASSERT_EQ(::listen(passed.get(), 5), 0);
    std::vector<ActivatedSocket> sockets;
    sockets.push_back({byName ? kServiceName : "docuvend.socket", byName ? "" : path, std::move(passed)});
    LinuxRpcService service(driver.reactor, driver.peers, driver.log.defaultLog(), {{kServiceName, {path}}}, std::move(sockets));
    listener = service.listenerForService(kServiceName);
    listener->setDelegate(delegate);
    auto client = driver.connect();
    listener->resume();
    EXPECT_TRUE(roundTrip(client));
    listener.reset();
    EXPECT_TRUE(std::filesystem::exists(path)) << "its file belongs to the service manager";
    std::filesystem::remove(path);
  }
}

TEST_F(LinuxRpcServiceTest, APassedSocketThatSomebodyHasClosedIsToldOfInTheLog) {
  UniqueDescriptor passed(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const int number = passed.get();
  std::vector<ActivatedSocket> sockets;
  sockets.push_back({kServiceName, "", std::move(passed)});
  LinuxRpcService service(driver.reactor, driver.peers, driver.log.defaultLog(), {{kServiceName, {driver.socketPath}}}, std::move(sockets));
  listener = service.listenerForService(kServiceName);
  ASSERT_EQ(::close(number), 0);
  listener->resume();
  EXPECT_THAT(driver.log.entries(),
              testing::ElementsAre(fake_platform::FakeLogEntry{QXLogType::fault, "[ERROR] A listener's socket cannot be watched."}));
  ASSERT_EQ(::dup2(STDERR_FILENO, number), number);  // for the listener to close
  listener.reset();
}

TEST_F(LinuxRpcServiceTest, UnconfinedProcessesHaveALimitOfTheirOwn) {
  rlimit descriptors{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &descriptors), 0);
  descriptors.rlim_cur = descriptors.rlim_max;
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &descriptors), 0);
  ASSERT_GT(descriptors.rlim_cur, 3 * kMaximumUnconfinedConnections) << "both ends and the peers' own are of this process";
  serve();
  driver.peers.setNextPeer(Standing::unconfined, std::nullopt, {});
  std::vector<LinuxDriver::Client> clients;
  for (std::size_t i = 0; i < kMaximumUnconfinedConnections; ++i) clients.push_back(driver.connect());
  ASSERT_TRUE(roundTrip(clients.back()));
  const auto refused = driver.connect({}, [this](const QXError& reason) { closed.put(reason); });
  EXPECT_THAT(closed.take(), IsRpcError(QXRpcErrorCode::refused));
  EXPECT_THAT(driver.log.entries(), testing::ElementsAre(notice("Refusing a connection of PID " + std::to_string(::getpid()) +
                                                                ": unconfined processes may not open more than " +
                                                                std::to_string(kMaximumUnconfinedConnections) + ".")));
  driver.peers.setNextPeer(Standing::nobody, std::nullopt, {});
  EXPECT_TRUE(roundTrip(driver.connect())) << "others are counted by themselves";
}

// --- A service for unconfined peers alone

class UnconfinedServiceTest : public LinuxRpcServiceTest {
 protected:
  void serveUnconfined(std::vector<ActivatedSocket> passedSockets = {}) {
    service.emplace(driver.reactor, driver.peers, driver.log.defaultLog(),
                    NamedServices{{kServiceName, {driver.socketPath, Audience::unconfinedPeers}}}, std::move(passedSockets));
    listener = service->listenerForService(kServiceName);
    listener->setDelegate(delegate);
    listener->resume();
  }
  // Of a connection that ends with it.
  std::optional<QXError> refusal() {
    const auto client = driver.connect({}, [this](const QXError& reason) { closed.put(reason); });
    return closed.take();
  }
  static fake_platform::FakeLogEntry line(const std::string& peer) {
    return notice("Refusing a connection of PID " + std::to_string(::getpid()) + ": com.example.Service is not for " + peer + ".");
  }

  std::optional<LinuxRpcService> service;
};

TEST_F(UnconfinedServiceTest, ServesUnconfinedPeers) {
  driver.peers.setNextPeer(Standing::unconfined, std::nullopt, {});
  serveUnconfined();
  EXPECT_TRUE(roundTrip(driver.connect()));
  EXPECT_THAT(driver.log.texts(), testing::IsEmpty());
}

TEST_F(UnconfinedServiceTest, ServesAnUnconfinedPeerThatActsForABundle) {
  driver.peers.setNextPeer(Standing::unconfined, std::nullopt, {});
  driver.peers.install("com.example.App", {});
  serveUnconfined();
  Hello hello;
  hello.declaredBundle = "com.example.App";
  EXPECT_TRUE(roundTrip(driver.connect(hello)));
  driver.peers.setNextPeer(Standing::unconfined, "com.example.App", {});
  EXPECT_TRUE(roundTrip(driver.connect()));
}

TEST_F(UnconfinedServiceTest, AConfinedPeerIsRefusedWithAReasonAndNoDelegateHears) {
  driver.peers.setNextPeer(Standing::confined, "com.example.App", {{"right", QXValue(true)}});
  serveUnconfined();
  const auto reason = refusal();
  ASSERT_THAT(reason, IsRpcError(QXRpcErrorCode::refused));
  EXPECT_EQ(reason->texts.at("description"), "com.example.Service is for unconfined processes alone");
  EXPECT_THAT(driver.log.entries(), testing::ElementsAre(line("com.example.App")));
  driver.peers.setNextPeer(Standing::unconfined, std::nullopt, {});
  EXPECT_TRUE(roundTrip(driver.connect()));
  EXPECT_TRUE(delegate->connections.take());
  EXPECT_EQ(delegate->connections.count(), 0U) << "the refused one came to the delegate";
}

TEST_F(UnconfinedServiceTest, ARequestOfARefusedPeerFailsWithTheSameReason) {
  driver.peers.setNextPeer(Standing::confined, "com.example.App", {});
  serveUnconfined();
  const auto client = driver.connect();
  Mailbox<QXError> errors;
  QXRemote<TestProtocol>(client.proxy([&errors](const QXError& error) { errors.put(error); })).call<&TestProtocol::ping>([] {
    ADD_FAILURE() << "answered";
  });
  EXPECT_THAT(errors.take(), IsRpcError(QXRpcErrorCode::refused));
}

TEST_F(UnconfinedServiceTest, NobodyIsRefused) {
  driver.peers.setNextPeer(Standing::nobody, std::nullopt, {});
  serveUnconfined();
  EXPECT_THAT(refusal(), IsRpcError(QXRpcErrorCode::refused));
  EXPECT_THAT(driver.log.entries(), testing::ElementsAre(line("processes without an identity")));
}

TEST_F(UnconfinedServiceTest, ADeclarationIsNoWayInForAConfinedPeer) {
  driver.peers.setNextPeer(Standing::confined, "com.example.Other", {});
  driver.peers.install("com.example.App", {});
  serveUnconfined();
  Hello hello;
  hello.declaredBundle = "com.example.App";
  const auto client = driver.connect(hello, [this](const QXError& reason) { closed.put(reason); });
  EXPECT_THAT(closed.take(), IsRpcError(QXRpcErrorCode::refused));
}

TEST_F(UnconfinedServiceTest, AFloodOfRefusalsIsOneLineForEachPeerAndTakesNobodysPlace) {
  serveUnconfined();
  driver.peers.setNextPeer(Standing::confined, "com.example.App", {});
  for (std::size_t i = 0; i < 2 * kMaximumConnectionsPerPeer; ++i) ASSERT_THAT(refusal(), IsRpcError(QXRpcErrorCode::refused));
  EXPECT_EQ(service->connectionCount(), 0U);
  driver.peers.setNextPeer(Standing::confined, "com.example.Other", {});
  ASSERT_THAT(refusal(), IsRpcError(QXRpcErrorCode::refused));
  EXPECT_THAT(driver.log.entries(), testing::ElementsAre(line("com.example.App"), line("com.example.Other")));
  driver.peers.setNextPeer(Standing::unconfined, std::nullopt, {});
  const auto served = driver.connect();
  EXPECT_TRUE(roundTrip(served));
  EXPECT_EQ(service->connectionCount(), 1U);
}

TEST_F(UnconfinedServiceTest, APassedSocketIsForTheSameAudience) {
  auto found = SocketAddress::forPath(driver.socketPath);
  const auto& address = std::get<SocketAddress>(found);
  UniqueDescriptor passed(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::bind(passed.get(), address.address(), address.length()), 0);
  ASSERT_EQ(::listen(passed.get(), 5), 0);
  std::vector<ActivatedSocket> sockets;
  sockets.push_back({kServiceName, "", std::move(passed)});
  serveUnconfined(std::move(sockets));
  driver.peers.setNextPeer(Standing::confined, "com.example.App", {});
  EXPECT_THAT(refusal(), IsRpcError(QXRpcErrorCode::refused));
  driver.peers.setNextPeer(Standing::unconfined, std::nullopt, {});
  EXPECT_TRUE(roundTrip(driver.connect()));
}

// Connects without waiting until there is no room in the line; how many found some. They leave when the sockets go.
int connectionsThatWait(const std::string& path) {
  auto found = SocketAddress::forPath(path);
  const auto& address = std::get<SocketAddress>(found);
  std::vector<UniqueDescriptor> waiting;
  constexpr int kMany = 10 * kMaximumWaitingConnections;
  while (static_cast<int>(waiting.size()) < kMany) {
    UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    if (::connect(socket.get(), address.address(), address.length()) != 0) break;
    waiting.push_back(std::move(socket));
  }
  return static_cast<int>(waiting.size());
}

// Of the kernel's own line, which holds one more than it is told. Nobody accepts any, for nothing has been resumed.
TEST(LinuxRpcServicePublishingTest, NoMoreConnectionsWaitThanItsLineHolds) {
  const tests::TemporaryDirectory directory;
  const std::string path = directory.path() + "/" + kServiceName;
  auto made = BoundSocket::create(path);
  ASSERT_TRUE(std::holds_alternative<std::unique_ptr<BoundSocket>>(made));
  EXPECT_EQ(connectionsThatWait(path), kMaximumWaitingConnections + 1);
}

TEST_F(UnconfinedServiceTest, APassedSocketsLineIsCutToThatLength) {
  auto found = SocketAddress::forPath(driver.socketPath);
  const auto& address = std::get<SocketAddress>(found);
  UniqueDescriptor passed(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::bind(passed.get(), address.address(), address.length()), 0);
  ASSERT_EQ(::listen(passed.get(), SOMAXCONN), 0);
  std::vector<ActivatedSocket> sockets;
  sockets.push_back({kServiceName, "", std::move(passed)});
  LinuxRpcService passing(driver.reactor, driver.peers, driver.log.defaultLog(),
                          NamedServices{{kServiceName, {driver.socketPath, Audience::everyone}}}, std::move(sockets));
  const auto unresumed = passing.listenerForService(kServiceName);
  EXPECT_EQ(connectionsThatWait(driver.socketPath), kMaximumWaitingConnections + 1);
}

TEST(LinuxRpcServicePublishingTest, APassedSocketDoesNotMakeItsNameAService) {
  const tests::TemporaryDirectory directory;
  EXPECT_THAT(publish(directory.path() + "/" + kServiceName, "com.example.Other", PassedSocket::ofThatName),
              EndedWith("no socket is known for it"));
}

// The first connection that is made gets the slow object.
class SlowRequestTest : public LinuxRpcServiceTest {
 protected:
  void serveSlowly() {
    delegate->makeObject = [slow = slow, isFirst = true]() mutable -> std::shared_ptr<TestProtocol> {
      if (std::exchange(isFirst, false)) return slow;
      return std::make_shared<TestObject>();
    };
    serve();
  }
  LinuxDriver::Client connectAs(Standing standing, std::optional<std::string> bundle) {
    driver.peers.setNextPeer(standing, std::move(bundle), {});
    auto client = driver.connect();
    EXPECT_TRUE(delegate->connections.take()) << "it is looked at before the next peer is another";
    return client;
  }
  // What is returned hears whether it was answered or has failed, at the latest when the client goes.
  [[nodiscard]] static std::shared_ptr<Mailbox<bool>> ping(const LinuxDriver::Client& client) {
    auto answered = std::make_shared<Mailbox<bool>>();
    QXRemote<TestProtocol>(client.proxy([answered](const QXError&) { answered->put(false); })).call<&TestProtocol::ping>([answered] {
      answered->put(true);
    });
    return answered;
  }

  const std::shared_ptr<SlowObject> slow = std::make_shared<SlowObject>();
};

TEST_F(SlowRequestTest, ARequestThatTakesLongHoldsUpNoOtherPeer) {
  serveSlowly();
  const auto first = connectAs(Standing::confined, "com.example.Slow");
  const auto answered = ping(first);
  ASSERT_TRUE(slow->begun.take());
  EXPECT_TRUE(roundTrip(connectAs(Standing::confined, "com.example.Other")));
  EXPECT_TRUE(roundTrip(connectAs(Standing::unconfined, std::nullopt)));
  EXPECT_TRUE(roundTrip(connectAs(Standing::nobody, std::nullopt)));
  EXPECT_EQ(answered->count(), 0U);
  slow->mayEnd.put(true);
  EXPECT_EQ(answered->take(), true);
}

TEST_F(SlowRequestTest, UnconfinedProcessesDoNotHoldUpEachOther) {
  serveSlowly();
  const auto first = connectAs(Standing::unconfined, std::nullopt);
  const auto answered = ping(first);
  ASSERT_TRUE(slow->begun.take());
  EXPECT_TRUE(roundTrip(connectAs(Standing::unconfined, std::nullopt)));
  EXPECT_EQ(answered->count(), 0U);
  slow->mayEnd.put(true);
  EXPECT_EQ(answered->take(), true);
}

TEST_F(SlowRequestTest, OfOneBundlesConnectionsOneIsServedAtATime) {
  serveSlowly();
  const auto first = connectAs(Standing::confined, "com.example.Slow");
  const auto answered = ping(first);
  ASSERT_TRUE(slow->begun.take());
  const auto second = connectAs(Standing::confined, "com.example.Slow");
  const auto answeredSecond = ping(second);
  for (int i = 0; i < 20; ++i) EXPECT_TRUE(roundTrip(connectAs(Standing::confined, "com.example.Other")));
  EXPECT_EQ(answeredSecond->count(), 0U);
  slow->mayEnd.put(true);
  EXPECT_EQ(answered->take(), true);
  EXPECT_EQ(answeredSecond->take(), true);
}

TEST_F(LinuxRpcServiceTest, TheListenersEndClosesItsConnections) {
  serve();
  auto client = driver.connect({}, [this](const QXError& reason) { closed.put(reason); });
  ASSERT_TRUE(roundTrip(client));
  ASSERT_TRUE(delegate->connections.take());
  listener.reset();
  EXPECT_TRUE(closed.take());
}

TEST_F(LinuxRpcServiceTest, TheServiceMayCallItsClients) {
  serve();
  auto socket = connectToSocket(driver.socketPath);
  const auto endpoint = Endpoint::create(driver.reactor, std::get<UniqueDescriptor>(std::move(socket)), {}, {});
  const auto object = std::make_shared<TestObject>();
  endpoint->setExportedInterface(qxInterfaceOf<TestProtocol>());
  endpoint->setExportedObject(std::make_shared<QXRpcExport<TestProtocol>>(object));
  endpoint->resume();
  const auto connection = delegate->connections.take();
  ASSERT_TRUE(connection);
  Mailbox<std::optional<std::string>> texts;
  QXRemote<TestProtocol>((*connection)->remoteObjectProxy([](const QXError& error) {
    ADD_FAILURE() << error.description();
  })).call<&TestProtocol::echo>("a", [&texts](std::optional<std::string> text) { texts.put(std::move(text)); });
  auto echo = object->echoes.take();
  ASSERT_TRUE(echo);
  echo->completion("b");
  EXPECT_EQ(texts.take(), std::optional<std::string>("b"));
}

}  // namespace
}  // namespace docuvend::linux_platform
