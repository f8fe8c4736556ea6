// Accesses to the files of a provider that is installed and not registered.
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/linux/coordination/FileAccesses.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "tests/coordination/RecordingProvider.h"
#include "tests/coordination/Turns.h"

namespace docuvend::linux_platform {
namespace {

using testing::fileNamed;
using testing::partyOf;
using testing::RecordingProvider;

using Answers = std::vector<std::optional<QXError>>;

struct AwaitedAccessesTest : ::testing::Test {
  void SetUp() override { fileSystem.addDirectory("/storage"); }

  AccessNumber begin(const std::string& path, AccessKind kind, int process) {
    const AccessNumber number = accesses.newNumber();
    accesses.begin(number, {fileNamed(path), QXURL::fileURL(path, QXURLKind::file), kind, partyOf(process), {process, std::nullopt}},
                   [this](std::optional<QXError> error) { answers.push_back(std::move(error)); });
    return number;
  }
  AccessNumber read(int process) { return begin(item, AccessKind::reading, process); }
  AccessNumber write(int process) { return begin(item, AccessKind::writing, process); }
  void end(AccessNumber number) {
    accesses.end(number, [this] { ++endedCount; });
  }

  const std::string item = "/storage/item";
  const QXURL storage = QXURL::fileURL("/storage", QXURLKind::directory);
  std::vector<InstalledStorage> installed = {{"com.example.provider", storage}};
  fake_platform::FakeFileSystem fileSystem;
  bool isRemnant = false;
  LinuxFileCoordinator coordinator{
      fileSystem, {.installedStorages = [this] { return installed; }, .isRemnant = [this](const KeyedFile&) { return isRemnant; }}};
  FileAccesses accesses{coordinator};
  const std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>(storage);
  Answers answers;
  int endedCount = 0;
};

TEST_F(AwaitedAccessesTest, AReaderWaitsForTheProviderAndThenForTheContents) {
  const AccessNumber reader = read(1);
  EXPECT_EQ(accesses.stateOf(reader), AccessState::providing);
  EXPECT_TRUE(answers.empty()) << "a placeholder's zeros are no contents";
  coordinator._addDocuvend(provider);
  ASSERT_EQ(provider->asked.size(), 1U);
  EXPECT_TRUE(answers.empty());
  provider->asked[0].completion(std::nullopt);
  EXPECT_EQ(answers, Answers{std::nullopt});
}

TEST_F(AwaitedAccessesTest, AllWhoWaitedShareOneRequest) {
  read(1);
  read(2);
  coordinator._addDocuvend(provider);
  ASSERT_EQ(provider->asked.size(), 1U);
  provider->asked[0].completion(std::nullopt);
  EXPECT_EQ(answers, (Answers{std::nullopt, std::nullopt}));
}

TEST_F(AwaitedAccessesTest, AnotherProvidersRegistrationIsNotTakenForIt) {
  const AccessNumber reader = read(1);
  fileSystem.addDirectory("/other");
  coordinator._addDocuvend(std::make_shared<RecordingProvider>(QXURL::fileURL("/other", QXURLKind::directory)));
  EXPECT_EQ(accesses.stateOf(reader), AccessState::providing);
  EXPECT_TRUE(answers.empty());
}

TEST_F(AwaitedAccessesTest, AReaderWhoLeavesIsForgotten) {
  const AccessNumber reader = read(1);
  end(reader);
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_TRUE(answers[0]);
  const AccessNumber writer = write(2);
  EXPECT_EQ(accesses.stateOf(writer), AccessState::holding);
  coordinator._addDocuvend(provider);
  EXPECT_TRUE(provider->asked.empty());
}

TEST_F(AwaitedAccessesTest, AProviderThatIsReplacedIsWaitedFor) {
  coordinator._addDocuvend(provider);
  coordinator._removeDocuvend(provider);
  const AccessNumber reader = read(1);
  EXPECT_EQ(accesses.stateOf(reader), AccessState::providing);
  const auto next = std::make_shared<RecordingProvider>(storage);
  coordinator._addDocuvend(next);
  ASSERT_EQ(next->asked.size(), 1U);
  next->asked[0].completion(std::nullopt);
  EXPECT_EQ(answers, Answers{std::nullopt});
}

TEST_F(AwaitedAccessesTest, AReaderOfAProviderThatIsUninstalledGoesOnWithTheNextRegistration) {
  read(1);
  installed.clear();
  fileSystem.addDirectory("/other");
  coordinator._addDocuvend(std::make_shared<RecordingProvider>(QXURL::fileURL("/other", QXURLKind::directory)));
  EXPECT_EQ(answers, Answers{std::nullopt});
}

TEST_F(AwaitedAccessesTest, AReaderOfAProviderThatIsUninstalledGoesOnAtOnce) {
  read(1);
  installed.push_back({"com.example.other", QXURL::fileURL("/other", QXURLKind::directory)});
  coordinator.installedStoragesChanged();
  EXPECT_TRUE(answers.empty()) << "another has come";
  installed.clear();
  coordinator.installedStoragesChanged();
  EXPECT_EQ(answers, Answers{std::nullopt});
}

TEST_F(AwaitedAccessesTest, AReaderWhoseProviderIsUninstalledBetweenTheLookAndTheNoteGoesOnToo) {
  const auto storages = std::exchange(installed, {});
  bool isFirst = true;
  LinuxFileCoordinator racing{fileSystem, {.installedStorages = [&storages, &isFirst, &racing] {
                                if (!std::exchange(isFirst, false)) return std::vector<InstalledStorage>();
                                racing.installedStoragesChanged();
                                return storages;
                              }}};
  FileAccesses racingAccesses{racing};
  racingAccesses.begin(racingAccesses.newNumber(),
                       {fileNamed(item), QXURL::fileURL(item, QXURLKind::file), AccessKind::reading, partyOf(1), {1, std::nullopt}},
                       [this](std::optional<QXError> error) { answers.push_back(std::move(error)); });
  EXPECT_EQ(answers, Answers{std::nullopt});
}

TEST_F(AwaitedAccessesTest, AReaderOfAPlaceholderWhoseProviderIsUninstalledHasAnErrorInsteadOfZeros) {
  isRemnant = true;
  read(1);
  EXPECT_TRUE(answers.empty()) << "it is somebody's";
  installed.clear();
  coordinator.installedStoragesChanged();
  ASSERT_EQ(answers.size(), 1U);
  ASSERT_TRUE(answers[0]);
  EXPECT_EQ(answers[0]->domain, kQXFileCoordinationErrorDomain);
  EXPECT_EQ(answers[0]->code, static_cast<std::int64_t>(FileCoordinationErrorCode::noProvider));
  EXPECT_EQ(answers[0]->url, QXURL::fileURL(item, QXURLKind::file));
  const AccessNumber writer = write(2);
  EXPECT_EQ(accesses.stateOf(writer), AccessState::holding) << "the failed read holds nothing, and it may be written";
  end(writer);
  EXPECT_EQ(endedCount, 1);
  coordinator._addDocuvend(provider);
  read(3);
  EXPECT_EQ(provider->asked.size(), 1U) << "somebody's again";
}

TEST_F(AwaitedAccessesTest, WhatIsUntoldOutlivesTheChangeOfAnotherBundle) {
  end(write(1));
  coordinator.installedStoragesChanged();
  coordinator._addDocuvend(provider);
  EXPECT_EQ(provider->told.size(), 1U);
}

TEST_F(AwaitedAccessesTest, AWritersEndWaitsForNobodyAndTheProviderHearsOfItLater) {
  end(write(7));
  EXPECT_EQ(endedCount, 1);
  EXPECT_EQ(answers, Answers{std::nullopt});
  const AccessNumber next = write(8);
  EXPECT_EQ(accesses.stateOf(next), AccessState::holding);
  coordinator._addDocuvend(provider);
  ASSERT_EQ(provider->told.size(), 1U);
  EXPECT_EQ(provider->told[0].second, QXURL::fileURL(item, QXURLKind::file));
  EXPECT_NE(provider->told[0].first.find("writer 7-"), std::string::npos) << provider->told[0].first;
}

TEST_F(AwaitedAccessesTest, WhatCannotBeKnownIsTheReadersError) {
  coordinator._addDocuvend(provider);
  QXError churn = QXError::system(EAGAIN, "churn");
  churn.url = QXURL::fileURL(item, QXURLKind::file);
  fileSystem.setRelationship(storage, *churn.url, churn);
  read(1);
  EXPECT_EQ(answers, Answers{churn});
  fileSystem.setRelationship(storage, *churn.url, QXRelationship::contains);
  EXPECT_EQ(accesses.stateOf(write(2)), AccessState::holding) << "the failed read holds nothing";
}

}  // namespace
}  // namespace docuvend::linux_platform
