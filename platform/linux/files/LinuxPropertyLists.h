// Property lists in the files of this machine.
//
// A stream is made for regular files alone, so that neither a pipe nor a device can hold the caller. Written files have mode 600. Before a
// file that is no property list is overwritten it gets the further name PATH.unreadable-N, with the first N from 1 that is free; when that
// fails nothing is written. May be used from any thread; two writes of one path at a time are the caller's to avoid.
#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <istream>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>

#include "platform/property_list.h"

namespace docuvend::linux_platform {

class LinuxPropertyLists : public QXPropertyLists {
 public:
  std::unique_ptr<std::istream> openStream(const std::string& path) override;
  ReadResult read(std::istream& stream) override;
  bool writeXMLAtomically(const QXDictionary& dictionary, const std::string& path) override;
  bool keepBeside(const std::string& path) override;

 private:
  // What tells a file from every other one, and from itself after a change of its contents or of who may read them.
  struct Stamp {
    std::uint64_t device = 0;
    std::uint64_t inode = 0;
    std::uint32_t mode = 0;
    std::int64_t size = 0;
    std::int64_t seconds = 0;
    std::int64_t nanoseconds = 0;

    friend bool operator==(const Stamp&, const Stamp&) = default;
  };

  [[nodiscard]] static Stamp stampOf(const struct stat& status);
  // Whether something is at the path that is no property list, or that nobody has been able to read. A file that this object wrote is not
  // read again to know.
  [[nodiscard]] bool holdsSomethingElse(const std::string& path);

  std::mutex mutex_;
  // Guarded by mutex_.
  std::map<std::string, Stamp> written_;
  std::set<std::string> unread_;  // could not be opened when that was last tried, for want of descriptors or memory
};

}  // namespace docuvend::linux_platform
