// Random grants, revocations, questions, rereads, failed writes, restarts and accidents of the file, against a list and a copy of it.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "acl/DVAccessControlStore.h"
#include "tests/support/FakePlatform.h"
#include "tests/support/Sequences.h"

namespace docuvend {
namespace {

using fake_platform::FakePlatform;
using fake_platform::FakeWriteFailure;
using List = std::vector<DVGrant>;

constexpr const char* kFile = "/home/fake/Library/Docuvend/AccessControl.plist";
constexpr std::size_t kLongestSequence = 40;
constexpr std::array kProviders{"p", "q", ""};
constexpr std::array kItems{"1", "2", "a/b", ""};
constexpr std::array kConsumers{"c", "d", ""};

struct Step {
  enum class Kind { grant, revoke, ask, reread, restart, failNextWrite, writeUnwritten, removeFile, spoilFile };

  Kind kind;
  DVGrant grant;
};

constexpr std::array kNames{"grant",           "revoke",          "ask",         "reread",    "restart",
                            "fail next write", "write unwritten", "remove file", "spoil file"};
// Changes are what most steps are.
constexpr std::array kWeights{8, 6, 4, 2, 1, 2, 1, 1, 1};

// What the store must be: a list, and what the file has of it.
struct Model {
  void allow(const DVGrant& grant) {
    if (allows(grant)) return;
    list.push_back(grant);
    commit();
  }
  void disallow(const DVGrant& grant) {
    if (std::erase(list, grant) > 0) commit();
  }
  void commit() {
    ++writes;
    isUnwritten = std::exchange(nextWriteFails, false);
    if (!isUnwritten) setFile(list, /*spoilt=*/false);
  }
  void read() {
    if (!file && !isSpoilt) return;
    list = file.value_or(List());
    isUnwritten = false;
  }
  void restart() {
    list.clear();
    isUnwritten = false;
    read();
  }
  void setFile(std::optional<List> to, bool spoilt) {
    file = std::move(to);
    isSpoilt = spoilt;
  }
  [[nodiscard]] bool allows(const DVGrant& grant) const { return std::find(list.begin(), list.end(), grant) != list.end(); }

  List list;
  std::optional<List> file;
  bool isSpoilt = false;  // there is a file, and it holds no list
  bool nextWriteFails = false;
  bool isUnwritten = false;
  std::size_t writes = 0;
};

// Items in the order of their grants; nothing empty below the top.
QXDictionary dictionaryOf(const List& list) {
  QXDictionary dictionary;
  const auto below = [](QXDictionary& above, const std::string& key) -> QXDictionary& {
    return *above.emplace(key, QXDictionary()).first->second.as<QXDictionary>();
  };
  for (const DVGrant& grant : list) {
    auto& grants = below(below(dictionary, grant.provider.value), grant.consumer.value);
    grants.emplace("AllowedItemIDs", QXArray()).first->second.as<QXArray>()->emplace_back(grant.item.value);
  }
  return dictionary;
}

class Trial {
 public:
  // What is wrong; nothing when nothing is.
  std::string run(const tests::Sequence<Step>& sequence) {
    for (const Step& step : sequence) {
      take(step);
      if (!problem_.empty()) return problem_;
      expectTheFile();
    }
    expectTheList();
    return problem_;
  }

