// URLs that come in from another process, under their straight names (files/StraightURL.h).
//
// The names are those of the daemon's own view: of what a peer names elsewhere it is told nothing that it did not know, not even in the
// form of the name.
#pragma once

#include <memory>
#include <string>

#include "platform/rpc.h"

namespace docuvend::linux_platform {

// The object, called with every URL among the arguments that leads below the directory made straight. Null for none.
[[nodiscard]] std::shared_ptr<QXRpcExportedObject> withStraightArguments(std::shared_ptr<QXRpcExportedObject> object, std::string below);

// The proxy, whose replies have every URL among their values made straight.
[[nodiscard]] std::shared_ptr<QXRpcProxy> withStraightReplies(std::shared_ptr<QXRpcProxy> proxy);

}  // namespace docuvend::linux_platform
