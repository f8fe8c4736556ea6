// A provider object that remembers what it was told.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/file_coordination.h"

namespace docuvend::linux_platform::testing {

class RecordingProvider final : public QXDocuvend {
 public:
  RecordingProvider() = default;
  explicit RecordingProvider(QXURL directory, std::shared_ptr<QXOperationQueue> queue = {})
      : directory_(std::move(directory)), queue_(std::move(queue)) {}

  std::optional<QXURL> _providedItemsURL() const override { return directory_; }
  std::shared_ptr<QXOperationQueue> _providedItemsOperationQueue() const override { return queue_; }
  std::optional<std::string> _fileReactorID() const override { return std::nullopt; }
  void _provideItemAtURL(const QXURL& /*url*/, const std::optional<QXCoordinationID>& /*toReaderWithID*/,
                         ProvideCompletion /*completionHandler*/) override {}
  void _provideItemAtURL(const QXURL& /*url*/, ProvideCompletion /*completionHandler*/) override {}
  void _writerWithID(const QXCoordinationID& writer, const QXURL& didFinishWritingForURL) override {
    told.emplace_back(writer.value, didFinishWritingForURL);
    if (onTold) onTold();
  }

  std::vector<std::pair<std::string, QXURL>> told;
  std::function<void()> onTold;

 private:
  const std::optional<QXURL> directory_;
  const std::shared_ptr<QXOperationQueue> queue_;
};

}  // namespace docuvend::linux_platform::testing
