#include "platform/linux/extension_host/LinuxExtensionHost.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <thread>

#include "platform/linux/base/LogSubject.h"
#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/base/pidfd.h"
#include "platform/linux/extension_host/ExtensionErrors.h"
#include "tests/extension_host/support/RealExtensions.h"

namespace docuvend::linux_platform {
namespace {

using std::chrono::milliseconds;

class LinuxExtensionHostTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!RealExtensions::mayRun()) GTEST_FAIL();
  }

  static ExtensionTimes times(milliseconds linger, milliseconds answerLimit = milliseconds(10'000)) {
    ExtensionTimes result;
    result.linger = linger;
    result.answerLimit = answerLimit;
    return result;
  }
  static ExtensionTimes withGrace(milliseconds updateGrace) {
    ExtensionTimes result = times(/*linger=*/std::chrono::hours(1));
    result.updateGrace = updateGrace;
    return result;
  }
  // The bundle as it is found after `docuvendctl install` of another version.
  static Bundle updated(Bundle bundle) {
    bundle.version += ".1";
    bundle.incarnation = "another";
    return bundle;
  }
};

bool isOfKind(const std::optional<QXError>& error, ExtensionHostErrorCode code) {
  return error && error->domain == kExtensionHostErrorDomain && error->code == static_cast<std::int64_t>(code);
}

// Empty when the process has ended, also while it is read.
std::string commandLineAt(const std::filesystem::path& process) {
  const UniqueDescriptor file(::open((process / "cmdline").c_str(), O_RDONLY | O_CLOEXEC));
  std::string line;
  std::array<char, 4096> piece{};
  ssize_t count = 0;
  while (file && (count = ::read(file.get(), piece.data(), piece.size())) > 0) line.append(piece.data(), static_cast<std::size_t>(count));
  return line;
}

// True as soon as no process has the directory in its command line any more.
bool nobodyRuns(const std::string& directory) {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  bool isFound = true;
  while (isFound && std::chrono::steady_clock::now() < deadline) {
    isFound = false;
    for (const auto& entry : std::filesystem::directory_iterator("/proc")) {
      isFound = isFound || commandLineAt(entry.path()).find(directory) != std::string::npos;
    }
  }
  return !isFound;
}

TEST_F(LinuxExtensionHostTest, OnlyBundlesOfThePointAreExtensions) {
  RealExtensions real;
  Bundle other = real.makeBundle("com.orvane.other");
  other.info = {{"QXExtension", QXDictionary{{std::string(kQXExtensionPointName), "com.orvane.other-point"}}}};
  Bundle application = real.makeBundle("com.orvane.application");
  application.info.clear();
  const auto set = real.extensions({application, other, real.makeBundle("com.orvane.test")});
  ASSERT_EQ(set.size(), 1U);
  EXPECT_EQ(set.front()->identifier(), "com.orvane.test");
  EXPECT_EQ(set.front()->description(), "<QXExtension com.orvane.test>");
}

TEST_F(LinuxExtensionHostTest, AnUnchangedExtensionIsTheSameObject) {
  RealExtensions real;
  Reports reports;
  real.install({real.makeBundle("com.orvane.a")});
  const auto match = real.match(reports);
  const auto before = reports.await(0);
  real.install({real.makeBundle("com.orvane.a"), real.makeBundle("com.orvane.b")});
  const auto after = reports.await(1);
  ASSERT_TRUE(before && after);
  EXPECT_EQ(before->front(), after->front());
}

TEST_F(LinuxExtensionHostTest, AChangeThatChangesNothingIsNotReported) {
  RealExtensions real;
  Reports reports;
  real.install({real.makeBundle("com.orvane.a")});
  const auto match = real.match(reports);
  ASSERT_TRUE(reports.await(0));
  Bundle application = real.makeBundle("com.orvane.application");
  application.info.clear();
  real.install({real.makeBundle("com.orvane.a"), application});
  // A match that begins now is looked at in the same pass or in a later one.
  Reports later;
  const auto laterMatch = real.match(later);
  ASSERT_TRUE(later.await(0));
  EXPECT_EQ(reports.count(), 1U);
}

