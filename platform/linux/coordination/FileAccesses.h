// Accesses to files from their request to their end, over a table of turns and the providers.
//
// Reading: its turn, then the contents, which are asked of the provider if the file lies below a provider's directory, then it has begun.
// All readers that wait for one file's contents wait for one request to the provider, also those that come while it runs; a failure is the
// error of all that wait then, and whoever comes later asks anew. A request that runs goes on when nobody waits for it any more; for one
// application a provider is asked for so many files at a time (Provisions.h). A provider that is installed and not registered is waited
// for. A read within an access of its own process asks the provider only when no access of this process has had it asked since it has the
// turn. Writing: its turn, then it has begun. When it has begun and ends, the provider is being told, or will be when it has answered what
// it was told before or is registered, and only then the turn passes on.
//
// May be used from any thread. Providers are asked and told with no lock held; answers run with no lock held, on any thread, also inside
// the call. Outlives every request that a provider may still answer.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <vector>

#include "platform/QXError.h"
#include "platform/QXURL.h"
#include "platform/linux/coordination/AccessHolder.h"
#include "platform/linux/coordination/AccessTable.h"
#include "platform/linux/coordination/LinuxFileCoordinator.h"
#include "platform/linux/coordination/Provisions.h"
#include "platform/linux/coordination/WrittenDirectories.h"

namespace docuvend::linux_platform {

struct FileAccess {
  FileKey file;
  QXURL url;  // as the caller named it; the provider hears this
  AccessKind kind;
  AccessParty party;
  AccessHolder holder;
};

enum class AccessState { waiting, providing, holding };

struct KnownAccess {
  FileAccess access;
  AccessState state;
};

class FileAccesses {
 public:
  // Of one application, over all its connections; as the rest of what one may have, all unconfined processes together have more.
  static constexpr std::size_t kMaximumAccessesOfApplication = 1024;
  static constexpr std::size_t kMaximumUnconfinedAccesses = 16384;

  using Answer = std::function<void(std::optional<QXError>)>;

  // The coordinator outlives it.
  explicit FileAccesses(LinuxFileCoordinator& coordinator);
  ~FileAccesses();
  FileAccesses(const FileAccesses&) = delete;
  FileAccesses& operator=(const FileAccesses&) = delete;

  [[nodiscard]] AccessNumber newNumber();
  // `answer` runs once: without an error when the access has begun. After an error the access is over; its end need not be asked for.
  // `tooManyAccesses` of FileCoordinationErrorCode: the holder's application has as many as it may have.
  void begin(AccessNumber number, FileAccess access, Answer answer);
  // `ended` runs once: of a write that had begun, when the provider is being told or sure to be. An access that has not begun is answered
  // with `ended` of FileCoordinationErrorCode. The end of an access that is over already, or is ending, has nothing to wait for.
  void end(AccessNumber number, std::function<void()> ended);

  // Those that have the file, then those that wait for it, in their order; no more than that many.
  [[nodiscard]] std::vector<KnownAccess> of(const FileKey& file, std::size_t most = SIZE_MAX) const;
  // None when the access is over.
  [[nodiscard]] std::optional<AccessState> stateOf(AccessNumber number) const;
  // The file of an access that waits for its contents.
  [[nodiscard]] std::optional<KeyedFile> beingProvided(AccessNumber number) const;
  // A write of that process has begun and its end, which tells the provider, has not.
  [[nodiscard]] bool isWriting(const QXAuditToken& process, const FileKey& file) const;

 private:
  enum class Stage { waiting, providing, holding, ending };
  struct Entry {
    FileAccess access;
    Stage stage;
    Answer answer;  // until it has run
  };
  // A write that is over, of which the provider is to hear.
  struct Written {
    FileAccess access;
    std::optional<HeldDirectory> directory;
  };
  struct Reader {
    AccessNumber number;
    FileKey file;
    QXURL url;
    AccessHolder holder;
    QXAuditToken process;
  };
  struct Question {
    std::shared_ptr<QXDocuvend> provider;
    ProvideRequest request;
    AccessHolder reader;
    QXURL url;
  };
  // What follows from a change, for when the lock is free.
  struct Consequences {
    std::vector<std::function<void()>> answers;
    std::vector<Reader> readers;  // have the turn and need the contents
    std::vector<Question> questions;
  };

  // With the lock held.
  void enter(AccessNumber number, Entry entry, Consequences& consequences);
  [[nodiscard]] bool hasRoomFor(const Application& application) const;
  void takeTurn(AccessNumber number, Consequences& consequences);
  static void hold(Entry& entry, Consequences& consequences);
  void remove(AccessNumber number, Consequences& consequences);
  [[nodiscard]] Question question(const std::shared_ptr<QXDocuvend>& provider, const Provisions::Question& asked) const;
  static void answerWith(Entry& entry, std::optional<QXError> error, Consequences& consequences);
  [[nodiscard]] static AccessState stateOf(Stage stage);
  [[nodiscard]] static Reader reader(AccessNumber number, const Entry& entry);

  // Without.
  void carryOut(Consequences consequences);
  void provide(const Reader& reader);
  void lookAgain();
  void ask(const Question& question);
  void requestIsAnswered(ProvideRequest request, const std::optional<QXError>& error);
  void tellThenRelease(AccessNumber number, const Written& written, std::function<void()> ended);
  void release(AccessNumber number, std::function<void()> ended);

  LinuxFileCoordinator& coordinator_;
  std::atomic<AccessNumber> lastNumber_{0};
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  AccessTable table_;
  Provisions provisions_;
  WrittenDirectories directories_;             // of entries that write
  std::map<AccessNumber, Entry> entries_;      // as many as the table has
  std::map<Application, std::size_t> counts_;  // of entries; none that is 0
  std::set<AccessNumber> awaiting_;            // have the turn, and their provider is not registered
};

}  // namespace docuvend::linux_platform
