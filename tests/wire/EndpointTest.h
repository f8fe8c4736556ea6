// Endpoints that talk to each other or to a peer that speaks by hand, and what hears of it.
#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <iterator>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>

#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Limits.h"
#include "tests/wire/RawPeer.h"
#include "tests/wire/Waiting.h"

namespace docuvend::linux_platform {

using tests::Mailbox;
using tests::RawPeer;
using tests::socketPair;

inline const QXRpcOperation kEcho{"echo:", {QXValueKind::string}, {QXValueKind::string}};
inline const QXRpcOperation kOpen{"open:completion:", {QXValueKind::descriptor}, {QXValueKind::descriptor, QXValueKind::error}};
inline const QXRpcOperation kList{"list:", {}, {QXValueKind::dictionary}};

inline const Hello kHello{kProtocolVersion, std::nullopt};

inline QXRpcInterface testInterface() { return {"Test", {kEcho, kOpen, kList}}; }

// Hands every request to the test.
class Recorder final : public QXRpcExportedObject {
 public:
  struct Request {
    std::size_t operation;
    QXArray arguments;
    QXRpcReply reply;
    std::thread::id thread;
  };

  void invoke(std::size_t operation, QXArray arguments, QXRpcReply reply) override {
    requests.put({operation, std::move(arguments), std::move(reply), std::this_thread::get_id()});
  }

  Mailbox<Request> requests;
};

// Answers each request on the spot with what the function makes of its arguments.
class Answerer final : public QXRpcExportedObject {
 public:
  explicit Answerer(std::function<QXArray(QXArray)> function) : function_(std::move(function)) {}
  void invoke(std::size_t, QXArray arguments, QXRpcReply reply) override {
    auto values = function_(std::move(arguments));
    if (reply) reply(std::move(values));
  }

 private:
  const std::function<QXArray(QXArray)> function_;
};

inline std::int64_t code(QXRpcErrorCode value) { return static_cast<std::int64_t>(value); }

MATCHER_P(IsRpcError, value, "") { return arg.has_value() && arg->domain == kQXRpcErrorDomain && arg->code == code(value); }
MATCHER_P(IsSystemError, value, "") { return arg.has_value() && arg->domain == kQXSystemErrorDomain && arg->code == value; }

inline std::size_t openDescriptors() {
  const std::filesystem::directory_iterator all("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(all), end(all)));
}

// Every test leaves as many open descriptors as it found.
class EndpointTest : public testing::Test {
 protected:
  void TearDown() override {
    client = {};
    server = {};
    reactor.reset();
    recorder.reset();
    EXPECT_EQ(openDescriptors(), descriptorsBefore);
  }

  struct Side {
    std::shared_ptr<Endpoint> endpoint;
    std::shared_ptr<Mailbox<QXError>> closed = std::make_shared<Mailbox<QXError>>();
    std::shared_ptr<Mailbox<QXError>> blamed = std::make_shared<Mailbox<QXError>>();
    std::shared_ptr<Mailbox<bool>> unpassed = std::make_shared<Mailbox<bool>>();
    std::shared_ptr<Mailbox<Hello>> hellos = std::make_shared<Mailbox<Hello>>();
  };

  Side makeSide(UniqueDescriptor socket, Hello hello = {}, CallRules rules = {}) {
    Side side;
    Endpoint::Handlers handlers;
    handlers.onHello = [hellos = side.hellos](const Hello& said) -> std::optional<QXError> {
      hellos->put(said);
      return std::nullopt;
    };
    handlers.onClose = [closed = side.closed](const QXError& reason) { closed->put(reason); };
    handlers.onMisbehaviour = [blamed = side.blamed](const QXError& reason) { blamed->put(reason); };
    handlers.onDescriptorsRefused = [unpassed = side.unpassed] { unpassed->put(true); };
    side.endpoint = Endpoint::create(*reactor, std::move(socket), std::move(hello), std::move(handlers), std::move(rules));
    return side;
  }

  // Two endpoints that talk to each other; `object` is exported by the second.
  void connect(std::shared_ptr<QXRpcExportedObject> object) {
    auto [one, two] = socketPair();
    client = makeSide(std::move(one));
    server = makeSide(std::move(two));
    server.endpoint->setExportedInterface(testInterface());
    server.endpoint->setExportedObject(std::move(object));
    server.endpoint->resume();
    client.endpoint->resume();
  }

  // An endpoint that exports `object`, and a peer written by hand.
  RawPeer connectRaw(std::shared_ptr<QXRpcExportedObject> object, CallRules rules = {}) {
    auto [one, two] = socketPair();
    server = makeSide(std::move(one), {}, std::move(rules));
    server.endpoint->setExportedInterface(testInterface());
    server.endpoint->setExportedObject(std::move(object));
    server.endpoint->resume();
    return RawPeer(std::move(two));
  }

  std::shared_ptr<QXRpcProxy> proxy() {
    return client.endpoint->remoteObjectProxy([this](const QXError& error) { errors.put(error); });
  }
  QXRpcReply intoReplies() {
    return [this](QXArray values) { replies.put(std::move(values)); };
  }

  std::function<void()> intoPongs() {
    return [this] { pongs.put(true); };
  }
  FailureHandler intoFates() {
    return [this](const QXError&, MessageFate fate) { fates.put(fate); };
  }
  // A task that is posted now has run when this returns.
  [[nodiscard]] bool aTaskRuns() const {
    const auto ran = std::make_shared<Mailbox<bool>>();
    reactor->post([ran] { ran->put(true); });
    return ran->take().has_value();
  }

  const std::size_t descriptorsBefore = openDescriptors();

  // Destroyed from below: the reactor's threads end before what they fill goes.
  Mailbox<QXError> errors;
  Mailbox<QXArray> replies;
  Mailbox<bool> pongs;
  Mailbox<MessageFate> fates;
  std::shared_ptr<Recorder> recorder = std::make_shared<Recorder>();
  Side client;
  Side server;
  std::unique_ptr<Reactor> reactor = std::make_unique<Reactor>(2U);
};

}  // namespace docuvend::linux_platform
