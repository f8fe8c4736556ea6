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
  friend bool operator==(const Fingerprint&, const Fingerprint&) = default;
};

struct Entry {
  std::string name;
  Fingerprint fingerprint;
};

[[nodiscard]] QXError systemError(const std::string& what);

// The regular files directly in the directory whose names do not begin with ".". Links are none.
[[nodiscard]] std::vector<Entry> listFiles(const std::string& directory);
// None when it is no regular file.
[[nodiscard]] std::optional<Fingerprint> fingerprintOf(const UniqueDescriptor& file);
// Makes the directory if it is missing (mode 700).
[[nodiscard]] std::optional<QXError> ensureDirectory(const std::string& path);

// A file that is being written to take a place in its directory: nobody sees it before `commit`, and without `commit` it is removed.
class Replacement {
 public:
  enum class Over { anything, nothing };

  explicit Replacement(std::string temporary);
  ~Replacement();
  Replacement(const Replacement&) = delete;
  Replacement& operator=(const Replacement&) = delete;

  // No descriptor: it could not be made.
  [[nodiscard]] const UniqueDescriptor& file() const { return file_; }
  // Puts the file on disk, then in its place, which lies in the same directory. None: done. Over nothing, a place that is taken is EEXIST.
  [[nodiscard]] std::optional<QXError> commit(const std::string& path, Over over);

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
