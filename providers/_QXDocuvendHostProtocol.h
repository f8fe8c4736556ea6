// What the daemon offers a provider extension: nothing yet, by name.
#pragma once

#include <string_view>
#include <tuple>

#include "platform/rpc_protocol.h"

namespace docuvend {

class _QXDocuvendHostProtocol {};

template <>
struct QXProtocolTable<_QXDocuvendHostProtocol> {
  static constexpr std::string_view name = "_QXDocuvendHostProtocol";
  static constexpr auto operations = std::tuple{};
};

}  // namespace docuvend
