#include "platform/linux/coordination/Provisions.h"

#include <algorithm>
#include <cassert>

namespace docuvend::linux_platform {

Provisions::Joined Provisions::join(const Provider& provider, const FileKey& file, AccessNumber number, const QXAuditToken& process,
                                    const Application& application) {
  const auto [place, isNew] = numbers_.try_emplace({provider, file}, last_ + 1);
  if (isNew) requests_.emplace(++last_, Request{{provider, file, /*waiting=*/{}, /*processes=*/{}, /*next=*/{}}, /*underWay=*/{}});
  const ProvideRequest wanted = place->second;
  Request& request = requests_.at(wanted);
  request.state.waiting.push_back(number);
  request.state.processes.insert(process);
  waiting_.emplace(number, Waiting{wanted, application});
  if (request.underWay) return {wanted, Wait::forRunningRequest};
  lines_.enter(provider, application, file);
  // Only a line that was empty gives what has come last.
  return {wanted, begin(provider, application) ? Wait::forNewRequest : Wait::inLine};
}

void Provisions::leave(AccessNumber number) {
  const auto left = waiting_.extract(number);
  if (left.empty()) return;
  const Waiting& gone = left.mapped();
  const auto found = requests_.find(gone.request);
  Request& request = found->second;
  std::erase(request.state.waiting, number);
  if (request.underWay) return;
  const bool isLast = std::none_of(request.state.waiting.begin(), request.state.waiting.end(),
                                   [this, &gone](AccessNumber other) { return waiting_.at(other).application == gone.application; });
  if (isLast) lines_.leave(request.state.provider, gone.application, request.state.file);
  if (!request.state.waiting.empty()) return;
  numbers_.erase({request.state.provider, request.state.file});
  requests_.erase(found);
}

std::set<AccessNumber> Provisions::leaveLines() {
  std::set<AccessNumber> numbers;
  for (const auto& [number, waiting] : waiting_) {
    if (!requests_.at(waiting.request).underWay) numbers.insert(number);
  }
  for (const AccessNumber number : numbers) leave(number);
  return numbers;
}

std::optional<Provisions::Finished> Provisions::finish(ProvideRequest request) {
  const auto found = requests_.find(request);
  if (found == requests_.end()) return std::nullopt;
  Finished finished = std::move(found->second.state);
  const std::optional<Application> underWay = std::move(found->second.underWay);
  requests_.erase(found);
  numbers_.erase({finished.provider, finished.file});
  for (const AccessNumber number : finished.waiting) waiting_.erase(number);
  assert(underWay);
  lines_.end(finished.provider, *underWay);
  finished.next = begin(finished.provider, *underWay);
  return finished;
}

std::optional<Provisions::Question> Provisions::begin(const Provider& provider, const Application& application) {
  const auto file = lines_.begin(provider, application);
  if (!file) return std::nullopt;
  const ProvideRequest number = numbers_.at({provider, *file});
  Request& request = requests_.at(number);
  request.underWay = application;
  const auto& waiting = request.state.waiting;
  const auto asker = std::find_if(waiting.begin(), waiting.end(),
                                  [this, &application](AccessNumber access) { return waiting_.at(access).application == application; });
  assert(asker != waiting.end());
  return Question{number, *asker};
}

}  // namespace docuvend::linux_platform
