#include "providers/_QXDocuvendExtensionHostContext.h"

#include "platform/rpc_protocol.h"
#include "providers/_QXDocuvendHostProtocol.h"
#include "providers/_QXDocuvendVendor.h"

namespace docuvend {

const QXRpcInterface& _QXDocuvendExtensionHostContext::_extensionAuxiliaryHostProtocol() {
  static const QXRpcInterface& interface = *new QXRpcInterface(qxInterfaceOf<_QXDocuvendHostProtocol>());
  return interface;
}

const QXRpcInterface& _QXDocuvendExtensionHostContext::_extensionAuxiliaryVendorProtocol() {
  static const QXRpcInterface& interface = *new QXRpcInterface(qxInterfaceOf<_QXDocuvendVendor>());
  return interface;
}

}  // namespace docuvend
