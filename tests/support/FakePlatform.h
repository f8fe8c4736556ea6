// A whole platform of fakes, installed for the test's process.
//
// A process can install one platform only, so every test that makes one of these needs a process of its own, as each test here has.
// Everything of the fakes is reached through its members. Queues are turned by hand on the thread that made it; a test that wants threads
// takes another queue service, and does not destroy its platform while they run.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/QXPlatform.h"
#include "platform/fake/FakeApplicationRegistry.h"
#include "platform/fake/FakeDeviceLock.h"
#include "platform/fake/FakeExtensionHost.h"
#include "platform/fake/FakeFileCoordinator.h"
#include "platform/fake/FakeFileSystem.h"
#include "platform/fake/FakeLog.h"
#include "platform/fake/FakeNotificationCenter.h"
#include "platform/fake/FakePropertyLists.h"
#include "platform/fake/FakeQueues.h"
#include "platform/fake/FakeRpc.h"
#include "platform/fake/FakeSandbox.h"
#include "platform/fake/FakeStatus.h"

namespace docuvend::fake_platform {

template <class Queues>
class FakePlatformOver {
 public:
  FakePlatformOver() {
    QXPlatform::install({queues, log, rpc, applicationRegistry, sandbox, extensionHost, fileCoordinator, deviceLock, notificationCenter,
                         fileSystem, propertyLists, status});
  }
  // Conversations that the test left open own their extension, and are owned by it.
  ~FakePlatformOver() {
    for (const auto& vendor : vendors_) vendor->forget();
  }
  FakePlatformOver(const FakePlatformOver&) = delete;
  FakePlatformOver& operator=(const FakePlatformOver&) = delete;

  // A well-formed provider bundle: its record, and its group's container with the storage directory in it.
  void installProviderBundle(const std::string& identifier) {
    applicationRegistry.setProviderRecord(identifier, "group." + identifier, containerPath(identifier));
    fileSystem.addDirectory(storagePath(identifier));
  }
  // The bundle, and an extension whose initial setup succeeds. It is not announced: give the extensions to
  // `extensionHost.setExtensions`.
  std::shared_ptr<FakeExtension> installProvider(const std::string& identifier, int version = 1) {
    installProviderBundle(identifier);
    auto extension = std::make_shared<FakeExtension>(identifier, version);
    adopt(*extension);
    succeedSetup(*extension);
    return extension;
  }
  // Of an extension that was made elsewhere: what its conversations own is let go with the platform.
  void adopt(FakeExtension& extension) { vendors_.push_back(extension.vendor().shared_from_this()); }
  static void succeedSetup(FakeExtension& extension) {
    extension.vendor().respond("_performInitialSetupWithCompletion:", [](const QXArray&) {
      return QXArray{QXValue(), QXValue(), QXValue()};
    });
  }

  // Where `installProviderBundle` puts things.
  [[nodiscard]] static std::string containerPath(const std::string& identifier) { return "/containers/group." + identifier; }
  [[nodiscard]] static std::string storagePath(const std::string& identifier) { return containerPath(identifier) + "/Docuvend Storage"; }
  [[nodiscard]] static QXURL storageURL(const std::string& identifier) {
    return QXURL::fileURL(storagePath(identifier), QXURLKind::directory);
  }
  [[nodiscard]] static QXURL itemURL(const std::string& identifier, std::string_view name) {
    return storageURL(identifier).appendingPathComponent(name, QXURLKind::file);
  }

  Queues queues;
  FakeLog log;
  FakeRpcService rpc;
  FakeApplicationRegistry applicationRegistry;
  FakeSandbox sandbox;
  FakeExtensionHost extensionHost;
  FakeFileCoordinator fileCoordinator;
  FakeDeviceLock deviceLock;
  FakeNotificationCenter notificationCenter{queues.mainRunLoop()};
  FakeFileSystem fileSystem;
  FakePropertyLists propertyLists{fileSystem};
  FakeStatus status;

 private:
  std::vector<std::shared_ptr<FakeVendor>> vendors_;
};

using FakePlatform = FakePlatformOver<FakeQueues>;

}  // namespace docuvend::fake_platform
