// Files of a provider that is installed and not registered: after a restart of the daemon, during an update, on a locked device, after a
// setup that failed. Who reads one waits, and never has a placeholder's zeros; what is written meanwhile the provider is told later.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tests/system/house/TurnTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

constexpr const char* kDeadlinePassed = "DVConsumerErrorDomain 2";

class AwaitedProviders : public TurnTest {
 protected:
  void restartWithoutWaiting() {
    house_.killDaemon();
    house_.startDaemonWithoutWaiting();
  }
  // A directory with a copy of an installed bundle that differs from it.
  [[nodiscard]] std::string changedCopy(const std::string& bundle, const std::string& version) const {
    const fs::path copy = fs::path(house_.home()) / "copies" / (bundle + "-" + version);
    fs::create_directories(copy.parent_path());
    fs::copy(fs::path(house_.bundles()) / bundle, copy, fs::copy_options::recursive);
    writeFile(copy / "version", version);
    return copy;
  }
  void update(const std::string& directory) const {
    const Ending installed = house_.ctl({"install", directory});
    EXPECT_EQ(installed.status, 0) << installed.errors;
  }
  void set(const std::string& mark) const { writeFile(house_.container(kTrickster) + "/" + mark, ""); }
  void clear(const std::string& mark) const { fs::remove(house_.container(kTrickster) + "/" + mark); }
  // The end of a write is answered when a registered provider has been told.
  void awaitUnregistration() const {
    int writes = 0;
    eventually("the provider is not registered", [this, &writes] {
      const QXURL probe = trick("probe" + std::to_string(++writes));
      EXPECT_THAT(answers({"writing", probe.absoluteString(), "end"}), ElementsAre("ok", "ok"));
      return timesTold(probe) == 0;
    });
  }

  // The trickster is not registered until `bring` has it registered.
  void expectItIsAwaitedUntil(const std::function<void()>& bring) {
    const QXURL read = trick("read");
    const QXURL given = trick("given up");
    const QXURL written = trick("written");
    const QXURL plain = url(house_.home() + "/plain.txt");
    const auto reader = ask({"reading", read.absoluteString(), "end"});
    eventually("it waits", [this, &read, &reader] { return !holders(read).empty() || !reader->isRunning(); });
    EXPECT_THAT(holders(read), ElementsAre("reading providing"));

    EXPECT_THAT(answers({"within", "300", "reading", given.absoluteString()}), ElementsAre("ok", kDeadlinePassed));
    EXPECT_TRUE(holders(given).empty());
    EXPECT_THAT(answers({"reading", plain.absoluteString(), "end", "writing", plain.absoluteString(), "end"}),
                ElementsAre("ok", "ok", "ok", "ok"))
        << "a file of nobody's";
    const std::string file = written.absoluteString();
    EXPECT_THAT(answers({"writing", file, "end", "writing", file, "end"}), ElementsAre("ok", "ok", "ok", "ok")) << "nobody waits for that";

    EXPECT_THAT(holders(read), ElementsAre("reading providing"));
    EXPECT_EQ(timesAsked(read), 0);
    EXPECT_EQ(timesTold(written), 0);
    bring();
    EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok"));
    EXPECT_EQ(timesAsked(read), 1);
    EXPECT_EQ(timesAsked(given), 0) << "nobody waits for it any more";
    eventually("the provider is told", [this, &written] { return timesTold(written) > 0; });
    EXPECT_THAT(answers({"writing", trick("last").absoluteString(), "end"}), ElementsAre("ok", "ok"));
    EXPECT_EQ(timesTold(trick("last")), 1);
    EXPECT_EQ(timesTold(written), 1) << "once for a file";
    EXPECT_EQ(timesTold(plain), 0);
  }
};

// --- Over a provider that is held up

TEST_F(AwaitedProviders, WhileItIsSetUpAfterARestartItIsAwaited) {
  set("hang");
  restartWithoutWaiting();
  expectItIsAwaitedUntil([this] { clear("hang"); });
}

TEST_F(AwaitedProviders, WhileItIsUpdatedItIsAwaited) {
  set("hang");
  update(changedCopy(kTrickster, "two"));
  awaitUnregistration();
  expectItIsAwaitedUntil([this] { clear("hang"); });
}

TEST_F(AwaitedProviders, AfterASetupThatFailedItIsAwaitedUntilAnUpdateMendsIt) {
  const std::string mended = changedCopy(kTrickster, "mended");
  set("unwell");
  restartWithoutWaiting();
  ASSERT_TRUE(house_.awaitLog("[ERROR] Could not register docuvend " + kTrickster));
  EXPECT_EQ(house_.loggedBeginning("[ERROR] Docuvend extension " + kTrickster + " failed to initialize."), 3);
  expectItIsAwaitedUntil([this, &mended] {
    clear("unwell");
    update(mended);
  });
}