 private:
  void take(const Step& step) {
    const DVGrant& grant = step.grant;
    switch (step.kind) {
      case Step::Kind::grant:
        model_.allow(grant);
        return store_->allowProviderWithIdentifier(grant.provider, grant.item, grant.consumer);
      case Step::Kind::revoke:
        model_.disallow(grant);
        return store_->disallowProviderWithIdentifier(grant.provider, grant.item, grant.consumer);
      case Step::Kind::ask:
        return expectTheAnswers(grant);
      case Step::Kind::reread:
        model_.read();
        return store_->rereadAccessControl();
      case Step::Kind::restart:
        model_.restart();
        store_ = std::make_shared<DVAccessControlStore>();
        return;
      case Step::Kind::failNextWrite:
        model_.nextWriteFails = true;
        return platform_.propertyLists.failWrite(model_.writes + 1, FakeWriteFailure::once);
      case Step::Kind::writeUnwritten:
        if (model_.isUnwritten) model_.commit();
        return store_->writeUnwrittenChanges();
      case Step::Kind::removeFile:
        finishRereading();
        model_.setFile(std::nullopt, /*spoilt=*/false);
        return platform_.fileSystem.remove(kFile);
      case Step::Kind::spoilFile:
        finishRereading();
        model_.setFile(std::nullopt, /*spoilt=*/true);
        return platform_.propertyLists.setCorrupt(kFile);
    }
  }

  // The model reads at once, the store at the latest when it is asked something.
  void finishRereading() { (void)store_->grants(); }

  void expect(bool isSo, const std::string& what) {
    if (!isSo) problem_.append("  ").append(what).append("\n");
  }
  void expectTheAnswers(const DVGrant& grant) {
    const bool isAllowed = model_.allows(grant);
    const bool hasNames = !grant.provider.value.empty() && !grant.item.value.empty();
    expect(store_->isProviderWithIdentifier(grant.provider, grant.item, grant.consumer) == isAllowed, "the protocol's question");
    expect(store_->isProviderIdentifier(grant.provider, grant.item, grant.consumer) == (isAllowed && hasNames), "the other question");
  }
  void expectTheFile() {
    const std::size_t writes = platform_.propertyLists.writeCount();
    expect(writes == model_.writes, "the writes are " + std::to_string(writes) + " and not " + std::to_string(model_.writes));
    const auto file = platform_.propertyLists.value(kFile);
    const auto due = model_.file ? std::optional<QXValue>(dictionaryOf(*model_.file)) : std::nullopt;
    expect(file == due, "the file is " + text(file) + " and not " + text(due));
  }
  void expectTheList() {
    for (const char* provider : kProviders) {
      for (const char* item : kItems) {
        for (const char* consumer : kConsumers) expectTheAnswers({ProviderID{provider}, ConsumerID{consumer}, ItemID{item}});
      }
    }
    expect(store_->grants().size() == model_.list.size(), "the list has " + std::to_string(store_->grants().size()) + " grants");
    expect(store_->hasUnwrittenChanges() == model_.isUnwritten, "whether something is unwritten");
  }
  static std::string text(const std::optional<QXValue>& value) { return value ? value->description() : "none"; }

  FakePlatform platform_;
  std::shared_ptr<DVAccessControlStore> store_ = std::make_shared<DVAccessControlStore>();
  Model model_;
  std::string problem_;
};

tests::Sequence<Step> someSteps(std::mt19937& random) {
  const auto pick = [&random](const auto& names) { return std::string(names[random() % names.size()]); };
  std::discrete_distribution<int> kind(kWeights.begin(), kWeights.end());
  tests::Sequence<Step> sequence(1 + random() % kLongestSequence);
  for (Step& step : sequence) {
    step.kind = static_cast<Step::Kind>(kind(random));
    step.grant = {ProviderID{pick(kProviders)}, ConsumerID{pick(kConsumers)}, ItemID{pick(kItems)}};
  }
  return sequence;
}

std::string described(const Step& step) {
  std::string text = kNames.at(static_cast<std::size_t>(step.kind));
  if (step.kind > Step::Kind::ask) return text;
  return text + " provider “" + step.grant.provider.value + "” item “" + step.grant.item.value + "” consumer “" +
         step.grant.consumer.value + "”";
}

TEST(StoreModel, AgreesWithAListAndItsCopyWhateverHappens) {
  tests::trySequences<Step>(
      {}, someSteps, [](const tests::Sequence<Step>& sequence) { return Trial().run(sequence); }, described);
}

}  // namespace
}  // namespace docuvend
