// The user's bundle directory while one installer has its turn.
#pragma once

#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "platform/QXError.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::linux_platform {

// Used by one thread. The turn ends with the object, and with the process at the latest.
class UserBundleDirectory {
 public:
  enum class Absence { isMended, isAnError };

  // Waits for its turn, and clears away what killed installers have left behind.
  [[nodiscard]] static std::variant<UserBundleDirectory, QXError> open(const Paths& paths, Absence absence);

  [[nodiscard]] const std::string& path() const { return path_; }  // real, absolute
  [[nodiscard]] int descriptor() const { return directory_.get(); }

  // A name that nobody looks at and nothing has.
  [[nodiscard]] std::variant<std::string, QXError> hiddenName() const;

  // Each is on disk when it returns without an error.
  [[nodiscard]] std::optional<QXError> rename(const std::string& from, const std::string& to) const;  // fails when `to` exists
  [[nodiscard]] std::optional<QXError> exchange(const std::string& one, const std::string& other) const;

  // Removes the directory and all that it holds, as far as that goes: what is left has a hidden name.
  void removeHidden(const std::string& name) const;

 private:
  UserBundleDirectory(std::string path, UniqueDescriptor directory) : path_(std::move(path)), directory_(std::move(directory)) {}

  void clearLeftovers() const;
  [[nodiscard]] std::optional<QXError> renameWith(unsigned flags, const std::string& from, const std::string& to) const;

  std::string path_;
  UniqueDescriptor directory_;  // locked
};

}  // namespace docuvend::linux_platform