TEST_F(AwaitedProviders, OnALockedDeviceItIsAwaitedUntilTheFirstUnlock) {
  house_.killDaemon();
  ASSERT_EQ(house_.ctl({"platform", "lock-state", "1", "locked"}).status, 0);
  house_.startDaemonWithoutWaiting();
  expectItIsAwaitedUntil([this] { EXPECT_EQ(house_.ctl({"platform", "first-unlock"}).status, 0); });
}

TEST_F(AwaitedProviders, OneThatIsRemovedIsNotAwaitedAnyMore) {
  set("unwell");
  restartWithoutWaiting();
  ASSERT_TRUE(house_.awaitLog("[ERROR] Could not register docuvend " + kTrickster));
  const auto reader = ask({"reading", trick("read").absoluteString(), "end"});
  awaitHolders(trick("read"), {"reading providing"});
  EXPECT_EQ(house_.ctl({"uninstall", kTrickster}).status, 0);
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok")) << "the file is nobody's now";
}

TEST_F(AwaitedProviders, OneThatIsRemovedFromALockedDeviceIsNotAwaitedUntilTheUnlock) {
  house_.killDaemon();
  ASSERT_EQ(house_.ctl({"platform", "lock-state", "1", "locked"}).status, 0);
  house_.startDaemonWithoutWaiting();
  const auto reader = ask({"reading", trick("read").absoluteString(), "end"});
  const auto other = ask({"reading", letter_.absoluteString(), "end"});
  awaitHolders(trick("read"), {"reading providing"});
  awaitHolders(letter_, {"reading providing"});
  EXPECT_EQ(house_.ctl({"uninstall", kTrickster}).status, 0);
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok")) << "the file is nobody's now";
  EXPECT_THAT(holders(letter_), ElementsAre("reading providing")) << "the other provider is still there";
  EXPECT_EQ(house_.ctl({"platform", "first-unlock"}).status, 0);
  EXPECT_THAT(linesOf(*other), ElementsAre("ok", "ok"));
}

TEST_F(AwaitedProviders, OneThatIsRemovedWhileAnotherIsSetUpIsNotAwaited) {
  // Its turn to be set up comes after the trickster's.
  const std::string last = "com.orvane.wight";
  const std::string group = last + ".documents";
  house_.install(last, "docuvend-trickster",
                 stringEntry("QXBundleIdentifier", last) + "<key>QXGroups</key><array><string>" + group +
                     "</string></array><key>QXExtension</key><dict>" + stringEntry("QXExtensionPointName", "com.orvane.docuvend-nonui") +
                     stringEntry("QXExtensionDocuvendDocumentGroup", group) + "</dict>",
                 /*entitlements=*/{});
  fs::create_directories(house_.storage(last));
  const QXURL file = url(house_.storage(last) + "/read");
  set("hang");
  restartWithoutWaiting();
  const auto reader = ask({"reading", file.absoluteString(), "end"});
  const auto other = ask({"reading", trick("read").absoluteString(), "end"});
  awaitHolders(file, {"reading providing"});
  awaitHolders(trick("read"), {"reading providing"});
  EXPECT_EQ(house_.ctl({"uninstall", last}).status, 0);
  EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok")) << "the file is nobody's now";
  EXPECT_THAT(holders(trick("read")), ElementsAre("reading providing")) << "the other is set up still";
  clear("hang");
  EXPECT_THAT(linesOf(*other), ElementsAre("ok", "ok"));
}

// --- Over the cellar, whose placeholders say whether the contents were there

class AwaitedCellar : public AwaitedProviders {
 protected:
  static constexpr int kRestarts = 5;
  static constexpr int kUpdates = 12;

  // The documents are placeholders before the first of them is read.
  void SetUp() override {
    for (int i = 0; i < std::max(kRestarts, kUpdates); ++i) {
      for (const char* reader : kReaders) {
        const std::string name = nameOf(reader, i);
        paths_.emplace(name, house_.putInCloud(name, textOf(name)));
      }
    }
    TurnTest::SetUp();
    for (const auto& [name, path] : paths_) ASSERT_EQ(contentsOf(path), std::string(textOf(name).size(), '\0')) << "a placeholder";
  }
  static std::string nameOf(const std::string& reader, int round) { return reader + std::to_string(round); }
  static std::string textOf(const std::string& name) { return "This is the document " + name + ".\n"; }

  [[nodiscard]] std::unique_ptr<Process> startReading(const std::string& path) const {
    return std::make_unique<Process>(Command{{std::string(DOCUVEND_BIN) + "/docuvendctl", "read", path}, house_.environment(), {}});
  }

  static constexpr std::array kReaders = {"early", "late"};
  std::map<std::string, std::string> paths_;
};

