// What a look at a place in the file system found, or that it could not be made.
//
// A failed call is an answer when it says something about the place: nothing is there, or something else, or this user may not have it. The
// place then counts as what it is. Every other failure is this process's or the machine's (no descriptor, no memory, a disk that does not
// read) and says nothing of the place: whoever looked keeps what it knew, and looks again.
//
// That something may not be had is an answer also where it could be had before. Only its owner or an administrator makes it so, no shortage
// does; so what is closed is taken away, and a directory that was never open is not asked for again and again. A lease is an answer as
// well: any process that can read a file may take one, and with it keep what was known of the file.
#pragma once

#include <string>
#include <variant>
#include <vector>

#include "platform/QXError.h"

namespace docuvend::linux_platform {

// The error is the system's, and says what could not be looked at.
template <class What>
using Seen = std::variant<What, QXError>;

// Whether a call that failed with this number said something about the place.
[[nodiscard]] bool isAnswer(int error);

// That the place could not be looked at, for the reason that this number is.
[[nodiscard]] QXError notSeen(const std::string& place, int error);

struct DirectoryEntry {
  enum class Kind { directory, link, other };
  std::string name;
  Kind kind;
};

// What a directory holds, in order of name; nothing where there is none, or none that may be read.
[[nodiscard]] Seen<std::vector<DirectoryEntry>> entriesOf(const std::string& directory);

// The real path of something that may not exist yet; the path itself where there may not be looked.
[[nodiscard]] Seen<std::string> realPath(const std::string& path);

}  // namespace docuvend::linux_platform
