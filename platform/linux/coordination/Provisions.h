// What providers are being asked to bring, who waits for it, and which processes have it.
//
// A pure value: it asks nobody. A request is one object's work on one file; whoever wants the same of the same object while it runs waits
// for it too.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <utility>
#include <vector>

#include "platform/file_coordination.h"
#include "platform/linux/coordination/AccessTable.h"

namespace docuvend::linux_platform {

using ProvideRequest = std::uint64_t;

class Provisions {
 public:
  enum class Wait { forNewRequest, forRunningRequest };
  struct Joined {
    ProvideRequest request;
    Wait wait;  // for a new one the caller asks the object
  };
  // An access of that process waits for the file's contents.
  [[nodiscard]] Joined join(const std::shared_ptr<QXDocuvend>& provider, const FileKey& file, AccessNumber number,
                            const QXAuditToken& process);
  // It waits no longer; the request goes on.
  void leave(AccessNumber number);

  struct Finished {
    std::shared_ptr<QXDocuvend> provider;  // let go where its end may call back
    FileKey file;
    std::vector<AccessNumber> waiting;  // in the order in which they came
    std::set<QXAuditToken> processes;   // all that have waited, those too that left
  };
  // None when it was finished before.
  [[nodiscard]] std::optional<Finished> finish(ProvideRequest request);

  // Whether the contents were brought for a process since it has the file's turn: noted by the caller, who knows of turns.
  void noteProvided(const FileKey& file, const QXAuditToken& process) { provided_.emplace(file, process); }
  void noteTurnIsOver(const FileKey& file, const QXAuditToken& process) { provided_.erase({file, process}); }
  [[nodiscard]] bool isProvided(const FileKey& file, const QXAuditToken& process) const { return provided_.contains({file, process}); }

  // True when nobody waits, no request runs, and nothing is noted.
  [[nodiscard]] bool isEmpty() const { return running_.empty() && waiting_.empty() && provided_.empty(); }

 private:
  ProvideRequest last_ = 0;
  std::map<ProvideRequest, Finished> running_;  // each as it stands
  std::map<AccessNumber, ProvideRequest> waiting_;
  std::set<std::pair<FileKey, QXAuditToken>> provided_;
};

}  // namespace docuvend::linux_platform
