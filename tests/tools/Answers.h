// Answers to show.
#pragma once

#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

inline const List kGrants{{"provider", "item", "consumer"}, {{"org.p", "1", "org.c"}, {"org.provider", "22", "org.cc"}}};
inline const List kEmpty{{"provider", "item"}, {}};
inline const Record kRecord{{{"url", QXValue(*QXURL::fromString("file:///x%20y"))}, {"token", QXValue("docuvend-token:1")}}};
inline const QXValue kNested =
    QXDictionary{{"list", QXArray{"one", 2, QXDictionary{{"key", "value"}}}}, {"number", 3}, {"empty", QXArray{}}};

}  // namespace docuvend::ctl
