// What a record says, in words alone.
#pragma once

#include <string>

#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

// A record whose every value is a text or a list of texts: what lies in dictionaries gets their keys before its own, with dots between.
// An array of values becomes a list with one nameless column; containers in an array are numbered from 1.
[[nodiscard]] Record flattened(const Record& record);

// A value that is no container, as people read it. An absent one is unknown.
[[nodiscard]] std::string scalarText(const QXValue& value);

}  // namespace docuvend::ctl
