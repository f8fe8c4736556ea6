// Random installations, updates, removals, duplicates and failing registrations, announced while passes are under way, against a model of
// the registry and of what is to be set up, registered and unregistered, in order.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "providers/DVExtensionDocuvend.h"
#include "tests/support/FakePlatform.h"
#include "tests/support/Sequences.h"

namespace docuvend {
namespace {

using fake_platform::FakeExtension;
using fake_platform::FakeFileCoordinator;
using fake_platform::FakePlatform;

constexpr std::size_t kLongestSequence = 24;
constexpr int kTries = 3;
constexpr int kMaximumRounds = 1000;  // of two seconds each
constexpr std::size_t kMaximumTurns = 8;
constexpr std::array kIdentifiers{"com.orvane.attic", "com.orvane.cellar", "com.orvane.shed"};

struct Step {
  enum class Kind { install, installNameless, update, replaceByEqual, remove, moveToFront, announce, announceError, turn, settle };

  Kind kind;
  std::size_t number = 0;  // which of the identifiers or of those installed; how many tasks are run
  int failures = 0;        // of the tries of each of its registrations
  bool failsInSetup = false;
};

constexpr std::array kNames{
    "install",        "install nameless", "update", "replace by an equal one", "remove", "move to front", "announce",
    "announce error", "run tasks:",       "settle"};
constexpr std::array kWeights{8, 1, 4, 2, 4, 2, 8, 1, 4, 2};

// What happens to extensions and providers: a request is begun, a provider is registered or unregistered. Providers are numbered as they
// are made.
struct Event {
  enum class Kind { begin, add, remove };

  Kind kind;
  const QXExtension* extension = nullptr;
  std::optional<int> provider;  // of the last two kinds

  friend bool operator==(const Event&, const Event&) = default;
};

// Tells when it is begun; of each registration's tries the first `failures` fail.
class ScriptedExtension final : public FakeExtension {
 public:
  ScriptedExtension(std::optional<std::string> identifier, int version, const Step& step, std::function<void()> onBegin)
      : FakeExtension(std::move(identifier), version),
        failures(step.failures),
        failsInSetup_(step.failsInSetup),
        onBegin_(std::move(onBegin)) {
    vendor().respond("_performInitialSetupWithCompletion:", [this](const QXArray&) {
      return QXArray{QXValue(), QXValue(), isFailing_ ? QXValue(QXError::make("TestDomain", 2, "no setup")) : QXValue()};
    });
  }

  void beginExtensionRequest(BeginCompletion completion) override {
    onBegin_();
    isFailing_ = begun_++ % tries() < failures;
    if (isFailing_ && !failsInSetup_) {
      failBegins(QXError::make("TestDomain", 1, "no request"));
    } else {
      answerBegins();
    }
    FakeExtension::beginExtensionRequest(std::move(completion));
  }
  [[nodiscard]] int tries() const { return std::min(failures + 1, kTries); }

  const int failures;

 private:
  const bool failsInSetup_;
  const std::function<void()> onBegin_;
  int begun_ = 0;
  bool isFailing_ = false;
};

using Extension = std::shared_ptr<ScriptedExtension>;

// What a pass must do to the registry, and what must come of it.
struct Model {
  struct Provider {
    int number;
    Extension extension;
  };

  void pass(const std::vector<Extension>& installed) {
    ++passes;
    std::map<std::string, Provider> leftovers = registry;
    std::map<std::string, Provider> renewed;
    std::vector<Provider> made;
    for (const Extension& extension : installed) {
      const auto identifier = extension->identifier();
      if (!identifier) continue;
      const auto found = leftovers.find(*identifier);
      if (found != leftovers.end() && found->second.extension->isEqual(*extension)) {
        renewed.insert_or_assign(*identifier, found->second);
        leftovers.erase(found);
      } else {
        made.push_back({providers++, extension});
        renewed.insert_or_assign(*identifier, made.back());
      }
    }
    for (const auto& [identifier, provider] : leftovers) events.push_back({Event::Kind::remove, provider.extension.get(), provider.number});
    for (const Provider& provider : made) {
      const QXExtension* const extension = provider.extension.get();
      for (int i = 0; i < provider.extension->tries(); ++i) events.push_back({Event::Kind::begin, extension, std::nullopt});
      if (provider.extension->failures < kTries) events.push_back({Event::Kind::add, extension, provider.number});
    }
    registry = renewed;
  }

