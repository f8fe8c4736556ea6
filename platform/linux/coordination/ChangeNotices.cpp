#include "platform/linux/coordination/ChangeNotices.h"

#include <algorithm>
#include <iterator>

namespace docuvend::linux_platform {

bool ChangeNotices::add(const Provider& provider, const FileChange& change) {
  const auto running = underWay_.find({provider, change.file.key});
  if (running != underWay_.end()) {
    running->second.owed = change;
    return false;
  }
  queue(provider, change);
  // Only a line that was empty gives what was queued last.
  return begin(provider, change.writer.bundleIdentifier).has_value();
}

std::vector<ChangeNotices::Notice> ChangeNotices::end(const Provider& provider, const FileKey& file) {
  const auto ended = underWay_.extract({provider, file});
  if (ended.empty()) return {};
  const auto& [application, owed] = ended.mapped();
  --lines_.at({provider, application}).underWay;
  if (owed) queue(provider, *owed);
  std::vector<Notice> notices;
  if (auto next = begin(provider, application)) notices.push_back(std::move(*next));
  if (owed && owed->writer.bundleIdentifier != application) {
    if (auto next = begin(provider, owed->writer.bundleIdentifier)) notices.push_back(std::move(*next));
  }
  return notices;
}

std::vector<FileChange> ChangeNotices::takeFromAllBut(const std::vector<Provider>& providers) {
  const auto isOther = [&providers](const Provider& provider) {
    return std::find(providers.begin(), providers.end(), provider) == providers.end();
  };
  std::vector<FileChange> taken;
  for (auto& [place, notice] : underWay_) {
    if (!notice.owed || !isOther(place.first)) continue;
    taken.push_back(std::move(*notice.owed));
    notice.owed.reset();
  }
  for (auto& [of, line] : lines_) {
    if (!isOther(of.first)) continue;
    for (const FileChange& change : line.waiting) waiting_.erase({of.first, change.file.key});
    std::move(line.waiting.begin(), line.waiting.end(), std::back_inserter(taken));
    line.waiting.clear();
  }
  return taken;
}

void ChangeNotices::queue(const Provider& provider, const FileChange& change) {
  if (!waiting_.emplace(provider, change.file.key).second) return;
  lines_[{provider, change.writer.bundleIdentifier}].waiting.push_back(change);
}

std::optional<ChangeNotices::Notice> ChangeNotices::begin(const Provider& provider, const Application& application) {
  const auto found = lines_.find({provider, application});
  if (found == lines_.end()) return std::nullopt;
  Line& line = found->second;
  std::optional<Notice> notice;
  if (!line.waiting.empty() && line.underWay < kMaximumNoticesUnderWay) {
    notice = Notice{provider, std::move(line.waiting.front())};
    line.waiting.pop_front();
    ++line.underWay;
    waiting_.erase({provider, notice->change.file.key});
    underWay_.emplace(Place{provider, notice->change.file.key}, UnderWay{application, /*owed=*/{}});
  }
  if (line.waiting.empty() && line.underWay == 0) lines_.erase(found);
  return notice;
}

}  // namespace docuvend::linux_platform
