#include "daemon/DVServer.h"

#include "common/DVLog.h"
#include "daemon/DVRpcListenerDelegate.h"
#include "platform/QXPlatform.h"
#include "providers/DVExtensionDocuvend.h"
#include "service/DVDaemon.h"

namespace docuvend {

void DVServer::startCompletion(std::function<void()> completion) {
  dvLog("[INFO] Server starting.");
  listener_ = QXPlatform::current().rpc.listenerForService(kDVServiceName);
  listenerDelegate_ = std::make_shared<DVRpcListenerDelegate>(weak_from_this());
  listener_->setDelegate(listenerDelegate_);

  QXPlatform::current().notificationCenter.addObserver(
      kQXFirstUnlockNotification, [] { DVExtensionDocuvend::createInstancesCompletion(/*completion=*/{}); },
      QXSuspensionBehavior::deliverImmediately);

  if (isUnlockedOrUnprotected()) {
    listenOnceProvidersExist(std::move(completion));
  } else {
    listenBeforeFirstUnlock(std::move(completion));
  }
}

bool DVServer::isUnlockedOrUnprotected() {
  QXDeviceLock& lock = QXPlatform::current().deviceLock;
  return lock.lockState() == kQXLockStateUnprotected || lock.unlockedSinceBoot();
}

void DVServer::listenBeforeFirstUnlock(std::function<void()> completion) {
  dvLog("[INFO] Not instantiating docuvends until first unlock.");
  listener_->resume();
  if (completion) QXPlatform::current().queues.globalQueue().async(std::move(completion));
}

void DVServer::listenOnceProvidersExist(std::function<void()> completion) {
  DVExtensionDocuvend::createInstancesCompletion([strongSelf = shared_from_this(), completion = std::move(completion)] {
    strongSelf->listener_->resume();
    if (completion) completion();
  });
}

}  // namespace docuvend