TEST_F(LinuxExtensionHostTest, HandlersRunOnAThreadOfTheirOwnAndOneAtATime) {
  RealExtensions real;
  const QXRpcInterface host = qxInterfaceOf<_QXDocuvendHostProtocol>();
  const QXRpcInterface vendor = qxInterfaceOf<_QXDocuvendVendor>();
  Reports reports;
  std::atomic<int> inside{0};
  std::atomic<bool> overlapped{false};
  std::atomic<bool> onCallersThread{false};
  const auto handler = [&reports, &inside, &overlapped, &onCallersThread, caller = std::this_thread::get_id()](
                           Reports::Set set, const std::optional<QXError>&) {
    if (++inside != 1) overlapped = true;
    if (std::this_thread::get_id() == caller) onCallersThread = true;
    std::this_thread::yield();
    --inside;
    reports.add(std::move(set));
  };
  const auto first = real.host().beginMatching({}, {host, vendor}, handler);
  const auto second = real.host().beginMatching({}, {host, vendor}, handler);
  ASSERT_TRUE(reports.await(1));
  real.install({real.makeBundle("com.orvane.a")});
  ASSERT_TRUE(reports.await(3));
  EXPECT_FALSE(overlapped);
  EXPECT_FALSE(onCallersThread);
}

TEST_F(LinuxExtensionHostTest, ADroppedMatchIsNotReportedTo) {
  RealExtensions real;
  Reports dropped;
  auto match = real.match(dropped);
  ASSERT_TRUE(dropped.await(0));
  match.reset();
  Reports other;
  const auto otherMatch = real.match(other);
  ASSERT_TRUE(other.await(0));
  real.install({real.makeBundle("com.orvane.a")});
  ASSERT_TRUE(other.await(1));
  EXPECT_EQ(dropped.count(), 1U);
}

TEST_F(LinuxExtensionHostTest, RequestsShareAProcess) {
  RealExtensions real;
  const auto extension = real.extension();
  const Conversation first(extension);
  const std::string process = first.identifier("process");
  EXPECT_EQ(Conversation(extension).identifier("process"), process);
  EXPECT_EQ(first.identifier("process"), process);
}

TEST_F(LinuxExtensionHostTest, ExtensionsDoNotShareAProcess) {
  RealExtensions real;
  const auto set = real.extensions({real.makeBundle("com.orvane.a"), real.makeBundle("com.orvane.b")});
  ASSERT_EQ(set.size(), 2U);
  EXPECT_NE(Conversation(set[0]).identifier("process"), Conversation(set[1]).identifier("process"));
}

TEST_F(LinuxExtensionHostTest, AProcessHasItsOutputsAndItsSocketAndNoOtherDescriptor) {
  RealExtensions real;
  EXPECT_EQ(Conversation(real.extension()).identifier("descriptors"), "0 1 2 3");
}

TEST_F(LinuxExtensionHostTest, AnIdleProcessEndsAfterTheLingerAndTheNextRequestStartsAnother) {
  RealExtensions real(times(milliseconds(1)));
  const auto extension = real.extension();
  const std::string process = Conversation(extension).identifier("process");
  ASSERT_TRUE(real.awaitLog("[INFO] The process of com.orvane.test exited with status 0."));
  const Conversation second(extension);
  EXPECT_FALSE(second.error());
  EXPECT_NE(second.identifier("process"), process);
}

TEST_F(LinuxExtensionHostTest, AProcessWithARequestIsNotIdle) {
  RealExtensions real(times(milliseconds(1)));
  const auto set = real.extensions({real.makeBundle("com.orvane.a"), real.makeBundle("com.orvane.b")});
  ASSERT_EQ(set.size(), 2U);
  const Conversation open(set[0]);
  const std::string process = open.identifier("process");
  { const Conversation over(set[0]); }
  // The other's end shows that time enough has gone by.
  ASSERT_NE(Conversation(set[1]).identifier("process"), "");
  ASSERT_TRUE(real.awaitLog("The process of com.orvane.b exited"));
  EXPECT_EQ(open.identifier("process"), process);
}

TEST_F(LinuxExtensionHostTest, AProcessThatOutlivesItsConnectionIsEndedBySignal) {
  ExtensionTimes quick = times(milliseconds(1));
  quick.endGrace = milliseconds(20);
  RealExtensions real(quick);
  const auto extension = real.extension();
  ASSERT_TRUE(await(Conversation(extension).start("stay")));
  ASSERT_TRUE(real.awaitLog("[INFO] The process of com.orvane.test was ended by signal "));
  EXPECT_FALSE(Conversation(extension).error());
}

TEST_F(LinuxExtensionHostTest, ACrashFailsTheMessagesThatWaitAndForgetsTheRequest) {
  RealExtensions real;
  const auto extension = real.extension();
  const Conversation conversation(extension);
  auto waiting = conversation.start("wait");
  const auto crashed = await(conversation.start("crash"));
  ASSERT_TRUE(crashed && crashed->error);
  const auto failed = await(std::move(waiting));
  ASSERT_TRUE(failed);
  EXPECT_TRUE(failed->error);
  ASSERT_TRUE(real.awaitLog("[NOTICE] The process of com.orvane.test "));
  EXPECT_EQ(extension->extensionContextForRequest(conversation.request()), nullptr);
}

