// A provider object that remembers what it was asked and told; the test answers. One thread at a time.
#pragma once

#include <cstddef>
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
  explicit RecordingProvider(QXURL directory, std::shared_ptr<QXOperationQueue> queue = {}, std::optional<std::string> identity = {})
      : directory_(std::move(directory)), queue_(std::move(queue)), identity_(std::move(identity)) {}

  std::optional<QXURL> _providedItemsURL() const override { return directory_; }
  std::shared_ptr<QXOperationQueue> _providedItemsOperationQueue() const override { return queue_; }
  std::optional<std::string> _fileReactorID() const override { return identity_; }
  void _provideItemAtURL(const QXURL& url, const std::optional<QXCoordinationID>& toReaderWithID,
                         ProvideCompletion completionHandler) override {
    asked.push_back({toReaderWithID ? toReaderWithID->value : "nobody", url, std::move(completionHandler)});
    if (onAsked) onAsked();
  }
  void _provideItemAtURL(const QXURL& url, ProvideCompletion completionHandler) override {
    _provideItemAtURL(url, /*toReaderWithID=*/{}, std::move(completionHandler));
  }
  void _writerWithID(const QXCoordinationID& writer, const QXURL& didFinishWritingForURL) override {
    told.emplace_back(writer.value, didFinishWritingForURL);
    if (isSlow) unanswered.push_back(writer.untilTold);
    if (onTold) onTold();
  }

  struct Asked {
    std::string reader;
    QXURL url;
    ProvideCompletion completion;
  };
  std::vector<Asked> asked;
  std::function<void()> onAsked;
  std::vector<std::pair<std::string, QXURL>> told;
  std::function<void()> onTold;

  // What a slow extension is being told.
  bool isSlow = false;
  std::vector<std::shared_ptr<const void>> unanswered;
  void answer(std::size_t index = 0) {
    const auto answered = unanswered.at(index);
    unanswered.erase(unanswered.begin() + static_cast<std::ptrdiff_t>(index));
  }
  // What is unanswered holds this object.
  void answerAll() {
    while (!unanswered.empty()) answer();
  }

 private:
  const std::optional<QXURL> directory_;
  const std::shared_ptr<QXOperationQueue> queue_;
  const std::optional<std::string> identity_;
};

}  // namespace docuvend::linux_platform::testing