  std::map<std::string, Provider> registry;
  int passes = 0;
  int providers = 0;  // made so far
  std::vector<Event> events;
};

class Trial {
 public:
  Trial() {
    for (const char* identifier : kIdentifiers) platform_.installProviderBundle(identifier);
    DVExtensionDocuvend::createInstancesCompletion([this] { ++starts_; });
  }
  ~Trial() {
    for (const Extension& extension : made_) extension->vendor().forget();
  }
  Trial(const Trial&) = delete;
  Trial& operator=(const Trial&) = delete;

  // What is wrong; nothing when nothing is.
  std::string run(const tests::Sequence<Step>& sequence) {
    for (const Step& step : sequence) take(step);
    settle();
    return problem_;
  }

 private:
  void take(const Step& step) {
    Extension* chosen = installed_.empty() ? nullptr : &installed_[step.number % installed_.size()];
    switch (step.kind) {
      case Step::Kind::install:
        return installed_.push_back(make(kIdentifiers.at(step.number % kIdentifiers.size()), /*version=*/1, step));
      case Step::Kind::installNameless:
        return installed_.push_back(make(std::nullopt, /*version=*/1, step));
      case Step::Kind::update:
        if (chosen != nullptr) *chosen = make((*chosen)->identifier(), ++version_, step);
        return;
      case Step::Kind::replaceByEqual:
        if (chosen != nullptr) *chosen = makeEqualTo(**chosen, step);
        return;
      case Step::Kind::remove:
        if (chosen != nullptr) std::erase(installed_, Extension(*chosen));
        return;
      case Step::Kind::moveToFront:
        for (; chosen != nullptr && chosen != installed_.data(); --chosen) std::swap(*chosen, *(chosen - 1));
        return;
      case Step::Kind::announce:
        model_.pass(installed_);
        return platform_.extensionHost.setExtensions({installed_.begin(), installed_.end()});
      case Step::Kind::announceError:
        model_.pass({});
        return platform_.extensionHost.deliverError(QXError::make("TestDomain", 3, "no match"));
      case Step::Kind::turn:
        for (std::size_t i = 0; i <= step.number % kMaximumTurns && platform_.queues.runOne(); ++i) continue;
        return;
      case Step::Kind::settle:
        return settle();
    }
  }

  Extension make(const std::optional<std::string>& identifier, int version, const Step& step) {
    // The number is not known before there is an extension.
    const std::size_t index = made_.size();
    made_.push_back(std::make_shared<ScriptedExtension>(identifier, version, step, [this, index] {
      noteRegistrations();
      events_.push_back({Event::Kind::begin, made_[index].get(), std::nullopt});
    }));
    versions_.emplace(made_.back().get(), version);
    return made_.back();
  }
  Extension makeEqualTo(const ScriptedExtension& other, const Step& step) { return make(other.identifier(), versions_.at(&other), step); }

  // Those that the coordinator has heard of since it was last asked.
  void noteRegistrations() {
    const auto calls = platform_.fileCoordinator.calls();
    for (; callsSeen_ < calls.size(); ++callsSeen_) {
      const auto provider = std::static_pointer_cast<DVExtensionDocuvend>(calls[callsSeen_].provider);
      const auto kind = calls[callsSeen_].action == FakeFileCoordinator::Action::add ? Event::Kind::add : Event::Kind::remove;
      events_.push_back({kind, provider->extension().get(), numberOf(provider, events_.size())});
    }
  }

  // The number of a provider is that of the model's event in which it is first seen: everywhere else it has to be the same.
  int numberOf(const std::shared_ptr<DVExtensionDocuvend>& provider, std::size_t event) {
    if (const auto known = numbers_.find(provider); known != numbers_.end()) return known->second;
    const auto due = event < model_.events.size() ? model_.events[event].provider : std::nullopt;
    return name(provider, due.value_or(-1));
  }
  int name(const std::shared_ptr<DVExtensionDocuvend>& provider, int number) {
    const bool isTaken = std::any_of(numbers_.begin(), numbers_.end(), [number](const auto& entry) { return entry.second == number; });
    return numbers_[provider] = isTaken ? -1 : number;
  }

