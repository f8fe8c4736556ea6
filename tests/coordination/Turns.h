// Processes, parties and files to take turns with.
#pragma once

#include <cstdint>
#include <string>
#include <utility>

#include "platform/linux/coordination/AccessTable.h"

namespace docuvend::linux_platform::testing {

inline QXAuditToken processNumber(std::uint8_t number) {
  QXAuditToken process;
  process.bytes[0] = number;
  return process;
}

inline AccessParty partyOf(std::uint8_t process, std::int64_t number = 0) { return {processNumber(process), number}; }

// In a directory that all of them share.
inline FileKey fileNamed(std::string name) { return {ObjectIdentity{1, 2, 3, 4}, std::move(name)}; }

}  // namespace docuvend::linux_platform::testing