TEST_F(LinuxExtensionHostTest, AfterOneCrashTheVeryNextRequestWorks) {
  RealExtensions real;
  const auto extension = real.extension();
  std::string process;
  {
    const Conversation conversation(extension);
    process = conversation.identifier("process");
    const auto crashed = await(conversation.start("crash"));
    ASSERT_TRUE(crashed && crashed->error);
  }
  const Conversation next(extension);
  ASSERT_FALSE(next.error()) << next.error()->description();
  const std::string other = next.identifier("process");
  EXPECT_FALSE(other.empty());
  EXPECT_EQ(other.find_first_not_of("0123456789"), std::string::npos) << other;
  EXPECT_NE(other, process);
}

TEST_F(LinuxExtensionHostTest, AMessageToAProcessThatIsGoneFails) {
  RealExtensions real;
  const Conversation conversation(real.extension());
  ASSERT_TRUE(await(conversation.start("leave")));
  const auto late = await(conversation.identify("process"));
  ASSERT_TRUE(late);
  EXPECT_TRUE(late->error);
}

TEST_F(LinuxExtensionHostTest, ARequestEndsWithTheFailureOfItsMessageAndItsLivingProcessCanBecomeIdle) {
  std::promise<QXError> failed;
  RealExtensions real(times(milliseconds(1)));
  const auto extension = real.extension();
  const auto begun = begin(*extension);
  ASSERT_TRUE(begun && begun->request);
  const auto context = extension->extensionContextForRequest(*begun->request);
  ASSERT_TRUE(context);
  const QXRemote<_QXDocuvendVendor> vendor(
      context->auxiliaryConnection()->remoteObjectProxy([&failed](const QXError& error) { failed.set_value(error); }));
  // No text on the wire holds this character: the message fails and the process lives.
  vendor.call<&_QXDocuvendVendor::_URLForItemIdentifier>(ItemID{"\x01"}, [](std::optional<QXError>, std::optional<QXURL>) {});
  ASSERT_TRUE(await(failed.get_future()));
  EXPECT_EQ(extension->extensionContextForRequest(*begun->request), nullptr);
  EXPECT_TRUE(real.awaitLog("[INFO] The process of com.orvane.test exited with status 0."));
}

TEST_F(LinuxExtensionHostTest, AfterTheSecondQuickDeathRequestsFailAtOnce) {
  ExtensionTimes slow;
  slow.quickDeath = std::chrono::minutes(10);
  slow.firstBackOff = std::chrono::minutes(10);
  RealExtensions real(slow);
  const auto extension = real.extension();
  for (int i = 0; i < 2; ++i) ASSERT_TRUE(await(Conversation(extension).start("crash")));
  const Conversation refused(extension);
  ASSERT_TRUE(refused.error());
  EXPECT_TRUE(isOfKind(refused.error(), ExtensionHostErrorCode::backingOff)) << refused.error()->description();
}

TEST_F(LinuxExtensionHostTest, AfterTheBackOffItIsStartedAgain) {
  ExtensionTimes quick;
  quick.quickDeath = std::chrono::minutes(10);
  quick.firstBackOff = milliseconds(1);
  RealExtensions real(quick);
  const auto extension = real.extension();
  for (int i = 0; i < 2; ++i) ASSERT_TRUE(await(Conversation(extension).start("crash")));
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  std::optional<QXError> error;
  do {
    error = Conversation(extension).error();
  } while (error && std::chrono::steady_clock::now() < deadline);
  EXPECT_FALSE(error);
}

