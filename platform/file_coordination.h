// The file-coordination service and what it asks of a provider.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/QXError.h"
#include "platform/QXURL.h"
#include "platform/queue.h"

namespace docuvend {

// Names a reader or a writer to the provider; only printed.
struct QXCoordinationID {
  std::string value;
  // A writer's is kept as long as the provider is being told of the write: when the last copy goes, the service takes that to be over,
  // however it went. May be dropped on any thread.
  std::shared_ptr<const void> untilTold = {};
};

// What a provider object answers. Called on threads of the service's choosing.
class QXDocuvend {
 public:
  QXDocuvend() = default;
  QXDocuvend(const QXDocuvend&) = delete;
  QXDocuvend& operator=(const QXDocuvend&) = delete;
  virtual ~QXDocuvend() = default;

  // The directory whose files this object provides; absent: none yet.
  [[nodiscard]] virtual std::optional<QXURL> _providedItemsURL() const = 0;
  [[nodiscard]] virtual std::shared_ptr<QXOperationQueue> _providedItemsOperationQueue() const = 0;
  // Under which identity the service knows this object.
  [[nodiscard]] virtual std::optional<std::string> _fileReactorID() const = 0;

  // Somebody is about to read a file in the directory: its contents are brought into it. The completion, which may be empty, runs on any
  // thread, also inside the call, with the reason why the file cannot be read, if there is one; it may run a second time.
  using ProvideCompletion = std::function<void(std::optional<QXError> error)>;
  virtual void _provideItemAtURL(const QXURL& url, const std::optional<QXCoordinationID>& toReaderWithID,
                                 ProvideCompletion completionHandler) = 0;
  // The same for nobody in particular. Deprecated: a service that can say who reads calls the other one.
  virtual void _provideItemAtURL(const QXURL& url, ProvideCompletion completionHandler) = 0;
  // A writer has finished with a file in the directory. One call may stand for several writes.
  virtual void _writerWithID(const QXCoordinationID& writer, const QXURL& didFinishWritingForURL) = 0;
};

class QXFileCoordinator {
 public:
  QXFileCoordinator() = default;
  QXFileCoordinator(const QXFileCoordinator&) = delete;
  QXFileCoordinator& operator=(const QXFileCoordinator&) = delete;
  virtual ~QXFileCoordinator() = default;

  // Each addition counts; the service keeps the object alive until it has been removed as often.
  virtual void _addDocuvend(std::shared_ptr<QXDocuvend> provider) = 0;
  // Removing an object that is not there is harmless.
  virtual void _removeDocuvend(const std::shared_ptr<QXDocuvend>& provider) = 0;
};

}  // namespace docuvend
