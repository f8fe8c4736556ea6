// How the platform is, for a person who looks after it.
#pragma once

#include "platform/QXValue.h"

namespace docuvend {

class QXStatusSource {
 public:
  QXStatusSource() = default;
  QXStatusSource(const QXStatusSource&) = delete;
  QXStatusSource& operator=(const QXStatusSource&) = delete;
  virtual ~QXStatusSource() = default;

  // As it is now: booleans, numbers, strings, arrays and dictionaries, by names that may come and go. May be called from any thread.
  [[nodiscard]] virtual QXDictionary platformStatus() = 0;
};

}  // namespace docuvend
