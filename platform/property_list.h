// Property lists in files.
#pragma once

#include <istream>
#include <memory>
#include <optional>
#include <string>

#include "platform/QXError.h"
#include "platform/QXValue.h"

namespace docuvend {

class QXPropertyLists {
 public:
  // Both may be absent, and both may be present; the caller looks at the error to know whether reading went well.
  struct ReadResult {
    std::optional<QXValue> value;
    std::optional<QXError> error;
  };

  QXPropertyLists() = default;
  QXPropertyLists(const QXPropertyLists&) = delete;
  QXPropertyLists& operator=(const QXPropertyLists&) = delete;
  virtual ~QXPropertyLists() = default;

  // An input stream on a file; null when nothing is there to create it on, or this process can open no more. One on what cannot be opened or
  // is no file is bad from the start, and reading a property list from it is an error.
  [[nodiscard]] virtual std::unique_ptr<std::istream> openStream(const std::string& path) = 0;
  // Parses one property list. Size, depth and the values that XML cannot carry are bounded.
  [[nodiscard]] virtual ReadResult read(std::istream& stream) = 0;
  // Writes the XML encoding so that a reader sees the old file or the new one, and the new one is on disk when this returns. A file
  // that could not be read as a property list is kept beside under another name before it is first overwritten. False: not written.
  [[nodiscard]] virtual bool writeXMLAtomically(const QXDictionary& dictionary, const std::string& path) = 0;
  // Keeps the file beside under another name as well, for a caller that can read it and make nothing of it. False: it has no other name.
  [[nodiscard]] virtual bool keepBeside(const std::string& path) = 0;
};

}  // namespace docuvend
