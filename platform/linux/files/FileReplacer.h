// Replaces one file as a whole: fill it, then `commit` puts it in place. Whoever opens the path sees the old file or the new one.
//
// The new file lies beside the old one under a name nobody can guess, with mode 600, until it is committed; an object that goes without
// a commit takes it away again. A symbolic link at the path is itself replaced. One object serves one replacement, on one thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "platform/QXError.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

class FileReplacer {
 public:
  // `path` is absolute. Fails when its directory is missing, or the new file cannot be made there.
  [[nodiscard]] static std::variant<FileReplacer, QXError> begin(const std::string& path);

  FileReplacer(FileReplacer&& other) noexcept;
  FileReplacer& operator=(FileReplacer&&) = delete;
  ~FileReplacer();

  // Appends to the new file.
  [[nodiscard]] std::optional<QXError> write(std::string_view bytes);

  // Gives what is at the path now a second name: the path, `suffix`, and the first number from 1 that is free. The name is on disk when
  // this returns. Where files cannot have two names the old file moves there, and the path is empty until the commit.
  [[nodiscard]] std::optional<QXError> keepOld(std::string_view suffix);

  // The file that is being filled, until `commit`.
  [[nodiscard]] int descriptor() const { return file_.get(); }

  // On success the new file is in place and on disk. After a failure the path holds the old file or the new one; nothing more can be
  // done with this object. At most once.
  [[nodiscard]] std::optional<QXError> commit();

 private:
  FileReplacer(std::string path, UniqueDescriptor directory);

  [[nodiscard]] std::optional<QXError> createTemporary();
  [[nodiscard]] std::optional<QXError> syncDirectory() const;

  std::string path_;  // for messages
  std::string name_;  // last component
  UniqueDescriptor directory_;
  UniqueDescriptor file_;
  std::string temporary_;  // name in the directory; empty when there is nothing to take away
};

}  // namespace docuvend::linux_platform
