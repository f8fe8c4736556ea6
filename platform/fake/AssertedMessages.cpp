#include "platform/fake/AssertedMessages.h"

#include <cstdlib>
#include <fstream>
#include <mutex>

namespace docuvend::fake_platform {
namespace {

// A message may hold any other character, line ends too.
constexpr char kEndOfMessage = '\0';
constexpr char kFirstType = '0';

}  // namespace

void noteAsserted(const AssertedMessage& message) {
  static const char* const file = std::getenv(kAssertedMessagesVariable);
  if (file == nullptr) return;
  static std::mutex mutex;
  const std::lock_guard lock(mutex);
  std::ofstream(file, std::ios::binary | std::ios::app)
      << static_cast<char>(kFirstType + static_cast<int>(message.type)) << message.text << kEndOfMessage;
}

std::set<AssertedMessage> assertedMessagesIn(const std::string& file) {
  std::set<AssertedMessage> messages;
  std::ifstream stream(file, std::ios::binary);
  for (std::string entry; std::getline(stream, entry, kEndOfMessage);) {
    messages.insert({static_cast<QXLogType>(entry.front() - kFirstType), entry.substr(1)});
  }
  return messages;
}

}  // namespace docuvend::fake_platform
