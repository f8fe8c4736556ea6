// Files in a directory, and what tells one from another.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::cellar {

using linux_platform::UniqueDescriptor;

// The same through renames, and different for a new file that was given an old one's number.
struct FileKey {
  std::uint64_t inode = 0;
  std::int64_t born = 0;  // nanoseconds since 1970
  friend bool operator==(const FileKey&, const FileKey&) = default;
};

// Changes whenever the contents do.
struct Fingerprint {
  FileKey key;
  std::uint64_t size = 0;
  std::int64_t modified = 0;  // nanoseconds since 1970

  // A placeholder says so itself, by a time that no clock gives: so it is known for one whatever was ended in the middle, and is none any
  // more as soon as somebody writes it.
  [[nodiscard]] bool isPlaceholder() const;
  friend bool operator==(const Fingerprint&, const Fingerprint&) = default;
};

struct Entry {
  std::string name;
  Fingerprint fingerprint;
};

[[nodiscard]] QXError systemError(const std::string& what);

// Of no kind of file does this wait, and it follows no link. No descriptor: errno says why.
[[nodiscard]] UniqueDescriptor openForReading(const std::string& path);
// The regular files directly in the directory whose names do not begin with ".". Links are none.
[[nodiscard]] std::vector<Entry> listFiles(const std::string& directory);
// None when it is no regular file.
[[nodiscard]] std::optional<Fingerprint> fingerprintOf(const UniqueDescriptor& file);
// The same of what lies there, without opening it.
[[nodiscard]] std::optional<Fingerprint> fingerprintAt(const std::string& path);
// Gives the file a time of its last change.
[[nodiscard]] bool setModified(const UniqueDescriptor& file, std::int64_t modified);
// Returns when whatever is written from now on has another time than the file has now. Two changes within one tick of the kernel's clock
// may have the same, so this takes some milliseconds after a change. Of a file from the future it gives up.
void awaitLaterTime(const Fingerprint& file);
// Makes the directory if it is missing (mode 700).
[[nodiscard]] std::optional<QXError> ensureDirectory(const std::string& path);

// A file that is being written to take a place in its directory: nobody sees it before it is there, and otherwise it is removed.
class Replacement {
 public:
  explicit Replacement(std::string temporary);
  ~Replacement();
  Replacement(const Replacement&) = delete;
  Replacement& operator=(const Replacement&) = delete;

  // No descriptor: it could not be made.
  [[nodiscard]] const UniqueDescriptor& file() const { return file_; }
  // Makes it a placeholder of that size, for contents of that time, and puts it on disk.
  [[nodiscard]] std::optional<QXError> becomePlaceholder(std::uint64_t size, std::int64_t modified);
  // Puts it on disk under its temporary name.
  [[nodiscard]] std::optional<QXError> sync() const;

  // Puts the file, which is on disk, in its place, which lies in the same directory, whatever is there.
  [[nodiscard]] std::optional<QXError> commit(const std::string& path);
  // The same in the place of that file only, if it has not changed; of none: if nothing is there. EAGAIN: something else is there, which
  // stays.
  [[nodiscard]] std::optional<QXError> commitOver(const std::string& path, const std::optional<Fingerprint>& expected);

  // Has the file and that one change names, if the latter has not changed. EAGAIN: something else is there, which stays. Nothing is put on
  // disk.
  [[nodiscard]] std::optional<QXError> exchange(const std::string& path, const Fingerprint& expected);
  // After `exchange`, has the two change names back; but what somebody else has put in the place since stays there. Then, or after an
  // error, this can take no place any more.
  [[nodiscard]] std::optional<QXError> putBack(const std::string& path);
  // After `exchange`, removes the other file now.
  void removeReplaced();

 private:
  std::string temporary_;
  UniqueDescriptor file_;
};

// False: not done, and errno says why; with EEXIST the new name is taken.
[[nodiscard]] bool renameOverNothing(const std::string& from, const std::string& to);

// Removes the files of that directory whose names begin with "." and end so.
void removeHiddenFiles(const std::string& directory, std::string_view suffix);

// Writes all bytes.
[[nodiscard]] bool writeAll(const UniqueDescriptor& file, const char* bytes, std::size_t count);

}  // namespace docuvend::cellar
