// The file-coordination service in memory.
//
// Differs from the real one: it never calls a provider object; tests do. May be used from any thread.
#pragma once

#include <memory>
#include <mutex>
#include <vector>

#include "platform/file_coordination.h"

namespace docuvend::fake_platform {

class FakeFileCoordinator final : public QXFileCoordinator {
 public:
  enum class Action { add, remove };

  struct Call {
    Action action;
    std::shared_ptr<QXDocuvend> provider;
    friend bool operator==(const Call&, const Call&) = default;
  };

  // Everything asked of the service, in order, harmless removals included.
  [[nodiscard]] std::vector<Call> calls() const;
  // The registered objects in the order of their additions; one that was added twice stands here twice.
  [[nodiscard]] std::vector<std::shared_ptr<QXDocuvend>> providers() const;

  void _addDocuvend(std::shared_ptr<QXDocuvend> provider) override;
  void _removeDocuvend(const std::shared_ptr<QXDocuvend>& provider) override;

 private:
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::vector<Call> calls_;
  std::vector<std::shared_ptr<QXDocuvend>> providers_;
};

}  // namespace docuvend::fake_platform
