// The daemon's services in one process, which answer what a test says; and the place where the libraries look for them.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <deque>
#include <filesystem>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/Consumer.h"
#include "service/DVDaemon.h"
#include "tests/sdk/ScriptedService.h"
#include "tests/wire/Waiting.h"

namespace docuvend::tests {

inline const ProviderID kProvider{"com.example.provider"};
inline const ConsumerID kConsumer{"com.example.consumer"};

// What was asked, in order, of all services together.
class Calls {
 public:
  void add(std::string call) {
    std::function<void()> event;
    {
      const std::lock_guard lock(mutex_);
      calls_.push_back(std::move(call));
      event.swap(event_);
    }
    if (event) event();
  }
  // What happens when the next one has been asked and is not answered yet.
  void atTheNext(std::function<void()> event) {
    const std::lock_guard lock(mutex_);
    event_ = std::move(event);
  }
  [[nodiscard]] std::vector<std::string> all() const {
    const std::lock_guard lock(mutex_);
    return calls_;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> calls_;
  std::function<void()> event_;
};

// What an operation does with its reply instead of giving it. May be set while the services run.
template <class Reply>
class Instead {
 public:
  void operator=(std::function<void(Reply)> act) {
    const std::lock_guard lock(mutex_);
    act_ = std::move(act);
  }
  // False: nothing is set, and the reply is still to be given.
  [[nodiscard]] bool takes(Reply& reply) const {
    std::function<void(Reply)> act;
    {
      const std::lock_guard lock(mutex_);
      act = act_;
    }
    if (!act) return false;
    act(std::move(reply));
    return true;
  }

 private:
  mutable std::mutex mutex_;
  std::function<void(Reply)> act_;
};

// What the services answer. Set before the first question.
struct Script {
  std::optional<QXError> error;
  std::optional<QXURL> url = QXURL::fromString("file:///storage/letter.txt");
  std::optional<QXURL> siblingURL = QXURL::fromString("file:///storage/.letter.txt");
  std::optional<QXData> itemToken = QXData::fromText("item");
  std::optional<QXData> siblingToken = QXData::fromText("sibling");
  std::optional<std::string> string = "docuvend:p/i";
  std::optional<QXDictionary> providers = QXDictionary{{"p", QXDictionary{}}};
  std::optional<QXError> replaceError;
  std::optional<QXError> finishedError;
  std::optional<QXError> accessError;
  std::optional<QXError> endError;
  std::optional<QXError> progressError;
  std::optional<std::int64_t> bytesPresent;
  std::optional<std::int64_t> size;
  std::optional<QXArray> holders = QXArray{};
  // What a token is redeemed for.
  std::function<std::variant<QXDescriptor, QXError>(const std::string& token)> redeem;
  // These take a reply instead of giving it.
  Instead<DVDaemon::Done> waking;
  Instead<DVDaemon::ErrorReply> starting;
  Instead<DVDaemon::ErrorReply> stopping;
  Instead<linux_platform::QXSandboxRedemption::FileReply> redeeming;
  Instead<linux_platform::QXSandboxRedemption::ErrorReply> replacing;
  Instead<linux_platform::QXFileCoordination::ErrorReply> accessing;
  Instead<linux_platform::QXFileCoordination::ErrorReply> ending;
};

class ScriptedDaemon : public DVDaemon {
 public:
  ScriptedDaemon(Script& script, Calls& calls) : script_(script), calls_(calls) {}

