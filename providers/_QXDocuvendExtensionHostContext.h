// The two protocols of a conversation with a provider extension. Each interface is built on first use and is the same object from then on.
// Derives from nothing and is never made: the contexts are the extension host's own, and only the two class operations are used.
#pragma once

#include "platform/rpc.h"

namespace docuvend {

class _QXDocuvendExtensionHostContext {
 public:
  _QXDocuvendExtensionHostContext() = delete;

  // What this process offers the extension.
  [[nodiscard]] static const QXRpcInterface& _extensionAuxiliaryHostProtocol();
  // What the extension offers this process.
  [[nodiscard]] static const QXRpcInterface& _extensionAuxiliaryVendorProtocol();
};

}  // namespace docuvend
