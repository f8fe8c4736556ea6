// Bundles that are installed, updated and removed while the daemon runs and clients work.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <functional>
#include <future>
#include <iostream>
#include <map>
#include <mutex>
#include <set>
#include <sstream>
#include <thread>

#include "common/DVErrors.h"
#include "platform/linux/bundles/BundleInstaller.h"
#include "platform/linux/extension_host/ExtensionErrors.h"
#include "platform/linux/files/LinuxPropertyLists.h"
#include "sdk/BlockingCall.h"
#include "tests/system/house/Burden.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using linux_platform::InstalledBundle;
using ::testing::HasSubstr;
using ::testing::Not;

// A provider of versioned/main.cpp.
const std::string kVane = "com.orvane.vane";
const std::string kProgram = "docuvend-versioned";
const std::string kUpdating = "[INFO] Updating provider list.";
const ProviderID kVaneID{kVane};
const ConsumerID kPickerID{kPicker};

class LiveRegistry : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kCellar);
    house_.install(kEditor);
    house_.install(kPicker);
    paths_.home = house_.home();
    paths_.systemBundles = house_.home() + "/no-system";
    paths_.userBundles = house_.bundles();
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
  }
  void start() {
    house_.startDaemon();
    caller_ = house_.client(kPicker);
  }

  // A directory with that version of the provider, ready to be installed.
  std::string makeVersion(const std::string& version, const std::string& identifier = kVane) {
    const std::string place = house_.home() + "/sources/" + identifier + "-" + version;
    if (fs::exists(place)) return place;
    fs::create_directories(place);
    fs::copy_file(std::string(DOCUVEND_BIN) + "/" + kProgram, place + "/" + kProgram);
    writeFile(place + "/version", version);
    writeFile(place + "/Info.plist",
              propertyList(stringEntry("QXBundleIdentifier", identifier) + stringEntry("QXBundleExecutable", kProgram) +
                           "<key>QXGroups</key><array><string>" + identifier + ".documents</string></array><key>QXExtension</key><dict>" +
                           stringEntry("QXExtensionPointName", "com.orvane.docuvend-nonui") +
                           stringEntry("QXExtensionDocuvendDocumentGroup", identifier + ".documents") + "</dict>"));
    return place;
  }
  void install(const std::string& directory) {
    const auto result = linux_platform::installBundle(directory, paths_, propertyLists_);
    if (const auto* error = std::get_if<QXError>(&result)) ADD_FAILURE() << error->description();
  }
  void uninstall(const std::string& identifier = kVane) {
    const auto error = linux_platform::uninstallBundle(identifier, paths_, propertyLists_);
    if (error) ADD_FAILURE() << error->description();
  }
  void installAndAwait(const std::string& version) {
    install(makeVersion(version));
    eventually("version " + version + " serves", [this, &version] { return presentVersion() == version; });
  }

  QXURL item(const std::string& name, const std::string& identifier = kVane) const {
    return QXURL::fileURL(house_.storage(identifier) + "/" + name, QXURLKind::file);
  }
  // The version of the provider that answers now; empty when none does.
  std::string presentVersion(const std::string& identifier = kVane) {
    const auto answer = caller_->ask<&DVDaemon::bookmarkableStringFromDocumentURL>(item("version", identifier));
    const auto* values = std::get_if<0>(&answer);
    const auto string = values == nullptr ? std::nullopt : std::get<0>(*values);
    return string ? string->substr(string->rfind('/') + 1) : "";
  }
  std::optional<QXError> grant(const std::string& name) {
    return errorOf(caller_->ask<&DVDaemon::extendSandboxForFileURL>(item(name), kVaneID, kPickerID));
  }
  std::future<std::optional<QXError>> startProviding(const std::string& name) {
    return std::async(std::launch::async, [this, name] {
      return errorOf(house_.client(kPicker)->ask<&DVDaemon::startProvidingItemAtURL>(item(name), kVaneID, kPickerID));
    });
  }
  void free() const { writeFile(house_.container(kVane) + "/free", ""); }
  static bool isNotFound(const std::optional<QXError>& error) {
    return error && error->domain == kDVErrorDomain && error->code == static_cast<std::int64_t>(DVErrorCode::notFound);
  }
  [[nodiscard]] bool isUnknown() { return isNotFound(grant("other")); }
  [[nodiscard]] int passes() const { return house_.logged(kUpdating); }

  linux_platform::Paths paths_;
  linux_platform::LinuxPropertyLists propertyLists_;
  std::string letter_;
  std::unique_ptr<Client> caller_;
};

