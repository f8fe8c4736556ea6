// The provider objects that file coordination knows, and whose a file is.
//
// A provider that is installed is not always registered: not while the device is locked, nor before its setup is done, nor while it is
// being updated, nor after a setup that failed. Its files are its own all the same, and whoever reads one waits for it; what was written
// meanwhile it is told when it is registered.
//
// An object that is being told of a file's change is not told of that file again until it lets go of the writer's identifier, and is then
// if the file was written meanwhile; nor of any number of files at a time (ChangeNotices.h). What it was still to be told when it is
// removed is told to the next one that is registered for the file.
//
// May be used from any thread. Provider objects are called with no lock held, on their own operation queues; one that has none is called
// on the caller's thread. Outlives every writer's identifier that an object may hold.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/QXLogMessage.h"
#include "platform/file_coordination.h"
#include "platform/file_system.h"
#include "platform/linux/coordination/AccessHolder.h"
#include "platform/linux/coordination/ChangeNotices.h"
#include "platform/linux/coordination/FileKey.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

// Of at most one of these there is something; of none for a file of nobody's.
struct FileOwner {
  std::shared_ptr<QXDocuvend> provider;
  std::optional<std::string> awaited;  // the bundle of a provider that is installed and not registered
  std::optional<QXError> failure;      // it cannot be known; or it is nobody's, and its contents are not there
  bool isLost = false;                 // it would be somebody's, but is not where it was when it was given its key: so it is nobody's
  std::uint64_t changes = 0;           // of registrations and installed providers, up to when the look began

  // None for a file of nobody's, or of one that cannot be known.
  [[nodiscard]] std::optional<ChangeNotices::Owner> known() const;
};

// Where the provider of an installed bundle keeps its items, whether or not it is registered or the directory is there.
struct InstalledStorage {
  std::string bundleIdentifier;
  QXURL directory;
};

class LinuxFileCoordinator final : public QXFileCoordinator {
 public:
  // Asked from any thread; what they use outlives this.
  struct Outside {
    // In what order they are looked at; none when empty.
    std::function<std::vector<InstalledStorage>()> installedStorages = {};
    // Whether a file is still where it was when it was given its key: else it is nobody's. Always when empty.
    std::function<bool(const KeyedFile&)> isInPlace = {};
    // Whether a file of nobody's is a placeholder that a provider has left behind. Never when empty.
    std::function<bool(const KeyedFile&)> isRemnant = {};
    // For what nobody else hears of. Null: nothing is logged.
    QXLogHandle* log = nullptr;
  };

  // The file system outlives it.
  explicit LinuxFileCoordinator(QXFileSystem& fileSystem) : LinuxFileCoordinator(fileSystem, Outside{}) {}
  LinuxFileCoordinator(QXFileSystem& fileSystem, Outside outside) : fileSystem_(fileSystem), outside_(std::move(outside)) {}

  void _addDocuvend(std::shared_ptr<QXDocuvend> provider) override;
  void _removeDocuvend(const std::shared_ptr<QXDocuvend>& provider) override;

  enum class DirectoryItself { counts, doesNotCount };
  // Of the objects whose directory contains the file, or is it (where that counts), the one that was added first; if there is none, the
  // first installed provider of whom this is true.
  [[nodiscard]] FileOwner ownerOf(const KeyedFile& file, DirectoryItself itself) const;

  // The answer of `installedStorages` may be another one than before: who waits for a provider that is gone need not wait for the next
  // registration to find out.
  void installedStoragesChanged();

  // Who has noted that it waits for an owner asks this afterwards: true when a registration or an installed provider has come or gone since
  // that owner was looked for.
  [[nodiscard]] bool hasChangedSince(const FileOwner& owner) const { return changes_ != owner.changes; }
  // Called after each addition and removal, also of an object that was never added, and when the installed storages have changed; with no
  // lock held. One that is running when another handler is set may still run.
  void setRegistrationHandler(std::function<void()> handler);

  // Asks the object for the contents of the file on behalf of a reader, under an identifier that no other reader has. `completion` comes as
  // the object has it: on any thread, also inside the call, and perhaps twice. What objects are asked and told is work for the reader or
  // the writer, whoever's access has set it going.
  void askToProvide(const std::shared_ptr<QXDocuvend>& provider, const AccessHolder& reader, const QXURL& file,
                    QXDocuvend::ProvideCompletion completion);
  // Why nobody of that application may write the file now: its owner is still to be told of as much as one application may have written.
  [[nodiscard]] std::optional<QXError> refusalOfWrite(const FileOwner& owner, const AccessHolder& writer, const KeyedFile& file) const;
  // Tells the file's owner that a writer has finished with it, under an identifier that no other writer has; `told` runs after that, and
  // at once when there is no owner (which is logged when the file is not where it was, or its owner cannot be known), or when it will be
  // told later: one that is awaited or is being told already. It hears of several writes to one file once then.
  void tellFinishedWriting(const FileOwner& owner, const AccessHolder& writer, const KeyedFile& file, std::function<void()> told);

 private:
  struct Registration {
    std::shared_ptr<QXDocuvend> provider;
    std::size_t count;
  };
  class NoticeUnderWay;
  [[nodiscard]] std::vector<std::shared_ptr<QXDocuvend>> providers() const;
  [[nodiscard]] bool contains(const QXURL& directory, const QXURL& file, DirectoryItself itself, std::optional<QXError>& failure) const;
  void begin(const ChangeNotices::Notice& notice, std::function<void()> told);
  void noticeHasEnded(const std::shared_ptr<QXDocuvend>& provider, const FileKey& file);
  void tellUntold();
  void registrationsChanged();
  void callHandler();
  void logError(const QXLogMessage& message) const;
  // Never used before.
  [[nodiscard]] std::string nameFor(const char* role, int process);

  QXFileSystem& fileSystem_;
  const Outside outside_;
  std::atomic<std::uint64_t> names_{0};
  std::atomic<std::uint64_t> changes_{0};
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::vector<Registration> registrations_;  // in the order of the first additions
  ChangeNotices notices_;
  std::function<void()> registrationHandler_;
};

}  // namespace docuvend::linux_platform
