// Publishes the named service "com.orvane.Docuvend" and has the providers discovered once the device has been unlocked since boot.
//
// Belongs to a shared_ptr; lives until the process ends. There is no orderly shutdown.
#pragma once

#include <functional>
#include <memory>

#include "acl/DVAccessControlStore.h"
#include "platform/rpc.h"
#include "service/DVAccessControlSource.h"

namespace docuvend {

class DVRpcListenerDelegate;

class DVServer final : public DVAccessControlSource, public std::enable_shared_from_this<DVServer> {
 public:
  // Null until `startCompletion`.
  [[nodiscard]] const std::shared_ptr<QXRpcListener>& listener() const { return listener_; }
  [[nodiscard]] const std::shared_ptr<DVRpcListenerDelegate>& listenerDelegate() const { return listenerDelegate_; }

  [[nodiscard]] std::shared_ptr<DVAccessControlStore> accessControlStore() const override { return accessControlStore_.lock(); }
  // Before `startCompletion`: from then on other threads read it.
  void setAccessControlStore(std::weak_ptr<DVAccessControlStore> store) { accessControlStore_ = std::move(store); }

  // Called once, on the main thread. On a device that has been unlocked since boot, or that has no lock, no client is accepted until
  // every provider that is installed has been tried; then the completion runs on the registry's thread. On any other device clients are
  // accepted at once and find no providers until the first unlock; the completion runs on the global queue. It may be empty.
  void startCompletion(std::function<void()> completion);

 private:
  [[nodiscard]] static bool isUnlockedOrUnprotected();
  void listenBeforeFirstUnlock(std::function<void()> completion);
  void listenOnceProvidersExist(std::function<void()> completion);

  // Set before the listener is resumed, constant from then on.
  std::shared_ptr<QXRpcListener> listener_;
  std::shared_ptr<DVRpcListenerDelegate> listenerDelegate_;
  std::weak_ptr<DVAccessControlStore> accessControlStore_;  // the shared store, which keeps itself alive
};

}  // namespace docuvend
