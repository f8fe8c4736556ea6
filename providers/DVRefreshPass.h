// Brings the registry to the extensions that are installed now. One pass at a time; a pass lives until its end, held by its own tasks.
#pragma once

#include <memory>
#include <vector>

#include "platform/extension_host.h"
#include "providers/DVExtensionDocuvend.h"

namespace docuvend {

class DVRefreshPass : public std::enable_shared_from_this<DVRefreshPass> {
 public:
  using Extensions = std::vector<std::shared_ptr<QXExtension>>;

  explicit DVRefreshPass(Extensions installed) : installed_(std::move(installed)) {}

  // On the registry's refresh operations queue, which stays suspended until the pass has ended: on the global queue, with the pending
  // start-up completion if there is one.
  void refreshOperationsQueueStart();

 private:
  void concurrentQueueRebuild();
  void registerNewProviders();
  void end();

  const Extensions installed_;
  DVExtensionDocuvend::Providers toRegister_;  // filled by the rebuild, used after it
};

}  // namespace docuvend
