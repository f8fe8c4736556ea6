#include "examples/cellar/Eviction.h"

#include <fcntl.h>
#include <signal.h>

#include <cerrno>
#include <utility>

namespace docuvend::cellar {

Eviction::Eviction(std::string path) : path_(std::move(path)), file_(openForReading(path_)) {
  // The lease's holder is told by a signal that the file is wanted, which must be one that does not end the process.
  if (!file_ || fcntl(file_.get(), F_SETSIG, SIGURG) != 0 || fcntl(file_.get(), F_SETLEASE, F_WRLCK) != 0) {
    error_ = systemError("cannot lease " + path_);
  }
}

std::optional<QXError> Eviction::commit(Replacement& placeholder) const {
  const auto leased = fingerprintOf(file_);
  if (!leased) return systemError("cannot examine " + path_);
  if (auto error = placeholder.exchange(path_, *leased)) return error;
  // Looked at only now: from here on the file's name leads to the placeholder, so nobody else can come to want the file.
  if (fcntl(file_.get(), F_GETLEASE) == F_WRLCK) {
    // While the lease still holds off who found the file before the exchange: they get a file that says that it has no name.
    placeholder.removeReplaced();
    return std::nullopt;
  }
  if (auto error = placeholder.putBack(path_)) return error;
  return QXError::system(EAGAIN, "somebody opens " + path_);
}

}  // namespace docuvend::cellar