  // Ends all passes.
  void settle() {
    int rounds = 0;
    do {
      platform_.queues.runAll();
      platform_.queues.advance(std::chrono::seconds(2));
    } while (platform_.queues.pending() + platform_.queues.pendingTimers() > 0 && ++rounds < kMaximumRounds);
    noteRegistrations();
    expect(rounds < kMaximumRounds, "it does not come to an end");
    expect(events_ == model_.events, "there happened" + texts(events_) + "\n  and not" + texts(model_.events));
    expectTheRegistry();
    expect(starts_ == (model_.passes > 0 ? 1 : 0), "the start was told " + std::to_string(starts_) + " times");
  }

  void expectTheRegistry() {
    expect(DVExtensionDocuvend::providersInfo().size() == model_.registry.size(), "the registry has another size");
    for (const char* identifier : kIdentifiers) {
      const auto provider = DVExtensionDocuvend::providerWithIdentifier(ProviderID{identifier});
      const auto due = model_.registry.find(identifier);
      expect((provider == nullptr) == (due == model_.registry.end()), std::string("there should or should not be ") + identifier);
      if (provider == nullptr || due == model_.registry.end()) continue;
      if (!numbers_.contains(provider)) name(provider, due->second.number);
      expect(numbers_.at(provider) == due->second.number, std::string("another provider of ") + identifier);
      expect(provider->extension() == due->second.extension, std::string("another extension of ") + identifier);
    }
  }

  void expect(bool isSo, const std::string& what) {
    if (!isSo && problem_.empty()) problem_ = "  " + what + "\n";
  }
  [[nodiscard]] std::string texts(const std::vector<Event>& events) const {
    static constexpr std::array kKinds{"begin", "register", "unregister"};
    std::string list;
    for (const Event& event : events) {
      const auto made =
          std::find_if(made_.begin(), made_.end(), [&event](const Extension& extension) { return extension.get() == event.extension; });
      list.append("\n    ").append(kKinds.at(static_cast<std::size_t>(event.kind)));
      list.append(made == made_.end() ? " of an extension that is none" : " " + (*made)->description());
      if (event.provider) list.append(" provider ").append(std::to_string(*event.provider));
    }
    return list;
  }

  FakePlatform platform_;
  std::vector<Extension> made_;
  std::vector<Extension> installed_;
  std::map<const QXExtension*, int> versions_;
  int version_ = 1;
  int starts_ = 0;
  Model model_;
  std::vector<Event> events_;
  std::size_t callsSeen_ = 0;
  std::map<std::shared_ptr<DVExtensionDocuvend>, int> numbers_;
  std::string problem_;
};

tests::Sequence<Step> someSteps(std::mt19937& random) {
  std::discrete_distribution<int> kind(kWeights.begin(), kWeights.end());
  tests::Sequence<Step> sequence(1 + random() % kLongestSequence);
  for (Step& step : sequence) {
    step.kind = static_cast<Step::Kind>(kind(random));
    step.number = random() % 24;
    step.failures = random() % 2 == 0 ? 0 : static_cast<int>(random() % (kTries + 1));
    step.failsInSetup = random() % 2 == 0;
  }
  return sequence;
}

std::string described(const Step& step) {
  std::string text = kNames.at(static_cast<std::size_t>(step.kind));
  if (step.kind == Step::Kind::install) text.append(" ").append(kIdentifiers.at(step.number % kIdentifiers.size()));
  if (step.kind == Step::Kind::turn) text.append(" ").append(std::to_string(1 + step.number % kMaximumTurns));
  const bool choosesOne = step.kind >= Step::Kind::update && step.kind <= Step::Kind::moveToFront;
  if (choosesOne) text.append(" (number ").append(std::to_string(step.number)).append(", counted round)");
  if (step.kind <= Step::Kind::replaceByEqual && step.failures > 0) {
    text.append(", of each registration ").append(std::to_string(step.failures)).append(" tries fail");
    text.append(step.failsInSetup ? " in the setup" : " at the request");
  }
  return text;
}

TEST(DiscoveryModel, DoesToRegistryAndCoordinationWhatTheModelDoesInItsOrder) {
  tests::trySequences<Step>(
      {}, someSteps, [](const tests::Sequence<Step>& sequence) { return Trial().run(sequence); }, described);
}

}  // namespace
}  // namespace docuvend
