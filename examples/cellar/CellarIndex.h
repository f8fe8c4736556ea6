// What the cellar knows of its items: their identifiers, and which file each one is, here and in the cloud.
//
// An item keeps its identifier while its file is renamed (the file is recognised) and while it is replaced by an atomic save (the name is).
// The index is a text file, one line an item; a reader of the file finds the old index or the new one, whatever happens meanwhile.
#pragma once

#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "examples/cellar/Files.h"
#include "platform/QXError.h"

namespace docuvend::cellar {

// An item's file on one side.
struct Tracked {
  std::string name;         // as it was last seen; empty: there has never been one
  FileKey key;              // as it was last seen
  Fingerprint fingerprint;  // when the contents here and in the cloud were last the same

  // As it is now, not saved: none when there is no such file.
  std::optional<Fingerprint> present;
  bool isRenamed = false;  // since it was last seen
};

struct Item {
  std::string identifier;
  Tracked local;
  Tracked cloud;

  // There is a file, and it is no placeholder.
  [[nodiscard]] bool isHere() const { return local.present && !local.present->isPlaceholder(); }
  // Somebody has written the file since the two sides were the same.
  [[nodiscard]] bool isChangedHere() const { return isHere() && *local.present != local.fingerprint; }
  [[nodiscard]] bool isChangedInCloud() const { return cloud.present && *cloud.present != cloud.fingerprint; }
};

// Finds each item's file among those that are there, and gives back the files that belong to no item. A file of the same name and key is
// the item's; of an item whose name is gone, a file with its key (renamed); then a file with its name (replaced). An item without a file
// keeps what it knows.
[[nodiscard]] std::vector<Entry> recognise(std::vector<Item>& items, Tracked Item::*side, std::vector<Entry> entries);

[[nodiscard]] std::string indexText(const std::vector<Item>& items);
// None when the text is no index.
[[nodiscard]] std::optional<std::vector<Item>> parseIndex(std::string_view text);

// 32 hexadecimal digits that no other item has.
[[nodiscard]] std::string newIdentifier();

class CellarIndex {
 public:
  // `directory` is the provider's own.
  explicit CellarIndex(std::string directory) : directory_(std::move(directory)) {}

  // The index, for as long as this lives: no other thread and no other process of this provider has it.
  class Session {
   public:
    // What went wrong in reading; the index must not be used then.
    [[nodiscard]] const std::optional<QXError>& error() const { return error_; }
    [[nodiscard]] std::vector<Item>& items() { return items_; }
    [[nodiscard]] std::optional<QXError> save() const;
    void noteError(std::optional<QXError> error) { error_ = std::move(error); }

   private:
    friend class CellarIndex;
    Session(const std::string& directory, std::mutex& mutex);

    const std::string& directory_;
    std::unique_lock<std::mutex> lock_;
    UniqueDescriptor fileLock_;
    std::vector<Item> items_;
    std::optional<QXError> error_;
  };
  [[nodiscard]] Session open() { return {directory_, mutex_}; }

 private:
  const std::string directory_;
  std::mutex mutex_;
};

}  // namespace docuvend::cellar
