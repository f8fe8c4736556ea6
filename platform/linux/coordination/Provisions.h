// What providers are being asked to bring, who waits for it, and which processes have it.
//
// A pure value: it asks nobody. A request is one object's work on one file; whoever wants the same of the same object before it is finished
// waits for it too. For one application a limited number of requests to an object is under way; the further ones wait for that, each as
// long as somebody waits for it, and hold up no other application's readers, also of the same file.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <utility>
#include <vector>

#include "platform/file_coordination.h"
#include "platform/linux/coordination/AccessHolder.h"
#include "platform/linux/coordination/AccessTable.h"
#include "platform/linux/coordination/ApplicationLines.h"

namespace docuvend::linux_platform {

using ProvideRequest = std::uint64_t;

class Provisions {
 public:
  // Of one application to one object. Who gives up a read has its request go on all the same, so accesses are no limit on these.
  static constexpr std::size_t kMaximumRequestsUnderWay = 64;

  using Provider = ApplicationLines::Provider;

  // A request that is under way now: the caller asks the object, in the name of that access.
  struct Question {
    ProvideRequest request;
    AccessNumber number;
  };
  enum class Wait { forNewRequest, forRunningRequest, inLine };
  struct Joined {
    ProvideRequest request;
    Wait wait;  // for a new one the caller asks the object
  };
  // An access of that process and application waits for the file's contents.
  [[nodiscard]] Joined join(const Provider& provider, const FileKey& file, AccessNumber number, const QXAuditToken& process,
                            const Application& application);
  // It waits no longer; a request that is under way goes on.
  void leave(AccessNumber number);
  // All who wait for a request that is not under way leave: these.
  [[nodiscard]] std::set<AccessNumber> leaveLines();

  struct Finished {
    Provider provider;  // let go where its end may call back
    FileKey file;
    std::vector<AccessNumber> waiting;  // in the order in which they came
    std::set<QXAuditToken> processes;   // all that have waited, those too that left
    std::optional<Question> next;       // to the same object
  };
  // None when it was finished before.
  [[nodiscard]] std::optional<Finished> finish(ProvideRequest request);

  // Whether the contents were brought for a process since it has the file's turn: noted by the caller, who knows of turns.
  void noteProvided(const FileKey& file, const QXAuditToken& process) { provided_.emplace(file, process); }
  void noteTurnIsOver(const FileKey& file, const QXAuditToken& process) { provided_.erase({file, process}); }
  [[nodiscard]] bool isProvided(const FileKey& file, const QXAuditToken& process) const { return provided_.contains({file, process}); }

  // True when nobody waits, no request runs, and nothing is noted.
  [[nodiscard]] bool isEmpty() const {
    return requests_.empty() && numbers_.empty() && waiting_.empty() && provided_.empty() && lines_.isEmpty();
  }

 private:
  struct Request {
    Finished state;                       // as it stands
    std::optional<Application> underWay;  // in whose line; none: it waits in the lines of those who wait for it
  };
  struct Waiting {
    ProvideRequest request;
    Application application;
  };
  // The head of that line, when the line has room for it.
  [[nodiscard]] std::optional<Question> begin(const Provider& provider, const Application& application);

  ProvideRequest last_ = 0;
  std::map<ProvideRequest, Request> requests_;
  std::map<std::pair<Provider, FileKey>, ProvideRequest> numbers_;
  std::map<AccessNumber, Waiting> waiting_;
  ApplicationLines lines_{kMaximumRequestsUnderWay};
  std::set<std::pair<FileKey, QXAuditToken>> provided_;
};

}  // namespace docuvend::linux_platform
