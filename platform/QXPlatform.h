// The seam: one reference per platform service. The entry point installs it once, before anything else runs.
#pragma once

#include "platform/application_registry.h"
#include "platform/device_lock.h"
#include "platform/extension_host.h"
#include "platform/file_coordination.h"
#include "platform/file_system.h"
#include "platform/log.h"
#include "platform/notification_center.h"
#include "platform/property_list.h"
#include "platform/queue.h"
#include "platform/rpc.h"
#include "platform/sandbox.h"
#include "platform/status.h"

namespace docuvend {

struct QXPlatform {
  QXQueueService& queues;
  QXLogService& log;
  QXRpcService& rpc;
  QXApplicationRegistry& applicationRegistry;
  QXSandbox& sandbox;
  QXExtensionHost& extensionHost;
  QXFileCoordinator& fileCoordinator;
  QXDeviceLock& deviceLock;
  QXNotificationCenter& notificationCenter;
  QXFileSystem& fileSystem;
  QXPropertyLists& propertyLists;
  QXStatusSource& status;

  // The services must outlive the process's use of them; a second installation is a defect.
  static void install(const QXPlatform& platform);
  [[nodiscard]] static const QXPlatform& current();
};

}  // namespace docuvend
