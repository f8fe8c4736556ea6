// The conversations that docs/protocol.md shows byte by byte.
#pragma once

#include <array>
#include <cstdio>
#include <string>
#include <vector>

#include "platform/linux/wire/Frame.h"
#include "platform/linux/wire/Limits.h"
#include "platform/rpc_errors.h"
#include "tests/wire/RawPeer.h"

namespace docuvend::tests {

struct ExchangeStep {
  std::string title;  // as it stands above the bytes
  linux_platform::Frame frame;
};

inline std::vector<ExchangeStep> workedExchange() {
  using namespace linux_platform;
  const QXURL url = *QXURL::fromString("file:///home/u/Notes/a%20b.txt");
  return {
      {"Client: hello", Hello{kProtocolVersion, std::nullopt}},
      {"Daemon: hello", Hello{kProtocolVersion, std::nullopt}},
      {"Client: request 1", RequestFrame{1, true, "bookmarkableStringFromDocumentURL:completion:", {QXValue(url)}}},
      {"Daemon: reply 1", ReplyFrame{1, {QXValue("docuvend:com.example.Notes/7"), QXValue()}}},
      {"Client: request 2", RequestFrame{2, true, "wakeUp:", {}}},
      {"Daemon: failure 2", FailureFrame{2, QXError::make(kQXRpcErrorDomain, static_cast<std::int64_t>(QXRpcErrorCode::unknownOperation),
                                                          "unknown operation wakeUp:")}},
  };
}

inline std::vector<ExchangeStep> workedProviderExchange() {
  using namespace linux_platform;
  const QXURL url = *QXURL::fromString("file:///home/u/.local/share/docuvend/groups/org.example.p.g/Docuvend%20Storage/a%20b.txt");
  return {
      {"Daemon: hello", Hello{kProtocolVersion, std::nullopt}},
      {"Extension: hello", Hello{kProtocolVersion, std::nullopt}},
      {"Daemon: request 1", RequestFrame{1, true, "_performInitialSetupWithCompletion:", {}}},
      {"Extension: reply 1", ReplyFrame{1, {QXValue(), QXValue(), QXValue()}}},
      {"Daemon: request 2", RequestFrame{2, true, "_startProvidingItemAtURL:completion:", {QXValue(url)}}},
      {"Daemon: request 3", RequestFrame{3, true, "_identifierForItemAtURL:completion:", {QXValue(url)}}},
      {"Extension: reply 3", ReplyFrame{3, {QXValue(), QXValue("doc/7")}}},
      {"Daemon: ping", PingFrame{}},
      {"Extension: pong", PongFrame{}},
      {"Extension: reply 2", ReplyFrame{2, {QXValue(QXError::make("ExampleErrorDomain", 2, "offline"))}}},
  };
}

// Sixteen bytes to a line, in hexadecimal.
inline std::string hexLines(const linux_platform::Frame& frame) {
  constexpr std::size_t kBytesPerLine = 16;
  std::string text;
  const auto bytes = bytesOf(frame);
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    std::array<char, 4> digits{};
    std::snprintf(digits.data(), digits.size(), "%02x", bytes[i]);
    if (i > 0) text += i % kBytesPerLine == 0 ? "\n" : " ";
    text += digits.data();
  }
  return text + "\n";
}

}  // namespace docuvend::tests