TEST_F(LiveRegistry, AnUpdateLetsTheOldProcessFinishAndSendsTheNextRequestToANewOne) {
  start();
  installAndAwait("one");
  ASSERT_EQ(grant("stuck"), std::nullopt);
  auto answer = startProviding("stuck");
  ASSERT_TRUE(house_.awaitLog("is stuck"));
  const auto old = house_.processesOf(kProgram);
  ASSERT_EQ(old.size(), 1U);

  installAndAwait("two");
  const auto both = house_.processesOf(kProgram);
  EXPECT_EQ(both.size(), 2U);
  EXPECT_THAT(both, ::testing::Contains(old.front()));
  EXPECT_EQ(answer.wait_for(0s), std::future_status::timeout) << "nobody has cut it off";

  free();
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  EXPECT_EQ(answer.get(), std::nullopt);
  eventually("the old process has ended", [this] { return house_.processesOf(kProgram).size() == 1; });
  EXPECT_NE(house_.processesOf(kProgram).front(), old.front());
  EXPECT_EQ(presentVersion(), "two");
}

TEST_F(LiveRegistry, AnIdleProviderThatIsUpdatedLeavesNoOldProcess) {
  start();
  installAndAwait("one");
  const auto old = house_.processesOf(kProgram);
  ASSERT_EQ(old.size(), 1U);
  installAndAwait("two");
  eventually("only the new process is there", [this, &old] {
    const auto present = house_.processesOf(kProgram);
    return present.size() == 1 && present != old;
  });
}

TEST_F(LiveRegistry, ARemovalEndsRequestsAndNewOnesFindNothing) {
  start();
  installAndAwait("one");
  ASSERT_EQ(grant("stuck"), std::nullopt);
  auto answer = startProviding("stuck");
  ASSERT_TRUE(house_.awaitLog("is stuck"));
  uninstall();
  eventually("it is not found", [this] { return isUnknown(); });
  EXPECT_TRUE(isNotFound(errorOf(caller_->ask<&DVDaemon::startProvidingItemAtURL>(item("stuck"), kVaneID, kPickerID))));
  ASSERT_EQ(answer.wait_for(kPatience), std::future_status::ready);
  const auto error = answer.get();
  ASSERT_TRUE(error && error->underlying);
  EXPECT_EQ(error->underlying->domain, linux_platform::kExtensionHostErrorDomain);
  EXPECT_EQ(error->underlying->code, static_cast<std::int64_t>(linux_platform::ExtensionHostErrorCode::bundleIsGone));
  eventually("its process has ended", [this] { return house_.processesOf(kProgram).empty(); });
}

TEST_F(LiveRegistry, AReinstalledIdentifierInheritsItsGrantsAndItsUsersData) {
  start();
  installAndAwait("one");
  ASSERT_EQ(grant("letter"), std::nullopt);
  writeFile(house_.container(kVane) + "/kept", "x");
  uninstall();
  eventually("it is not found", [this] { return isUnknown(); });
  EXPECT_THAT(house_.accessControl(), HasSubstr("letter")) << "an uninstalled identifier keeps its grants";
  const Ending listed = house_.ctl({"grants", "--provider", kVane});
  EXPECT_EQ(listed.status, 0) << listed.errors;
  EXPECT_THAT(listed.output, HasSubstr("letter"));
  EXPECT_THAT(listed.output, HasSubstr(kPicker));

  installAndAwait("two");
  EXPECT_EQ(errorOf(caller_->ask<&DVDaemon::startProvidingItemAtURL>(item("letter"), kVaneID, kPickerID)), std::nullopt);
  EXPECT_EQ(contentsOf(house_.container(kVane) + "/kept"), "x");
}

// An application of tenant/main.cpp, confined, that holds a document while something is done to its bundle, and then tries everything
// again.
class LiveApplication : public LiveRegistry {
 protected:
  static inline const std::string kTenant = "com.orvane.tenant";