TEST_F(LinuxExtensionHostTest, AnIdentifierThatIsNotAnsweredInTimeEndsTheProcess) {
  RealExtensions real(times(milliseconds(30'000), milliseconds(300)));
  const auto extension = real.extension();
  {
    const Conversation conversation(extension);
    const auto answer = await(conversation.identify("hang"));
    ASSERT_TRUE(answer);
    EXPECT_TRUE(isOfKind(answer->error, ExtensionHostErrorCode::notAnswering)) << (answer->error ? answer->error->description() : "");
    EXPECT_EQ(extension->extensionContextForRequest(conversation.request()), nullptr);
  }
  ASSERT_TRUE(real.awaitLog("did not answer _identifierForItemAtURL:completion: in time."));
  EXPECT_FALSE(Conversation(extension).error());
}

TEST_F(LinuxExtensionHostTest, StartingToProvideHasNoTimeLimitAndDelaysNoIdentifier) {
  RealExtensions real(times(milliseconds(30'000), milliseconds(500)));
  const auto set = real.extensions({real.makeBundle("com.orvane.a"), real.makeBundle("com.orvane.b")});
  ASSERT_EQ(set.size(), 2U);
  const Conversation slow(set[0]);
  const std::string process = slow.identifier("process");
  auto started = slow.start("wait");
  // The other's end shows that the limit has gone by.
  const auto hung = await(Conversation(set[1]).identify("hang"));
  ASSERT_TRUE(hung && hung->error);
  EXPECT_EQ(slow.identifier("process"), process);
  real.release("com.orvane.a");
  const auto answer = await(std::move(started));
  ASSERT_TRUE(answer);
  ASSERT_FALSE(answer->error) << answer->error->description();
  EXPECT_TRUE(answer->values[0].isAbsent());
}

TEST_F(LinuxExtensionHostTest, WhatAProcessWritesIsLoggedUnderItsName) {
  RealExtensions real;
  const Conversation conversation(real.extension());
  EXPECT_EQ(conversation.identifier("say-good evening"), "said");
  ASSERT_TRUE(real.awaitLog("[INFO] com.orvane.test: good evening"));
}

TEST_F(LinuxExtensionHostTest, ARefusalOfTheProviderIsItsAnswer) {
  RealExtensions real;
  EXPECT_NE(Conversation(real.extension()).identifier("nothing").find("no such item"), std::string::npos);
}

TEST_F(LinuxExtensionHostTest, AnAbsentArgumentIsAnErrorOfTheProviderLibrary) {
  RealExtensions real;
  const Conversation conversation(real.extension());
  const auto answer = await(conversation.send("_identifierForItemAtURL:completion:", {QXValue()}));
  ASSERT_TRUE(answer);
  ASSERT_FALSE(answer->error);
  EXPECT_NE(answer->values[0].as<QXError>(), nullptr);
}

TEST_F(LinuxExtensionHostTest, WithoutAnExecutableARequestFailsWithTheReason) {
  RealExtensions real;
  const Bundle bundle = real.makeBundle("com.orvane.test");
  std::filesystem::remove(bundle.executable);
  const auto set = real.extensions({bundle});
  ASSERT_EQ(set.size(), 1U);
  const Conversation conversation(set.front());
  ASSERT_TRUE(isOfKind(conversation.error(), ExtensionHostErrorCode::notStarted));
  ASSERT_TRUE(conversation.error()->underlying);
  EXPECT_NE(conversation.error()->underlying->description().find(bundle.executable), std::string::npos);
}

TEST_F(LinuxExtensionHostTest, AnExecutableThatDoesNotServeFailsTheMessages) {
  RealExtensions real;
  const Bundle bundle = real.makeBundle("com.orvane.test");
  std::ofstream(bundle.executable, std::ios::trunc) << "#!/bin/sh\necho nothing to serve\nexit 3\n";
  const auto set = real.extensions({bundle});
  ASSERT_EQ(set.size(), 1U);
  const auto answer = await(Conversation(set.front()).identify("process"));
  ASSERT_TRUE(answer);
  EXPECT_TRUE(answer->error);
  EXPECT_TRUE(real.awaitLog("[INFO] com.orvane.test: nothing to serve"));
}

TEST_F(LinuxExtensionHostTest, AnUpdatedExtensionsOldProcessEndsWithItsLastRequest) {
  RealExtensions real(withGrace(std::chrono::hours(1)));
  Bundle bundle = real.makeBundle("com.orvane.test");
  const auto old = real.extension();
  std::string process;
  {
    const Conversation conversation(old);
    process = conversation.identifier("process");
    bundle.version = "2";
    real.install({bundle});
    EXPECT_EQ(conversation.identifier("process"), process);
  }
  EXPECT_TRUE(real.awaitLog("The process of com.orvane.test exited with status 0."));
}

TEST_F(LinuxExtensionHostTest, ARemovedExtensionsProcessIsEndedAtOnceWhateverItHasNotAnswered) {
  RealExtensions real(withGrace(std::chrono::hours(1)));
  const auto extension = real.extension();
  const Conversation conversation(extension);
  auto first = conversation.start("wait");
  auto second = conversation.start("wait");
  ASSERT_NE(conversation.identifier("process"), "");
  real.install({});
  for (auto* waiting : {&first, &second}) {
    const auto failed = await(std::move(*waiting));
    ASSERT_TRUE(failed);
    EXPECT_TRUE(isOfKind(failed->error, ExtensionHostErrorCode::bundleIsGone)) << (failed->error ? failed->error->description() : "");
  }
  EXPECT_EQ(extension->extensionContextForRequest(conversation.request()), nullptr);
  EXPECT_TRUE(isOfKind(Conversation(extension).error(), ExtensionHostErrorCode::bundleIsGone));
  EXPECT_TRUE(nobodyRuns(real.home()));
  EXPECT_TRUE(real.awaitLog("[NOTICE] The bundle of com.orvane.test was removed or replaced: its process is ended."));
}

TEST_F(LinuxExtensionHostTest, WhatAMessageToARemovedExtensionComesToIsItsError) {
  RealExtensions real;
  const Conversation conversation(real.extension());
  ASSERT_NE(conversation.identifier("process"), "");
  real.install({});
  ASSERT_TRUE(real.awaitLog("[INFO] The process of com.orvane.test "));  // its first one may have seen the others end, and say so
  const auto late = await(conversation.identify("process"));
  ASSERT_TRUE(late);
  EXPECT_TRUE(isOfKind(late->error, ExtensionHostErrorCode::bundleIsGone)) << (late->error ? late->error->description() : "");
}

TEST_F(LinuxExtensionHostTest, TheProcessOfOneThatHasLostAnEntitlementIsEndedAtOnceAndRequestsGoToTheNextOnes) {
  RealExtensions real(withGrace(std::chrono::hours(1)));
  Reports reports;
  Bundle bundle = real.makeBundle("com.orvane.test");
  bundle.entitlements = {{"right", true}};
  real.install({bundle});
  const auto match = real.match(reports);
  const auto before = reports.await(0);
  ASSERT_TRUE(before && before->size() == 1);
  const Conversation conversation(before->front());
  const std::string process = conversation.identifier("process");
  auto waiting = conversation.start("wait");
  bundle.entitlements.clear();
  real.install({updated(bundle)});
  const auto after = reports.await(1);
  ASSERT_TRUE(after && after->size() == 1);
  const auto failed = await(std::move(waiting));
  ASSERT_TRUE(failed);
  EXPECT_TRUE(isOfKind(failed->error, ExtensionHostErrorCode::bundleIsGone)) << (failed->error ? failed->error->description() : "");
  const Conversation next(after->front());
  ASSERT_FALSE(next.error()) << next.error()->description();
  EXPECT_NE(next.identifier("process"), process);
  EXPECT_TRUE(isOfKind(Conversation(before->front()).error(), ExtensionHostErrorCode::bundleIsGone));
}

TEST_F(LinuxExtensionHostTest, ASlowMatchHandlerKeepsNoProcessWhoseBundleIsGone) {
  RealExtensions real;
  const auto extension = real.extension();
  const QXRpcInterface host = qxInterfaceOf<_QXDocuvendHostProtocol>();
  const QXRpcInterface vendor = qxInterfaceOf<_QXDocuvendVendor>();
  std::promise<void> mayGoOn;
  const auto held = mayGoOn.get_future().share();
  const auto reports = std::make_shared<Reports>();  // the handler may still be at work when the test is over
  const Conversation conversation(extension);
  auto waiting = conversation.start("wait");
  ASSERT_NE(conversation.identifier("process"), "");
  const auto slow = real.host().beginMatching({}, {host, vendor}, [reports, held](Reports::Set set, const std::optional<QXError>&) {
    const bool isEmpty = set.empty();
    reports->add(std::move(set));
    if (isEmpty) held.wait();
  });
  ASSERT_TRUE(reports->await(0));
  real.install({});
  const auto failed = await(std::move(waiting));
  mayGoOn.set_value();
  ASSERT_TRUE(failed);
  EXPECT_TRUE(isOfKind(failed->error, ExtensionHostErrorCode::bundleIsGone));
}

TEST_F(LinuxExtensionHostTest, AnExtensionWhoseMatchWasDroppedEndsWithItsBundleToo) {
  RealExtensions real;
  Reports reports;
  real.install({real.makeBundle("com.orvane.test")});
  auto match = real.match(reports);
  const auto set = reports.await(0);
  ASSERT_TRUE(set && set->size() == 1);
  match.reset();
  const Conversation conversation(set->front());
  auto waiting = conversation.start("wait");
  ASSERT_NE(conversation.identifier("process"), "");
  real.install({});
  const auto failed = await(std::move(waiting));
  ASSERT_TRUE(failed);
  EXPECT_TRUE(isOfKind(failed->error, ExtensionHostErrorCode::bundleIsGone));
}

TEST_F(LinuxExtensionHostTest, AnUpdatedExtensionsProcessMayEndWhatItIsAbout) {
  RealExtensions real(withGrace(std::chrono::hours(1)));
  Reports reports;
  const Bundle bundle = real.makeBundle("com.orvane.test");
  real.install({bundle});
  const auto match = real.match(reports);
  const auto before = reports.await(0);
  ASSERT_TRUE(before && before->size() == 1);
  auto conversation = std::make_unique<Conversation>(before->front());
  const std::string process = conversation->identifier("process");
  auto waiting = conversation->start("wait");
  real.install({updated(bundle)});
  const auto after = reports.await(1);
  ASSERT_TRUE(after && after->size() == 1);
  EXPECT_NE(Conversation(after->front()).identifier("process"), process) << "a new request is the updated one's";
  EXPECT_EQ(Conversation(before->front()).identifier("process"), process);
  real.release();
  const auto answer = await(std::move(waiting));
  ASSERT_TRUE(answer);
  EXPECT_FALSE(answer->error) << answer->error->description();
  conversation.reset();
  EXPECT_TRUE(real.awaitLog("The process of com.orvane.test exited with status 0.")) << "it does not linger";
}

TEST_F(LinuxExtensionHostTest, AnUpdatedExtensionsProcessIsEndedWhenTheGraceIsOver) {
  RealExtensions real(withGrace(milliseconds(1)));
  const auto extension = real.extension();
  const Conversation conversation(extension);
  auto waiting = conversation.start("wait");
  ASSERT_NE(conversation.identifier("process"), "");
  real.install({updated(real.makeBundle("com.orvane.test"))});
  const auto failed = await(std::move(waiting));
  ASSERT_TRUE(failed);
  EXPECT_TRUE(isOfKind(failed->error, ExtensionHostErrorCode::bundleIsGone)) << (failed->error ? failed->error->description() : "");
  EXPECT_TRUE(isOfKind(Conversation(extension).error(), ExtensionHostErrorCode::bundleIsGone));
}

TEST_F(LinuxExtensionHostTest, AnExtensionThatIsUpdatedWhileItsProcessStartsHasTheGraceAndNoMore) {
  RealExtensions real(withGrace(milliseconds(500)));
  const Bundle other = real.makeBundle("com.orvane.a");
  const Bundle bundle = real.makeBundle("com.orvane.b");
  real.install({other, bundle});
  Reports reports;
  const auto match = real.match(reports);
  const auto set = reports.await(0);
  ASSERT_TRUE(set && set->size() == 2);
  std::promise<void> mayGoOn;
  std::promise<void> isHeldUp;
  // The first request's completion holds up the thread that starts processes.
  set->front()->beginExtensionRequest([&mayGoOn, &isHeldUp](std::optional<QXUUID>, std::optional<QXError>) {
    isHeldUp.set_value();
    mayGoOn.get_future().wait();
  });
  isHeldUp.get_future().wait();
  std::promise<Begun> begun;
  set->back()->beginExtensionRequest([&begun](std::optional<QXUUID> request, std::optional<QXError> error) {
    begun.set_value({request, std::move(error)});
  });
  real.install({other, updated(bundle)});
  ASSERT_TRUE(reports.await(1));
  mayGoOn.set_value();
  // A machine that is too busy to start it within the grace does not start it at all.
  const auto started = await(begun.get_future());
  ASSERT_TRUE(started);
  const auto context = started->request ? set->back()->extensionContextForRequest(*started->request) : nullptr;
  if (context) {
    const auto failed = std::make_shared<std::promise<QXError>>();
    const QXRemote<_QXDocuvendVendor> vendor(
        context->auxiliaryConnection()->remoteObjectProxy([failed](const QXError& error) { failed->set_value(error); }));
    vendor.call<&_QXDocuvendVendor::_startProvidingItemAtURL>(QXURL::fileURL("/wait", QXURLKind::file), [](std::optional<QXError>) {});
    const auto error = await(failed->get_future());
    EXPECT_TRUE(isOfKind(error, ExtensionHostErrorCode::bundleIsGone)) << (error ? error->description() : "");
  }
  EXPECT_TRUE(isOfKind(Conversation(set->back()).error(), ExtensionHostErrorCode::bundleIsGone));
}

TEST_F(LinuxExtensionHostTest, AnEditedExtensionThatIsRemovedHasNoMoreGrace) {
  RealExtensions real(withGrace(std::chrono::hours(1)));
  Reports reports;
  const Bundle bundle = real.makeBundle("com.orvane.test");
  real.install({bundle});
  const auto match = real.match(reports);
  const auto before = reports.await(0);
  ASSERT_TRUE(before && before->size() == 1);
  const Conversation conversation(before->front());
  auto waiting = conversation.start("wait");
  ASSERT_NE(conversation.identifier("process"), "");
  real.install({updated(bundle)});
  ASSERT_TRUE(reports.await(1));
  EXPECT_NE(conversation.identifier("process"), "");
  real.install({});
  const auto failed = await(std::move(waiting));
  ASSERT_TRUE(failed);
  EXPECT_TRUE(isOfKind(failed->error, ExtensionHostErrorCode::bundleIsGone));
}

TEST_F(LinuxExtensionHostTest, ARequestThatWaitsForAProcessFailsWhenTheBundleIsRemovedAndNoneIsStarted) {
  std::promise<std::optional<QXError>> answer;
  RealExtensions real;
  const Bundle other = real.makeBundle("com.orvane.a");
  const Bundle last = real.makeBundle("com.orvane.c");
  const auto set = real.extensions({other, real.makeBundle("com.orvane.b"), last});
  ASSERT_EQ(set.size(), 3U);
  std::promise<void> mayGoOn;
  std::promise<void> isHeldUp;
  // The first request's completion holds up the thread that starts processes.
  set[0]->beginExtensionRequest([&mayGoOn, &isHeldUp](std::optional<QXUUID>, std::optional<QXError>) {
    isHeldUp.set_value();
    mayGoOn.get_future().wait();
  });
  isHeldUp.get_future().wait();
  set[1]->beginExtensionRequest(
      [&answer](const std::optional<QXUUID>&, std::optional<QXError> error) { answer.set_value(std::move(error)); });
  real.install({other, last});
  const auto error = await(answer.get_future());
  mayGoOn.set_value();
  ASSERT_TRUE(error);
  EXPECT_TRUE(isOfKind(*error, ExtensionHostErrorCode::bundleIsGone));
  EXPECT_TRUE(isOfKind(Conversation(set[1]).error(), ExtensionHostErrorCode::bundleIsGone));
  // The thread starts one after another, and makes the container of what it starts.
  ASSERT_FALSE(Conversation(set[2]).error());
  EXPECT_TRUE(std::filesystem::exists(last.container));
  EXPECT_FALSE(std::filesystem::exists(real.home() + "/containers/com.orvane.b"));
}

TEST_F(LinuxExtensionHostTest, NoProcessOutlivesTheHost) {
  // Ended at once after its start or when it runs: each moment of a start has its own way of leaving something behind.
  for (const char* moment : {"starting", "running"}) {
    RealExtensions real;
    const auto extension = real.extension();
    const Conversation conversation(extension);
    ASSERT_FALSE(conversation.error());
    if (std::string(moment) == "running") {
      ASSERT_NE(conversation.identifier("process"), "");
    }
    const UniqueDescriptor process = openPidfd(conversation.connection()->processIdentifier());
    ASSERT_TRUE(process);
    real.dropHost();
    pollfd ended{process.get(), POLLIN, 0};
    EXPECT_EQ(poll(&ended, 1, static_cast<int>(milliseconds(kPatience).count())), 1) << moment;
    EXPECT_TRUE(nobodyRuns(real.home())) << moment;
    EXPECT_TRUE(Conversation(extension).error()) << moment;
  }
}

TEST_F(LinuxExtensionHostTest, WhenTheHostGoesMessagesThatWaitFail) {
  RealExtensions real;
  const Conversation conversation(real.extension());
  auto waiting = conversation.start("wait");
  ASSERT_NE(conversation.identifier("process"), "");
  real.dropHost();
  const auto failed = await(std::move(waiting));
  ASSERT_TRUE(failed);
  EXPECT_TRUE(isOfKind(failed->error, ExtensionHostErrorCode::stopped));
}

TEST_F(LinuxExtensionHostTest, TheStatusOfARunningExtensionNamesItsProcessAndCountsItsRequests) {
  RealExtensions real;
  const auto extension = real.extension();
  EXPECT_EQ(real.status(), (QXDictionary{{"state", "not running"}, {"openRequests", 0}, {"badLivesInARow", 0}}));
  const Conversation first(extension);
  ASSERT_FALSE(first.error());
  const int process = first.connection()->processIdentifier();
  {
    const Conversation second(extension);
    EXPECT_EQ(real.status(),
              (QXDictionary{{"state", "running"}, {"openRequests", 2}, {"badLivesInARow", 0}, {"processIdentifier", process}}));
  }
  EXPECT_EQ(real.status(),
            (QXDictionary{{"state", "running"}, {"openRequests", 1}, {"badLivesInARow", 0}, {"processIdentifier", process}}));
}

TEST_F(LinuxExtensionHostTest, ARequestThatWaitsForAProcessCountsAsOpen) {
  std::promise<QXDictionary> during;
  std::atomic<bool> isBegun = false;
  RealExtensions real;
  // The first request's completion holds up the thread that starts processes, so the second one's process cannot be there yet.
  const auto set = real.extensions({real.makeBundle("com.orvane.a"), real.makeBundle("com.orvane.b")});
  ASSERT_EQ(set.size(), 2U);
  set[0]->beginExtensionRequest([&](std::optional<QXUUID>, std::optional<QXError>) {
    set[1]->beginExtensionRequest([&isBegun](std::optional<QXUUID>, std::optional<QXError>) { isBegun = true; });
    during.set_value(real.status("com.orvane.b"));
  });
  const auto status = await(during.get_future());
  ASSERT_TRUE(status);
  EXPECT_EQ(*status, (QXDictionary{{"state", "starting"}, {"openRequests", 1}, {"badLivesInARow", 0}}));
  real.dropHost();
  EXPECT_TRUE(isBegun);
}

// It runs on the thread that starts processes, which is at work for nobody in particular.
TEST_F(LinuxExtensionHostTest, ARequestThatWaitsForAProcessIsCompletedForWhomItWasBegun) {
  std::promise<LogSubject::Name> subject;
  RealExtensions real;
  const auto extension = real.extension();
  {
    const LogSubject beginners(std::make_shared<const std::string>("com.example.app"));
    extension->beginExtensionRequest(
        [&subject](std::optional<QXUUID>, std::optional<QXError>) { subject.set_value(LogSubject::current()); });
  }
  const auto completed = await(subject.get_future());
  ASSERT_TRUE(completed && *completed);
  EXPECT_EQ(**completed, "com.example.app");
}

TEST_F(LinuxExtensionHostTest, TheStatusOfAnExtensionThatBacksOffSaysForHowLong) {
  ExtensionTimes slow;
  slow.quickDeath = std::chrono::minutes(10);
  slow.firstBackOff = std::chrono::minutes(10);
  RealExtensions real(slow);
  const auto extension = real.extension();
  for (int i = 0; i < 2; ++i) ASSERT_TRUE(await(Conversation(extension).start("crash")));
  ASSERT_TRUE(Conversation(extension).error());
  QXDictionary status = real.status();
  const auto* left = qxFind<std::int64_t>(status, "refusedForMilliseconds");
  ASSERT_NE(left, nullptr);
  EXPECT_GT(*left, 0);
  EXPECT_LE(*left, milliseconds(slow.firstBackOff).count());
  status.erase("refusedForMilliseconds");
  EXPECT_EQ(status, (QXDictionary{{"state", "backing off"}, {"openRequests", 0}, {"badLivesInARow", 2}}));
}

TEST_F(LinuxExtensionHostTest, ARemovedExtensionHasAStatusAsLongAsItHasAProcess) {
  RealExtensions real;
  const auto extension = real.extension();
  const Conversation conversation(extension);
  ASSERT_FALSE(conversation.error());
  EXPECT_FALSE(real.status().empty());
  real.install({});
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (!real.host().status().empty() && std::chrono::steady_clock::now() < deadline) std::this_thread::yield();
  EXPECT_EQ(real.host().status(), QXDictionary{});
}

TEST_F(LinuxExtensionHostTest, AnUpdatedExtensionsStatusIsThatOfTheNewOne) {
  RealExtensions real;
  const auto old = real.extension();
  const Conversation conversation(old);
  ASSERT_FALSE(conversation.error());
  Bundle bundle = real.makeBundle("com.orvane.test");
  bundle.version = "2";
  real.install({bundle});
  Reports later;
  const auto match = real.match(later);
  ASSERT_TRUE(later.await(0));
  EXPECT_EQ(real.status(), (QXDictionary{{"state", "not running"}, {"openRequests", 0}, {"badLivesInARow", 0}}));
}

TEST_F(LinuxExtensionHostTest, AConnectionAnswersForTheBundle) {
  RealExtensions real;
  Bundle bundle = real.makeBundle("com.orvane.test");
  bundle.entitlements.emplace("com.orvane.right", true);
  const auto set = real.extensions({bundle});
  ASSERT_EQ(set.size(), 1U);
  const Conversation conversation(set.front());
  ASSERT_FALSE(conversation.error());
  EXPECT_EQ(conversation.connection()->valueForEntitlement("com.orvane.right"), QXValue(true));
  EXPECT_FALSE(conversation.connection()->valueForEntitlement("com.orvane.wrong"));
  EXPECT_EQ(conversation.connection()->auditToken(), QXAuditToken{});
}

}  // namespace
}  // namespace docuvend::linux_platform
