// Which provider objects are being told that files have changed, and what they are still to be told.
//
// A pure value: it tells nobody. A notice tells one object of one file, and is under way from its beginning until whoever began it says
// that it has ended. Of one file an object is told by one notice at a time. Writes that end meanwhile owe one more between them, which
// begins after that; so after each write there begins at least one. What one application has written is told to an object by a limited
// number of notices at a time, whichever files they are of; the rest waits, in the order in which it came, and holds up no other
// application's. What waits is at most one change of a file: it is bounded by the files that may be written.
#pragma once

#include <cstddef>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/file_coordination.h"
#include "platform/linux/coordination/AccessHolder.h"
#include "platform/linux/coordination/FileKey.h"

namespace docuvend::linux_platform {

// A file that has been written, and by whom last.
struct FileChange {
  AccessHolder writer;
  KeyedFile file;
};

class ChangeNotices {
 public:
  // Of one application to one object.
  static constexpr std::size_t kMaximumNoticesUnderWay = 16;

  using Provider = std::shared_ptr<QXDocuvend>;

  struct Notice {
    Provider provider;
    FileChange change;
  };

  // A write of one of the object's files has ended. True: the notice of it is under way now, and the caller begins it. False: one will be.
  [[nodiscard]] bool add(const Provider& provider, const FileChange& change);
  // A notice that was under way has ended. Those that are under way now instead; the caller begins them.
  [[nodiscard]] std::vector<Notice> end(const Provider& provider, const FileKey& file);

  // What objects other than these were still to be told: they will not be, nor of what is under way a second time.
  [[nodiscard]] std::vector<FileChange> takeFromAllBut(const std::vector<Provider>& providers);

  // Nothing is under way, and so nothing waits.
  [[nodiscard]] bool isEmpty() const { return underWay_.empty() && waiting_.empty() && lines_.empty(); }

 private:
  using Place = std::pair<Provider, FileKey>;
  using Application = std::optional<std::string>;
  struct UnderWay {
    Application application;
    std::optional<FileChange> owed;  // the last of the writes that have ended since it began
  };
  // One application's notices to one object.
  struct Line {
    std::size_t underWay = 0;
    std::deque<FileChange> waiting;
  };
  using Lines = std::map<std::pair<Provider, Application>, Line>;

  void queue(const Provider& provider, const FileChange& change);
  // The head of that line, when the line has room for it.
  [[nodiscard]] std::optional<Notice> begin(const Provider& provider, const Application& application);

  std::map<Place, UnderWay> underWay_;
  std::set<Place> waiting_;  // what waits in the lines
  Lines lines_;              // none that is empty
};

}  // namespace docuvend::linux_platform