  std::string makeTenant(const std::string& version) const {
    const std::string place = house_.home() + "/sources/tenant-" + version;
    fs::create_directories(place);
    fs::copy_file(std::string(DOCUVEND_BIN) + "/docuvend-tenant", place + "/docuvend-tenant");
    writeFile(place + "/version", version);
    writeFile(place + "/Info.plist",
              propertyList(stringEntry("QXBundleIdentifier", kTenant) + stringEntry("QXBundleExecutable", "docuvend-tenant")));
    writeFile(place + "/Entitlements.plist", propertyList(trueEntry("com.orvane.docuvend.acl-read")));
    return place;
  }
  Ending holdMeanwhile(const std::function<void()>& change) {
    install(makeTenant("one"));
    start();
    installAndAwait("one");
    EXPECT_EQ(grant("letter"), std::nullopt);
    EXPECT_EQ(errorOf(caller_->ask<&DVDaemon::extendSandboxForFileURL>(item("letter"), kVaneID, ConsumerID{kTenant})), std::nullopt);
    writeFile(house_.storage(kVane) + "/letter", "x");
    const std::string string = house_.bookmark(item("letter").fileSystemPath());
    auto held = std::async(std::launch::async, [this, string] { return house_.confined(kTenant, {string, kVane}); });
    eventually("it holds the document", [this, &held] {
      return fs::exists(house_.container(kTenant) + "/holding") || held.wait_for(0s) == std::future_status::ready;
    });
    change();
    writeFile(house_.container(kTenant) + "/go", "");
    return held.get();
  }
  // Its connections to the daemon and to the sandbox are ended.
  void awaitTheEndOfItsConnections() const { EXPECT_TRUE(house_.awaitLog(": its bundle " + kTenant + " was removed or replaced.", 2)); }
  static void expectRefusedAfterwards(const Ending& ending) {
    EXPECT_EQ(ending.status, 0) << ending.errors;
    for (const char* what : {" redeem: ok\n", " start: ok\n", " extend: ok\n", " resolve: ok\n"}) {
      EXPECT_THAT(ending.output, HasSubstr(std::string("before") + what));
      EXPECT_THAT(ending.output, Not(HasSubstr(std::string("after") + what)));
    }
    EXPECT_THAT(ending.output, HasSubstr("after write: ok\n")) << "what it holds it keeps";
  }
};

TEST_F(LiveApplication, OneThatRunsFromTheOlderCopyOfItsBundleKeepsWhatItHoldsAndIsToBeStartedAgain) {
  expectRefusedAfterwards(holdMeanwhile([this] {
    install(makeTenant("two"));
    EXPECT_EQ(contentsOf(house_.bundles() + "/" + kTenant + "/version"), "two");
    awaitTheEndOfItsConnections();
  }));
}

TEST_F(LiveApplication, OneWhoseBundleIsRemovedKeepsWhatItHoldsAndIsNotStartedAgain) {
  expectRefusedAfterwards(holdMeanwhile([this] {
    uninstall(kTenant);
    awaitTheEndOfItsConnections();
  }));
  EXPECT_NE(house_.confined(kTenant, {"x", kVane}).status, 0);
}

TEST_F(LiveRegistry, AHundredChangesInARowAreFewPassesAndTheEndIsRight) {
  constexpr int kBundles = 4;
  start();
  const auto identifier = [](int number) { return kVane + std::to_string(number); };
  std::vector<std::string> last(kBundles);  // the version that is installed; empty: none
  for (int i = 0; i < kBundles; ++i) {
    for (const char* version : {"one", "two", "three"}) makeVersion(version, identifier(i));
  }
  const int before = passes();
  for (int change = 0; change < 100; ++change) {
    const int number = change % kBundles;
    std::string& present = last[static_cast<std::size_t>(number)];
    switch (change / kBundles % 4) {
      case 0:
      case 1:
      case 2:
        present = std::vector<std::string>{"one", "two", "three"}[static_cast<std::size_t>(change / kBundles % 4)];
        install(makeVersion(present, identifier(number)));
        break;
      default:
        present.clear();
        uninstall(identifier(number));
    }
  }
  EXPECT_EQ(std::count(last.begin(), last.end(), "one"), kBundles) << "the last change of each was an installation";
  for (int i = 0; i < kBundles; ++i) {
    eventually(identifier(i) + " serves its last version",
               [this, &last, &identifier, i] { return presentVersion(identifier(i)) == last[static_cast<std::size_t>(i)]; });
  }
  EXPECT_LE(passes() - before, 20);
  EXPECT_GE(passes() - before, 1);
  RecordProperty("passes", passes() - before);
  for (int i = 0; i < kBundles; ++i) uninstall(identifier(i));
  eventually("no process of theirs is left", [this] { return house_.processesOf(kProgram).empty(); });
}

