#include "platform/linux/coordination/ApplicationLines.h"

namespace docuvend::linux_platform {

void ApplicationLines::enter(const Provider& provider, const Application& application, const FileKey& file) {
  const Number number = ++last_;
  if (!places_[{provider, file}].emplace(application, number).second) return;
  lines_[{provider, application}].waiting.emplace(number, file);
}

void ApplicationLines::leave(const Provider& provider, const Application& application, const FileKey& file) {
  const auto places = places_.find({provider, file});
  if (places == places_.end()) return;
  const auto place = places->second.extract(application);
  if (places->second.empty()) places_.erase(places);
  if (place.empty()) return;
  const auto line = lines_.find({provider, application});
  line->second.waiting.erase(place.mapped());
  forgetIfEmpty(line);
}

void ApplicationLines::leaveAll(const Provider& provider, const FileKey& file) {
  const auto places = places_.extract({provider, file});
  if (places.empty()) return;
  for (const auto& [application, number] : places.mapped()) {
    const auto line = lines_.find({provider, application});
    line->second.waiting.erase(number);
    forgetIfEmpty(line);
  }
}

std::optional<FileKey> ApplicationLines::begin(const Provider& provider, const Application& application) {
  const auto found = lines_.find({provider, application});
  if (found == lines_.end()) return std::nullopt;
  Line& line = found->second;
  if (line.waiting.empty() || line.underWay == room_) return std::nullopt;
  ++line.underWay;
  FileKey file = line.waiting.begin()->second;
  leaveAll(provider, file);
  return file;
}

void ApplicationLines::end(const Provider& provider, const Application& application) {
  const auto line = lines_.find({provider, application});
  --line->second.underWay;
  forgetIfEmpty(line);
}

void ApplicationLines::forgetIfEmpty(Lines::iterator line) {
  if (line->second.waiting.empty() && line->second.underWay == 0) lines_.erase(line);
}

}  // namespace docuvend::linux_platform
