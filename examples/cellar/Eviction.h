// Takes the contents from a file that nobody has open, by putting a placeholder in its place.
//
// A lease is held from the making of this object until it goes. There is none while anybody else has the file open or mapped, the latter
// also when the descriptor of the mapping has been closed. Whoever opens the file meanwhile waits, or is told to come back, and so has
// asked for it: then nothing is taken. What is left are the few instructions between the kernel's finding a file by its name and its asking
// for the lease: who is caught there by the whole of `commit` gets the old file, which keeps its contents but has no name any more.
#pragma once

#include <optional>
#include <string>

#include "examples/cellar/Files.h"

namespace docuvend::cellar {

class Eviction {
 public:
  explicit Eviction(std::string path);

  // Why there is no lease; with EAGAIN somebody has the file open.
  [[nodiscard]] const std::optional<QXError>& error() const { return error_; }
  [[nodiscard]] const UniqueDescriptor& file() const { return file_; }
  // Puts the placeholder in the file's place and removes the file. EAGAIN: somebody wants to open the file, which is where it was, or has
  // put another there, which stays.
  [[nodiscard]] std::optional<QXError> commit(Replacement& placeholder) const;

 private:
  const std::string path_;
  const UniqueDescriptor file_;
  std::optional<QXError> error_;
};

}  // namespace docuvend::cellar
