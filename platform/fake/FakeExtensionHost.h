// Installed extensions and their processes, as a test says they are.
//
// Differs from the real extension host:
//  - For one thread: handlers run inside the call that causes them, so a begin request is answered before it returns unless it is held.
//  - The set of extensions is what the test gave, whatever the attributes of the match. It never changes by itself.
//  - No process is started; a request lives until it is cancelled or the test ends it. Nothing is limited in time.
//  - Messages to the vendor wait until the test answers them or lets their delivery fail, also after they were answered: nothing here
//    holds a test to "exactly one of reply and error handler".
//  - An answer that does not fit the operation is a mistake of the test and caught by an assertion.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/extension_host.h"

namespace docuvend::fake_platform {

// The vendor's end of all conversations with one extension.
class FakeVendor : public std::enable_shared_from_this<FakeVendor> {
 public:
  struct Message {
    QXRpcOperation operation;
    QXArray arguments;
    QXRpcReply reply;
    QXErrorHandler errorHandler;  // that of the proxy which sent it
  };
  using Responder = std::function<std::optional<QXArray>(const QXArray& arguments)>;

  // Every message sent so far, in order, answered or not.
  [[nodiscard]] const std::vector<Message>& messages() const { return messages_; }
  [[nodiscard]] std::vector<std::string> operationNames() const;
  // The error handlers of the proxies handed out so far, in order.
  [[nodiscard]] const std::vector<QXErrorHandler>& proxies() const { return proxies_; }

  // From now on messages of that full keyword name are answered at once with what the responder gives, unless it gives nothing.
  void respond(std::string operationName, Responder responder);
  // Calls the message's reply, if it has one.
  void answer(std::size_t message, QXArray values);
  void answerLast(QXArray values) { answer(messages_.size() - 1, std::move(values)); }
  // Calls the error handler of the proxy that sent the message.
  void failDelivery(std::size_t message, const QXError& error);
  void failLastDelivery(const QXError& error) { failDelivery(messages_.size() - 1, error); }

  // Lets go of all messages, proxies and responders. Their handlers may own the extension, and so this.
  void forget();

  // For FakeExtension.
  [[nodiscard]] std::shared_ptr<QXRpcConnection> connection();
  void send(QXErrorHandler errorHandler, const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply);
  void addProxy(QXErrorHandler errorHandler) { proxies_.push_back(std::move(errorHandler)); }

 private:
  std::vector<Message> messages_;
  std::vector<QXErrorHandler> proxies_;
  std::map<std::string, Responder, std::less<>> responders_;
};

// Equal to another of the same identifier and version.
class FakeExtension : public QXExtension {
 public:
  explicit FakeExtension(std::optional<std::string> identifier, int version = 1) : identifier_(std::move(identifier)), version_(version) {}

  [[nodiscard]] std::optional<std::string> identifier() const override { return identifier_; }
  // "<FakeExtension com.orvane.cellar 1>", with "(null)" for an absent identifier.
  [[nodiscard]] std::string description() const override;
  [[nodiscard]] bool isEqual(const QXExtension& other) const override;

  void beginExtensionRequest(BeginCompletion completion) override;
  void cancelExtensionRequest(const QXUUID& request) override;
  [[nodiscard]] std::shared_ptr<QXExtensionContext> extensionContextForRequest(const QXUUID& request) override;

  // How the next begin requests go: answered at once with a fresh identifier (the default), with that identifier, with that error; or held.
  void answerBegins();
  void answerBeginsWith(const QXUUID& request);
  void failBegins(QXError error);
  void holdBegins();
  // The oldest held one.
  void answerHeldBegin(const QXUUID& request);
  void failHeldBegin(QXError error);
  [[nodiscard]] std::size_t heldBeginCount() const { return held_.size(); }

  // Without contexts every request is answered as before but has none.
  void setHasContexts(bool hasContexts) { hasContexts_ = hasContexts; }

  [[nodiscard]] int beginCount() const { return beginCount_; }
  // The identifiers given out so far, and every cancelled one, known or not, in order.
  [[nodiscard]] const std::vector<QXUUID>& requests() const { return requests_; }
  [[nodiscard]] const std::vector<QXUUID>& cancelled() const { return cancelled_; }
  [[nodiscard]] FakeVendor& vendor() { return *vendor_; }

  // An identifier that differs for each number.
  [[nodiscard]] static QXUUID uuid(std::uint8_t number);

 private:
  enum class Begin { fresh, chosen, error, hold };

  void give(const BeginCompletion& completion, const QXUUID& request);

  std::optional<std::string> identifier_;
  int version_;
  Begin begin_ = Begin::fresh;
  QXUUID chosen_;
  QXError error_;
  bool hasContexts_ = true;
  int beginCount_ = 0;
  std::vector<BeginCompletion> held_;
  std::vector<QXUUID> requests_;
  std::set<QXUUID> open_;
  std::vector<QXUUID> cancelled_;
  std::shared_ptr<FakeVendor> vendor_ = std::make_shared<FakeVendor>();
};

class FakeExtensionHost : public QXExtensionHost {
 public:
  using Extensions = std::vector<std::shared_ptr<QXExtension>>;

  [[nodiscard]] std::unique_ptr<QXExtensionMatch> beginMatching(Attributes attributes, QXExtensionContextClass contextClass,
                                                                MatchHandler handler) override;

  // Called by every further `beginMatching` at its end: what another thread can do to a match before its beginner has it.
  void onBeginMatching(std::function<void()> callback) { onBeginMatching_ = std::move(callback); }

  // Makes this the present set and calls the handlers of the matches that are alive.
  void setExtensions(Extensions extensions);
  // Calls those handlers with the present set: the first call of a match that was begun after the set was given.
  void deliver();
  // Calls those handlers with an empty set and an error.
  void deliverError(const QXError& error);

  // Of every match begun so far, in order.
  struct Begun {
    Attributes attributes;
    const QXRpcInterface* hostInterface;
    const QXRpcInterface* vendorInterface;
  };
  [[nodiscard]] const std::vector<Begun>& begun() const { return begun_; }
  [[nodiscard]] std::size_t liveMatchCount() const;

 private:
  class Match;

  Extensions extensions_;
  std::vector<Begun> begun_;
  std::vector<std::weak_ptr<MatchHandler>> handlers_;
  std::function<void()> onBeginMatching_;
};

}  // namespace docuvend::fake_platform
