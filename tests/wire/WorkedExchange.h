// The conversation that docs/protocol.md shows byte by byte.
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
