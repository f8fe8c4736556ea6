// Which provider objects are being told that files have changed, and what providers are still to be told.
//
// A pure value: it tells nobody. A notice tells one object of one file, and is under way from its beginning until whoever began it says
// that it has ended. Of one file an object is told by one notice at a time. Writes that end meanwhile owe one more between them, which
// begins after that; so after each write there begins at least one. What one application has written is told to an object by a limited
// number of notices at a time, whichever files they are of; the rest waits, in the order in which it came, and holds up no other
// application's, also of a file that both have written. What a provider that is not registered is to be told is kept by its bundle.
//
// What waits or is kept is at most one change of a file. That is no limit, for a name may be written without a file ever being there: an
// application that has written too much of which a provider has not been told is to write nothing more there meanwhile. Whoever lets
// it write asks before; a write that has ended is always told.
#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/coordination/AccessHolder.h"
#include "platform/linux/coordination/ApplicationLines.h"
#include "platform/linux/coordination/FileKey.h"

namespace docuvend::linux_platform {

// A file that has been written, and by whom.
struct FileChange {
  KeyedFile file;
  std::map<Application, int> writers;  // of each application the process that wrote last
};

class ChangeNotices {
 public:
  // Of one application to one object.
  static constexpr std::size_t kMaximumNoticesUnderWay = 16;
  // Of one application's writes of which one provider is not being told yet, and the bytes of their URLs. What had begun while there was
  // room comes on top, which the accesses of an application limit.
  static constexpr std::size_t kMaximumUntoldFiles = 1024;
  static constexpr std::size_t kMaximumUntoldBytes = std::size_t{1} << 20U;
  // All unconfined processes are counted as one. They are trusted, and may write whole trees while a provider is not there.
  static constexpr std::size_t kMaximumUnconfinedUntoldFiles = 16384;
  static constexpr std::size_t kMaximumUnconfinedUntoldBytes = std::size_t{16} << 20U;

  using Provider = ApplicationLines::Provider;
  // A provider's object, or the bundle of a provider that is not registered.
  using Owner = std::variant<Provider, std::string>;

  struct Notice {
    Provider provider;
    KeyedFile file;
    AccessHolder writer;
  };

  // Whether that application may write a further file of the owner's, or has one that waits and may write it again.
  [[nodiscard]] bool hasRoomFor(const Owner& owner, const Application& application, const KeyedFile& file) const;

  // A write of one of the owner's files has ended. The notice of it when that is under way now, and the caller begins it; else one will be.
  [[nodiscard]] std::optional<Notice> add(const Owner& owner, const FileChange& change);
  // A notice that was under way has ended. Those that are under way now instead; the caller begins them.
  [[nodiscard]] std::vector<Notice> end(const Provider& provider, const FileKey& file);

  struct Untold {
    Owner owner;
    KeyedFile file;
  };
  // What owners other than these objects are still to be told.
  [[nodiscard]] std::vector<Untold> untoldOfAllBut(const std::vector<Provider>& providers) const;
  // If that is still so: another owner is to be told of it instead, or nobody. As `add`.
  [[nodiscard]] std::optional<Notice> move(const Untold& untold, const std::optional<Owner>& owner);

  // Nothing is under way, and nothing waits.
  [[nodiscard]] bool isEmpty() const { return underWay_.empty() && waiting_.empty() && backlogs_.empty() && lines_.isEmpty(); }

 private:
  using Place = std::pair<Owner, FileKey>;
  struct UnderWay {
    Application application;         // in whose line it is
    std::optional<FileChange> owed;  // what was written since it began
  };
  // What one application has written and an owner is still to be told.
  struct Backlog {
    std::size_t files = 0;
    std::size_t bytes = 0;
  };

  enum class Counting { in, out };
  void count(const Owner& owner, const FileChange& change, Counting way);
  void wait(const Owner& owner, const FileChange& change);
  [[nodiscard]] FileChange waitNoMore(std::map<Place, FileChange>::iterator waiting);
  // The head of that line, when the line has room for it.
  [[nodiscard]] std::optional<Notice> begin(const Provider& provider, const Application& application);

  std::map<Place, UnderWay> underWay_;                         // of objects
  std::map<Place, FileChange> waiting_;                        // those of objects stand in the lines of their writers
  std::map<std::pair<Owner, Application>, Backlog> backlogs_;  // of what is waiting; none that is empty
  ApplicationLines lines_{kMaximumNoticesUnderWay};
};

}  // namespace docuvend::linux_platform
