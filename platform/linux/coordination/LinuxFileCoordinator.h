// The provider objects that file coordination knows, and the way to the one that holds a file.
//
// May be used from any thread. Provider objects are called with no lock held, on their own operation queues; one that has none is called
// on the caller's thread.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/file_coordination.h"
#include "platform/file_system.h"

namespace docuvend::linux_platform {

class LinuxFileCoordinator final : public QXFileCoordinator {
 public:
  // The file system outlives it.
  explicit LinuxFileCoordinator(QXFileSystem& fileSystem) : fileSystem_(fileSystem) {}

  void _addDocuvend(std::shared_ptr<QXDocuvend> provider) override;
  void _removeDocuvend(const std::shared_ptr<QXDocuvend>& provider) override;

  enum class DirectoryItself { counts, doesNotCount };
  // Of the objects whose directory contains the file, or is it (where that counts), the one that was added first; null when there is none.
  [[nodiscard]] std::shared_ptr<QXDocuvend> providerOf(const QXURL& file, DirectoryItself itself = DirectoryItself::counts) const;

  // Asks the object for the contents of the file on behalf of a reader of that process, under an identifier that no other reader has.
  // `completion` comes as the object has it: on any thread, also inside the call, and perhaps twice.
  void askToProvide(const std::shared_ptr<QXDocuvend>& provider, int readerProcess, const QXURL& file,
                    QXDocuvend::ProvideCompletion completion);
  // Tells the object that a writer of that process has finished with the file, under an identifier that no other writer has; `told` runs
  // after that.
  void tellFinishedWriting(const std::shared_ptr<QXDocuvend>& provider, int writerProcess, const QXURL& file, std::function<void()> told);

 private:
  struct Registration {
    std::shared_ptr<QXDocuvend> provider;
    std::size_t count;
  };
  [[nodiscard]] std::vector<std::shared_ptr<QXDocuvend>> providers() const;
  // Never used before.
  [[nodiscard]] QXCoordinationID nameFor(const char* role, int process);

  QXFileSystem& fileSystem_;
  std::atomic<std::uint64_t> names_{0};
  mutable std::mutex mutex_;
  std::vector<Registration> registrations_;  // guarded by mutex_; in the order of the first additions
};

}  // namespace docuvend::linux_platform