  void wakeUpCompletion(Done completion) override {
    calls_.add("wake");
    if (script_.waking.takes(completion)) return;
    completion();
  }
  void extendSandboxForFileURL(std::optional<QXURL>, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> toConsumerID,
                               SandboxReply completionHandler) override {
    calls_.add("extend " + fromProviderID->value + " " + toConsumerID->value);
    if (script_.error) return completionHandler(script_.error, {}, {}, {});
    completionHandler({}, script_.itemToken, script_.siblingURL, script_.siblingToken);
  }
  void startProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> forConsumerID,
                               ErrorReply completionHandler) override {
    calls_.add("start " + url->absoluteString() + " " + fromProviderID->value + " " + forConsumerID->value);
    if (script_.starting.takes(completionHandler)) return;
    completionHandler(script_.error);
  }
  void providePlaceholderForItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID,
                                      std::optional<ConsumerID> forConsumerID, ErrorReply completionHandler) override {
    calls_.add("placeholder " + url->absoluteString() + " " + fromProviderID->value + " " + forConsumerID->value);
    completionHandler(script_.error);
  }
  void stopProvidingItemAtURL(std::optional<QXURL> url, std::optional<ProviderID> fromProviderID, std::optional<ConsumerID> forConsumerID,
                              ErrorReply completionHandler) override {
    calls_.add("stop " + url->absoluteString() + " " + fromProviderID->value + " " + forConsumerID->value);
    if (script_.stopping.takes(completionHandler)) return;
    completionHandler(script_.error);
  }
  void extendBookmarkForFileURL(std::optional<QXURL> url, std::optional<ConsumerID> toConsumerID, StringReply completionHandler) override {
    calls_.add("bookmark " + url->absoluteString() + " " + toConsumerID->value);
    if (script_.error) return completionHandler({}, script_.error);
    completionHandler(script_.string, {});
  }
  void providersCompletionHandler(ProvidersReply completionHandler) override {
    calls_.add("providers");
    if (script_.error) return completionHandler(script_.error, {});
    completionHandler({}, script_.providers);
  }
  void bookmarkableStringFromDocumentURL(std::optional<QXURL> url, StringReply completion) override {
    calls_.add("string of " + url->absoluteString());
    if (script_.error) return completion({}, script_.error);
    completion(script_.string, {});
  }
  void documentURLFromBookmarkableString(std::optional<std::string> string, DocumentReply completion) override {
    calls_.add("document of " + *string);
    if (script_.error) return completion({}, {}, {}, {}, script_.error);
    completion(script_.url, script_.itemToken, script_.siblingURL, script_.siblingToken, {});
  }

 private:
  Script& script_;
  Calls& calls_;
};

class ScriptedSandbox : public linux_platform::QXSandboxRedemption {
 public:
  ScriptedSandbox(Script& script, Calls& calls) : script_(script), calls_(calls) {}

  void redeemToken(std::optional<QXData> token, std::optional<bool> forWriting, FileReply completionHandler) override {
    calls_.add("redeem " + token->text() + (*forWriting ? " for writing" : " for reading"));
    if (script_.redeeming.takes(completionHandler)) return;
    if (!script_.redeem) return completionHandler({}, {});
    auto redeemed = script_.redeem(token->text());
    if (auto* error = std::get_if<QXError>(&redeemed)) return completionHandler(*error, {});
    completionHandler({}, std::get<QXDescriptor>(redeemed));
  }
  void replaceItemWithToken(std::optional<QXData> itemToken, std::optional<QXData> bySiblingWithToken,
                            ErrorReply completionHandler) override {
    calls_.add("replace " + itemToken->text() + " by " + bySiblingWithToken->text());
    if (script_.replacing.takes(completionHandler)) return;
    completionHandler(script_.replaceError);
  }

 private:
  Script& script_;
  Calls& calls_;
};

// How accesses were named, in the order of the requests for them and for their ends.
struct AccessNames {
  struct Asked {
    QXUUID accessID;
    std::int64_t party;
  };
  Mailbox<Asked> asked;
  Mailbox<QXUUID> ended;
};

class ScriptedCoordination : public linux_platform::QXFileCoordination {
 public:
  ScriptedCoordination(Script& script, Calls& calls, AccessNames& names) : script_(script), calls_(calls), names_(names) {}

  void coordinateReadingItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, std::optional<QXUUID> accessID,
                                  std::optional<std::int64_t> party, ErrorReply completionHandler) override {
    begin("read", url, token, {*accessID, *party}, std::move(completionHandler));
  }
  void coordinateWritingItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, std::optional<QXUUID> accessID,
                                  std::optional<std::int64_t> party, ErrorReply completionHandler) override {
    begin("write", url, token, {*accessID, *party}, std::move(completionHandler));
  }
  void endAccess(std::optional<QXUUID> accessID, ErrorReply completionHandler) override {
    calls_.add("end");
    names_.ended.put(*accessID);
    if (script_.ending.takes(completionHandler)) return;
    completionHandler(script_.endError);
  }
  void progressOfAccess(std::optional<QXUUID>, ProgressReply completionHandler) override {
    calls_.add("progress");
    completionHandler(script_.progressError, script_.bytesPresent, script_.size);
  }
  void holdersOfItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, HoldersReply completionHandler) override {
    calls_.add("holders of " + named(url, token));
    if (script_.error) return completionHandler(script_.error, {});
    completionHandler({}, script_.holders);
  }
  void writerDidFinishWritingForURL(std::optional<QXURL> url, ErrorReply completionHandler) override {
    calls_.add("finished " + url->absoluteString());
    completionHandler(script_.finishedError);
  }

 private:
  static std::string named(const std::optional<QXURL>& url, const std::optional<QXData>& token) {
    return url->absoluteString() + (token ? " by " + token->text() : "");
  }
  void begin(const std::string& verb, const std::optional<QXURL>& url, const std::optional<QXData>& token, const AccessNames::Asked& asked,
             ErrorReply completionHandler) {
    calls_.add(verb + " " + named(url, token));
    names_.asked.put(asked);
    if (script_.accessing.takes(completionHandler)) return;
    completionHandler(script_.accessError);
  }

  Script& script_;
  Calls& calls_;
  AccessNames& names_;
};