TEST_F(LiveRegistry, ChangesBehindASlowSetupAreCaughtUpWithInTheEnd) {
  start();
  fs::create_directories(house_.container(kVane));
  fs::permissions(house_.container(kVane), fs::perms::owner_all);
  writeFile(house_.container(kVane) + "/slow", "");
  install(makeVersion("one"));
  ASSERT_TRUE(house_.awaitLog("is slow"));
  const int before = passes();
  for (int i = 0; i < 10; ++i) install(makeVersion(i % 2 == 0 ? "two" : "three"));
  EXPECT_EQ(passes(), before) << "one pass at a time";
  // The other provider's requests do not wait for a pass.
  EXPECT_NE(house_.granted(letter_, kEditor), "");
  fs::remove(house_.container(kVane) + "/slow");
  free();
  eventually("the last version serves", [this] { return presentVersion() == "three"; });
  EXPECT_LE(passes() - before, 10);
}

TEST_F(LiveRegistry, AProviderThatIsCopiedInPlaceServesWhenItIsWhole) {
  start();
  const std::string source = makeVersion("one");
  const std::string place = house_.bundles() + "/by-hand";
  fs::create_directory(place);
  fs::copy_file(source + "/Info.plist", place + "/Info.plist");
  {
    // The program in many small pieces, as from a slow disk.
    std::ofstream program(place + "/" + kProgram, std::ios::binary);
    fs::permissions(place + "/" + kProgram, fs::perms::owner_all);
    const std::string bytes = contentsOf(source + "/" + kProgram);
    for (std::size_t i = 0; i < bytes.size(); i += 4096) program << bytes.substr(i, 4096) << std::flush;
  }
  fs::copy_file(source + "/version", place + "/version");
  eventually("it serves", [this] { return presentVersion() == "one"; });
}

const std::string kDone = "done";
const std::string kNoAnswer = "NoAnswer 0";

// What ended how often, from many threads.
class Tally {
 public:
  void count(const std::optional<QXError>& error) {
    const std::lock_guard lock(mutex_);
    ++counts_[error ? error->domain + " " + std::to_string(error->code) : kDone];
  }
  // Nothing ended otherwise, and something was done.
  void expectOnly(const std::string& what, const std::set<std::string>& expected) {
    const std::lock_guard lock(mutex_);
    for (const auto& [ending, times] : counts_) {
      std::cout << "  " << what << ": " << ending << ", " << times << " times\n";
      EXPECT_TRUE(expected.contains(ending)) << what << ": " << ending;
    }
    EXPECT_TRUE(counts_.contains(kDone)) << what;
  }

 private:
  std::mutex mutex_;
  std::map<std::string, int> counts_;
};

class Churn : public LiveRegistry {
 protected:
  // Of a provider's process the daemon has its socket, its output and itself.
  static constexpr std::size_t kDescriptorsOfProcess = 3;

  [[nodiscard]] std::size_t descriptors() { return burdenOf(house_.daemon().pid()).descriptors; }
  [[nodiscard]] std::string memory() { return burdenOf(house_.daemon().pid()).memory; }
  [[nodiscard]] std::size_t processes() { return burdenOf(house_.daemon().pid()).processes; }

  // Does the work again and again with a client of its own until the end.
  void keepDoing(std::function<void(Client&)> work) {
    workers_.push_back(std::async(std::launch::async, [this, work = std::move(work)] {
      const auto client = house_.client(kPicker);
      while (!isOver_) work(*client);
    }));
  }
  // What the work uses may go when this returns.
  void finish() {
    isOver_ = true;
    for (auto& worker : workers_) {
      EXPECT_EQ(worker.wait_for(kPatience), std::future_status::ready) << "a request is lost";
      worker.get();
    }
    workers_.clear();
  }

  std::atomic<bool> isOver_ = false;
  std::vector<std::future<void>> workers_;
};

// An answer that need not come: a string that names a provider that is not registered gets none.
std::optional<QXError> resolve(Client& client, const std::string& string, std::chrono::milliseconds deadline) {
  const auto outcome = sdk_detail::callAndWait<&DVDaemon::documentURLFromBookmarkableString>(
      client.endpoint(), sdk_detail::Waiting{sdk_detail::after(deadline)}, string);
  if (std::holds_alternative<sdk_detail::NotInTime>(outcome)) return QXError::make("NoAnswer", 0, {});
  if (const auto* undelivered = std::get_if<sdk_detail::NotDelivered>(&outcome)) return undelivered->error;
  return std::get<std::optional<QXError>>(std::get<0>(outcome));
}