TEST_F(AwaitedCellar, WhoReadsAtOnceAfterARestartHasTheTrueBytes) {
  for (int round = 0; round < kRestarts; ++round) {
    const std::string program = nameOf("early", round);
    const std::string tool = nameOf("late", round);
    restartWithoutWaiting();
    const auto process = startReading(paths_[tool]);
    const auto reader = holder("reading", url(paths_[program]), program);
    EXPECT_EQ(contentsOf(paths_[program]), textOf(program));
    letGo(place(program));
    EXPECT_THAT(linesOf(*reader), ElementsAre("ok", "ok", "ok"));
    EXPECT_EQ(process->wait().output, textOf(tool)) << process->wait().errors;
  }
}

TEST_F(AwaitedCellar, WhatIsWrittenAtOnceAfterARestartReachesTheCloud) {
  restartWithoutWaiting();
  const Ending written = house_.ctl({"write", letter_.fileSystemPath()}, "new");
  EXPECT_EQ(written.status, 0) << written.errors;
  eventually("the cloud has it", [this] { return contentsOf(house_.cloudFile("letter.txt")) == "new"; });
  EXPECT_EQ(contentsOf(letter_.fileSystemPath()), "new");
}

TEST_F(AwaitedCellar, WhoReadsWhileItIsUpdatedAgainAndAgainHasTheTrueBytes) {
  const std::vector<std::string> copies = {changedCopy(kCellar, "one"), changedCopy(kCellar, "two")};
  for (int round = 0; round < kUpdates; ++round) {
    const std::string before = nameOf("early", round);
    const std::string after = nameOf("late", round);
    const auto early = startReading(paths_[before]);
    update(copies[static_cast<std::size_t>(round) % copies.size()]);
    const auto late = startReading(paths_[after]);
    EXPECT_EQ(early->wait().output, textOf(before)) << early->wait().errors;
    EXPECT_EQ(late->wait().output, textOf(after)) << late->wait().errors;
  }
}

TEST_F(AwaitedCellar, WhoReadsWhenItIsRemovedWhileAnotherIsSetUpHasTheTrueBytesOrAnErrorAndDoesNotWait) {
  set("hang");
  update(changedCopy(kTrickster, "two"));
  awaitUnregistration();
  EXPECT_EQ(house_.ctl({"uninstall", kCellar}).status, 0);
  for (const char* reader : kReaders) {
    const std::string name = nameOf(reader, 0);
    const auto process = startReading(paths_[name]);
    const Ending& read = process->wait();
    EXPECT_EQ(read.output, read.status == 0 ? textOf(name) : "") << read.errors;
  }
  clear("hang");
}

TEST_F(AwaitedCellar, WhoReadsWhatItHasLeftBehindHasTheTrueBytesOrAnError) {
  const std::string whole = paths_[nameOf("early", 0)];
  const std::string empty = paths_[nameOf("late", 0)];
  ASSERT_EQ(startReading(whole)->wait().output, textOf(nameOf("early", 0)));
  house_.killDaemon();
  fs::remove_all(fs::path(house_.bundles()) / kCellar);
  house_.startDaemon();
  EXPECT_EQ(startReading(whole)->wait().output, textOf(nameOf("early", 0))) << "contents that are there can be read";
  const auto reader = startReading(empty);
  const Ending& read = reader->wait();
  EXPECT_NE(read.status, 0);
  EXPECT_EQ(read.output, "") << "no zeros";
  EXPECT_THAT(read.errors, HasSubstr("the file's provider is not installed, and the contents are not here"));
  const std::string file = url(empty).absoluteString();
  EXPECT_THAT(answers({"reading", file, "writing", file, "end"}), ElementsAre("QXFileCoordinationErrorDomain 3", "ok", "ok"))
      << "it may be written all the same";
}

TEST_F(AwaitedCellar, OnALockedDeviceReadersAndTheCloudHaveTheirBytesAfterTheFirstUnlock) {
  house_.killDaemon();
  ASSERT_EQ(house_.ctl({"platform", "lock-state", "1", "locked"}).status, 0);
  house_.startDaemon();
  const auto reader = startReading(letter_.fileSystemPath());
  awaitHolders(letter_, {"reading providing"});
  const std::string name = nameOf("early", 0);
  const Ending written = house_.ctl({"write", paths_[name]}, "new");
  EXPECT_EQ(written.status, 0) << written.errors;
  EXPECT_EQ(contentsOf(house_.cloudFile(name)), textOf(name));
  EXPECT_THAT(holders(letter_), ElementsAre("reading providing"));

  EXPECT_EQ(house_.ctl({"platform", "first-unlock"}).status, 0);
  EXPECT_EQ(reader->wait().output, kLetterText) << reader->wait().errors;
  eventually("the cloud has it", [this, &name] { return contentsOf(house_.cloudFile(name)) == "new"; });
  EXPECT_EQ(timesTold(url(paths_[name])), 1);
}

}  // namespace
}  // namespace docuvend::tests