// A run-time directory of the test's own.
class LibraryTest : public ::testing::Test {
 protected:
  LibraryTest() {
    std::string pattern = (std::filesystem::temp_directory_path() / "dvXXXXXX").string();
    if (::mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory for a test");
    root_ = pattern;
    std::filesystem::create_directories(root_ + "/docuvend/public");
    ::setenv("XDG_RUNTIME_DIR", root_.c_str(), 1);
  }
  ~LibraryTest() override { std::filesystem::remove_all(root_); }

  // The error's domain and code, none when it went well.
  template <class T>
  static std::optional<std::pair<std::string, std::int64_t>> errorIn(const Result<T>& result) {
    const auto* error = std::get_if<QXError>(&result);
    if (error == nullptr) return std::nullopt;
    return std::pair(error->domain, error->code);
  }
  static std::optional<std::pair<std::string, std::int64_t>> errorIn(const Failure& failure) {
    if (!failure) return std::nullopt;
    return std::pair(failure->domain, failure->code);
  }
  static std::optional<std::pair<std::string, std::int64_t>> own(ConsumerErrorCode code) {
    return std::pair(std::string(kConsumerErrorDomain), static_cast<std::int64_t>(code));
  }

  std::string root_;
};

class ConsumerTest : public LibraryTest {
 protected:
  // Before anything of a test's own class goes: the script may use it until then.
  void TearDown() override {
    consumer_.reset();
    stopServices();
  }

  void startServices() {
    const std::string directory = root_ + "/docuvend/public/";
    daemon_ = std::make_unique<ScriptedService<DVDaemon>>(directory + kDVServiceName, std::make_shared<ScriptedDaemon>(script_, calls_));
    sandbox_ = std::make_unique<ScriptedService<linux_platform::QXSandboxRedemption>>(directory + linux_platform::kSandboxServiceName,
                                                                                      std::make_shared<ScriptedSandbox>(script_, calls_));
    coordination_ = std::make_unique<ScriptedService<linux_platform::QXFileCoordination>>(
        directory + linux_platform::kFileCoordinationServiceName, std::make_shared<ScriptedCoordination>(script_, calls_, names_));
  }
  // As when the daemon is killed.
  void stopServices() {
    stop(daemon_);
    stop(sandbox_);
    stop(coordination_);
  }
  // The services must be running.
  Consumer& consumer(Consumer::Options options = {}) {
    if (!options.actAs) options.actAs = kConsumer.value;
    auto connected = Consumer::connect(std::move(options));
    if (auto* made = std::get_if<std::unique_ptr<Consumer>>(&connected)) consumer_ = std::move(*made);
    if (!consumer_) throw std::runtime_error(std::get<QXError>(connected).description());
    return *consumer_;
  }
  // Wakings are put into `taken_` instead of being answered, and so on.
  void holdWakings() {
    script_.waking = [this](DVDaemon::Done completion) { taken_.put(std::move(completion)); };
  }
  void holdStarts() {
    script_.starting = [this](DVDaemon::ErrorReply reply) { started_.put(std::move(reply)); };
  }
  void holdStops() {
    script_.stopping = [this](DVDaemon::ErrorReply reply) { stopped_.put(std::move(reply)); };
  }
  [[nodiscard]] Document document() const { return {*script_.url, script_.itemToken, script_.siblingURL, script_.siblingToken}; }

  Script script_;
  Calls calls_;
  AccessNames names_;
  Mailbox<DVDaemon::Done> taken_;
  Mailbox<DVDaemon::ErrorReply> started_;
  Mailbox<DVDaemon::ErrorReply> stopped_;
  std::unique_ptr<ScriptedService<DVDaemon>> daemon_;
  std::unique_ptr<ScriptedService<linux_platform::QXSandboxRedemption>> sandbox_;
  std::unique_ptr<ScriptedService<linux_platform::QXFileCoordination>> coordination_;
  std::unique_ptr<Consumer> consumer_;
};

}  // namespace docuvend::tests
