// Which messages a test has asserted: not merely seen in the log, but spelled out and found there.
//
// Where the environment variable DOCUVEND_ASSERTED_MESSAGES names a file, every such message is added to it, so that another program can
// hold what all tests assert against what the sources can write. Nothing is noted without the variable.
#pragma once

#include <compare>
#include <set>
#include <string>

#include "platform/log.h"

namespace docuvend::fake_platform {

inline constexpr const char* kAssertedMessagesVariable = "DOCUVEND_ASSERTED_MESSAGES";

struct AssertedMessage {
  QXLogType type;
  std::string text;

  friend auto operator<=>(const AssertedMessage&, const AssertedMessage&) = default;
};

// May be called from any thread.
void noteAsserted(const AssertedMessage& message);

// What the processes that were given that file have noted. Empty when they noted nothing.
[[nodiscard]] std::set<AssertedMessage> assertedMessagesIn(const std::string& file);

}  // namespace docuvend::fake_platform
