// Property lists in memory, in the files of a FakeFileSystem: a path is there for both or for neither.
//
// Differs from the real one:
//  - There is no text: a stream holds a ticket for what the file held when the stream was made, and only `read` understands it.
//  - A file may yield a value and an error at once, when a test says so.
//  - Nothing is bounded in size or depth.
//  - A file whose content nobody gave (FakeFileSystem::addFile alone) is no property list.
//
// May be used from any thread.
#pragma once

#include <cstddef>
#include <istream>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/FakeFileSystem.h"
#include "platform/property_list.h"

namespace docuvend::fake_platform {

enum class FakeWriteFailure { once, forGood };

class FakePropertyLists : public QXPropertyLists {
 public:
  struct Write {
    std::string path;
    QXDictionary dictionary;
    bool succeeded = false;
  };

  explicit FakePropertyLists(FakeFileSystem& fileSystem) : fileSystem_(fileSystem) {}

  std::unique_ptr<std::istream> openStream(const std::string& path) override;
  ReadResult read(std::istream& stream) override;
  bool writeXMLAtomically(const QXDictionary& dictionary, const std::string& path) override;
  bool keepBeside(const std::string& path) override;

  // What reading the file yields from now on; each puts the file there.
  void setValue(const std::string& path, QXValue value);
  void setCorrupt(const std::string& path);
  void setReadResult(const std::string& path, ReadResult result);
  // The file is there, and no stream on it can be created.
  void setNoStream(const std::string& path);

  // The n-th write of this object's life fails, counted from 1; or that one and all after it.
  void failWrite(std::size_t number, FakeWriteFailure failure);

  // What reading the file would yield; none when there is no such file, or it is not a property list.
  [[nodiscard]] std::optional<QXValue> value(const std::string& path) const;
  // Every write that was tried, in order.
  [[nodiscard]] std::vector<Write> writes() const;
  [[nodiscard]] std::size_t writeCount() const;

 private:
  struct Content {
    bool hasStream = true;
    ReadResult result;
  };

  void setContent(const std::string& path, Content content);
  [[nodiscard]] bool canWrite(const QXDictionary& dictionary, const std::string& path);
  void keepUnreadable(const std::string& path);
  bool keep(const std::string& path);

  FakeFileSystem& fileSystem_;

  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::map<std::string, Content> contents_;
  std::map<std::string, ReadResult> tickets_;  // a stream's text: what it stands for
  std::vector<Write> writes_;
  std::size_t failingWrite_ = 0;  // 0: none
  FakeWriteFailure failure_ = FakeWriteFailure::once;
};

}  // namespace docuvend::fake_platform
