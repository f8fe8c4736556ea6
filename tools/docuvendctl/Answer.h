// What a command gives back. How it looks is the printer's matter.
#pragma once

#include <memory>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/QXValue.h"
#include "sdk/CoordinatedAccess.h"
#include "tools/docuvendctl/Outcome.h"

namespace docuvend::ctl {

struct Nothing {};

// One text that scripts take as it is.
struct Line {
  std::string name;
  std::string text;
};

// Any number of things of one kind: each row has a value for every column.
struct List {
  std::vector<std::string> columns;
  std::vector<std::vector<QXValue>> rows;
};

// One thing: what is known of it, in the order in which people read it.
struct Record {
  using Value = std::variant<QXValue, List>;
  std::vector<std::pair<std::string, Value>> fields;
};

// Text for a person.
struct Page {
  std::string name;
  std::string text;  // lines
};

// The bytes of a file from where it stands.
struct Contents {
  QXURL url;
  QXDescriptor file;
  // The turn at the file, which ends when all is printed; none when it was taken without one.
  std::shared_ptr<CoordinatedAccess> access = {};
};

// A list that says by itself how the command ends: what it found was not as it should be, though the command was done.
struct Report {
  List list;
  ExitStatus status;
};

using Answer = std::variant<Nothing, Line, Record, List, Page, Contents, Report>;

}  // namespace docuvend::ctl