TEST_F(Churn, TwoHundredInstallationsUpdatesAndRemovalsLoseNoRequestAndLeaveNothingBehind) {
  constexpr int kRounds = 200;
  constexpr int kWaitEvery = 20;  // in these rounds the provider is waited for, so that it is sure to be seen at all
  const std::string first = makeVersion("one");
  const std::string second = makeVersion("two");
  start();
  // A first life, so that everything that is made once is made.
  installAndAwait("one");
  ASSERT_EQ(grant("letter"), std::nullopt);
  writeFile(house_.storage(kVane) + "/letter", "x");
  const std::string vaneString = house_.bookmark(item("letter").fileSystemPath());
  const std::string cellarString = house_.granted(letter_, kPicker);
  const QXURL cellarURL = QXURL::fileURL(letter_, QXURLKind::file);
  const ProviderID cellarID{kCellar};
  ASSERT_EQ(errorOf(caller_->ask<&DVDaemon::startProvidingItemAtURL>(cellarURL, cellarID, kPickerID)), std::nullopt);
  const std::size_t descriptorsWithIt = descriptors();
  uninstall();
  eventually("it is not found", [this] { return isUnknown(); });
  eventually("its process has ended", [this] { return house_.processesOf(kProgram).empty(); });
  eventually("the daemon has closed what it had of it", [&] { return descriptors() + kDescriptorsOfProcess <= descriptorsWithIt; });
  const std::size_t descriptorsBefore = descriptors();
  const std::size_t processesBefore = processes();
  const std::string memoryBefore = memory();
  const int passesBefore = passes();
  const auto began = std::chrono::steady_clock::now();

  Tally cellar;
  Tally starts;
  Tally grants;
  Tally resolutions;
  keepDoing([&cellar, &cellarURL, &cellarID](Client& client) {
    cellar.count(errorOf(client.ask<&DVDaemon::startProvidingItemAtURL>(cellarURL, cellarID, kPickerID)));
  });
  keepDoing([&cellar, &cellarURL, &cellarID](Client& client) {
    cellar.count(errorOf(client.ask<&DVDaemon::extendSandboxForFileURL>(cellarURL, cellarID, kPickerID)));
  });
  keepDoing([&cellar, &cellarString](Client& client) { cellar.count(resolve(client, cellarString, kPatience)); });
  keepDoing([&starts, this](Client& client) {
    starts.count(errorOf(client.ask<&DVDaemon::startProvidingItemAtURL>(item("letter"), kVaneID, kPickerID)));
  });
  keepDoing([&grants, this](Client& client) {
    grants.count(errorOf(client.ask<&DVDaemon::extendSandboxForFileURL>(item("letter"), kVaneID, kPickerID)));
  });
  keepDoing([&resolutions, &vaneString](Client& client) { resolutions.count(resolve(client, vaneString, 200ms)); });
  for (int round = 0; round < kRounds; ++round) {
    install(first);
    install(second);
    if (round % kWaitEvery == 0) eventually("the provider serves", [this] { return presentVersion() == "two"; });
    uninstall();
  }
  const auto churned = std::chrono::steady_clock::now();
  finish();

  eventually("it is not found", [this] { return isUnknown(); });
  eventually("its processes have ended", [this] { return house_.processesOf(kProgram).empty(); });
  // Or fewer: the other provider's process may have ended, as idle ones do.
  eventually("there are no more processes than before", [&] { return processes() <= processesBefore; });
  eventually("there are no more descriptors than before", [&] { return descriptors() <= descriptorsBefore; });
  using Seconds = std::chrono::duration<double>;
  const double settling = Seconds(std::chrono::steady_clock::now() - churned).count();
  std::cout << kRounds << " rounds in " << Seconds(churned - began).count() << " s, settled " << settling << " s later, "
            << passes() - passesBefore << " passes; " << processesBefore << " processes, " << descriptorsBefore << " descriptors, "
            << memoryBefore << " before, " << memory() << " after\n";

  cellar.expectOnly("the other provider", {kDone});
  // Its own clients are served, or told what the matter is: there is none, its process ended or could not be started, or it has gone
  // between its answer and the token for it. A string that names nobody is not answered.
  const auto code = [](DVErrorCode value) { return std::string(kDVErrorDomain) + " " + std::to_string(static_cast<int>(value)); };
  const std::string notFound = code(DVErrorCode::notFound);
  const std::string failed = code(DVErrorCode::pluginOperationFailed);
  starts.expectOnly("start providing", {kDone, notFound, failed});
  const std::string noToken = code(DVErrorCode::sandboxExtensionFailed);
  grants.expectOnly("grant", {kDone, notFound, failed, noToken});
  resolutions.expectOnly("resolve", {kDone, kNoAnswer, noToken, code(DVErrorCode::notPermitted)});

  installAndAwait("one");
  EXPECT_EQ(errorOf(caller_->ask<&DVDaemon::startProvidingItemAtURL>(item("letter"), kVaneID, kPickerID)), std::nullopt);
}

}  // namespace
}  // namespace docuvend::tests
