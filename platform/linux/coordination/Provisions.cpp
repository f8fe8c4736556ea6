#include "platform/linux/coordination/Provisions.h"

#include <algorithm>

namespace docuvend::linux_platform {

Provisions::Joined Provisions::join(const std::shared_ptr<QXDocuvend>& provider, const FileKey& file, AccessNumber number,
                                    const QXAuditToken& process) {
  auto found = std::find_if(running_.begin(), running_.end(), [&provider, &file](const auto& running) {
    return running.second.provider == provider && running.second.file == file;
  });
  const Wait wait = found == running_.end() ? Wait::forNewRequest : Wait::forRunningRequest;
  if (wait == Wait::forNewRequest) found = running_.emplace(++last_, Finished{provider, file, /*waiting=*/{}, /*processes=*/{}}).first;
  Finished& state = found->second;
  state.waiting.push_back(number);
  state.processes.insert(process);
  waiting_.emplace(number, found->first);
  return {found->first, wait};
}

void Provisions::leave(AccessNumber number) {
  const auto found = waiting_.find(number);
  if (found == waiting_.end()) return;
  std::erase(running_.at(found->second).waiting, number);
  waiting_.erase(found);
}

std::optional<Provisions::Finished> Provisions::finish(ProvideRequest request) {
  const auto found = running_.find(request);
  if (found == running_.end()) return std::nullopt;
  Finished finished = std::move(found->second);
  running_.erase(found);
  for (const AccessNumber number : finished.waiting) waiting_.erase(number);
  return finished;
}

}  // namespace docuvend::linux_platform
