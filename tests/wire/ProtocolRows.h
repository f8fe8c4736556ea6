// The rows of an operation table in docs/protocol.md.
#pragma once

#include <string>
#include <vector>

#include "platform/rpc.h"

namespace docuvend::tests {

inline std::string kindNames(const std::vector<QXValueKind>& kinds) {
  std::string text;
  for (const QXValueKind kind : kinds) text += (text.empty() ? "" : ", ") + std::string(qxKindName(kind));
  return text.empty() ? "none" : text;
}

inline std::vector<std::string> protocolRows(const QXRpcInterface& interface) {
  std::vector<std::string> rows;
  for (const QXRpcOperation& operation : interface.operations()) {
    rows.push_back("| `" + operation.name + "` | " + kindNames(operation.arguments) + " | " + kindNames(operation.replies) + " |");
  }
  return rows;
}

}  // namespace docuvend::tests
