// Whose turn it is where a provider object does a limited number of things at a time for one application.
//
// A pure value. A file stands in an object's line of every application that wants something of the object for it. The first of these lines
// that has come to the file and has room begins it; it leaves the others then, and counts as under way in that line alone, until it ends.
// So an application never waits for the room of another one, also where both want the same. Whoever uses this begins after each change
// what can be begun: a line that has room has nobody waiting.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <utility>

#include "platform/file_coordination.h"
#include "platform/linux/coordination/AccessHolder.h"
#include "platform/linux/coordination/FileKey.h"

namespace docuvend::linux_platform {

class ApplicationLines {
 public:
  using Provider = std::shared_ptr<QXDocuvend>;

  // So many may be under way in a line.
  explicit ApplicationLines(std::size_t room) : room_(room) {}

  // At the end of that line, unless the file stands in it.
  void enter(const Provider& provider, const Application& application, const FileKey& file);
  void leave(const Provider& provider, const Application& application, const FileKey& file);
  void leaveAll(const Provider& provider, const FileKey& file);
  // The file at the head of that line, if there is one and room for it.
  [[nodiscard]] std::optional<FileKey> begin(const Provider& provider, const Application& application);
  // One of those that are under way in that line has ended.
  void end(const Provider& provider, const Application& application);

  // Nothing is under way and nobody waits.
  [[nodiscard]] bool isEmpty() const { return lines_.empty() && places_.empty(); }

 private:
  using Number = std::uint64_t;  // who came first has the smaller one
  struct Line {
    std::size_t underWay = 0;
    std::map<Number, FileKey> waiting;
  };
  using Lines = std::map<std::pair<Provider, Application>, Line>;
  void forgetIfEmpty(Lines::iterator line);

  const std::size_t room_;
  Number last_ = 0;
  Lines lines_;                                                                   // none that is empty
  std::map<std::pair<Provider, FileKey>, std::map<Application, Number>> places_;  // of what waits; none without a place
};

}  // namespace docuvend::linux_platform
