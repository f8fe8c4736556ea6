// What a servicer needs of the server whose client it serves.
#pragma once

#include <memory>

#include "acl/DVAccessControlStore.h"

namespace docuvend {

class DVAccessControlSource {
 public:
  DVAccessControlSource() = default;
  DVAccessControlSource(const DVAccessControlSource&) = delete;
  DVAccessControlSource& operator=(const DVAccessControlSource&) = delete;
  virtual ~DVAccessControlSource() = default;

  // Null when there is none. May be called from any thread.
  [[nodiscard]] virtual std::shared_ptr<DVAccessControlStore> accessControlStore() const = 0;
};

}  // namespace docuvend
